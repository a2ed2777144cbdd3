// The command-line tool, run as its users run it.
#include "img.h"
#include "support/files.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <gtest/gtest.h>
#include <nlohmann/json.hpp>
#include <random>
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
    template <typename Prepare>
    finished run(const std::string &arguments, Prepare prepare, int signal = 0, int delay = 0)
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
    finished run(const std::string &arguments)
    {
        return run(arguments, [] {});
    }
    void expect_done(const std::string &arguments)
    {
        const finished end = run(arguments);
        EXPECT_EQ(end.status, 0) << arguments << ": " << end.err;
        EXPECT_EQ(end.err, "") << arguments;
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
    std::array<bool, 4> bands;  // [n]: it holds n of them
    bool two_bytes;
};
const std::vector<kept_as> formats{
    {"a.img", "", {false, true, true, true}, true},
    {"tiled.img", "--tile 16x8", {false, true, true, true}, true},
    {"a.d", "", {false, true, true, true}, false},
    {"a.pnm", "", {false, true, false, true}, true},
    {"a.png", "", {false, true, false, true}, true},
    {"a.tif", "", {false, true, true, true}, true},
    {"tiled.tif", "--tile 32x16", {false, true, true, true}, true},
};

TEST_F(Tool, KeepsSamplesFromAnyFormatToAnyOther)
{
    for (const int nbands : {1, 2, 3})
        for (const int nbytes : {1, 2}) {
            const picture source =
                random_picture(37, 53 + nbands, 3, nbytes, nbytes == 1 ? 255 : 4095);
            const std::vector<int> bands = nbands == 3   ? std::vector{0, 1, 2}
                                           : nbands == 2 ? std::vector{2, 0}
                                                         : std::vector{1};
            write_content("source.ppm", source.as_pnm({0, 1, 2}));
            const std::string chosen = nbands == 3 ? "0,1,2" : nbands == 2 ? "2,0" : "1";
            const auto holds = [=](const kept_as &format) {
                return format.bands.at(static_cast<std::size_t>(nbands)) &&
                       (nbytes == 1 || format.two_bytes);
            };
            for (const kept_as &source_format : formats) {
                if (!holds(source_format)) continue;
                const std::string first = std::string("from_") + source_format.name;
                expect_done("convert source.ppm " + first + " --overwrite --band " + chosen + " " +
                            source_format.options);
                for (const kept_as &target : formats) {
                    if (!holds(target)) continue;
                    const std::string second = std::string("to_") + target.name;
                    expect_done("convert " + first + " " + second + " --overwrite " +
                                target.options);
                    const int band = nbytes - 1 < nbands ? nbytes - 1 : 0;
                    expect_done("convert " + second + " seen.pgm --overwrite --band " +
                                std::to_string(band));
                    EXPECT_EQ(content_of("seen.pgm"),
                              source.as_pnm({bands[static_cast<std::size_t>(band)]}))
                        << first << " to " << second << ", " << nbands << " bands of " << nbytes;
                }
                EXPECT_EQ(run("compare " + first + " to_a.img").status, 0);
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
    const finished piped =
        run("convert - - --format ppm", [] { ::dup2(::open("a.ppm", O_RDONLY), STDIN_FILENO); });
    EXPECT_EQ(piped.out, content_of("a.ppm"));
    EXPECT_EQ(piped.err, "");
    // Standard input can be read more than once, by more than one reader at a time.
    const auto from_picture = [] { ::dup2(::open("a.png", O_RDONLY), STDIN_FILENO); };
    EXPECT_EQ(run("compare - -", from_picture).status, 0);
    EXPECT_EQ(run("convert - b.ppm --stretch", from_picture).status, 0);
    expect_done("convert a.ppm c.ppm --stretch");
    EXPECT_EQ(content_of("b.ppm"), content_of("c.ppm"));
}

void write_tiff(const char *name, const char *mode, const picture &source, int compression,
                bool planar, int strip)
{
    TIFF *const file = TIFFOpen(name, mode);
    TIFFSetField(file, TIFFTAG_IMAGELENGTH, source.nlines);
    TIFFSetField(file, TIFFTAG_IMAGEWIDTH, source.nsamps);
    TIFFSetField(file, TIFFTAG_SAMPLESPERPIXEL, source.nbands);
    TIFFSetField(file, TIFFTAG_BITSPERSAMPLE, 16);
    TIFFSetField(file, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_RGB);
    TIFFSetField(file, TIFFTAG_PLANARCONFIG, planar ? PLANARCONFIG_SEPARATE : PLANARCONFIG_CONTIG);
    TIFFSetField(file, TIFFTAG_COMPRESSION, compression);
    TIFFSetField(file, TIFFTAG_ROWSPERSTRIP, strip);
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
                EXPECT_EQ(run("compare a.ppm a.tif").status, 0)
                    << compression << ' ' << planar << ' ' << strip;
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
    EXPECT_NE(converted.err.find("imgfile: a.pgm: note: "), std::string::npos);
    EXPECT_NE(converted.err.find(" samples lie beyond 12 bits; they were kept as they are\n"),
              std::string::npos);
    for (const auto &part : {std::array{0, 0, 70, 90}, std::array{3, 5, 60, 71}}) {
        const auto [line, samp, nlines, nsamps] = part;
        const finished end =
            run("convert a.img s.pgm --stretch --overwrite --window " + std::to_string(line) + "," +
                std::to_string(samp) + "," + std::to_string(nlines) + "," + std::to_string(nsamps));
        EXPECT_NE(end.err.find(" beyond 12 bits; they were mapped as the highest value\n"),
                  std::string::npos);
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
    ASSERT_EQ(::mkfifo("pipe", 0600), 0);
    struct refusal {
        const char *arguments;
        int status;
        const char *message;
    };
    const std::string pixels = content_of("rgb.ppm");
    for (const auto &[arguments, status, message] : {
             refusal{"convert rgb.ppm old --format png", 1, "old: exists; --overwrite replaces it"},
             {"convert rgb.ppm rgb.ppm --overwrite", 1, "rgb.ppm: is the input file"},
             {"convert rgb.ppm twin.ppm --overwrite", 1, "twin.ppm: is the input file"},
             {"convert link.ppm rgb.ppm --overwrite", 1, "rgb.ppm: is the input file"},
             {"convert missing.img old --format png --overwrite", 1,
              "missing.img: No such file or directory"},
             {"convert . old --format png --overwrite", 1, ".: is a folder"},
             {"convert pipe old --format png --overwrite", 1, "pipe: is not a regular file"},
             {"convert vast.pgm old --format png --overwrite", 1,
              "vast.pgm: has no valid PGM or PPM header"},
             {"convert rgb.ppm pipe --format png --overwrite", 1,
              "pipe: exists and is not a regular file"},
             {"convert rgb.ppm nowhere/new.png", 1,
              "nowhere/new.png: cannot be written: No such file or directory"},
             {"convert junk old --format png --overwrite", 1,
              "junk: is not a known image format, or its header is damaged"},
             {"convert cut.pgm old --format img --overwrite", 2, nullptr},
             {"convert cut.pgm old --format vitec --overwrite", 1,
              "cut.pgm: truncated: line 12 is missing"},
             {"convert cut.img old --format png --overwrite", 1,
              "cut.img: truncated: line 8 of band 0 is missing"},
             {"convert two.img old --format helava --overwrite", 1,
              "old: Helava files hold samples of one byte (imgfile convert --stretch reduces "
              "samples "
              "to one byte)"},
             {"convert seven.d old --format vitec --overwrite", 1,
              "old: VITec files hold at most 3 bands, not 7 (imgfile convert --band chooses some)"},
             {"convert seven.d old --format png --overwrite", 1,
              "old: PNG files hold 1 or 3 bands, not 7; --band chooses some"},
             {"convert rgb.ppm old --format pgm --overwrite", 1,
              "old: PGM files hold 1 band, not 3"},
             {"convert rgb.ppm old --format vitec --tile 100 --overwrite", 1,
              "old: the tile sides of VITec files are powers of two from 8 to 32768"},
             {"convert rgb.ppm old --format tiff --tile 8 --overwrite", 1,
              "old: the tile sides of TIFF files are multiples of 16"},
             {"convert rgb.ppm old --format png --tile 16 --overwrite", 1,
              "old: PNG files have no tiles"},
             {"convert rgb.ppm old --format png --window 0,0,21,1 --overwrite", 1,
              "rgb.ppm: has no window 0,0,21,1: it has 20 lines x 30 samples"},
             {"convert rgb.ppm old --format png --band 3 --overwrite", 1,
              "rgb.ppm: has no band 3: it has 3, counted from 0"},
             {"convert rgb.ppm old --format png --window 0,0,0,1 --overwrite", 2,
              "--window is empty (see imgfile convert --help)"},
             {"convert rgb.ppm old --format png --tile 0 --overwrite", 2, nullptr},
             {"convert rgb.ppm old --format png --band x --overwrite", 2, nullptr},
             {"convert rgb.ppm old --overwrite", 2, nullptr},
             {"convert rgb.ppm - --format png", 2, nullptr},
             {"convert rgb.ppm", 2, nullptr},
             {"preview junk old --overwrite", 2, nullptr},
             {"preview rgb.ppm old.png --band 0,1", 2, nullptr},
             {"stats rgb.ppm --histogram rgb.ppm --overwrite", 2, nullptr},
             {"create old --type vitec --lines 50000 --samples 50000 --overwrite", 1,
              "old: cannot be created: the file would have 2 GiB or more"},
             {"create old --type helava --lines 5 --samples 5 --tile 8 --overwrite", 1,
              "old: Helava files have no tiles"},
             {"create old.png --lines 5 --samples 5", 2, nullptr},
             {"create old.xyz --lines 5 --samples 5", 2,
              "old.xyz: cannot write .xyz files; use --type (see imgfile create --help)"},
             {"create old --type vitec --lines -5 --samples 5 --overwrite", 2,
              "--lines: Value -5 not in range 0 to 2147483647 (see imgfile create --help)"},
             {"convert rgb.ppm old --format png --overwrite --window=", 2, nullptr},
             {"convert rgb.ppm old --format png --overwrite --band=", 2, nullptr},
             {"check -", 2, "check cannot read standard input (see imgfile check --help)"},
             {"--quiet nonsense", 2, "unknown command: nonsense (see imgfile --help)"},
             {"info junk", 1, nullptr},
             {"info empty", 1, "empty: is empty"},
             {"--versio", 2, "unknown option: --versio (see imgfile --help)"},
             {"compare rgb.ppm missing.img", 1, "missing.img: No such file or directory"},
             {"", 2, "a command is required (see imgfile --help)"},
         }) {
        const auto before = files();
        const finished end = run(arguments);
        EXPECT_EQ(end.status, status) << arguments;
        EXPECT_EQ(std::ranges::count(end.err, '\n'), 1) << arguments << ": " << end.err;
        EXPECT_TRUE(end.err.starts_with("imgfile: ")) << arguments << ": " << end.err;
        EXPECT_TRUE(message == nullptr || end.err == std::string("imgfile: ") + message + "\n")
            << arguments << ": " << end.err;
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
    const auto facts = nlohmann::json::parse(end.out);
    ASSERT_EQ(facts.size(), 3U);
    const nlohmann::json expected{{"file", "a.img"},
                                  {"type", "VITec"},
                                  {"byte_order", "big"},
                                  {"lines", 100},
                                  {"samples", 70},
                                  {"bands", 2},
                                  {"bytes_per_sample", 2},
                                  {"bits_per_sample", 12},
                                  {"layout", "tiles of band planes"},
                                  {"tile_size", {{"lines", 16}, {"samples", 32}}},
                                  {"tile_grid", {{"down", 7}, {"across", 3}}},
                                  {"data_offset", 244},
                                  {"file_length", 244 + 21 * 2 * 1024},
                                  {"expected_length", 244 + 21 * 2 * 1024}};
    for (const auto &[key, value] : expected.items()) EXPECT_EQ(facts[0][key], value) << key;
    EXPECT_EQ(facts[0]["created"].get<std::string>().size(), 19U);
    EXPECT_EQ(facts[1]["type"], "Helava");
    EXPECT_EQ(facts[1]["expected_length"], 3 * 5 * 4 + 16);
    EXPECT_EQ(facts[1]["created"], nullptr);
    EXPECT_EQ(facts[2]["tile_size"], facts[0]["tile_size"]);

    write_content("a.img", content_of("a.img").substr(0, 1000));
    EXPECT_NE(run("info a.img").out.find("1,000 bytes, TRUNCATED: 42,252 of 43,252 are missing"),
              std::string::npos);
}

// Counts how often a file is opened while an object lives.
class open_counter {
public:
    explicit open_counter(const char *file) : m_notifications(::inotify_init1(IN_NONBLOCK))
    {
        // Equal events in a row come as one; reads and closes lie between two opens.
        ::inotify_add_watch(m_notifications, file, IN_OPEN | IN_ACCESS | IN_CLOSE);
    }
    ~open_counter() { ::close(m_notifications); }
    open_counter(const open_counter &) = delete;
    open_counter &operator=(const open_counter &) = delete;
    long count() const
    {
        std::array<inotify_event, 1000> events;
        const ssize_t length = ::read(m_notifications, events.data(), sizeof events);
        return std::count_if(events.begin(),
                             events.begin() + std::max<ssize_t>(length, 0) /
                                                  static_cast<ssize_t>(sizeof(inotify_event)),
                             [](const inotify_event &event) { return event.mask == IN_OPEN; });
    }

private:
    int m_notifications;
};

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
            const open_counter opens(name.c_str());
            run(arguments);
            EXPECT_EQ(opens.count(), 1) << arguments;
        }
}

TEST_F(Tool, FindsErrorsInFiles)
{
    expect_done("create a.img --lines 64 --samples 40 --pattern --tile 8");
    expect_done("check a.img");
    const std::string whole = content_of("a.img");
    struct damage {
        std::size_t at;
        const char *byte;
        std::vector<std::string> findings;
    };
    for (const auto &[at, byte, findings] : std::vector<damage>{
             {7, "\x6d", {"image_block_link is 109, not 108", "has a header that"}},
             {12, "\x01", {"the reserved bytes 8 to 15 are not 0"}},
             {17, "\x0c", {"create_date is not a date: "}},
             {32, "v", {"signature is not VITec"}},
             {115, "\x83", {"header_length is 131, not 132"}},
             {119, "\x01", {"total_length is 2561, not 2692"}},
             {139,
              "\x08",
              {"version is 8, not 7", "has a header that describes no readable image"}},
             {151, "\x29", {"total_length is 2692, not 3204", "truncated: 512 of 3,316 bytes"}},
             {159, "\x07", {"tile_nsamps is 7, neither 0 nor a power of two from 8 to 32768"}},
             {159,
              "",
              {"only one of tile_nlines and tile_nsamps is 0: the image is untiled, but padded"}},
             {167, "", {"band_flag is 0, not 1"}},
             {171, "\x05", {"nbands is 5, not 0 to 3", "truncated: 10,240 of "}},
             {175,
              "\x03",
              {"nbytes_code states 4 bytes per sample, not 1 or 2", "has a header that"}},
             {148, "\xff", {"nsamps is -16777176", "has a header that"}},
         }) {
        std::string damaged = whole;
        damaged[at] = *byte;
        write_content("a.img", damaged);
        const finished end = run("check a.img");
        EXPECT_EQ(end.err, "");
        EXPECT_EQ(end.status, 1) << at;
        for (const std::string &finding : findings)
            EXPECT_NE(end.out.find("a.img: " + finding), std::string::npos)
                << at << ": " << finding << "\n"
                << end.out;
    }
    write_content("a.img", whole + "more");
    EXPECT_EQ(run("check a.img").out, "a.img: 4 bytes more than the header states\n");
    write_content("a.img", whole.substr(0, 244 + 5 * 64 * 3) +
                               std::string(whole.size() - 244 - 5 * 64 * 3, '\0'));
    EXPECT_EQ(run("check a.img").out, "a.img: band 0 is 0 from line 24 on, of 64\n");
    write_content("b.pgm", random_picture(9, 9, 1, 2, 5000).as_pnm({0}));
    run("convert b.pgm b.img");
    EXPECT_NE(run("check b.img").out.find("samples beyond 12 bits\n"), std::string::npos);
    expect_done("check b.pgm");
    write_content("c.pgm", content_of("b.pgm") + "more");
    EXPECT_EQ(run("check c.pgm").out, "c.pgm: 4 bytes more than the header states\n");
    fs::create_symlink("loop", "loop");
    const finished none = run("check missing loop b.pgm");
    EXPECT_EQ(none.status, 1);
    EXPECT_EQ(none.err, "imgfile: missing: No such file or directory\n"
                        "imgfile: loop: Too many levels of symbolic links\n");
}

struct golden_file {
    const char *name, *facts;  // facts: part of the output of info
    int nlines, nsamps, nbands, nbytes;
    std::vector<std::string> findings;
};

// data/README.md describes the files and states the formula of their samples.
picture golden_picture(const golden_file &golden)
{
    picture made{golden.nlines, golden.nsamps, golden.nbands, golden.nbytes, {}};
    for (int line = 0; line < golden.nlines; ++line)
        for (int samp = 0; samp < golden.nsamps; ++samp)
            for (int band = 0; band < golden.nbands; ++band)
                made.samples.push_back(golden.nbytes == 1
                                           ? (band * 101 + line * 31 + samp * 7) % 251
                                           : (band * 501 + line * 13 + samp * 3) % 4096);
    return made;
}

TEST_F(Tool, ReadsFilesMadeOutsideThisCode)
{
    const std::vector<golden_file> list{
        {"untiled_8bit.img",
         "big-endian\n  layout     band sequential\n  tiles      none\n  data at    byte 244\n",
         37,
         53,
         1,
         1,
         {"signature is not VITec"}},
        {"untiled_3bands_little.img",
         "little-endian\n  layout     band sequential\n",
         20,
         31,
         3,
         1,
         {}},
        {"tiled_3bands.img",
         "tiles of band planes\n  tiles      16 lines x 8 samples, 3 down x 7 across\n",
         37,
         53,
         3,
         1,
         {}},
        {"untiled_16bit.img", "2 bytes, 12 bits\n  order      big-endian\n", 29, 41, 1, 2, {}},
        {"tiled_16bit_little.img", "8 lines x 32 samples, 4 down x 2 across\n", 29, 41, 2, 2, {}},
        {"long_header.img",
         "data at    byte 504\n",
         9,
         11,
         1,
         1,
         {"image_block_link is 300, not 108", "header_length is 200, not 132"}},
        {"helava_2bands.d",
         "Helava\n  size       23 lines x 35 samples x 2 bands\n",
         23,
         35,
         2,
         1,
         {}},
        {"helava_little.d", "little-endian\n", 23, 35, 1, 1, {}},
    };
    for (const golden_file &golden : list) {
        const std::string file = IMGFILE_TEST_DATA "/" + std::string(golden.name);
        const picture source = golden_picture(golden);
        const finished info = run("info " + file);
        EXPECT_NE(info.out.find(golden.facts), std::string::npos) << info.out;
        EXPECT_NE(info.out.find(" bytes, as the header states\n"), std::string::npos) << info.out;
        const std::string found = run("check " + file).out;
        for (const std::string &finding : golden.findings)
            EXPECT_NE(found.find(finding), std::string::npos) << found;
        for (int band = 0; band < golden.nbands; ++band) {
            expect_done("convert " + file + " band.pgm --overwrite --band " + std::to_string(band));
            EXPECT_EQ(content_of("band.pgm"), source.as_pnm({band})) << file;
        }
        const auto facts = nlohmann::json::parse(run("stats --json " + file).out);
        const auto [low, high] = std::ranges::minmax(source.samples);
        int least = high, most = low;
        for (const auto &band : facts["bands"]) {
            least = std::min<int>(least, band["minimum"]);
            most = std::max<int>(most, band["maximum"]);
        }
        EXPECT_EQ(least, low) << file;
        EXPECT_EQ(most, high) << file;
    }
    const std::string cut = IMGFILE_TEST_DATA "/cut_in_line_20.img";
    EXPECT_NE(run("info " + cut).out.find("TRUNCATED: 884 of 2,205 are missing"),
              std::string::npos);
    EXPECT_EQ(run("convert " + cut + " cut.png").err,
              "imgfile: " + cut + ": truncated: line 20 of band 0 is missing\n");
    EXPECT_NE(run("check " + cut).out.find("truncated: line 20 of band 0 is missing\n"),
              std::string::npos);
}

TEST_F(Tool, ComparesAndMeasuresSamples)
{
    picture source = random_picture(30, 20, 3, 1, 200);
    source.samples[0] = 0;
    write_content("a.ppm", source.as_pnm({0, 1, 2}));
    expect_done("convert a.ppm a.img --tile 8");
    EXPECT_EQ(run("compare a.ppm a.img").out, "a.ppm and a.img are equal: 1,800 samples\n");
    source.samples[static_cast<std::size_t>((7 * 20 + 5) * 3 + 2)] ^= 64;
    source.samples[static_cast<std::size_t>((7 * 20 + 6) * 3)] ^= 1;
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

    const auto facts = nlohmann::json::parse(run("stats b.ppm --json --histogram h.png").out);
    for (int band = 0; band < 3; ++band) {
        double sum = 0, squares = 0, zeros = 0;
        int low = 255, high = 0;
        for (std::size_t i = static_cast<std::size_t>(band); i < source.samples.size(); i += 3) {
            const int value = source.samples[i];
            sum += value;
            squares += value * value;
            zeros += value == 0 ? 1 : 0;
            low = std::min(low, value);
            high = std::max(high, value);
        }
        const auto &seen = facts["bands"][static_cast<std::size_t>(band)];
        EXPECT_EQ(seen["minimum"], low);
        EXPECT_EQ(seen["maximum"], high);
        EXPECT_NEAR(seen["mean"], sum / 600, 1e-9);
        EXPECT_NEAR(seen["standard_deviation"], std::sqrt(squares / 600 - sum / 600 * sum / 600),
                    1e-6);
        EXPECT_NEAR(seen["share_of_zero"], zeros / 600, 1e-12);
        EXPECT_EQ(seen["beyond_stated_bits"], 0);
    }
    EXPECT_NE(run("info h.png").out.find("540 lines x 960 samples x 3 bands"), std::string::npos);
    fs::copy("b.ppm", "\xff.ppm");
    expect_done("stats \xff.ppm --histogram i.png --quiet");
    EXPECT_GT(fs::file_size("i.png"), fs::file_size("h.png") / 2);  // not empty

    expect_done("preview a.img p.png --size 16 --raw");
    const auto reduced = nlohmann::json::parse(run("info p.png --json").out);
    EXPECT_EQ(reduced[0]["lines"], 15);
    EXPECT_EQ(reduced[0]["samples"], 10);
    expect_done("convert p.png p.ppm");
    const std::string pixels = content_of("p.ppm");
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
