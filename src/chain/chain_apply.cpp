// Applying a chain. LUT links do not touch the samples: they are folded into one running table,
// which is applied where the real samples are needed. Read chain.h, then chain_apply.h.
#include "chain/chain_apply.h"

#include "base/report.h"
#include "chain/chain_lut.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace {

// The LUT links that were passed but not yet applied to the samples, folded into one table.
class running_lut {
public:
    // Makes the tables for samples of up to `bits`. Returns false when memory is short.
    bool allocate(std::int32_t bits)
    {
        if (bits > IMG_CHAIN_MAX_BITS) {
            errno = ENOMEM;
            return false;
        }
        m_bits = bits;
        m_table = new_table();
        m_spare = new_table();
        return m_table && m_spare;
    }

    bool pending() const { return m_pending; }
    const std::uint16_t *table() const { return entries(m_table); }
    void reset() { m_pending = false; }

    void fold(const img_chain_lut &next)
    {
        if (!m_pending) {
            set_widths(next.bits_in, next.bits_out);
            std::copy_n(next.lut, next.size, entries(m_table));
        } else {
            if (m_lut.bits_out != next.bits_in) convert(m_lut.bits_in, next.bits_in);
            std::uint16_t *const table = entries(m_table);
            std::transform(table, table + m_lut.size, table, [&next](std::uint16_t entry) {
                return img_chain_entry(next.lut, next.size, entry);
            });
            m_lut.bits_out = next.bits_out;
        }
        m_pending = true;
    }

    // Re-expresses the pending table for samples of `nbits`. Returns false for a width beyond the
    // room of the tables.
    bool bring_to(std::int32_t nbits)
    {
        // unreachable: a wider one; preparation has raised lut_bits to every width
        if (nbits < 0 || nbits > m_bits) return false;
        if (m_lut.bits_in != nbits || m_lut.bits_out != nbits) convert(nbits, nbits);
        return true;
    }

    // Applies the pending table to the samples and resets it.
    bool apply_to(std::uint8_t *buffer, const img_buffer_def &def)
    {
        if (!bring_to(def.nbits)) return false;
        m_lut.lut = entries(m_table);
        img_chain_apply_lut(buffer, &def, &m_lut);
        reset();
        return true;
    }

private:
    static std::uint16_t *entries(const img_scratch &table)
    {
        return reinterpret_cast<std::uint16_t *>(table.get());
    }
    img_scratch new_table() const { return img_take_scratch(sizeof(std::uint16_t) << m_bits); }
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
        img_chain_convert_lut(entries(m_table), &source, entries(m_spare), &m_lut);
        std::swap(m_table, m_spare);
    }

    std::int32_t m_bits = 0;  // the tables have room for 1 << m_bits entries
    img_chain_lut m_lut{};    // widths of the pending table
    img_scratch m_table, m_spare;
    bool m_pending = false;
};

// One passage of the samples through the links.
class passage {
public:
    explicit passage(img_chain &chain)
        : m_chain(chain), m_current(chain.work_buffer), m_def(chain.work_def)
    {
    }
    bool allocate() { return m_chain.has_lut_link == 0 || m_lut.allocate(m_chain.lut_bits); }

    // Applies one link. Returns 0, or -1.
    std::int32_t pass(const img_chain_link &link)
    {
        img_scratch fresh;
        std::uint8_t *output = m_current;
        if (link.placement == IMG_CHAIN_OUT_FINAL) output = m_chain.final_buffer;
        if (link.placement == IMG_CHAIN_OUT_ALLOC) {
            fresh =
                img_chain_new_buffer(link.out_def.nlines, link.out_def.stride, link.out_def.nbytes);
            if (!fresh) return -1;
            output = fresh.get();
        }
        if (apply(link, output) == -1) return -1;
        if (link.kind != IMG_CHAIN_REMAP_FCN) return 0;  // the samples stay where they are
        if (link.release_input == IMG_CHAIN_FREE_INPUT) {
            if (m_current == m_chain.work_buffer) {
                m_chain.work_memory.reset();
                m_chain.work_buffer = nullptr;
            }
            m_temporary.reset();
        }
        if (fresh) m_temporary = std::move(fresh);
        m_current = output;
        m_def = &link.out_def;
        return 0;
    }

    // Applies what is still pending to the caller's buffer; the tables have room for its width.
    void finish()
    {
        if (m_lut.pending()) m_lut.apply_to(m_chain.final_buffer, *m_chain.final_def);
    }

private:
    std::int32_t apply(const img_chain_link &link, std::uint8_t *output)
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
    std::uint8_t *m_current;  // where the samples are, and how they are laid out
    const img_buffer_def *m_def;
    img_scratch m_temporary;  // owns m_current where a link's output was a fresh buffer
};

// Ends an application that failed: its buffers are freed, but `prepared` stays set until the next
// preparation.
std::int32_t fail_application(img_chain &chain)
{
    img_chain_release(chain);
    return -1;
}

bool is_known(std::int32_t kind)
{
    // unreachable: no other kind is ever added
    return kind == IMG_CHAIN_LUT_FCN || kind == IMG_CHAIN_LUT || kind == IMG_CHAIN_REMAP_FCN;
}

}  // namespace

std::int32_t img_apply_img_chain(img_handle handle)
{
    return img_chain_apply(img_chain_of(handle));
}

std::int32_t img_chain_apply(img_chain &chain)
{
    if (chain.identity != 0) return 0;
    if (chain.prepared == 0 || chain.work_buffer == nullptr) return -1;
    passage through(chain);
    if (!through.allocate()) {
        img_fail_errno("img_apply_img_chain:malloc LUT");
        return fail_application(chain);
    }
    for (const img_chain_link &link : chain.links) {
        if (link.kind == IMG_CHAIN_EMPTY) continue;
        if (!is_known(link.kind)) {  // unreachable: as said there
            img_fail("img_apply_img_chain: Invalid Image Chain Process type\n");
            return fail_application(chain);
        }
        if (through.pass(link) == -1) return fail_application(chain);
    }
    through.finish();
    img_chain_release(chain);
    chain.prepared = 0;
    return 0;
}
