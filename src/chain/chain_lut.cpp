// Lookup tables. Tables from two bytes to one are looked up only where no ramp computes the same
// entries faster. Read chain_lut.h and ramp.h first.
#include "chain/chain_lut.h"

#include "base/count.h"
#include "chain/ramp.h"

#include <cstring>

namespace {

template <typename Sample>
Sample load_sample(const std::uint8_t *bytes)
{
    Sample sample;
    std::memcpy(&sample, bytes, sizeof sample);
    return sample;
}

template <typename Sample>
void store_sample(std::uint8_t *bytes, std::uint16_t value)
{
    const auto sample = static_cast<Sample>(value);
    std::memcpy(bytes, &sample, sizeof sample);
}

// Passes every sample of a window through `map`, from one buffer to another or in place.
template <typename In, typename Out, typename Map>
void map_window(const std::uint8_t *source, const img_buffer_def &source_def, std::uint8_t *target,
                const img_buffer_def &target_def, Map map)
{
    for (std::int32_t line = 0; line < source_def.nlines; ++line) {
        const auto row = img_count(line);
        const auto *in = source + row * img_count(source_def.stride) * sizeof(In);
        auto *out = target + row * img_count(target_def.stride) * sizeof(Out);
        for (std::int32_t samp = 0; samp < source_def.nsamps; ++samp) {
            store_sample<Out>(out, map(load_sample<In>(in)));
            in += sizeof(In);
            out += sizeof(Out);
        }
    }
}

// Maps two bytes to one by a ramp, if the table is one and the window is large enough to pay for
// finding out. Returns false, with nothing mapped, otherwise.
bool map_along_ramp(const std::uint16_t *table, std::int32_t size, const std::uint8_t *source,
                    const img_buffer_def &source_def, std::uint8_t *target,
                    const img_buffer_def &target_def)
{
    constexpr std::int64_t break_even = 4;  // samples per entry
    img_chain_ramp ramp;
    if (std::int64_t{source_def.nlines} * source_def.nsamps < break_even * size ||
        !img_chain_find_ramp(table, size, &ramp))
        return false;
    for (std::int64_t row = 0; row < source_def.nlines; ++row)
        img_chain_map_ramp(source + row * source_def.stride * 2, target + row * target_def.stride,
                           img_count(source_def.nsamps), ramp);
    return true;
}

}  // namespace

void img_chain_apply_lut(std::uint8_t *buffer, const img_buffer_def *def, const img_chain_lut *lut)
{
    const auto map = [table = lut->lut, size = lut->size](std::uint32_t sample) {
        return img_chain_entry(table, size, sample);
    };
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
    // A narrower index or value takes the high bits of the wider one.
    for (std::int32_t i = 0; i < dst->size; ++i) {
        const std::int32_t index = in_shift >= 0 ? i >> in_shift : i << -in_shift;
        const std::int64_t value = src_table[index];
        dst_table[i] =
            static_cast<std::uint16_t>(out_shift >= 0 ? value << out_shift : value >> -out_shift);
    }
}

std::int32_t img_chain_lut_input_definition(void *record, const img_buffer_def *out_def,
                                            img_buffer_def *in_def)
{
    const auto &lut = *static_cast<const img_chain_lut *>(record);
    // unreachable: preparation refuses such an output before
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
    // unreachable: preparation gives the width of the table or of the image
    if (in_def->nbits < 0 || in_def->nbits > IMG_CHAIN_MAX_BITS) return -1;
    const std::int32_t size = std::int32_t{1} << in_def->nbits;
    const std::uint16_t *table = own.lut;
    img_scratch converted;
    if (in_def->nbits != own.bits_in) {
        converted = img_take_scratch(img_count(size) * sizeof(std::uint16_t));
        if (!converted) return -1;
        img_chain_lut widths = own;
        widths.bits_in = static_cast<std::uint8_t>(in_def->nbits);
        widths.size = size;
        auto *const entries = reinterpret_cast<std::uint16_t *>(converted.get());
        img_chain_convert_lut(own.lut, &own, entries, &widths);
        table = entries;
    }
    // The output's width decides, also where the input states an unusual one.
    const bool to_bytes = in_def->nbytes != 1 && out_def->nbytes == 1;
    if (to_bytes && pending == 0 &&
        map_along_ramp(table, size, in_buffer, *in_def, out_buffer, *out_def))
        return 0;
    const auto map = [=](std::uint32_t sample) {
        return img_chain_entry(table, size,
                               pending != 0 ? img_chain_entry(lut, size, sample) : sample);
    };
    if (in_def->nbytes == 1 && out_def->nbytes == 2)
        map_window<std::uint8_t, std::uint16_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else if (to_bytes)
        map_window<std::uint16_t, std::uint8_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else if (in_def->nbytes != 1)
        map_window<std::uint16_t, std::uint16_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    else
        map_window<std::uint8_t, std::uint8_t>(in_buffer, *in_def, out_buffer, *out_def, map);
    return 0;
}
