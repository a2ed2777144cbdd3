// One load through the chain: where each link works, and the work itself.
#include "api/img_desc.h"
#include "api/report.h"
#include "chain/chain.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <utility>

namespace
{

constexpr std::int32_t MAX_BITS = 30;  // so that a table's size fits 31 bits

using buffer_ptr = std::unique_ptr<std::uint8_t[]>;

// Returns memory for `rows` x `row_samples` samples; null when it cannot be had.
buffer_ptr new_buffer(std::int32_t rows, std::int32_t row_samples, std::int32_t nbytes)
{
    if (rows < 0 || row_samples < 0 || nbytes < 0) return nullptr;
    const auto size =
        std::uint64_t{static_cast<std::uint32_t>(rows)} * static_cast<std::uint32_t>(row_samples);
    return buffer_ptr(new (std::nothrow) std::uint8_t[size * static_cast<std::uint32_t>(nbytes)]);
}

template <typename Sample>
Sample load_sample(const std::uint8_t *at)
{
    Sample sample;
    std::memcpy(&sample, at, sizeof sample);
    return sample;
}

template <typename Sample>
void store_sample(std::uint8_t *at, std::uint16_t value)
{
    const auto sample = static_cast<Sample>(value);
    std::memcpy(at, &sample, sizeof sample);
}

// Passes every sample of a window through `map`, from one buffer to another or in place.
template <typename In, typename Out, typename Map>
void map_window(const std::uint8_t *from, const img_buffer_def &from_def, std::uint8_t *to,
                const img_buffer_def &to_def, Map map)
{
    for (std::int32_t line = 0; line < from_def.nlines; ++line) {
        const auto row = static_cast<std::size_t>(line);
        const auto *in = from + row * static_cast<std::size_t>(from_def.stride) * sizeof(In);
        auto *out = to + row * static_cast<std::size_t>(to_def.stride) * sizeof(Out);
        for (std::int32_t samp = 0; samp < from_def.nsamps; ++samp) {
            store_sample<Out>(out, map(load_sample<In>(in)));
            in += sizeof(In);
            out += sizeof(Out);
        }
    }
}

std::uint16_t entry_of(const std::uint16_t *table, std::uint32_t last, std::uint32_t sample)
{
    return table[std::min(sample, last)];
}

// Frees the buffer that the image type read into, unless it is the caller's, and forgets it.
void drop_work_buffer(img_chain &chain)
{
    if (chain.work_buffer != chain.final_buffer) delete[] chain.work_buffer;
    chain.work_buffer = nullptr;
}

// The LUT links that have been passed but not yet applied to the data, folded into one table.
class running_lut
{
public:
    // Returns false when memory is short. `with_spare`: there will be conversions.
    bool allocate(std::int32_t bits, bool with_spare)
    {
        if (bits < 0 || bits > MAX_BITS) {
            errno = ENOMEM;
            return false;
        }
        m_bits = bits;
        m_table.reset(new (std::nothrow) std::uint16_t[std::size_t{1} << bits]);
        if (with_spare) m_spare.reset(new (std::nothrow) std::uint16_t[std::size_t{1} << bits]);
        if (!m_table || (with_spare && !m_spare)) return false;
        reset();
        return true;
    }

    bool pending() const
    {
        return m_pending;
    }
    const std::uint16_t *table() const
    {
        return m_table.get();
    }

    void reset()
    {
        set_widths(m_bits, m_bits);
        for (std::int32_t i = 0; i < m_lut.size; ++i)
            m_table[static_cast<std::size_t>(i)] = static_cast<std::uint16_t>(i);
        m_pending = false;
    }

    void fold(const img_chain_lut &next)
    {
        const auto last = static_cast<std::uint32_t>(next.size - 1);
        if (!m_pending) {
            set_widths(next.bits_in, next.bits_out);
            std::copy_n(next.lut, next.size, m_table.get());
        } else {
            if (m_lut.bits_out != next.bits_in) convert(m_lut.bits_in, next.bits_in);
            for (std::int32_t i = 0; i < m_lut.size; ++i) {
                std::uint16_t &entry = m_table[static_cast<std::size_t>(i)];
                entry = entry_of(next.lut, last, entry);
            }
            m_lut.bits_out = next.bits_out;
        }
        m_pending = true;
    }

    // Re-expresses what is pending for data of `nbits`. Returns false for a width that the tables
    // were not made for.
    bool bring_to(std::int32_t nbits)
    {
        if (nbits < 0 || nbits > m_bits) return false;
        if (m_lut.bits_in != nbits || m_lut.bits_out != nbits) convert(nbits, nbits);
        return true;
    }

