// imgfile info: what an image file is.
#include "commands.h"
#include "failure.h"
#include "header.h"
#include "native.h"
#include "walk.h"

#include "base/img_desc.h"
#include "std/std.h"

#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>

namespace {

using json = nlohmann::ordered_json;

constexpr std::array layouts{"band sequential", "pixel interleaved", "tiles of band planes",
                             "bands of tiles", "tiles of pixels"};

// What only VITec and Helava files have. Other formats leave these null.
void describe_native(const std::string &name, json &facts)
{
    const native_image image(name);
    const img_desc &desc = image.desc();
    const auto vitec = read_vitec_header(name);
    const auto helava = read_helava_trailer(name);
    facts["byte_order"] = (vitec ? vitec->big_endian : helava->big_endian) ? "big" : "little";
    facts["layout"] = layouts.at(static_cast<std::size_t>(desc.layout));
    if (img_is_tiled(&desc))
        facts["tile_grid"] = {{"down", desc.std_file->tiles_down},
                              {"across", desc.std_file->tiles_across}};
    facts["data_offset"] = desc.std_file->data_offset;
    if (vitec && vitec->has_date()) facts["created"] = vitec->date();
}

json describe(const std::string &name)
{
    const auto image = open_image(name);
    const shape &form = image->form;
    json facts{{"file", name},
               {"type", name_of(image->format)},
               {"byte_order", nullptr},
               {"lines", form.nlines},
               {"samples", form.nsamps},
               {"bands", form.nbands},
               {"bytes_per_sample", form.nbytes},
               {"bits_per_sample", form.nbits},
               {"layout", nullptr},
               {"tile_size", nullptr},
               {"tile_grid", nullptr},
               {"data_offset", nullptr},
               {"file_length", nullptr},
               {"expected_length", nullptr},
               {"created", nullptr}};
    if (image->tiles.nlines != 0)
        facts["tile_size"] = {{"lines", image->tiles.nlines}, {"samples", image->tiles.nsamps}};
    std::error_code unknown;
    const auto length = std::filesystem::file_size(name, unknown);
    if (!unknown) facts["file_length"] = length;
    if (image->length != -1) facts["expected_length"] = image->length;
    if (image->format == file_format::vitec || image->format == file_format::helava)
        describe_native(name, facts);
    return facts;
}

void print_line(const char *what, const std::string &value)
{
    std::printf("  %-10s %s\n", what, value.c_str());
}

void print_length(const json &facts)
{
    if (facts["file_length"].is_null()) return;
    const std::int64_t length = facts["file_length"];
    std::string told = grouped(length) + " bytes";
    if (!facts["expected_length"].is_null()) {
        const std::int64_t expected = facts["expected_length"];
        if (length < expected)
            told += text(", CUT SHORT: ", grouped(expected - length), " of ", grouped(expected),
                         " are missing");
        else if (length > expected)
            told += text(", ", grouped(length - expected), " more than the header asks for");
        else
            told += ", as the header asks for";
    }
    print_line("length", told);
}

void print(const json &facts)
{
    const auto number = [&](const char *key) { return facts[key].get<std::int32_t>(); };
    std::printf("%s: %s\n", in_one_line(facts["file"]).c_str(),
                facts["type"].get<std::string>().c_str());
    print_line("size", text(number("lines"), " lines x ", number("samples"), " samples x ",
                            number("bands"), number("bands") == 1 ? " band" : " bands"));
    print_line("samples", text(number("bytes_per_sample"),
                               number("bytes_per_sample") == 1 ? " byte" : " bytes", ", ",
                               number("bits_per_sample"), " bits"));
    if (!facts["byte_order"].is_null())
        print_line("order", facts["byte_order"].get<std::string>() + "-endian");
    if (!facts["layout"].is_null()) print_line("layout", facts["layout"].get<std::string>());
    std::string tiles = "none";
    if (!facts["tile_size"].is_null())
        tiles = text(facts["tile_size"]["lines"], " lines x ", facts["tile_size"]["samples"],
                     " samples");
    if (!facts["tile_grid"].is_null())
        tiles += text(", ", facts["tile_grid"]["down"], " down x ", facts["tile_grid"]["across"],
                      " across");
    print_line("tiles", tiles);
    if (!facts["data_offset"].is_null())
        print_line("data at", text("byte ", number("data_offset")));
    print_length(facts);
    if (!facts["created"].is_null()) print_line("created", facts["created"].get<std::string>());
}

}  // namespace

int run_info(const info_options &asked)
{
    int status = 0;
    json all = json::array();
    for (const std::string &name : asked.files) {
        try {
            all.push_back(describe(name));
            if (!asked.json) print(all.back());
        } catch (const failure &failed) {
            std::fflush(stdout);
            std::fprintf(stderr, "imgfile: %s\n", failed.what());
            status = 1;
        }
    }
    if (asked.json)
        std::printf("%s\n", all.dump(2, ' ', false, json::error_handler_t::replace).c_str());
    return status;
}
