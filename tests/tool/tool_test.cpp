// The command-line tool, run as its users run it.
#include "img.h"
#include "support/files.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <functional>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <random>
#include <set>
#include <sstream>
#include <tiffio.h>

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace fs = std::filesystem;

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

struct finished {
    int status;  // below 0: the signal that ended the tool
    std::string out, err;
    long kilobytes;  // of memory, at most
};

// Samples in the order of PNM files.
struct picture {
    int nlines, nsamps, nbands, nbytes;
    std::vector<int> samples;

    int sample(int line, int samp, int band) const
    {
        return samples[static_cast<std::size_t>((line * nsamps + samp) * nbands + band)];
    }
    std::string as_pnm(const std::vector<int> &bands) const
    {
        std::ostringstream out;
        out << (bands.size() == 3 ? "P6\n" : "P5\n") << nsamps << ' ' << nlines << '\n'
            << (nbytes == 2 ? 65535 : 255) << '\n';
        for (int line = 0; line < nlines; ++line)
            for (int samp = 0; samp < nsamps; ++samp)
                for (const int band : bands) {
                    if (nbytes == 2) out.put(static_cast<char>(sample(line, samp, band) >> 8));
                    out.put(static_cast<char>(sample(line, samp, band) & 255));
                }
        return out.str();
    }
};

picture random_picture(int nlines, int nsamps, int nbands, int nbytes, int highest)
{
    std::mt19937 random(static_cast<unsigned>(nlines * 31 + nsamps * 7 + nbands * 3 + nbytes));
    picture made{nlines, nsamps, nbands, nbytes, {}};
    made.samples.resize(static_cast<std::size_t>(nlines * nsamps * nbands));
    for (int &sample : made.samples)
        sample = static_cast<int>(random() % (static_cast<unsigned>(highest) + 1));
    return made;
}

class Tool : public testing::Test {
protected:
    Tool() { fs::current_path(m_folder / ""); }
    ~Tool() override { fs::current_path("/"); }

