// Which format a file has, and which one it is to have.
#include "descriptor.h"
#include "failure.h"
#include "image.h"
#include "output.h"

#include "formats/helava.h"
#include "formats/vitec.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

struct ending {
    const char *text;
    file_format format;
};
constexpr std::array<ending, 9> endings{{{".img", file_format::vitec},
                                         {".d", file_format::helava},
                                         {".pgm", file_format::pgm},
                                         {".ppm", file_format::ppm},
                                         {".pnm", file_format::pnm},
                                         {".png", file_format::png},
                                         {".tif", file_format::tiff},
                                         {".tiff", file_format::tiff},
                                         {".btf", file_format::tiff}}};

std::string in_lower_case(std::string text)
{
    std::ranges::transform(text, text.begin(), [](unsigned char c) { return std::tolower(c); });
    return text;
}

// A file without a name, for what may be large.
int open_temporary()
{
    const char *const chosen = std::getenv("TMPDIR");
    std::string path = std::string(chosen != nullptr ? chosen : "/var/tmp") + "/imgfile_XXXXXX";
    const int fd = ::mkostemp(path.data(), O_CLOEXEC);
    if (fd == -1) throw failure(path, system_text(errno));
    ::unlink(path.c_str());
    return fd;
}

// Standard input as a file that can be read twice.
int spool_standard_input()
{
    descriptor file(open_temporary());
    const auto fail = [](const char *what) {
        throw failure("standard input", what + system_text(errno));
    };
    std::array<char, 65536> bytes;
    for (;;) {
        const ssize_t got = ::read(STDIN_FILENO, bytes.data(), bytes.size());
        if (got == 0) return file.release();
        if (got == -1 && errno != EINTR) fail("cannot be read: ");
        for (ssize_t done = 0; done < got;) {
            const ssize_t written =
                ::write(file, bytes.data() + done, static_cast<std::size_t>(got - done));
            if (written == -1 && errno != EINTR) fail("cannot be copied to a temporary file: ");
            done += std::max<ssize_t>(written, 0);
        }
    }
}

int open_to_read(const std::string &name)
{
    if (name == "-") {
        static const int spool = spool_standard_input();
        return open_again(spool, "standard input");
    }
    descriptor file(::open(name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    struct stat status;
    if (file == -1 || ::fstat(file, &status) == -1) throw failure(name, system_text(errno));
    if (!S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode))
        throw failure(name, S_ISDIR(status.st_mode) ? "is a folder" : "is not a regular file");
    return file.release();
}

bool is_pnm(file_format format)
{
    return format == file_format::pgm || format == file_format::ppm || format == file_format::pnm;
}

std::string bytes_at(int fd, std::int64_t offset, std::size_t count)
{
    std::string bytes(count, '\0');
    const ssize_t got = ::pread(fd, bytes.data(), count, std::max<std::int64_t>(offset, 0));
    bytes.resize(static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
    return bytes;
}

}  // namespace

const char *name_of(file_format format)
{
    constexpr std::array names{"VITec", "Helava", "PGM", "PPM", "PNM", "PNG", "TIFF"};
    return names.at(static_cast<std::size_t>(format));
}

band_list image_reader::all_bands() const
{
    constexpr std::int32_t most = 4096;  // a header may say anything
    if (form.nbands > most)
        throw failure(name, text("says that it has ", form.nbands, " bands; at most ", most,
                                 " are handled at once"));
    band_list bands(static_cast<std::size_t>(form.nbands));
    std::iota(bands.begin(), bands.end(), 0);
    return bands;
}

void check_png_name(const std::string &name)
{
    if (in_lower_case(std::filesystem::path(name).extension()) != ".png")
        throw wrong_usage(name + ": the picture will be a PNG file; let its name end in .png");
}

file_format format_of_output(const std::string &name, const std::string &wanted,
                             const std::string &option)
{
    if (name == "-" && wanted.empty()) return file_format::pnm;
    const std::string end = in_lower_case(
        wanted.empty() ? std::filesystem::path(name).extension().string() : "." + wanted);
    if (end == ".vitec") return file_format::vitec;
    if (end == ".helava") return file_format::helava;
    const auto *const found =
        std::ranges::find_if(endings, [&end](const ending &each) { return end == each.text; });
    if (found == endings.end())
        throw wrong_usage(text(name, ": ", end.empty() ? "a name without an ending" : end,
                               " tells no format that can be written; say ", option));
    if (name == "-" && !is_pnm(found->format))
        throw wrong_usage("only PGM and PPM can go to standard output");
    return found->format;
}

namespace {

bool is_word(const std::string &bytes, std::uint32_t magic, std::uint32_t swapped_magic)
{
    std::uint32_t word = 0;
    if (bytes.size() == sizeof word) std::memcpy(&word, bytes.data(), sizeof word);
    return word == magic || word == swapped_magic;
}

std::unique_ptr<image_reader> open_by_first_bytes(const std::string &name)
{
    descriptor file(open_to_read(name));
    const std::string shown = name == "-" ? "standard input" : name;
    const std::string start = bytes_at(file, 0, 4);
    // Samples of a Helava file come first, and may look like the beginning of anything.
    const std::string end = bytes_at(file, ::lseek(file, 0, SEEK_END) - 4, 4);
    const bool is_native = is_word(start, IMG_VITEC_MAGIC, IMG_VITEC_SWAPPED_MAGIC) ||
                           is_word(end, IMG_HELAVA_MAGIC, IMG_HELAVA_SWAPPED_MAGIC);
    ::lseek(file, 0, SEEK_SET);
    if (start.empty()) throw failure(shown, "is empty");
    if (!is_native) {
        if (start.size() == 4 && start[0] == 'P' && start[1] >= '1' && start[1] <= '7')
            return open_pnm(shown, file.release());
        if (start == "\x89PNG") return open_png(shown, file.release());
        if (start.starts_with("II*") || start.starts_with("II+") ||
            start == std::string("MM\0*", 4) || start == std::string("MM\0+", 4))
            return open_tiff(shown, file.release());
    }
    if (name == "-") throw failure(shown, "is no PGM, PPM, PNG or TIFF picture");
    return open_native(name);
}

}  // namespace

std::unique_ptr<image_reader> open_image(const std::string &name)
{
    auto image = open_by_first_bytes(name);
    const shape &form = image->form;
    if (1.0 * form.nlines * form.nsamps * form.nbands * form.nbytes > 1e18)
        throw failure(image->name, "says that it has more samples than any file can hold");
    return image;
}

std::unique_ptr<image_writer> create_image(output_file &out, file_format format, const shape &form,
                                           tile_size tiles)
{
    if (tiles.nlines != 0 && (is_pnm(format) || format == file_format::png))
        throw failure(out.name(), text(name_of(format), " files have no tiles"));
    switch (format) {
    case file_format::pgm:
    case file_format::ppm:
    case file_format::pnm:
        return create_pnm(out, format, form);
    case file_format::png:
        return create_png(out, form);
    case file_format::tiff:
        return create_tiff(out, form, tiles);
    default:
        return create_native(out, format, form, tiles);
    }
}
