// Recognising a format by magic words. A Helava file is recognised by its end, before all formats
// that are recognised by their start: its first bytes are samples and may have any value. Read
// recognise.h first.
#include "codecs/recognise.h"

#include "codecs/codecs.h"
#include "failure.h"

#include "formats/helava.h"
#include "formats/vitec.h"

#include <cstring>

namespace {

bool is_word(const std::string &bytes, std::uint32_t magic, std::uint32_t swapped_magic)
{
    std::uint32_t word = 0;
    if (bytes.size() == sizeof word) std::memcpy(&word, bytes.data(), sizeof word);
    return word == magic || word == swapped_magic;
}

std::unique_ptr<image_reader> open_by_magic_word(input_file file)
{
    const std::string start = file.bytes(0, 4), end = file.last_bytes(4);
    if (start.empty()) throw failure(file.name(), "is empty");
    const bool is_native = is_word(start, IMG_VITEC_MAGIC, IMG_VITEC_SWAPPED_MAGIC) ||
                           is_word(end, IMG_HELAVA_MAGIC, IMG_HELAVA_SWAPPED_MAGIC);
    if (!is_native) {
        if (start.size() == 4 && start[0] == 'P' && start[1] >= '1' && start[1] <= '7')
            return open_pnm(std::move(file));
        if (start == "\x89PNG") return open_png(std::move(file));
        if (start.starts_with("II*") || start.starts_with("II+") ||
            start == std::string("MM\0*", 4) || start == std::string("MM\0+", 4))
            return open_tiff(std::move(file));
    }
    if (file.is_standard_input()) throw failure(file.name(), "is not a PGM, PPM, PNG or TIFF file");
    return open_native(std::move(file));
}

}  // namespace

std::unique_ptr<image_reader> open_reader(input_file file)
{
    auto reader = open_by_magic_word(std::move(file));
    const shape &form = reader->form;
    if (1.0 * form.nlines * form.nsamps * form.nbands * form.nbytes > 1e18)
        throw failure(reader->name, "states more samples than any file can hold");
    return reader;
}

std::unique_ptr<image_reader> open_reader(const std::string &name)
{
    return open_reader(input_file(name));
}
