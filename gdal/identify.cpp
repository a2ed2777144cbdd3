// Telling whether a file is a VITec or a Helava image. GDAL asks for every file that any program
// opens, so this must be quick, silent and sure: other formats have files of the same names. Read
// drivers.h, formats/vitec.h and formats/helava.h first.
#include "drivers.h"

#include "formats/helava.h"
#include "formats/vitec.h"

#include <array>
#include <cstring>
#include <span>
#include <string>

namespace {

bool is_vitec_magic(std::uint32_t word)
{
    return word == IMG_VITEC_MAGIC || word == IMG_VITEC_SWAPPED_MAGIC;
}

bool is_helava_magic(std::uint32_t word)
{
    return word == IMG_HELAVA_MAGIC || word == IMG_HELAVA_SWAPPED_MAGIC;
}

// Reads bytes of a header; those that GDAL has read already take no request.
bool read_header(GDALOpenInfo *info, std::int64_t offset, std::span<std::uint8_t> bytes)
{
    if (offset < 0) return false;
    const auto begin = static_cast<std::size_t>(offset);
    if (begin + bytes.size() <= static_cast<std::size_t>(info->nHeaderBytes)) {
        std::memcpy(bytes.data(), info->pabyHeader + begin, bytes.size());
        return true;
    }
    const bool was_read = info->fpL != nullptr && VSIFSeekL(info->fpL, begin, SEEK_SET) == 0 &&
                          VSIFReadL(bytes.data(), 1, bytes.size(), info->fpL) == bytes.size();
    if (info->fpL != nullptr) VSIRewindL(info->fpL);
    return was_read;
}

int identify_vitec(GDALOpenInfo *info)
{
    if (info->nHeaderBytes < static_cast<int>(IMG_VITEC_FILE_BLOCK_SIZE)) return FALSE;
    std::array<std::uint8_t, IMG_VITEC_FILE_BLOCK_SIZE> block;
    std::memcpy(block.data(), info->pabyHeader, block.size());
    const std::uint32_t magic = img_get_word(block, IMG_VITEC_AT_MAGIC);
    if (!is_vitec_magic(magic)) return FALSE;
    const bool swapped = magic == IMG_VITEC_SWAPPED_MAGIC;
    if (swapped) img_swap_words(block, 0, IMG_VITEC_FILE_WORDS_END);
    const std::int64_t version_offset =
        std::int64_t{img_get_int(block, IMG_VITEC_AT_IMAGE_BLOCK_LINK)} + IMG_VITEC_LINK_BASE +
        static_cast<std::int64_t>(IMG_VITEC_AT_VERSION);
    std::array<std::uint8_t, sizeof(std::uint32_t)> bytes;
    if (!read_header(info, version_offset, bytes)) return FALSE;
    const std::uint32_t version = img_get_word(bytes, 0);
    return (swapped ? img_swapped_word(version) : version) == IMG_VITEC_VERSION ? TRUE : FALSE;
}

bool is_helava_name(const char *filename)
{
    const std::string extension = CPLGetExtension(filename);
    return EQUAL(extension.c_str(), "d") || (EQUAL(extension.c_str(), "gz") &&
                                             EQUAL(CPLGetExtension(CPLGetBasename(filename)), "d"));
}

// True when the trailer of a Helava file states `count` samples.
bool states_length(std::span<const std::uint8_t> trailer, std::uint64_t count)
{
    const bool swapped = img_get_word(trailer, IMG_HELAVA_AT_MAGIC) == IMG_HELAVA_SWAPPED_MAGIC;
    const auto field = [&](std::size_t offset) -> std::uint64_t {
        const std::uint32_t word = img_get_word(trailer, offset);
        return swapped ? img_swapped_word(word) : word;
    };
    const std::uint64_t band = field(IMG_HELAVA_AT_NSAMPS) * field(IMG_HELAVA_AT_NLINES);
    return band != 0 && count % band == 0 && count / band == field(IMG_HELAVA_AT_NBANDS);
}

// Files of this format begin with their samples. The end of a file is looked at where that takes no
// request to a server, and where the name asks for it. Files of other names must have the length
// that the trailer states: any file may end in the magic word by chance.
int identify_helava(GDALOpenInfo *info)
{
    constexpr auto trailer_length = static_cast<int>(IMG_HELAVA_TRAILER_LENGTH);
    if (info->fpL == nullptr || info->nHeaderBytes < trailer_length) return FALSE;
    const bool is_near = std::strncmp(info->pszFilename, "/vsi", 4) != 0 ||
                         std::strncmp(info->pszFilename, "/vsimem/", 8) == 0;
    const bool has_name = is_helava_name(info->pszFilename);
    if (!is_near && !has_name) return FALSE;
    std::array<std::uint8_t, IMG_HELAVA_TRAILER_LENGTH> trailer;
    if (VSIFSeekL(info->fpL, 0, SEEK_END) != 0) return FALSE;
    const vsi_l_offset length = VSIFTellL(info->fpL);
    const bool was_read = length >= trailer.size() &&
                          VSIFSeekL(info->fpL, length - trailer.size(), SEEK_SET) == 0 &&
                          VSIFReadL(trailer.data(), 1, trailer.size(), info->fpL) == trailer.size();
    VSIRewindL(info->fpL);
    if (!was_read || !is_helava_magic(img_get_word(trailer, IMG_HELAVA_AT_MAGIC))) return FALSE;
    return has_name || states_length(trailer, length - trailer.size()) ? TRUE : FALSE;
}

}  // namespace

const image_format vitec_format{.name = "VITec",
                                .long_name = "VITec image (.img)",
                                .type = IMG_TYPE_VITEC,
                                .most_bands = IMG_VITEC_MAX_BANDS,
                                .has_tiles = true,
                                .has_two_bytes = true,
                                .identify = identify_vitec};
const image_format helava_format{.name = "Helava",
                                 .long_name = "Helava image (.d)",
                                 .type = IMG_TYPE_HELAVA,
                                 .most_bands = 65535,
                                 .has_tiles = false,
                                 .has_two_bytes = false,
                                 .identify = identify_helava};
