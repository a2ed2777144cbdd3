// imgfile info: what image files state of themselves. Read codecs/image.h first.
#include "codecs/recognise.h"
#include "commands/commands.h"
#include "commands/each_file.h"
#include "failure.h"

#include "common/grouped.h"

#include <cstdio>
#include <nlohmann/json.hpp>

namespace {

using json = nlohmann::ordered_json;

// Adds the facts that are null for other formats.
void describe_native(const native_facts &native, json &facts)
{
    facts["byte_order"] = native.big_endian ? "big" : "little";
    facts["layout"] = native.layout;
    if (!facts["tile_size"].is_null())
        facts["tile_grid"] = {{"down", native.tiles_down}, {"across", native.tiles_across}};
    facts["data_offset"] = native.data_offset;
    if (!native.created.empty()) facts["created"] = native.created;
}

json describe(const std::string &name)
{
    const auto image = open_reader(name);
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
    if (image->file_length != -1) facts["file_length"] = image->file_length;
    if (image->expected_length != -1) facts["expected_length"] = image->expected_length;
    if (image->native) describe_native(*image->native, facts);
    return facts;
}

void print_line(const char *label, const std::string &value)
{
    std::printf("  %-10s %s\n", label, value.c_str());
}

void print_length(const json &facts)
{
    if (facts["file_length"].is_null()) return;
    const std::int64_t length = facts["file_length"];
    std::string line = grouped(length) + " bytes";
    if (!facts["expected_length"].is_null()) {
        const std::int64_t expected = facts["expected_length"];
        if (length < expected)
            line += text(", TRUNCATED: ", grouped(expected - length), " of ", grouped(expected),
                         " are missing");
        else if (length > expected)
            line += text(", ", grouped(length - expected), " more than the header states");
        else
            line += ", as the header states";
    }
    print_line("length", line);
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

int run_info(const info_options &options)
{
    json all = json::array();
    const int status = for_each_file(options.files, [&](const std::string &name) {
        all.push_back(describe(name));
        if (!options.json) print(all.back());
        return true;
    });
    if (options.json)
        std::printf("%s\n", all.dump(2, ' ', false, json::error_handler_t::replace).c_str());
    return status;
}
