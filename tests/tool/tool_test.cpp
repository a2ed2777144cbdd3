// The command-line tool, run as its users run it.
#include "img.h"
#include "support/files.h"

#include <algorithm>
#include <array>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <set>
#include <span>
#include <sstream>
#include <tiffio.h>

#include <sys/inotify.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

namespace fs = std::filesystem;
using nlohmann::json;

namespace {

std::string content_of(const std::string &file)
{
    const bytes content = read_file(file);
    return {content.begin(), content.end()};
}

void write_content(const std::string &file, const std::string &content)
{
    write_file(file, bytes(content.begin(), content.end()));
}

// Samples as data/README.md describes them; those of two bytes may be larger by a factor.
int sample(int line, int samp, int band, int nbytes, int factor = 1)
{
    return nbytes == 1 ? (band * 101 + line * 31 + samp * 7) % 251
                       : (band * 501 + line * 13 + samp * 3) % 4096 * factor % 65536;
}

struct window {
    int line, samp, nlines, nsamps;
};

// A PGM or PPM file of these samples.
std::string pnm(const window &part, const std::vector<int> &bands, int nbytes, int factor = 1)
{
    std::ostringstream out;
    out << (bands.size() == 3 ? "P6\n" : "P5\n") << part.nsamps << ' ' << part.nlines
        << (nbytes == 2 ? "\n65535\n" : "\n255\n");
    for (int line = part.line; line < part.line + part.nlines; ++line)
        for (int samp = part.samp; samp < part.samp + part.nsamps; ++samp)
            for (const int band : bands) {
                const int value = sample(line, samp, band, nbytes, factor);
                if (nbytes == 2) out.put(static_cast<char>(value >> 8));
                out.put(static_cast<char>(value & 255));
            }
    return out.str();
}

struct finished {
    int status;  // -1: a signal ended the tool
    std::string out, err;
};

class Tool : public testing::Test {
protected:
    Tool() { fs::current_path(m_folder / ""); }
    ~Tool() override { fs::current_path("/"); }

    // Runs the tool in the shell: arguments may contain redirections.
    finished run(const std::string &arguments, const std::string &before = "")
    {
        const std::string out = m_streams / "out", err = m_streams / "err";
        const int status =
            std::system((before + IMGFILE_TOOL " >" + out + " 2>" + err + " " + arguments).c_str());
        return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, content_of(out), content_of(err)};
    }
    void expect_done(const std::string &arguments)
    {
        const finished end = run(arguments);
        EXPECT_EQ(end.status, 0) << arguments << ": " << end.err;
        EXPECT_EQ(end.err, "") << arguments;
    }
    static void expect_within(const std::string &text, const std::string &part)
    {
        EXPECT_NE(text.find(part), text.npos) << part << " is not in\n" << text;
    }
    static std::set<std::string> files()
    {
        std::set<std::string> names;
        for (const auto &each : fs::directory_iterator(".")) names.insert(each.path().filename());
        return names;
    }

    scratch_folder m_folder, m_streams;
};

// The first four hold any image, the next two 1 or 3 bands, and the last one bytes alone.
const std::vector<std::string> formats = {
    "a.img", "tiled.img --tile 16x8", "a.tif", "tiled.tif --tile 32x16", "a.pnm", "a.png", "a.d"};

std::string file_of(const std::string &format)
{
    return format.substr(0, format.find(' '));
}

TEST_F(Tool, KeepsSamplesAndWindowsFromAnyFormatToAnyOther)
{
    for (const auto &[chosen, bands] : {std::pair{"1", std::vector{1}},
                                        {"2,0", std::vector{2, 0}},
                                        {"0,1,2", std::vector{0, 1, 2}}})
        for (const int nbytes : {1, 2}) {
            write_content("source.ppm", pnm({0, 0, 37, 53}, {0, 1, 2}, nbytes));
            const std::size_t able = bands.size() == 2 ? 4 : nbytes == 2 ? 6 : 7;
            const std::size_t band = static_cast<std::size_t>(nbytes) % bands.size();
            for (const std::string &first : std::span(formats).first(able)) {
                expect_done("convert --overwrite source.ppm from_" + first + " --band " + chosen);
                const std::string from = "from_" + file_of(first);
                for (const std::string &second : std::span(formats).first(able)) {
                    expect_done("convert --overwrite " + from + " to_" + second);
                    expect_done("convert --overwrite to_" + file_of(second) +
                                " seen.pgm --window 9,17,28,36 --band " + std::to_string(band));
                    EXPECT_EQ(content_of("seen.pgm"), pnm({9, 17, 28, 36}, {bands[band]}, nbytes))
                        << from << " to " << second << ", bands " << chosen;
                }
                expect_done("compare " + from + " to_a.img");
            }
        }
}

