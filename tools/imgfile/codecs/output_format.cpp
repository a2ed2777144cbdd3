// The endings of file names and the formats they stand for. Read output_format.h first.
#include "codecs/output_format.h"

#include "codecs/codecs.h"
#include "failure.h"
#include "output_file.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <filesystem>

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

bool is_pnm(file_format format)
{
    return format == file_format::pgm || format == file_format::ppm || format == file_format::pnm;
}

}  // namespace

void check_png_name(const std::string &name)
{
    if (in_lower_case(std::filesystem::path(name).extension()) != ".png")
        throw wrong_usage(name + ": the picture is a PNG file; its name must end in .png");
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
        throw wrong_usage(text(name, ": cannot write ",
                               end.empty() ? "files without an ending" : end + " files", "; use ",
                               option));
    if (name == "-" && !is_pnm(found->format))
        throw wrong_usage("standard output takes only PGM and PPM");
    return found->format;
}

std::unique_ptr<image_writer> create_writer(output_file &out, file_format format, const shape &form,
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
