// imgfile stats: what the samples of an image are like.
#include "commands.h"
#include "failure.h"
#include "histogram.h"
#include "output.h"
#include "walk.h"

#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>

namespace {

using json = nlohmann::ordered_json;

double share_of_zero(const band_histogram &of)
{
    return static_cast<double>(of.counts[0]) / static_cast<double>(of.total());
}

json facts_of(const band_histogram &of)
{
    return {{"band", of.band},
            {"minimum", of.lowest()},
            {"maximum", of.highest()},
            {"mean", of.mean()},
            {"standard_deviation", of.deviation()},
            {"share_of_zero", share_of_zero(of)},
            {"stated_bits", of.nbits},
            {"beyond_stated_bits", of.beyond()}};
}

void print(const band_histogram &of)
{
    std::printf("band %d\n"
                "  minimum    %d\n"
                "  maximum    %d\n"
                "  mean       %.3f\n"
                "  deviation  %.3f\n"
                "  zero       %.2f %%\n"
                "  beyond     %s samples beyond %d bits\n",
                of.band, of.lowest(), of.highest(), of.mean(), of.deviation(),
                100 * share_of_zero(of), grouped(static_cast<std::int64_t>(of.beyond())).c_str(),
                of.nbits);
    print_histogram(of, 20);
}

}  // namespace

int run_stats(const stats_options &asked)
{
    if (!asked.histogram.empty()) check_png_name(asked.histogram);
    const auto image = open_image(asked.in);
    if (image->form.nsamples() == 0) throw failure(image->name, "is empty: it has no samples");
    std::unique_ptr<output_file> out;
    if (!asked.histogram.empty())
        out = std::make_unique<output_file>(asked.histogram, asked.overwrite,
                                            asked.in == "-" ? "" : asked.in);
    const auto all = measure_histograms(*image);
    if (asked.json) {
        json bands = json::array();
        for (const band_histogram &each : all) bands.push_back(facts_of(each));
        const json facts{{"file", asked.in}, {"bands", bands}};
        std::printf("%s\n", facts.dump(2, ' ', false, json::error_handler_t::replace).c_str());
    } else {
        for (const band_histogram &each : all) print(each);
    }
    if (out) {
        const std::string picture =
            draw_histograms(all, std::filesystem::path(image->name).filename());
        out->write(picture.data(), picture.size());
        out->commit(static_cast<std::int64_t>(picture.size()));
    }
    return 0;
}