TEST_F(Tool, ReadsStandardInputMoreThanOnce)
{
    write_content("a.ppm", pnm({0, 0, 40, 50}, {0, 1, 2}, 2, 37));
    expect_done("convert a.ppm a.png");
    EXPECT_EQ(run("convert - - --format ppm <a.png").out, content_of("a.ppm"));
    expect_done("compare - - <a.png");  // by two readers at a time
    expect_done("convert - b.ppm --stretch <a.png");
    expect_done("convert a.ppm c.ppm --stretch");
    EXPECT_EQ(content_of("b.ppm"), content_of("c.ppm"));
}

constexpr window tall{0, 0, 1700, 900};

void write_tiff(const char *mode, int compression, bool planar, int strip)
{
    TIFF *const file = TIFFOpen("a.tif", mode);
    TIFFSetField(file, TIFFTAG_IMAGELENGTH, tall.nlines);
    TIFFSetField(file, TIFFTAG_IMAGEWIDTH, tall.nsamps);
    TIFFSetField(file, TIFFTAG_SAMPLESPERPIXEL, 3);
    TIFFSetField(file, TIFFTAG_BITSPERSAMPLE, 16);
    TIFFSetField(file, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB);
    TIFFSetField(file, TIFFTAG_COMPRESSION, compression);
    TIFFSetField(file, TIFFTAG_PLANARCONFIG, planar ? PLANARCONFIG_SEPARATE : PLANARCONFIG_CONTIG);
    TIFFSetField(file, TIFFTAG_ROWSPERSTRIP, strip);
    const int step = planar ? 1 : 3;
    for (int plane = 0; plane < 3; plane += step)
        for (int line = 0; line < tall.nlines; ++line) {
            std::vector<std::uint16_t> row;
            for (int i = 0; i < tall.nsamps * step; ++i)
                row.push_back(
                    static_cast<std::uint16_t>(sample(line, i / step, plane + i % step, 2, 37)));
            TIFFWriteScanline(file, row.data(), static_cast<std::uint32_t>(line),
                              static_cast<std::uint16_t>(plane));
        }
    TIFFClose(file);
}

// Strips are read piece by piece, from any line.
TEST_F(Tool, ReadsStripsOfAllKinds)
{
    write_content("a.ppm", pnm(tall, {0, 1, 2}, 2, 37));
    for (const int compression : {COMPRESSION_NONE, COMPRESSION_LZW})
        for (const bool planar : {false, true})
            for (const int strip : {7, 1700}) {
                write_tiff(strip == 7 ? "wb" : "wl", compression, planar, strip);
                expect_done("compare a.ppm a.tif");
                expect_done("convert a.tif b.ppm --overwrite --window 777,50,200,600 --band 2,0,2");
                EXPECT_EQ(content_of("b.ppm"), pnm({777, 50, 200, 600}, {2, 0, 2}, 2, 37));
            }
    expect_done("convert a.ppm b.tif");
    fs::resize_file("b.tif", 4'000'000);
    EXPECT_EQ(run("convert b.tif c.tif").err, "imgfile: b.tif: line 740 is missing\n");
}

// What the tool stretches is what a host of the library sees.
TEST_F(Tool, StretchesAsTheLibraryDoesAllAtOnce)
{
    write_content("a.pgm", pnm({0, 0, 70, 90}, {0}, 2, 1201));
    const std::string kept = run("convert a.pgm a.img").err;
    expect_within(kept, "imgfile: a.pgm: note: ");
    expect_within(kept, " samples lie beyond 12 bits; they were kept as they are\n");
    expect_within(run("check a.img").out, "samples beyond 12 bits\n");
    expect_done("--quiet convert a.pgm a.img --overwrite");
    expect_within(run("convert a.img s.pgm --stretch --window 3,5,60,71").err,
                  " beyond 12 bits; they were mapped as the highest value\n");
    std::string seen(60 * 71, '\0');
    const img_handle image = img_openfile("a.img", IMG_OPEN_READ_ONLY);
    EXPECT_EQ(img_load_buffer(image, 3, 5, 60, 71, 0, seen.data(), 71, nullptr), 0);
    img_closefile(image);
    EXPECT_EQ(content_of("s.pgm"), "P5\n71 60\n255\n" + seen);
}