    // Applies what is pending to the data and starts anew.
    bool apply_to(std::uint8_t *buffer, const img_buffer_def &def)
    {
        if (!bring_to(def.nbits)) return false;
        m_lut.lut = m_table.get();
        img_chain_apply_lut(buffer, &def, &m_lut);
        reset();
        return true;
    }

private:
    void set_widths(std::int32_t bits_in, std::int32_t bits_out)
    {
        m_lut.bits_in = static_cast<std::uint8_t>(bits_in);
        m_lut.bits_out = static_cast<std::uint8_t>(bits_out);
        m_lut.size = std::int32_t{1} << bits_in;
    }
    void convert(std::int32_t bits_in, std::int32_t bits_out)
    {
        const img_chain_lut source = m_lut;
        set_widths(bits_in, bits_out);
        img_chain_convert_lut(m_table.get(), &source, m_spare.get(), &m_lut);
        std::swap(m_table, m_spare);
    }

    std::int32_t m_bits = 0;  // the tables have room for 1 << m_bits entries
    img_chain_lut m_lut{};    // widths of what is in m_table
    std::unique_ptr<std::uint16_t[]> m_table, m_spare;
    bool m_pending = false;
};

// One passage of the data through the links.
class application
{
public:
    explicit application(img_chain &chain)
        : m_chain(chain), m_current(chain.work_buffer), m_def(chain.work_def)
    {
    }
    bool allocate()
    {
        return m_lut.allocate(m_chain.lut_bits, m_chain.has_lut_link != 0);
    }

    // Applies one link. Returns 0, or -1.
    std::int32_t pass(const img_chain_link &link)
    {
        buffer_ptr fresh;
        std::uint8_t *output = m_current;
        if (link.placement == IMG_CHAIN_OUT_FINAL) output = m_chain.final_buffer;
        if (link.placement == IMG_CHAIN_OUT_ALLOC) {
            fresh = new_buffer(link.out_def.nlines, link.out_def.stride, link.out_def.nbytes);
            if (!fresh) return -1;
            output = fresh.get();
        }
        if (run(link, output) == -1) return -1;
        // Only a remap carries the data to its output. Another link leaves it where it is, which
        // is its output, unless no link of the chain says that it needs other input.
        if (link.kind != IMG_CHAIN_REMAP_FCN && output != m_current) return 0;
        if (link.release_input == IMG_CHAIN_FREE_INPUT) {
            if (m_current == m_chain.work_buffer) drop_work_buffer(m_chain);
            m_temporary.reset();
        }
        if (fresh) m_temporary = std::move(fresh);
        m_current = output;
        m_def = &link.out_def;
        return 0;
    }

    // Applies what is still pending to the caller's buffer. Returns 0, or -1.
    std::int32_t finish()
    {
        if (!m_lut.pending()) return 0;
        return m_lut.apply_to(m_chain.final_buffer, *m_chain.final_def) ? 0 : -1;
    }

private:
    std::int32_t run(const img_chain_link &link, std::uint8_t *output)
    {
        switch (link.kind) {
        case IMG_CHAIN_LUT_FCN:
            return compute_lut(link);
        case IMG_CHAIN_LUT:
            m_lut.fold(link.lut_def);
            return 0;
        default:
            return remap(link, output);
        }
    }

    std::int32_t compute_lut(const img_chain_link &link)
    {
        if (m_lut.pending() && !m_lut.apply_to(m_current, *m_def)) return -1;
        const img_chain_lut_fcn_part &part = link.lut_fcn;
        if (part.lut == nullptr) return 0;
        if (m_def->nbits > part.bits_in ||  // the callback would write beyond the table
            part.create_fn(link.arg, m_current, m_def, part.lut) != 0)
            return img_fail("img_apply_img_chain: Error in IMG_CHAIN_LUT_FCN\n");
        return 0;
    }

    std::int32_t remap(const img_chain_link &link, std::uint8_t *output)
    {
        const bool pending = m_lut.pending();
        if (pending && !m_lut.bring_to(m_def->nbits)) return -1;
        if (link.remap.process_fn(link.arg, m_current, m_def, output, &link.out_def,
                                  pending ? 1 : 0, m_lut.table()) != 0)
            return img_fail("img_apply_img_chain: Error in IMG_CHAIN_REMAP_FCN\n");
        if (pending) m_lut.reset();
        return 0;
    }

