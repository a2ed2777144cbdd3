// imgfile check: all that can be wrong with an image file and can be found without looking at it.
#include "commands.h"
#include "failure.h"
#include "header.h"
#include "walk.h"

#include "formats/vitec.h"
#include "formats/words.h"

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <fstream>

namespace {

// Where the library places the image block, and how far behind it the pixels.
constexpr std::size_t IMAGE_BLOCK = sizeof(img_vitec_file_block) + IMG_VITEC_RESERVED;
constexpr std::int32_t IMAGE_BLOCK_LINK = IMAGE_BLOCK - 4;
constexpr std::int32_t HEADER_LENGTH = IMG_VITEC_DATA_OFFSET - std::int32_t{IMAGE_BLOCK};

class findings {
public:
    explicit findings(std::string name) : m_name(in_one_line(std::move(name))) {}
    void add(const std::string &what)
    {
        std::printf("%s: %s\n", m_name.c_str(), what.c_str());
        m_any = true;
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

bool is_all_zero(const std::uint8_t *bytes, std::size_t count)
{
    return std::all_of(bytes, bytes + count, [](std::uint8_t byte) { return byte == 0; });
}

void check_date(const vitec_header &header, findings &found)
{
    const bool is_left_out = is_all_zero(&header.file.bytes[IMG_VITEC_AT_CREATE_DATE], 6);
    if (!is_left_out && !header.has_date()) found.add("create_date is no date: " + header.date());
}

// Bytes of a file that begins as the library writes it.
void check_reserved_bytes(const std::string &name, findings &found)
{
    std::array<std::uint8_t, IMG_VITEC_DATA_OFFSET> start{};
    std::ifstream(name, std::ios::binary)
        .read(reinterpret_cast<char *>(start.data()), std::ssize(start));
    for (const auto &[from, end] :
         {std::pair<std::size_t, std::size_t>{IMG_VITEC_AT_IMAGE_BLOCK_LINK + 4,
                                              IMG_VITEC_FILE_WORDS_END},
          {IMG_VITEC_AT_CREATE_DATE + 6, IMG_VITEC_AT_SIGNATURE},
          {IMG_VITEC_AT_SIGNATURE + 6, IMAGE_BLOCK},
          {IMAGE_BLOCK + IMG_VITEC_AT_VERSION + 4, IMAGE_BLOCK + IMG_VITEC_AT_NSAMPS},
          {IMAGE_BLOCK + IMG_VITEC_AT_NBYTES_CODE + 4, start.size()}})
        if (!is_all_zero(&start.at(from), end - from))
            found.add(text("bytes ", from, " to ", end - 1, ", which are reserved, are not 0"));
}

void check_tile_sizes(std::int32_t tile_nlines, std::int32_t tile_nsamps, findings &found)
{
    for (const auto &[field, size] :
         {std::pair{"tile_nlines", tile_nlines}, {"tile_nsamps", tile_nsamps}})
        if (size != 0 && !is_vitec_tile_side(size))
            found.add(text(field, " is ", size, ", neither 0 nor a power of two from 8 to 32768"));
    if ((tile_nlines == 0) != (tile_nsamps == 0))
        found.add("only one of tile_nlines and tile_nsamps is 0: the image is untiled, but padded");
}

// The fields against what a writer may put there, and against each other.
void check_vitec_header(const std::string &file, const vitec_header &header, findings &found)
{
    const auto field = [&header](std::size_t at) { return header.word(at); };
    found.expect("image_block_link", header.file_word(IMG_VITEC_AT_IMAGE_BLOCK_LINK),
                 IMAGE_BLOCK_LINK);
    if (std::memcmp(&header.file.bytes[IMG_VITEC_AT_SIGNATURE], "VITec", 6) != 0)
        found.add("signature is not VITec");
    check_date(header, found);
    found.expect("version", field(IMG_VITEC_AT_VERSION), std::int32_t{IMG_VITEC_VERSION});
    found.expect("header_length", field(IMG_VITEC_AT_HEADER_LENGTH), HEADER_LENGTH);
    if (header.image_block_at == IMAGE_BLOCK && field(IMG_VITEC_AT_HEADER_LENGTH) == HEADER_LENGTH)
        check_reserved_bytes(file, found);

    const std::int32_t nlines = field(IMG_VITEC_AT_NLINES), nsamps = field(IMG_VITEC_AT_NSAMPS);
    const std::int32_t nbands = field(IMG_VITEC_AT_NBANDS);
    const std::int32_t tile_nlines = field(IMG_VITEC_AT_TILE_NLINES);
    const std::int32_t tile_nsamps = field(IMG_VITEC_AT_TILE_NSAMPS);
    const std::int64_t nbytes = std::int64_t{field(IMG_VITEC_AT_NBYTES_CODE)} + 1;
    for (const auto &[name, value] : {std::pair{"nlines", nlines}, {"nsamps", nsamps}})
        if (value < 0) found.add(text(name, " is ", value));
    if (nbands < 0 || nbands > 3) found.add(text("nbands is ", nbands, ", not 0 to 3"));
    if (nbytes != 1 && nbytes != 2)
        found.add(text("nbytes_code says ", nbytes, " bytes per sample, not 1 or 2"));
    check_tile_sizes(tile_nlines, tile_nsamps, found);

    // What follows from the geometry is as the library would write it.
    img_vitec_image_block written;
    if (nbytes < 1 || nbytes > 2 ||
        img_vitec_build_image_block(&written, nlines, nsamps, tile_nsamps, tile_nlines, nbands,
                                    static_cast<std::int32_t>(nbytes), IMG_VITEC_RESERVED) == -1)
        return;
    for (const auto &[name, at] : {std::pair{"band_flag", IMG_VITEC_AT_BAND_FLAG},
                                   {"total_length", IMG_VITEC_AT_TOTAL_LENGTH}})
        found.expect(name, static_cast<std::uint32_t>(field(at)), img_get_word(written.bytes, at));
}

// What the samples of one band are like.
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
        walk(image, whole(form), image.all_bands(), {},
             [&](const window &place, const block &samples) {
                 samples.for_each_row([&](std::int32_t band, std::int32_t line, const auto *row) {
                     band_state &state = bands[static_cast<std::size_t>(band)];
                     std::int32_t any = 0;
                     std::int64_t beyond = 0;
                     for (std::int32_t i = 0; i < samples.nsamps; ++i) {
                         any |= row[i];
                         beyond += row[i] > form.highest();
                     }
                     if (any != 0) state.last_used = std::max(state.last_used, place.line + line);
                     state.beyond += beyond;
                 });
             });
    } catch (const failure &failed) {
        found.add(std::string(failed.what()).substr(image.name.size() + 2));
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
    if (image.length == -1) return;
    std::error_code error;
    const auto length = static_cast<std::int64_t>(std::filesystem::file_size(image.name, error));
    if (error) throw failure(image.name, error.message());
    if (length < image.length)
        found.add(text("cut short: ", grouped(image.length - length), " of ", grouped(image.length),
                       " bytes are missing"));
    if (length > image.length)
        found.add(text(grouped(length - image.length), " bytes more than the header asks for"));
}

void check_header(const std::string &name, findings &found)
{
    if (const auto vitec = read_vitec_header(name)) {
        check_vitec_header(name, *vitec, found);
    } else if (const auto helava = read_helava_trailer(name)) {
        for (const auto &[field, value] : {std::pair{"nbands", helava->nbands},
                                           {"nsamps", helava->nsamps},
                                           {"nlines", helava->nlines}})
            if (value < 0) found.add(text(field, " is ", value));
    }
}

bool check(const std::string &name)
{
    findings found(name);
    std::unique_ptr<image_reader> image;
    try {
        image = open_image(name);
    } catch (const failure &failed) {
        std::error_code unknown;
        if (!std::filesystem::is_regular_file(name, unknown)) throw;
        check_header(name, found);
        found.add(std::string(failed.what()).substr(name.size() + 2));
        return false;
    }
    check_header(name, found);
    check_length(*image, found);
    check_samples(*image, found);
    return !found.any();
}

}  // namespace

int run_check(const check_options &asked)
{
    if (std::ranges::count(asked.files, "-") != 0) throw wrong_usage("check reads files alone");
    int status = 0;
    for (const std::string &name : asked.files) {
        try {
            if (!check(name)) status = 1;
        } catch (const failure &failed) {
            std::fflush(stdout);
            std::fprintf(stderr, "imgfile: %s\n", failed.what());
            status = 1;
        }
    }
    return status;
}