TEST_F(Tool, RefusesInOneLineAndKeepsTheTarget)
{
    const std::string pixels = pnm({0, 0, 20, 30}, {0, 1, 2}, 1);
    write_content("rgb.ppm", pixels);
    write_content("cut.pgm", pnm({0, 0, 20, 30}, {0}, 1).substr(0, 400));
    expect_done("convert rgb.ppm cut.img --tile 8 --band 0");
    fs::resize_file("cut.img", 244 + 8 * 40);
    write_content("junk", "nothing in particular, but long enough to hold a header of some kind");
    write_content("old", "what was there before");
    write_content("empty", "");
    write_content("vast.pgm", "P5 99999999999 5 255\n");
    fs::create_hard_link("rgb.ppm", "twin.ppm");
    ASSERT_EQ(::mkfifo("pipe", 0600), 0);
    const auto before = files();
    const struct {
        std::string arguments, message;  // the message's beginning, without the name of the tool
    } list[] = {
        {"", "a command is required (see imgfile --help)"},
        {"--versio", "unknown option: --versio (see imgfile --help)"},
        {"--quiet nonsense", "unknown command: nonsense (see imgfile --help)"},
        {"check -", "check cannot read standard input (see imgfile check --help)"},
        {"info empty", "empty: is empty"},
        {"convert missing.img old --overwrite --format png", "missing.img: No such file"},
        {"convert . old --overwrite --format png", ".: is a folder"},
        {"convert pipe old --overwrite --format png", "pipe: is not a regular file"},
        {"convert vast.pgm old --overwrite --format png", "vast.pgm: has no valid PGM or PPM he"},
        {"convert junk old --overwrite --format png", "junk: is not a known image format, or"},
        {"convert cut.pgm old --overwrite --format vitec", "cut.pgm: truncated: line 12 is miss"},
        {"convert cut.img old --overwrite --format png", "cut.img: truncated: line 8 of band 0 is"},
        {"convert rgb.ppm twin.ppm --overwrite", "twin.ppm: is the input file"},
        {"convert rgb.ppm pipe --overwrite --format png", "pipe: exists and is not a regular"},
        {"convert rgb.ppm old --format png", "old: exists; --overwrite replaces it"},
        {"convert rgb.ppm no/new.png", "no/new.png: cannot be written: No such file"},
        {"convert rgb.ppm old --overwrite", "old: cannot write files without an ending; use --fo"},
        {"convert rgb.ppm - --format png", "standard output takes only PGM and PPM (see imgfile"},
        {"convert rgb.ppm a.png --band 0,1,0,1", "a.png: PNG files hold 1 or 3 bands, not 4"},
        {"convert rgb.ppm vitec.img --tile 100", "vitec.img: the tile sides of VITec files are"},
        {"convert rgb.ppm tiff.tif --tile 8", "tiff.tif: the tile sides of TIFF files are"},
        {"convert rgb.ppm png.png --tile 16", "png.png: PNG files have no tiles"},
        {"convert rgb.ppm a.png --window 0,0,21,1", "rgb.ppm: has no window 0,0,21,1: it has 20"},
        {"convert rgb.ppm a.png --window 0,0,0,1", "--window is empty (see imgfile convert --help"},
        {"convert rgb.ppm a.png --band 3", "rgb.ppm: has no band 3: it has 3, counted from 0"},
        {"convert rgb.ppm a.png --band 1,x", "--band: invalid value \"1,x\" (see imgfile convert"},
        {"preview rgb.ppm a.png --band 0,1", "--band takes one band or three (see imgfile prev"},
        {"stats rgb.ppm --histogram rgb.ppm --overwrite", "rgb.ppm: the picture is a PNG file; it"},
        {"create vast.img --lines 50000 --samples 50000",
         "vast.img: cannot be created: the file would have 2 GiB or more"},
        {"create a.d --lines 5 --samples 5 --tile 8", "a.d: Helava files have no tiles"},
        {"create a.d --lines 5 --samples 5 --bytes 2", "a.d: Helava files hold samples of one"},
        {"create a.img --lines 5 --samples 5 --bands 7", "a.img: VITec files hold at most 3 ba"},
        {"create a.d --lines -5 --samples 5", "--lines: Value -5 not in range 0 to 2147483647"},
    };
    for (const auto &[arguments, message] : list) {
        const finished end = run(arguments);
        const bool is_usage = end.err.find(" --help)") != end.err.npos;
        EXPECT_EQ(end.status, is_usage ? 2 : 1) << arguments;
        EXPECT_EQ(std::ranges::count(end.err, '\n'), 1) << arguments << ": " << end.err;
        EXPECT_TRUE(end.err.starts_with("imgfile: " + message)) << arguments << ": " << end.err;
        EXPECT_EQ(end.out, "") << arguments;
        EXPECT_EQ(files(), before) << arguments;
        EXPECT_EQ(content_of("old"), "what was there before") << arguments;
        EXPECT_EQ(content_of("rgb.ppm"), pixels) << arguments;
    }
}