    img_chain &m_chain;
    running_lut m_lut;
    std::uint8_t *m_current;  // where the data is, and how it is laid out
    const img_buffer_def *m_def;
    buffer_ptr m_temporary;  // m_current, when a link's output was a fresh buffer
};

// Fails a preparation; its message, if any, has been printed.
std::uint8_t *not_prepared(img_chain &chain)
{
    chain.prepared = 0;
    return nullptr;
}

// Works out, for one link, what it gets for what follows it. `def` is the latter on entry and the
// former on return, `placement` likewise where a link would put its output.
std::int32_t prepare_link(img_chain &chain, img_chain_link &link, img_buffer_def *def,
                          std::int32_t *placement)
{
    link.out_def = *def;
    link.placement = *placement;
    link.changes_def = 0;
    if (link.kind == IMG_CHAIN_LUT) {
        chain.has_lut_link = 1;
        chain.lut_bits = std::max(chain.lut_bits, std::int32_t{link.lut_def.bits_in});
    }
    if (link.kind != IMG_CHAIN_REMAP_FCN) return 0;

    const img_chain_remap_part &remap = link.remap;
    if (remap.out_bits != 0 && remap.out_bits != def->nbits)
        return img_fail("img_chain_prepare_operations: Inconsistent output bits in image "
                        "chain!\n");
    if (remap.input_def_fn == nullptr) return 0;
    img_buffer_def in_def = *def;
    link.changes_def = remap.input_def_fn(link.arg, def, &in_def);
    if (link.changes_def < 0)
        return img_fail("img_chain_prepare_operations: get_input_definition() failed!!\n");
    *def = in_def;
    chain.lut_bits = std::max(chain.lut_bits, def->nbits);
    if (link.changes_def != 0) *placement = IMG_CHAIN_OUT_UNDECIDED;
    return 0;
}

// Gives the chain a packed buffer of its own for the image type to read into. Returns false when
// memory is short.
bool take_work_buffer(img_chain &chain, img_buffer_def *def)
{
    def->stride = def->nsamps;
    chain.work_buffer = new_buffer(def->nlines, def->nsamps, def->nbytes).release();
    if (chain.work_buffer == nullptr) return false;

    // The links before the first that changes the definition work in place on this buffer.
    const auto first_change =
        std::ranges::find_if(chain.links, [](const auto &link) { return link.changes_def != 0; });
    if (first_change != chain.links.end())
        std::for_each(chain.links.begin(), first_change,
                      [def](img_chain_link &link) { link.out_def.stride = def->stride; });
    if (def->nbytes > chain.final_def->nbytes) def->fill = chain.final_def->fill;
    return true;
}

// Settles who frees what, now that it is known whether the first buffer is a temporary one.
void settle_buffers(img_chain &chain, bool temporary)
{
    for (img_chain_link &link : chain.links) {
        const bool changes = link.changes_def != 0;
        link.release_input = changes && temporary ? IMG_CHAIN_FREE_INPUT : IMG_CHAIN_KEEP_INPUT;
        if (changes) temporary = false;
        if (link.placement != IMG_CHAIN_OUT_UNDECIDED) continue;
        link.placement = changes ? IMG_CHAIN_OUT_ALLOC : IMG_CHAIN_OUT_IN_PLACE;
        if (changes) temporary = true;
    }
}

bool agree(const img_buffer_def &a, const img_buffer_def &b)
{
    return a.nlines == b.nlines && a.nsamps == b.nsamps && a.nbytes == b.nbytes &&
           a.stride == b.stride;
}

// Ends an application that failed: its buffers are given back, but the chain counts as prepared
// until the next preparation starts afresh.
std::int32_t fail_application(img_chain &chain)
{
    drop_work_buffer(chain);
    return -1;
}

bool is_known(std::int32_t kind)
{
    return kind == IMG_CHAIN_LUT_FCN || kind == IMG_CHAIN_LUT || kind == IMG_CHAIN_REMAP_FCN;
}

}  // namespace

std::uint8_t *img_chain_prepare_operations(img_handle handle, std::uint8_t *buffer,
                                           const img_buffer_def *def, img_buffer_def *work_def)
{
    img_chain &chain = img_chain_of(handle);
    if (chain.identity != 0) {
        *work_def = *def;
        return buffer;
    }
    drop_work_buffer(chain);  // of an earlier load that did not come to its end
    chain.prepared = 1;
    if (def->nbits != chain.out_bits) {
        img_fail("img_chain_prepare_operations:  output bits of image chain dont match output "
                 "buffer!\n");
        return not_prepared(chain);
    }
    chain.final_buffer = buffer;
    chain.final_def = def;
    chain.has_lut_link = 0;
    chain.lut_bits = def->nbits;

    img_buffer_def needed = *def;
    std::int32_t placement = IMG_CHAIN_OUT_FINAL;
    for (auto link = chain.links.rbegin(); link != chain.links.rend(); ++link)
        if (prepare_link(chain, *link, &needed, &placement) == -1) return not_prepared(chain);
    needed.nbits = img_query_nbits(handle);
    needed.nbytes = img_find_image(handle)->nbytes;
    chain.lut_bits = std::max(chain.lut_bits, needed.nbits);

    const bool direct = agree(needed, *def);
    if (direct)
        chain.work_buffer = buffer;
    else if (!take_work_buffer(chain, &needed))
        return not_prepared(chain);
    *work_def = needed;
    chain.work_def = work_def;
    settle_buffers(chain, !direct);
    return chain.work_buffer;
}

