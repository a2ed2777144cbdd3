// The input is a file: the parser of PNM headers and samples, and the readers of VITec and Helava
// headers, which the tool runs on any file, must find in it what a plain reading of its bytes
// finds, and refuse the rest.
#include "api/library.h"
#include "checked_image.h"
#include "common/pnm_file.h"
#include "formats/header_file.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "io/io_method.h"

#include <optional>
#include <stdexcept>
#include <string>

#include <sys/mman.h>
#include <unistd.h>

namespace {

using file_bytes = std::span<const std::uint8_t>;

// Returns the text of the failure of an action; nothing when it succeeds.
template <typename Action>
std::optional<std::string> failure_of(Action action)
{
    try {
        action();
        return std::nullopt;
    } catch (const std::runtime_error &problem) {
        return problem.what();
    }
}

void check_pnm_header(const pnm_header &header, file_bytes content)
{
    const bool is_ppm = content[1] == '6';
    require(content[0] == 'P' && (is_ppm || content[1] == '5'), "a PNM file starts with its kind");
    require(header.nbands == (is_ppm ? 3 : 1) && header.nlines > 0 && header.nsamps > 0 &&
                header.highest > 0 && header.highest < 65536,
            "the numbers of a PNM header have limits");
    require(header.data_offset >= 8 && header.data_offset <= std::ssize(content),
            "a PNM header lies inside the file");
    // What precedes the samples ends in the highest value and one blank.
    const std::string text(content.begin(), content.begin() + header.data_offset - 1);
    const std::string digits = text.substr(text.find_last_not_of("0123456789") + 1);
    require(std::stoll(digits) == header.highest, "a PNM header ends in the highest value");
}

// Reads the first lines and those around the end of the file.
void check_pnm_samples(const pnm_file &file, file_bytes content)
{
    const pnm_header &header = file.header();
    if (header.line_length() > 100'000) return;
    const std::int64_t stored = std::ssize(content) - header.data_offset;
    const std::int64_t complete = stored / header.line_length();
    bytes pixels(static_cast<std::size_t>(header.line_length()));
    for (const std::int64_t line : {std::int64_t{0}, complete - 1, complete, complete + 1}) {
        if (line < 0 || line >= header.nlines) continue;
        const auto failure = failure_of([&] { file.read(line, 0, pixels); });
        require(failure.has_value() == (line >= complete), "the lines of the file can be read");
        require(!failure || *failure == "truncated: line " + std::to_string(line) + " is missing",
                "a missing line is named");
        require(failure ||
                    std::equal(pixels.begin(), pixels.end(),
                               content.begin() + header.data_offset + line * header.line_length()),
                "samples are those of the file");
    }
    const bool has_all = header.file_length() != -1 && header.file_length() <= std::ssize(content);
    require(has_all == (complete >= header.nlines), "the length follows from the header");
}

void check_pnm(int fd, file_bytes content)
{
    std::optional<pnm_file> file;
    const auto refused = failure_of([&] { file.emplace(fd); });
    require(refused.has_value() != file.has_value(), "a header is read or refused");
    if (!file) return;
    check_pnm_header(file->header(), content);
    check_pnm_samples(*file, content);
}

// Returns the word at an offset, in big-endian or little-endian order; nothing outside the file.
std::optional<std::uint32_t> word_at(file_bytes content, std::int64_t offset, bool big_endian)
{
    if (offset < 0 || offset + 4 > std::ssize(content)) return std::nullopt;
    std::uint32_t word = 0;
    for (std::size_t i = 0; i < 4; ++i)
        word = word << 8U | content[static_cast<std::size_t>(offset) + (big_endian ? i : 3 - i)];
    return word;
}

// Returns whether a magic word is big-endian; nothing when it is not there.
std::optional<bool> order_of(file_bytes content, std::int64_t offset, std::uint32_t magic)
{
    for (const bool big_endian : {true, false})
        if (word_at(content, offset, big_endian) == magic) return big_endian;
    return std::nullopt;
}

std::int32_t swap_of(std::optional<bool> big_endian)
{
    if (!big_endian) return -1;
    return *big_endian == IMG_WRITES_SWAPPED ? 1 : 0;
}

void check_words(std::span<const std::uint8_t> block, std::size_t first, std::size_t end,
                 file_bytes content, std::int64_t block_offset, bool big_endian)
{
    for (std::size_t offset = first; offset < end; offset += 4)
        require(img_get_word(block, offset) ==
                    word_at(content, block_offset + static_cast<std::int64_t>(offset), big_endian),
                "words of a header arrive in the host's order");
}

void check_vitec(const img_header_file &file, file_bytes content)
{
    const auto order = order_of(content, 0, IMG_VITEC_MAGIC);
    require(img_vitec_find_magic(file) == swap_of(order), "a VITec magic word is found");
    if (!order) return;
    img_vitec_blocks blocks;
    const bool found = img_vitec_read_blocks(file, swap_of(order), &blocks);
    const auto link = word_at(content, IMG_VITEC_AT_IMAGE_BLOCK_LINK, *order);
    const std::int64_t image =
        std::int64_t{static_cast<std::int32_t>(link.value_or(0))} + IMG_VITEC_LINK_BASE;
    const bool expected = std::size(content) >= IMG_VITEC_FILE_BLOCK_SIZE && image >= 0 &&
                          image + std::int64_t{IMG_VITEC_IMAGE_BLOCK_SIZE} <= std::ssize(content);
    require(found == expected, "both blocks are read where the file has them");
    if (!found) return;
    require(blocks.image_offset == image, "the link leads to the image block");
    check_words(blocks.file.bytes, 0, IMG_VITEC_FILE_WORDS_END, content, 0, *order);
    check_words(blocks.image.bytes, IMG_VITEC_AT_VERSION, IMG_VITEC_IMAGE_WORDS_END, content, image,
                *order);
    require(std::equal(&blocks.file.bytes[IMG_VITEC_FILE_WORDS_END], blocks.file.bytes.end(),
                       content.begin() + IMG_VITEC_FILE_WORDS_END),
            "the text of the file block stays as it is");
}

void check_helava(const img_header_file &file, file_bytes content)
{
    const auto order = order_of(content, std::ssize(content) - 4, IMG_HELAVA_MAGIC);
    require(img_helava_find_magic(file) == swap_of(order), "a Helava magic word is found");
    if (!order) return;
    std::array<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH> trailer{};
    const bool found = img_helava_read_trailer_words(file, swap_of(order), trailer);
    require(found == (content.size() >= trailer.size()), "a whole trailer is read");
    if (found)
        check_words(trailer, 0, trailer.size(), content, std::ssize(content) - std::ssize(trailer),
                    *order);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    static const int fd = memfd_create("tool_parsers", 0);
    static const std::string name = "/proc/self/fd/" + std::to_string(fd);
    require(ftruncate(fd, 0) == 0 && pwrite(fd, data, size, 0) == static_cast<ssize_t>(size),
            "a file in memory can be written");
    const file_bytes content(data, size);
    check_pnm(fd, content);

    img_library_init();
    const img_io_method *const method = img_lookup_io_method("");
    const img_header_file file{method, method->open(name.c_str(), IMG_OPEN_READ_ONLY, 0)};
    require(file.fd != -1, "the file can be opened");
    check_vitec(file, content);
    check_helava(file, content);
    method->close(file.fd);
    return 0;
}