TEST_F(Tool, LeavesNothingWhenItFails)
{
    expect_done("create a.img --lines 900 --samples 700 --bands 3 --pattern");
    for (const std::string name : {"b.img", "b.d", "b.ppm", "b.png", "b.tif"}) {
        const finished end = run("convert a.img " + name, "ulimit -f 3; ");
        EXPECT_EQ(end.status, 1) << name;
        EXPECT_EQ(end.err, "imgfile: " + name + ": cannot be written: File too large\n");
    }
    for (const std::string before : {"timeout -s INT 0.0", "timeout -s KILL 0.0"})
        for (const char *const delay : {"05 ", "1 ", "15 ", "2 ", "3 ", "4 ", "5 ", "6 "}) {
            const int status = run("convert a.img c.png", before + delay).status;
            EXPECT_TRUE(status == 0 || status == 124 || status == 137) << status;
            // The work may end before the signal.
            EXPECT_TRUE(fs::exists("c.png") ? run("compare a.img c.png").status == 0 : status != 0);
            fs::remove("c.png");
        }
    EXPECT_EQ(files(), std::set<std::string>{"a.img"});

    for (const std::string arguments : {"info a.img", "--help", "convert a.img -"})
        for (const char *const closed_or_full : {" >&-", " >/dev/full"}) {
            const finished end = run(arguments + closed_or_full);
            EXPECT_EQ(end.status, 1) << arguments;
            EXPECT_TRUE(end.err.starts_with("imgfile: standard output: cannot be written"))
                << end.err;
        }
}

TEST_F(Tool, DescribesFiles)
{
    expect_done("create a.img --lines 100 --samples 70 --bands 2 --bytes 2 --tile 16x32");
    expect_done("create user@host.d --lines 3 --samples 5 --bands 4");
    const finished end = run("info a.img missing user@host.d --json");
    EXPECT_EQ(end.status, 1);
    EXPECT_EQ(end.err, "imgfile: missing: No such file or directory\n");
    json facts = json::parse(end.out);
    ASSERT_EQ(facts.size(), 2U);
    EXPECT_EQ(facts[0]["created"].get<std::string>().size(), 19U);
    facts[0].erase("created");
    EXPECT_EQ(facts[0], json::parse(R"({
        "file": "a.img", "type": "VITec", "byte_order": "big", "lines": 100, "samples": 70,
        "bands": 2, "bytes_per_sample": 2, "bits_per_sample": 12, "layout": "tiles of band planes",
        "tile_size": {"lines": 16, "samples": 32}, "tile_grid": {"down": 7, "across": 3},
        "data_offset": 244, "file_length": 43252, "expected_length": 43252})"));
    EXPECT_EQ(facts[1]["expected_length"], 3 * 5 * 4 + 16);
    EXPECT_EQ(facts[1]["created"], nullptr);
}

