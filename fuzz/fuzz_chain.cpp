// Adds links of all kinds to an image's chain, removes, prepares and applies them, with tables of
// all widths. No chain may reach outside the buffers, and without a chain the image must be
// unchanged.
#include "base/count.h"
#include "chain/chain.h"
#include "chain/chain_apply.h"
#include "chain/chain_links.h"
#include "chain/chain_lut.h"
#include "chain/chain_prepare.h"
#include "chain/stretch.h"
#include "checked_image.h"
#include "imgfile/img.h"

#include <cstring>

namespace {

// `arg` points to a byte of the input, which decides what the functions of a link do.
std::int32_t choice_of(void *arg)
{
    return *static_cast<std::uint8_t *>(arg);
}

std::int32_t create(void *arg, const std::uint8_t *buffer, const img_buffer_def *def,
                    std::uint16_t *lut)
{
    const std::int32_t choice = choice_of(arg);
    lut[(std::int32_t{1} << def->nbits) - 1] = buffer[0];
    if (choice % 4 != 0) return choice % 16 == 1 ? 1 : 0;
    return img_chain_create_stretch_lut_from_buffer(buffer, def, lut, choice / 4);
}

std::int32_t define(void *arg, const img_buffer_def *out_def, img_buffer_def *in_def)
{
    const std::int32_t nbits = choice_of(arg) % 16;
    if (nbits == 0) return -1;
    in_def->nbits = nbits;
    in_def->nbytes = img_chain_nbytes(nbits);
    return nbits != out_def->nbits ? 1 : 0;
}

std::int32_t process(void *arg, const std::uint8_t *in_buffer, const img_buffer_def *in_def,
                     std::uint8_t *out_buffer, const img_buffer_def *out_def, std::int32_t pending,
                     const std::uint16_t *lut)
{
    const auto width_of = [](const img_buffer_def *def) {  // a link may state any width
        return static_cast<std::size_t>(std::clamp(def->nbytes, 0, 4));
    };
    for (std::int32_t i = 0; i < in_def->nlines * in_def->nsamps; ++i) {
        const std::int64_t line = i / in_def->nsamps, samp = i % in_def->nsamps;
        std::uint32_t sample = 0;
        std::memcpy(&sample, in_buffer + (line * in_def->stride + samp) * in_def->nbytes,
                    width_of(in_def));
        if (pending != 0) sample = img_chain_entry(lut, std::int32_t{1} << in_def->nbits, sample);
        std::memcpy(out_buffer + (line * out_def->stride + samp) * out_def->nbytes, &sample,
                    width_of(out_def));
    }
    return choice_of(arg) % 8 == 7 ? 1 : 0;
}

// Adds a link of some kind and width. Removes the links in its slots first, as the chain requires.
void add_link(fuzz_input &in, img_handle image, std::uint8_t *arg)
{
    const auto width = [&in] { return in.below(64) == 63 ? in.number() | 32 : in.below(13) + 1; };
    const std::int32_t kind = in.below(4), link = in.near(10), target = in.near(10);
    const std::int32_t bits_in = width(), bits_out = width(), remap = in.below(2);
    *arg = static_cast<std::uint8_t>(in.byte());
    img_chain_remove_link(image, link);
    if (kind == 0)
        img_chain_add_remap_link(image, link, remap * bits_out, arg, process,
                                 in.below(2) == 0 ? define : nullptr);
    if (kind == 1) img_chain_remove_link(image, target);
    if (kind == 1)
        img_chain_add_lut_create_link(image, link, arg, create, target, bits_in, bits_out, remap,
                                      nullptr, 0);
    if (kind < 2) return;
    auto table = std::make_unique<std::uint16_t[]>(1 << 13);
    for (std::size_t i = 0; i < 1 << 13; ++i) table[i] = static_cast<std::uint16_t>(i * *arg);
    if (img_chain_add_lut_link(image, link, bits_in, bits_out, remap, table.get(), 1) == 0)
        static_cast<void>(table.release());  // the link owns it
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    const fuzz_run run;
    fuzz_input in({data, size});
    const std::int32_t nbytes = in.below(2) + 1;
    bytes pixels(35 * img_count(nbytes)), loaded = pixels, buffer;
    for (auto &each : pixels) each = static_cast<std::uint8_t>(in.byte());
    const img_handle image = img_createfile("file@memory", 5, 7, 1, IMG_TYPE_VITEC, 0, 0, nbytes);
    img_dump_buffer(image, 0, 0, 5, 7, 0, pixels.data(), 7, nullptr);
    std::deque<std::uint8_t> arguments;
    img_buffer_def def, work_def;
    while (!in.ended()) {
        const std::int32_t choice = in.below(8), out_nbytes = img_chain_out_nbytes(image);
        if (choice < 3) add_link(in, image, &arguments.emplace_back());
        if (choice == 3) img_chain_remove_link(image, in.near(10));
        if (choice == 4) img_apply_img_chain(image);
        if (choice < 5 || out_nbytes > 8) continue;
        img_chain_release(image);  // releases the buffer of an earlier preparation
        def = {in.below(6) + 1, in.below(9) + 1,           in.near(5), in.near(7), 9,
               out_nbytes,      img_chain_out_bits(image), 0};
        buffer.assign(img_count(def.nlines * 9 - 9 + def.nsamps) * img_count(out_nbytes), 0);
        if (choice < 7)
            img_load_buffer(image, def.line, def.samp, def.nlines, def.nsamps, 0, buffer.data(), 9,
                            nullptr);
        else if (auto *const work =
                     img_chain_prepare_operations(image, buffer.data(), &def, &work_def))
            std::fill_n(work,
                        (work_def.nlines * work_def.stride - work_def.stride + work_def.nsamps) *
                            work_def.nbytes,
                        static_cast<std::uint8_t>(in.byte()));
    }
    img_chain_init(image);
    img_load_buffer(image, 0, 0, 5, 7, 0, loaded.data(), 7, nullptr);
    require(loaded == pixels, "without a chain an image is unchanged");
    return 0;
}
