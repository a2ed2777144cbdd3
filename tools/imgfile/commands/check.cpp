// imgfile check: everything that can be found wrong with an image file from its bytes alone. Read
// codecs/native_header.h and codecs/image.h first.
#include "codecs/native_header.h"
#include "codecs/recognise.h"
#include "commands/commands.h"
#include "commands/each_file.h"
#include "failure.h"
#include "walk.h"

#include "common/grouped.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "formats/words.h"

#include <algorithm>
#include <array>
#include <cstdio>

namespace {

// The values that the library writes.
constexpr std::int32_t IMAGE_BLOCK_LINK = IMG_VITEC_IMAGE_BLOCK_OFFSET - IMG_VITEC_LINK_BASE;
constexpr std::int32_t HEADER_LENGTH = IMG_VITEC_DATA_OFFSET - IMG_VITEC_IMAGE_BLOCK_OFFSET;

class findings {
public:
    explicit findings(std::string name) : m_name(in_one_line(std::move(name))) {}
    void add(const std::string &finding)
    {
        std::printf("%s: %s\n", m_name.c_str(), finding.c_str());
        m_any = true;
    }
    // A failure names the file as the first part of its text, the length of which is known.
    void add(const failure &failed, const std::string &name)
    {
        add(std::string(failed.what()).substr(name.size() + 2));
    }
    template <typename Value>
    void expect(const char *field, const Value &found, const Value &wanted)
    {
        if (found != wanted) add(text(field, " is ", found, ", not ", wanted));
    }
    bool any() const { return m_any; }

private:
    std::string m_name;
    bool m_any = false;
};

template <typename Bytes>
bool is_all_zero(const Bytes &bytes, std::size_t first, std::size_t end)
{
    return std::all_of(&bytes[first], &bytes[first] + (end - first),
                       [](auto byte) { return byte == 0; });
}

void check_date(const img_vitec_file_block &block, findings &found)
{
    const bool is_missing = is_all_zero(block.bytes, IMG_VITEC_AT_CREATE_DATE,
                                        IMG_VITEC_AT_CREATE_DATE + IMG_VITEC_CREATE_DATE_SIZE);
    if (!is_missing && !has_date(block))
        found.add("create_date is not a date: " + date_text(block));
}

// `start`: as many bytes as the library writes before the pixels, of a file whose blocks lie where
// the library writes them; 0 beyond the end of the file.
void check_reserved_bytes(const std::string &start, findings &found)
{
    constexpr std::size_t image_block = IMG_VITEC_IMAGE_BLOCK_OFFSET;
    constexpr std::size_t word = sizeof(std::uint32_t);
    for (const auto &[first, end] :
         {std::pair<std::size_t, std::size_t>{IMG_VITEC_AT_IMAGE_BLOCK_LINK + word,
                                              IMG_VITEC_FILE_WORDS_END},
          {IMG_VITEC_AT_CREATE_DATE + IMG_VITEC_CREATE_DATE_SIZE, IMG_VITEC_AT_SIGNATURE},
          {IMG_VITEC_AT_SIGNATURE + sizeof IMG_VITEC_NAME, image_block},
          {image_block + IMG_VITEC_AT_VERSION + word, image_block + IMG_VITEC_AT_NSAMPS},
          {image_block + IMG_VITEC_AT_NBYTES_CODE + word, start.size()}})
        if (!is_all_zero(start, first, end))
            found.add(text("the reserved bytes ", first, " to ", end - 1, " are not 0"));
}

void check_tile_sizes(std::int32_t tile_nlines, std::int32_t tile_nsamps, findings &found)
{
    for (const auto &[field, size] :
         {std::pair{"tile_nlines", tile_nlines}, {"tile_nsamps", tile_nsamps}})
        if (size != 0 && !img_vitec_is_tile_size(size))
            found.add(text(field, " is ", size, ", neither 0 nor a power of two from ",
                           IMG_VITEC_MIN_TILE, " to ", IMG_VITEC_MAX_TILE));
    if ((tile_nlines == 0) != (tile_nsamps == 0))
        found.add("only one of tile_nlines and tile_nsamps is 0: the image is untiled, but padded");
}

// Compares what follows from the geometry with what the library would write.
void check_derived_fields(const img_vitec_image_block &block, std::int32_t nbytes, findings &found)
{
    const auto field = [&block](std::size_t offset) { return img_get_int(block.bytes, offset); };
    img_vitec_image_block written;
    if (img_vitec_build_image_block(&written, field(IMG_VITEC_AT_NLINES),
                                    field(IMG_VITEC_AT_NSAMPS), field(IMG_VITEC_AT_TILE_NSAMPS),
                                    field(IMG_VITEC_AT_TILE_NLINES), field(IMG_VITEC_AT_NBANDS),
                                    nbytes, IMG_VITEC_RESERVED) == -1)
        return;
    for (const auto &[name, offset] : {std::pair{"band_flag", IMG_VITEC_AT_BAND_FLAG},
                                       {"total_length", IMG_VITEC_AT_TOTAL_LENGTH}})
        found.expect(name, img_get_word(block.bytes, offset), img_get_word(written.bytes, offset));
}

// Checks each field against the values that a writer may store, and against the other fields.
void check_vitec_header(const img_vitec_blocks &blocks, const std::string &start, findings &found)
{
    const auto field = [&blocks](std::size_t offset) {
        return img_get_int(blocks.image.bytes, offset);
    };
    found.expect("image_block_link", img_get_int(blocks.file.bytes, IMG_VITEC_AT_IMAGE_BLOCK_LINK),
                 IMAGE_BLOCK_LINK);
    if (std::memcmp(&blocks.file.bytes[IMG_VITEC_AT_SIGNATURE], IMG_VITEC_NAME,
                    sizeof IMG_VITEC_NAME) != 0)
        found.add(text("signature is not ", IMG_VITEC_NAME));
    check_date(blocks.file, found);
    found.expect("version", field(IMG_VITEC_AT_VERSION), std::int32_t{IMG_VITEC_VERSION});
    found.expect("header_length", field(IMG_VITEC_AT_HEADER_LENGTH), HEADER_LENGTH);
    if (blocks.image_offset == IMG_VITEC_IMAGE_BLOCK_OFFSET &&
        field(IMG_VITEC_AT_HEADER_LENGTH) == HEADER_LENGTH)
        check_reserved_bytes(start, found);

    const std::int32_t nlines = field(IMG_VITEC_AT_NLINES), nsamps = field(IMG_VITEC_AT_NSAMPS);
    for (const auto &[name, value] : {std::pair{"nlines", nlines}, {"nsamps", nsamps}})
        if (value < 0) found.add(text(name, " is ", value));
    if (const std::int32_t nbands = field(IMG_VITEC_AT_NBANDS);
        nbands < 0 || nbands > IMG_VITEC_MAX_BANDS)
        found.add(text("nbands is ", nbands, ", not 0 to ", IMG_VITEC_MAX_BANDS));
    const std::int64_t nbytes = std::int64_t{field(IMG_VITEC_AT_NBYTES_CODE)} + 1;
    if (nbytes != 1 && nbytes != 2)
        found.add(text("nbytes_code states ", nbytes, " bytes per sample, not 1 or 2"));
    check_tile_sizes(field(IMG_VITEC_AT_TILE_NLINES), field(IMG_VITEC_AT_TILE_NSAMPS), found);
    if (nbytes == 1 || nbytes == 2)
        check_derived_fields(blocks.image, static_cast<std::int32_t>(nbytes), found);
}

void check_header(const native_header &header, const std::string &start, findings &found)
{
    if (header.vitec) {
        check_vitec_header(*header.vitec, start, found);
    } else if (header.helava) {
        for (const auto &[field, offset] : {std::pair{"nbands", IMG_HELAVA_AT_NBANDS},
                                            {"nsamps", IMG_HELAVA_AT_NSAMPS},
                                            {"nlines", IMG_HELAVA_AT_NLINES}})
            if (const std::int32_t value = img_get_int(*header.helava, offset); value < 0)
                found.add(text(field, " is ", value));
    }
}

// The state of one band after some of its samples.
struct band_state {
    std::int32_t last_used = -1;  // the last line that is not all zero
    std::int64_t beyond = 0;
};

void check_samples(image_reader &image, findings &found)
{
    const shape &form = image.form;
    if (form.nsamples() == 0) {
        found.add("has no samples");
        return;
    }
    std::vector<band_state> bands;
    try {
        bands.resize(image.all_bands().size());
        walk(image, form.whole(), image.all_bands(), {},
             [&](const window &piece, const block &samples) {
                 samples.for_each_row([&](std::int32_t band, std::int32_t line, const auto *row) {
                     band_state &state = bands[static_cast<std::size_t>(band)];
                     std::int32_t any = 0;
                     std::int64_t beyond = 0;
                     for (std::int32_t i = 0; i < samples.nsamps; ++i) {
                         any |= row[i];
                         beyond += row[i] > form.highest();
                     }
                     if (any != 0) state.last_used = std::max(state.last_used, piece.line + line);
                     state.beyond += beyond;
                 });
             });
    } catch (const failure &failed) {
        found.add(failed, image.name);
        return;
    }
    for (std::int32_t band = 0; band < form.nbands; ++band) {
        const auto &[last_used, beyond] = bands[static_cast<std::size_t>(band)];
        if (last_used + 1 < form.nlines)
            found.add(last_used == -1 ? text("band ", band, " is 0 throughout")
                                      : text("band ", band, " is 0 from line ", last_used + 1,
                                             " on, of ", form.nlines));
        if (beyond != 0)
            found.add(text("band ", band, " has ", grouped(beyond), " samples beyond ", form.nbits,
                           " bits"));
    }
}

void check_length(const image_reader &image, findings &found)
{
    const std::int64_t length = image.file_length, expected = image.expected_length;
    if (expected == -1) return;
    if (length == -1) throw failure(image.name, "has no length: it is a block device");
    if (length < expected)
        found.add(text("truncated: ", grouped(expected - length), " of ", grouped(expected),
                       " bytes are missing"));
    if (length > expected)
        found.add(text(grouped(length - expected), " bytes more than the header states"));
}

// Returns true when nothing was found.
bool check(const std::string &name)
{
    findings found(name);
    input_file file(name);
    const bool is_regular = file.length() != -1;
    std::string start = file.bytes(0, IMG_VITEC_DATA_OFFSET);
    start.resize(IMG_VITEC_DATA_OFFSET);
    check_header(read_native_header(file.fd()), start, found);
    std::unique_ptr<image_reader> image;
    try {
        image = open_reader(std::move(file));
    } catch (const failure &failed) {
        if (!is_regular) throw;
        found.add(failed, name);
        return false;
    }
    check_length(*image, found);
    check_samples(*image, found);
    return !found.any();
}

}  // namespace

int run_check(const check_options &options)
{
    if (std::ranges::count(options.files, "-") != 0)
        throw wrong_usage("check cannot read standard input");
    return for_each_file(options.files, check);
}