// Facts of one file come from one open: else a file replaced in between would mix them.
TEST_F(Tool, OpensAFileOnce)
{
    write_content("c.ppm", pnm({0, 0, 40, 40}, {0, 1, 2}, 1));
    for (const char *const target : {"a.img --tile 8", "b.d", "c.png", "c.tif"})
        expect_done(std::string("convert c.ppm ") + target);
    for (const std::string name : {"a.img", "b.d", "c.ppm", "c.png", "c.tif"})
        for (const std::string &arguments :
             {"info " + name, "check " + name, "stats --overwrite --histogram h.png " + name,
              "preview --overwrite " + name + " p.png", "convert --overwrite " + name + " o.tif",
              "convert --overwrite --stretch " + name + " o.tif"}) {
            const int watch = ::inotify_init1(IN_NONBLOCK);
            // Equal events in a row come as one; reads and closes lie between two opens.
            ::inotify_add_watch(watch, name.c_str(), IN_OPEN | IN_ACCESS | IN_CLOSE);
            run(arguments);
            std::array<inotify_event, 1000> events{};
            EXPECT_NE(::read(watch, events.data(), sizeof events), -1);
            ::close(watch);
            EXPECT_EQ(std::ranges::count(events, std::uint32_t{IN_OPEN}, &inotify_event::mask), 1)
                << arguments;
        }
}

TEST_F(Tool, FindsErrorsInFiles)
{
    expect_done("create a.img --lines 64 --samples 40 --pattern --tile 8");
    expect_done("check a.img");
    const std::string whole = content_of("a.img");
    const struct {
        std::size_t position;
        char byte;
        const char *finding;
    } list[] = {
        {7, 109, "image_block_link is 109, not 108"},
        {12, 1, "the reserved bytes 8 to 15 are not 0"},
        {17, 12, "create_date is not a date: "},
        {32, 'v', "signature is not VITec"},
        {115, '\x83', "header_length is 131, not 132"},
        {119, 1, "total_length is 2561, not 2692"},
        {139, 8, "version is 8, not 7\na.img: has a header that describes no readable image"},
        {151, 41, "total_length is 2692, not 3204\na.img: truncated: 512 of 3,316 bytes"},
        {159, 7, "tile_nsamps is 7, neither 0 nor a power of two from 8 to 32768"},
        {159, 0, "only one of tile_nlines and tile_nsamps is 0: the image is untiled, but padded"},
        {167, 0, "band_flag is 0, not 1"},
        {171, 5, "nbands is 5, not 0 to 3"},
        {175, 3, "nbytes_code states 4 bytes per sample, not 1 or 2"},
        {148, '\xff', "nsamps is -16777176"},
    };
    for (const auto &[position, byte, finding] : list) {
        std::string damaged = whole;
        damaged[position] = byte;
        write_content("a.img", damaged);
        const finished end = run("check a.img");
        EXPECT_EQ(end.status, 1) << position;
        expect_within(end.out, std::string("a.img: ") + finding);
    }
    write_content("a.img", whole + "more");
    EXPECT_EQ(run("check a.img").out, "a.img: 4 bytes more than the header states\n");
    std::string zeros = whole;
    std::fill(zeros.begin() + 244 + 5 * 64 * 3, zeros.end(), '\0');
    write_content("a.img", zeros);
    EXPECT_EQ(run("check a.img").out, "a.img: band 0 is 0 from line 24 on, of 64\n");
    write_content("b.pgm", pnm({0, 0, 9, 9}, {0}, 2));
    expect_done("check b.pgm");
}

// data/README.md describes the files.
TEST_F(Tool, ReadsFilesMadeOutsideThisCode)
{
    const struct {
        const char *name;
        int nlines, nsamps, nbands, nbytes;
        const char *fact;
    } list[] = {
        {"untiled_8bit.img", 37, 53, 1, 1, "data at    byte 244\n"},
        {"untiled_3bands_little.img", 20, 31, 3, 1, "order      little-endian\n"},
        {"tiled_3bands.img", 37, 53, 3, 1, "16 lines x 8 samples, 3 down x 7 across\n"},
        {"untiled_16bit.img", 29, 41, 1, 2, "2 bytes, 12 bits\n  order      big-endian\n"},
        {"tiled_16bit_little.img", 29, 41, 2, 2, "8 lines x 32 samples, 4 down x 2 across\n"},
        {"long_header.img", 9, 11, 1, 1, "data at    byte 504\n"},
        {"helava_2bands.d", 23, 35, 2, 1, "Helava\n  size       23 lines x 35 samples x 2 bands\n"},
        {"helava_little.d", 23, 35, 1, 1, "little-endian\n"},
    };
    for (const auto &[name, nlines, nsamps, nbands, nbytes, fact] : list) {
        const std::string file = std::string(IMGFILE_TEST_DATA "/") + name;
        const std::string facts = run("info " + file).out;
        expect_within(facts, fact);
        expect_within(facts, " bytes, as the header states\n");
        for (int band = 0; band < nbands; ++band) {
            expect_done("convert " + file + " band.pgm --overwrite --band " + std::to_string(band));
            EXPECT_EQ(content_of("band.pgm"), pnm({0, 0, nlines, nsamps}, {band}, nbytes)) << file;
        }
    }
    const std::string cut = IMGFILE_TEST_DATA "/cut_in_line_20.img";
    expect_within(run("info " + cut).out, "TRUNCATED: 884 of 2,205 are missing");
    const std::string problem = cut + ": truncated: line 20 of band 0 is missing\n";
    expect_within(run("check " + cut).out, problem);
    EXPECT_EQ(run("convert " + cut + " cut.png").err, "imgfile: " + problem);
}