    // Runs the tool with arguments that are separated by blanks. `prepare` runs in the new process,
    // which is sent `signal` after `delay` milliseconds.
    finished run(
        const std::string &arguments, const std::function<void()> &prepare = [] {}, int signal = 0,
        int delay = 0)
    {
        std::istringstream words(arguments);
        std::vector<std::string> list{IMGFILE_TOOL};
        for (std::string word; words >> word;) list.push_back(word);
        std::vector<char *> argv;
        for (std::string &word : list) argv.push_back(word.data());
        argv.push_back(nullptr);
        const pid_t child = ::fork();
        if (child == 0) {
            for (const auto &[name, stream] :
                 {std::pair{"out", STDOUT_FILENO}, {"err", STDERR_FILENO}})
                ::dup2(::open((m_streams / name).c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600),
                       stream);
            prepare();
            ::execv(argv[0], argv.data());
            ::_exit(127);
        }
        if (signal != 0) {
            ::usleep(static_cast<useconds_t>(delay) * 1000);
            ::kill(child, signal);
        }
        int status = -1;
        rusage used{};
        ::wait4(child, &status, 0, &used);
        return {WIFSIGNALED(status) ? -WTERMSIG(status) : WEXITSTATUS(status),
                content_of(m_streams / "out"), content_of(m_streams / "err"), used.ru_maxrss};
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
    std::vector<std::string> files() const
    {
        std::vector<std::string> names;
        for (const auto &each : fs::directory_iterator("."))
            names.push_back(each.path().filename());
        std::ranges::sort(names);
        return names;
    }

    scratch_folder m_folder, m_streams;
};

struct kept_as {
    const char *name, *options;
    std::set<std::size_t> bands;  // how many it can hold
    int nbytes;                   // of a sample, at most
};
const kept_as formats[] = {
    {"a.img", "", {1, 2, 3}, 2},
    {"tiled.img", "--tile 16x8", {1, 2, 3}, 2},
    {"a.d", "", {1, 2, 3}, 1},
    {"a.pnm", "", {1, 3}, 2},
    {"a.png", "", {1, 3}, 2},
    {"a.tif", "", {1, 2, 3}, 2},
    {"tiled.tif", "--tile 32x16", {1, 2, 3}, 2},
};

TEST_F(Tool, KeepsSamplesFromAnyFormatToAnyOther)
{
    for (const auto &[chosen, bands] : {std::pair{"1", std::vector{1}},
                                        {"2,0", std::vector{2, 0}},
                                        {"0,1,2", std::vector{0, 1, 2}}})
        for (const int nbytes : {1, 2}) {
            const picture source = random_picture(37, 53, 3, nbytes, nbytes == 1 ? 255 : 4095);
            write_content("source.ppm", source.as_pnm({0, 1, 2}));
            std::vector<kept_as> able;
            for (const kept_as &each : formats)
                if (each.bands.contains(bands.size()) && nbytes <= each.nbytes)
                    able.push_back(each);
            const std::size_t band = static_cast<std::size_t>(nbytes) % bands.size();
            for (const kept_as &first : able) {
                const std::string from = std::string("from_") + first.name;
                expect_done("convert source.ppm " + from + " --overwrite --band " + chosen + " " +
                            first.options);
                for (const kept_as &second : able) {
                    const std::string target = std::string("to_") + second.name;
                    expect_done("convert " + from + " " + target + " --overwrite " +
                                second.options);
                    expect_done("convert " + target + " seen.pgm --overwrite --band " +
                                std::to_string(band));
                    EXPECT_EQ(content_of("seen.pgm"), source.as_pnm({bands[band]}))
                        << from << " to " << target << ", bands " << chosen;
                }
                expect_done("compare " + from + " to_a.img");
            }
        }
}

TEST_F(Tool, ExtractsWindowsAndReadsStandardInput)
{
    const picture source = random_picture(40, 50, 3, 2, 65535);
    write_content("a.ppm", source.as_pnm({0, 1, 2}));
    for (const char *const name :
         {"a.img --tile 8", "a.tif --tile 16", "a.png", "a.tif --overwrite"}) {
        expect_done(std::string("convert --quiet a.ppm ") + name);
        const std::string file = std::string(name).substr(0, 5);
        expect_done("--quiet convert " + file + " w.pgm --overwrite --window 9,17,20,30 --band 2");
        picture part{20, 30, 1, 2, {}};
        for (int line = 0; line < 20; ++line)
            for (int samp = 0; samp < 30; ++samp)
                part.samples.push_back(source.sample(line + 9, samp + 17, 2));
        EXPECT_EQ(content_of("w.pgm"), part.as_pnm({0})) << name;
    }
    // Standard input can be read more than once, by more than one reader at a time.
    const auto from_picture = [] { ::dup2(::open("a.png", O_RDONLY), STDIN_FILENO); };
    EXPECT_EQ(run("convert - - --format ppm", from_picture).out, content_of("a.ppm"));
    EXPECT_EQ(run("compare - -", from_picture).status, 0);
    EXPECT_EQ(run("convert - b.ppm --stretch", from_picture).status, 0);
    expect_done("convert a.ppm c.ppm --stretch");
    EXPECT_EQ(content_of("b.ppm"), content_of("c.ppm"));
}

void write_tiff(const char *name, const char *mode, const picture &source, int compression,
                bool planar, int strip)
{
    TIFF *const file = TIFFOpen(name, mode);
    for (const auto &[tag, value] :
         {std::pair{TIFFTAG_IMAGELENGTH, source.nlines},
          {TIFFTAG_IMAGEWIDTH, source.nsamps},
          {TIFFTAG_SAMPLESPERPIXEL, source.nbands},
          {TIFFTAG_BITSPERSAMPLE, 16},
          {TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB},
          {TIFFTAG_COMPRESSION, compression},
          {TIFFTAG_PLANARCONFIG, planar ? PLANARCONFIG_SEPARATE : PLANARCONFIG_CONTIG},
          {TIFFTAG_ROWSPERSTRIP, strip}})
        TIFFSetField(file, static_cast<std::uint32_t>(tag), value);
    const int step = planar ? 1 : source.nbands;
    for (int plane = 0; plane < source.nbands; plane += step)
        for (int line = 0; line < source.nlines; ++line) {
            std::vector<std::uint16_t> samples;
            for (int samp = 0; samp < source.nsamps; ++samp)
                for (int band = plane; band < plane + step; ++band)
                    samples.push_back(static_cast<std::uint16_t>(source.sample(line, samp, band)));
            TIFFWriteScanline(file, samples.data(), static_cast<std::uint32_t>(line),
                              static_cast<std::uint16_t>(plane));
        }
    TIFFClose(file);
}

// Strips are read piece by piece, from any line.
TEST_F(Tool, ReadsStripsOfAllKinds)
{
    const picture source = random_picture(1700, 900, 3, 2, 300);
    write_content("a.ppm", source.as_pnm({0, 1, 2}));
    expect_done("convert a.ppm window.ppm --window 777,50,200,600 --band 2,0,2");
    for (const int compression : {COMPRESSION_NONE, COMPRESSION_LZW})
        for (const bool planar : {false, true})
            for (const int strip : {7, 1700}) {
                write_tiff("a.tif", strip == 7 ? "wb" : "wl", source, compression, planar, strip);
                expect_done("compare a.ppm a.tif");
                expect_done("convert a.tif b.ppm --overwrite --window 777,50,200,600 --band 2,0,2");
                EXPECT_EQ(content_of("b.ppm"), content_of("window.ppm"));
            }
    expect_done("convert a.ppm b.tif");
    fs::resize_file("b.tif", 4'000'000);
    EXPECT_EQ(run("convert b.tif c.tif").err, "imgfile: b.tif: line 740 is missing\n");
}

// What the tool stretches is what a host of the library sees.
TEST_F(Tool, StretchesAsTheLibraryDoesAllAtOnce)
{
    const picture source = random_picture(70, 90, 1, 2, 6000);
    write_content("a.pgm", source.as_pnm({0}));
    const finished converted = run("convert a.pgm a.img");
    expect_within(converted.err, "imgfile: a.pgm: note: ");
    expect_within(converted.err, " samples lie beyond 12 bits; they were kept as they are\n");
    for (const std::string window : {"0,0,70,90", "3,5,60,71"}) {
        int line, samp, nlines, nsamps;
        std::sscanf(window.c_str(), "%d,%d,%d,%d", &line, &samp, &nlines, &nsamps);
        const finished end = run("convert a.img s.pgm --stretch --overwrite --window " + window);
        expect_within(end.err, " beyond 12 bits; they were mapped as the highest value\n");
        std::vector<std::uint8_t> seen(static_cast<std::size_t>(nlines * nsamps));
        const img_handle image = img_openfile("a.img", IMG_OPEN_READ_ONLY);
        ASSERT_EQ(
            img_load_buffer(image, line, samp, nlines, nsamps, 0, seen.data(), nsamps, nullptr), 0);
        img_closefile(image);
        const std::string bytes = content_of("s.pgm");
        EXPECT_EQ(bytes.substr(bytes.size() - seen.size()), std::string(seen.begin(), seen.end()));
    }
}

TEST_F(Tool, RefusesInOneLineAndKeepsTheTarget)
{
    write_content("rgb.ppm", random_picture(20, 30, 3, 1, 255).as_pnm({0, 1, 2}));
    expect_done("create two.img --lines 20 --samples 30 --bytes 2 --pattern");
    expect_done("create seven.d --lines 20 --samples 30 --bands 7 --pattern");
    write_content("cut.pgm", random_picture(20, 30, 1, 1, 255).as_pnm({0}).substr(0, 400));
    expect_done("convert rgb.ppm whole.img --tile 8 --band 0");
    write_content("cut.img", content_of("whole.img").substr(0, 244 + 8 * 40));
    write_content("junk", "nothing in particular, but long enough to hold a header of some kind");
    write_content("old", "what was there before");
    write_content("empty", "");
    write_content("vast.pgm", "P5 99999999999 5 255\n");
    fs::create_hard_link("rgb.ppm", "twin.ppm");
    fs::create_symlink("rgb.ppm", "link.ppm");
    fs::create_symlink("loop", "loop");
    ASSERT_EQ(::mkfifo("pipe", 0600), 0);
    const std::string pixels = content_of("rgb.ppm");
    struct refusal {
        std::string arguments;
        int status;
        std::string message;  // its beginning, without the name of the tool
    };
    std::vector<refusal> list{
        {"convert rgb.ppm old --format png", 1, "old: exists; --overwrite replaces it"},
        {"convert rgb.ppm twin.ppm --overwrite", 1, "twin.ppm: is the input file"},
        {"convert link.ppm rgb.ppm --overwrite", 1, "rgb.ppm: is the input file"},
        {"convert rgb.ppm pipe --format png --overwrite", 1, "pipe: exists and is not a regular"},
        {"convert rgb.ppm nowhere/new.png", 1, "nowhere/new.png: cannot be written: No such file"},
        {"convert rgb.ppm - --format png", 2, ""},
        {"preview rgb.ppm old.png --band 0,1", 2, ""},
        {"stats rgb.ppm --histogram rgb.ppm --overwrite", 2, ""},
        {"create old --overwrite --type vitec --lines 50000 --samples 50000", 1,
         "old: cannot be created: the file would have 2 GiB or more\n"},
        {"create old --overwrite --type helava --lines 5 --samples 5 --tile 8", 1,
         "old: Helava files have no tiles\n"},
        {"create old.xyz --lines 5 --samples 5", 2, "old.xyz: cannot write .xyz files; use --type"},
        {"create old --overwrite --type vitec --lines -5 --samples 5", 2,
         "--lines: Value -5 not in range 0 to 2147483647 (see imgfile create --help)\n"},
        {"check -", 2, "check cannot read standard input (see imgfile check --help)\n"},
        {"info empty", 1, "empty: is empty\n"},
        {"check loop", 1, "loop: Too many levels of symbolic links\n"},
        {"compare rgb.ppm missing.img", 1, "missing.img: No such file or directory\n"},
        {"--quiet nonsense", 2, "unknown command: nonsense (see imgfile --help)\n"},
        {"--versio", 2, "unknown option: --versio (see imgfile --help)\n"},
        {"", 2, "a command is required (see imgfile --help)\n"},
    };
    for (const auto &[arguments, status, message] : {
             refusal{"missing.img old --format png", 1, "missing.img: No such file or directory\n"},
             {". old --format png", 1, ".: is a folder\n"},
             {"pipe old --format png", 1, "pipe: is not a regular file\n"},
             {"vast.pgm old --format png", 1, "vast.pgm: has no valid PGM or PPM header\n"},
             {"junk old --format png", 1, "junk: is not a known image format, or its header is"},
             {"cut.pgm old --format vitec", 1, "cut.pgm: truncated: line 12 is missing\n"},
             {"cut.img old --format png", 1, "cut.img: truncated: line 8 of band 0 is missing\n"},
             {"two.img old --format helava", 1,
              "old: Helava files hold samples of one byte (imgfile"},
             {"seven.d old --format vitec", 1,
              "old: VITec files hold at most 3 bands, not 7 (imgfile"},
             {"seven.d old --format png", 1,
              "old: PNG files hold 1 or 3 bands, not 7; --band chooses"},
             {"rgb.ppm old --format vitec --tile 100", 1, "old: the tile sides of VITec files are"},
             {"rgb.ppm old --format tiff --tile 8", 1, "old: the tile sides of TIFF files are"},
             {"rgb.ppm old --format png --tile 16", 1, "old: PNG files have no tiles\n"},
             {"rgb.ppm old --format png --window 0,0,21,1", 1,
              "rgb.ppm: has no window 0,0,21,1: it"},
             {"rgb.ppm old --format png --window 0,0,0,1", 2, "--window is empty (see imgfile"},
             {"rgb.ppm old --format png --band 3", 1, "rgb.ppm: has no band 3: it has 3, counted"},
             {"rgb.ppm old --format png --band=", 2, ""},
             {"rgb.ppm old", 2, ""},
         })
        list.push_back({"convert " + arguments + " --overwrite", status, message});
    for (const auto &[arguments, status, message] : list) {
        const auto before = files();
        const finished end = run(arguments);
        EXPECT_EQ(end.status, status) << arguments;
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
    for (const char *const name : {"b.img", "b.d", "b.ppm", "b.png", "b.tif"}) {
        const finished end = run(std::string("convert a.img ") + name, [] {
            const rlimit limit{2'000, 2'000};
            ::setrlimit(RLIMIT_FSIZE, &limit);
        });
        EXPECT_EQ(end.status, 1) << name;
        EXPECT_EQ(end.err,
                  std::string("imgfile: ") + name + ": cannot be written: File too large\n");
    }
    for (const int signal : {SIGINT, SIGTERM, SIGKILL})
        for (int delay = 5; delay < 60; delay += 10) {
            const finished end = run(
                "convert a.img c.png", [] {}, signal, delay);
            EXPECT_TRUE(end.status == 0 || end.status == -signal);
            EXPECT_TRUE(end.status != 0 || fs::exists("c.png"));
            const bool is_there = fs::exists("c.png");  // the work may end before the signal
            EXPECT_TRUE(!is_there || run("compare a.img c.png").status == 0);
            fs::remove("c.png");
        }
    EXPECT_EQ(files(), (std::vector<std::string>{"a.img"}));

    for (const char *const arguments : {"info a.img", "--help", "convert a.img -", "stats a.img",
                                        "compare a.img a.img", "--version"})
        for (const bool closed : {false, true}) {
            const finished end = run(arguments, [=] {
                if (closed)
                    ::close(STDOUT_FILENO);
                else
                    ::dup2(::open("/dev/full", O_WRONLY), STDOUT_FILENO);
            });
            EXPECT_EQ(end.status, 1) << arguments;
            EXPECT_TRUE(end.err.starts_with("imgfile: standard output: cannot be written"))
                << end.err;
        }
}

TEST_F(Tool, DescribesFiles)
{
    expect_done("create a.img --lines 100 --samples 70 --bands 2 --bytes 2 --tile 16x32");
    expect_done("create user@host.d --lines 3 --samples 5 --bands 4");
    expect_done("convert a.img t.tif --tile 16x32");
    const finished end = run("info a.img missing user@host.d t.tif --json");
    EXPECT_EQ(end.status, 1);
    EXPECT_EQ(end.err, "imgfile: missing: No such file or directory\n");
    auto facts = nlohmann::json::parse(end.out);
    ASSERT_EQ(facts.size(), 3U);
    EXPECT_EQ(facts[0]["created"].get<std::string>().size(), 19U);
    facts[0].erase("created");
    EXPECT_EQ(facts[0], nlohmann::json::parse(R"({
        "file": "a.img", "type": "VITec", "byte_order": "big", "lines": 100, "samples": 70,
        "bands": 2, "bytes_per_sample": 2, "bits_per_sample": 12, "layout": "tiles of band planes",
        "tile_size": {"lines": 16, "samples": 32}, "tile_grid": {"down": 7, "across": 3},
        "data_offset": 244, "file_length": 43252, "expected_length": 43252})"));
    EXPECT_EQ(facts[1]["type"], "Helava");
    EXPECT_EQ(facts[1]["expected_length"], 3 * 5 * 4 + 16);
    EXPECT_EQ(facts[1]["created"], nullptr);
    EXPECT_EQ(facts[2]["tile_size"], facts[0]["tile_size"]);

    write_content("a.img", content_of("a.img").substr(0, 1000));
    expect_within(run("info a.img").out, "1,000 bytes, TRUNCATED: 42,252 of 43,252 are missing");
}

// Facts of one file come from one open: else a file replaced in between would mix them.
TEST_F(Tool, OpensAFileOnce)
{
    expect_done("create a.img --lines 40 --samples 40 --tile 8 --bytes 2 --pattern");
    expect_done("create b.d --lines 40 --samples 40 --pattern");
    for (const char *const name : {"c.ppm", "c.png", "c.tif"})
        expect_done(std::string("convert --band 0,0,0 a.img ") + name);
    for (const std::string name : {"a.img", "b.d", "c.ppm", "c.png", "c.tif"})
        for (const std::string &arguments :
             {"info " + name, "info --json " + name, "check " + name, "stats " + name,
              "stats --overwrite --histogram h.png " + name,
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
        EXPECT_EQ(end.err, "");
        EXPECT_EQ(end.status, 1) << position;
        expect_within(end.out, std::string("a.img: ") + finding);
    }
    write_content("a.img", whole + "more");
    EXPECT_EQ(run("check a.img").out, "a.img: 4 bytes more than the header states\n");
    std::string zeros = whole;
    std::fill(zeros.begin() + 244 + 5 * 64 * 3, zeros.end(), '\0');
    write_content("a.img", zeros);
    EXPECT_EQ(run("check a.img").out, "a.img: band 0 is 0 from line 24 on, of 64\n");
    write_content("b.pgm", random_picture(9, 9, 1, 2, 5000).as_pnm({0}));
    run("convert b.pgm b.img");
    expect_within(run("check b.img").out, "samples beyond 12 bits\n");
    expect_done("check b.pgm");
    write_content("c.pgm", content_of("b.pgm") + "more");
    EXPECT_EQ(run("check c.pgm").out, "c.pgm: 4 bytes more than the header states\n");
}

// data/README.md describes the files and states the formula of their samples.
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
        {"helava_2bands.d", 23, 35, 2, 1, "size       23 lines x 35 samples x 2 bands\n"},
        {"helava_little.d", 23, 35, 1, 1, "little-endian\n"},
    };
    for (const auto &[name, nlines, nsamps, nbands, nbytes, fact] : list) {
        picture source{nlines, nsamps, nbands, nbytes, {}};
        for (int i = 0; i < nlines * nsamps * nbands; ++i) {
            const int band = i % nbands, samp = i / nbands % nsamps, line = i / nbands / nsamps;
            source.samples.push_back(nbytes == 1 ? (band * 101 + line * 31 + samp * 7) % 251
                                                 : (band * 501 + line * 13 + samp * 3) % 4096);
        }
        const std::string file = std::string(IMGFILE_TEST_DATA "/") + name;
        const std::string facts = run("info " + file).out;
        expect_within(facts, fact);
        expect_within(facts, " bytes, as the header states\n");
        for (int band = 0; band < nbands; ++band) {
            expect_done("convert " + file + " band.pgm --overwrite --band " + std::to_string(band));
            EXPECT_EQ(content_of("band.pgm"), source.as_pnm({band})) << file;
        }
    }
    const std::string cut = IMGFILE_TEST_DATA "/cut_in_line_20.img";
    expect_within(run("info " + cut).out, "TRUNCATED: 884 of 2,205 are missing");
    expect_within(run("check " + cut).out, "truncated: line 20 of band 0 is missing\n");
    EXPECT_EQ(run("convert " + cut + " cut.png").err,
              "imgfile: " + cut + ": truncated: line 20 of band 0 is missing\n");
}

TEST_F(Tool, ComparesAndMeasuresSamples)
{
    picture source = random_picture(30, 20, 3, 1, 200);
    write_content("a.ppm", source.as_pnm({0, 1, 2}));
    expect_done("convert a.ppm a.img --tile 8");
    EXPECT_EQ(run("compare a.ppm a.img").out, "a.ppm and a.img are equal: 1,800 samples\n");
    source.samples[(7 * 20 + 5) * 3 + 2] ^= 64;
    source.samples[(7 * 20 + 6) * 3] ^= 1;
    write_content("b.ppm", source.as_pnm({0, 1, 2}));
    const finished end = run("compare a.img b.ppm");
    EXPECT_EQ(end.status, 1);
    const int changed = source.sample(7, 5, 2);
    EXPECT_EQ(end.out,
              "a.img and b.ppm differ: 2 of 1,800 samples; first at line 7, sample 5, band 2: " +
                  std::to_string(changed ^ 64) + " and " + std::to_string(changed) +
                  "; largest difference 64\n");
    expect_done("convert a.ppm c.png --window 0,0,29,20");
    EXPECT_EQ(run("compare a.ppm c.png").status, 1);

    const picture measured{2, 2, 3, 1, {0, 5, 0, 0, 5, 0, 2, 5, 0, 2, 5, 8}};
    write_content("m.ppm", measured.as_pnm({0, 1, 2}));
    const auto facts = nlohmann::json::parse(run("stats m.ppm --json --histogram h.png").out);
    const double expected[3][5] = {
        {0, 2, 1, 1, 0.5}, {5, 5, 5, 0, 0}, {0, 8, 2, std::sqrt(12), 0.75}};
    for (std::size_t band = 0; band < 3; ++band) {
        const char *const names[] = {"minimum", "maximum", "mean", "standard_deviation",
                                     "share_of_zero"};
        for (std::size_t i = 0; i < 5; ++i)
            EXPECT_NEAR(facts["bands"][band][names[i]], expected[band][i], 1e-6) << names[i];
        EXPECT_EQ(facts["bands"][band]["beyond_stated_bits"], 0);
    }
    expect_within(run("info h.png").out, "540 lines x 960 samples x 3 bands");
    fs::copy("m.ppm", "\xff.ppm");
    expect_done("stats \xff.ppm --histogram i.png --quiet");
    EXPECT_GT(fs::file_size("i.png"), fs::file_size("h.png") / 2);  // not empty

    expect_done("preview a.img p.png --size 16 --raw");
    expect_done("convert p.png p.ppm");
    const std::string pixels = content_of("p.ppm");
    EXPECT_TRUE(pixels.starts_with("P6\n10 15\n255\n"));
    const int mean = (source.sample(8, 4, 1) + source.sample(8, 5, 1) + source.sample(9, 4, 1) +
                      source.sample(9, 5, 1)) /
                     4;
    EXPECT_EQ(static_cast<unsigned char>(pixels[pixels.size() - 450 + (4 * 10 + 2) * 3 + 1]), mean);
}

#ifndef IMGFILE_SANITIZED  // sanitizers use memory of their own
TEST_F(Tool, UsesLittleMemoryForLargeImages)
{
    expect_done("create line.img --lines 1 --samples 200000000");
    const char header[] = "\x89PNG\r\n\x1a\n\0\0\0\rIHDR\x7f\xff\xff\xff\0\0\0\1\x10\2\0\0\0\x7f"
                          "\xc4\x78\xc9\0\0\0\0IDAT";
    write_content("line.png", std::string(header, sizeof header - 1));
    expect_done("create a.img --lines 10000 --samples 15000");
    for (const char *const arguments :
         {"convert a.img b.img --tile 256", "convert b.img c.tif --tile 512", "convert a.img -",
          "stats b.img", "preview b.img p.png", "check a.img", "compare a.img b.img",
          "preview line.img l.png", "convert line.img l.pgm", "check line.png", "check line.img"}) {
        const finished end =
            run(arguments, [] { ::dup2(::open("/dev/null", O_WRONLY), STDOUT_FILENO); });
        EXPECT_LT(end.kilobytes, 64 * 1024) << arguments;
        EXPECT_EQ(end.status, std::strncmp(arguments, "check", 5) == 0 ? 1 : 0) << arguments;
    }
}
#endif

}  // namespace