std::int32_t img_apply_img_chain(img_handle handle)
{
    img_chain &chain = img_chain_of(handle);
    if (chain.identity != 0) return 0;
    if (chain.prepared == 0) return -1;
    application passage(chain);
    if (!passage.allocate()) {
        img_fail_errno("img_apply_img_chain:malloc LUT");
        return fail_application(chain);
    }
    for (const img_chain_link &link : chain.links) {
        if (link.kind == IMG_CHAIN_EMPTY) continue;
        if (!is_known(link.kind))
            return img_fail("img_apply_img_chain: Invalid Image Chain Process type\n");
        if (passage.pass(link) == -1) return fail_application(chain);
    }
    if (passage.finish() == -1) return fail_application(chain);
    drop_work_buffer(chain);
    chain.prepared = 0;
    return 0;
}

void img_chain_release(img_handle handle)
{
    drop_work_buffer(img_chain_of(handle));
}

void img_chain_apply_lut(std::uint8_t *buffer, const img_buffer_def *def, const img_chain_lut *lut)
{
    const auto last = static_cast<std::uint32_t>(lut->size - 1);
    const auto map = [=](std::uint32_t sample) { return entry_of(lut->lut, last, sample); };
    if (def->nbytes == 1)
        map_window<std::uint8_t, std::uint8_t>(buffer, *def, buffer, *def, map);
    else
        map_window<std::uint16_t, std::uint16_t>(buffer, *def, buffer, *def, map);
}

void img_chain_convert_lut(const std::uint16_t *src_table, const img_chain_lut *src,
                           std::uint16_t *dst_table, const img_chain_lut *dst)
{
    const std::int32_t in_shift = dst->bits_in - src->bits_in;
    const std::int32_t out_shift = dst->bits_out - src->bits_out;
    if (in_shift == 0 && out_shift == 0) {
        if (src_table != dst_table) std::copy_n(src_table, dst->size, dst_table);
        return;
    }
    // Chains only widen; a narrower index or value takes the high bits of the wider one.
    for (std::int32_t i = 0; i < dst->size; ++i) {
        const std::int32_t from = in_shift >= 0 ? i >> in_shift : i << -in_shift;
        const std::int64_t value = src_table[from];
        dst_table[i] =
            static_cast<std::uint16_t>(out_shift >= 0 ? value << out_shift : value >> -out_shift);
    }
}

std::int32_t img_chain_lut_input_definition(void *record, const img_buffer_def *out_def,
                                            img_buffer_def *in_def)
{
    const auto &lut = *static_cast<const img_chain_lut *>(record);
    if (out_def->nbits != lut.bits_out) return -1;
    *in_def = *out_def;
    in_def->nbits = lut.bits_in;
    in_def->nbytes = img_chain_nbytes(lut.bits_in);
    return lut.bits_in != out_def->nbits ? 1 : 0;
}

std::int32_t img_chain_lut_remap(void *record, const std::uint8_t *in_buffer,
                                 const img_buffer_def *in_def, std::uint8_t *out_buffer,
                                 const img_buffer_def *out_def, std::int32_t pending,
                                 const std::uint16_t *lut)
{
    const auto &own = *static_cast<const img_chain_lut *>(record);
    if (in_def->nbits < 0 || in_def->nbits > MAX_BITS) return -1;
    const auto last = static_cast<std::uint32_t>((std::int32_t{1} << in_def->nbits) - 1);
    const std::uint16_t *table = own.lut;
    std::unique_ptr<std::uint16_t[]> converted;
    if (in_def->nbits != own.bits_in) {
        converted.reset(new (std::nothrow) std::uint16_t[std::size_t{last} + 1]);
        if (!converted) return -1;
        img_chain_lut widths = own;
        widths.bits_in = static_cast<std::uint8_t>(in_def->nbits);
        widths.size = static_cast<std::int32_t>(last) + 1;
        img_chain_convert_lut(own.lut, &own, converted.get(), &widths);
        table = converted.get();
    }
    const auto map = [=](std::uint32_t sample) {
        return entry_of(table, last, pending != 0 ? entry_of(lut, last, sample) : sample);
    };
    if (in_def->nbytes == 1 && out_def->nbytes == 2)
        map_window<std::uint8_t, std::uint16_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else if (in_def->nbytes == 2 && out_def->nbytes == 1)
        map_window<std::uint16_t, std::uint8_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else if (in_def->nbytes != 1)
        map_window<std::uint16_t, std::uint16_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else
        map_window<std::uint8_t, std::uint8_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    return 0;
}