TEST_F(Tool, ComparesAndMeasuresSamples)
{
    const std::string samples("P6\n2 2\n255\n\0\5\0\0\5\0\2\5\0\2\5\x8", 23);
    write_content("m.ppm", samples);
    EXPECT_EQ(run("compare m.ppm m.ppm").out, "m.ppm and m.ppm are equal: 12 samples\n");
    std::string changed = samples;
    changed[11 + 5] = 64;
    changed[11 + 6] = 3;
    write_content("n.ppm", changed);
    const finished end = run("compare n.ppm m.ppm");
    EXPECT_EQ(end.status, 1);
    EXPECT_EQ(end.out, "n.ppm and m.ppm differ: 2 of 12 samples; first at line 0, sample 1, "
                       "band 2: 64 and 0; largest difference 64\n");

    const json facts = json::parse(run("stats m.ppm --json --histogram h.png").out);
    EXPECT_EQ(facts["bands"][1]["minimum"], 5);
    EXPECT_EQ(facts["bands"][2], json::parse(R"({
        "band": 2, "minimum": 0, "maximum": 8, "mean": 2.0, "share_of_zero": 0.75,
        "standard_deviation": 3.4641016151377544, "stated_bits": 8, "beyond_stated_bits": 0})"));
    expect_within(run("info h.png").out, "540 lines x 960 samples x 3 bands");
    EXPECT_EQ(run("compare m.ppm h.png").status, 1);
    fs::copy("m.ppm", "\xff.ppm");
    expect_done("stats \xff.ppm --histogram i.png --quiet");
    EXPECT_GT(fs::file_size("i.png"), fs::file_size("h.png") / 2);  // not empty

    write_content("a.ppm", pnm({0, 0, 30, 20}, {0, 1, 2}, 1));
    expect_done("preview a.ppm p.png --size 16 --raw");
    expect_done("convert p.png p.ppm");
    const std::string pixels = content_of("p.ppm");
    EXPECT_TRUE(pixels.starts_with("P6\n10 15\n255\n"));
    // The mean of 126, 133, 157 and 164.
    EXPECT_EQ(static_cast<unsigned char>(pixels[pixels.size() - 450 + (4 * 10 + 2) * 3 + 1]), 145);
}

#ifndef IMGFILE_SANITIZED  // sanitizers use memory of their own
TEST_F(Tool, UsesLittleMemoryForLargeImages)
{
    expect_done("create line.img --lines 1 --samples 200000000");
    const char header[] = "\x89PNG\r\n\x1a\n\0\0\0\rIHDR\x7f\xff\xff\xff\0\0\0\1\x10\2\0\0\0\x7f"
                          "\xc4\x78\xc9\0\0\0\0IDAT";
    write_content("line.png", std::string(header, sizeof header - 1));
    expect_done("create a.img --lines 10000 --samples 15000");
    for (const std::string arguments :
         {"convert a.img b.img --tile 256", "convert b.img c.tif --tile 512", "convert a.img -",
          "stats b.img", "preview b.img p.png", "check a.img", "compare a.img b.img",
          "preview line.img l.png", "convert line.img l.pgm", "check line.png", "check line.img"}) {
        EXPECT_EQ(run(arguments + " >/dev/null").status, arguments.starts_with("check") ? 1 : 0)
            << arguments;
        rusage used{};  // by the run that used most
        ::getrusage(RUSAGE_CHILDREN, &used);
        EXPECT_LT(used.ru_maxrss, 64 * 1024) << arguments;
    }
}
#endif

}  // namespace
