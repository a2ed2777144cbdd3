// imgfile stats: statistics of the samples of an image. Read histogram.h first.
#include "codecs/output_format.h"
#include "codecs/recognise.h"
#include "commands/commands.h"
#include "failure.h"
#include "histogram.h"
#include "histogram_picture.h"
#include "output_file.h"

#include "common/grouped.h"

#include <cstdio>
#include <filesystem>
#include <nlohmann/json.hpp>

namespace {

using json = nlohmann::ordered_json;

json facts_of(const band_histogram &histogram)
{
    return {{"band", histogram.band},
            {"minimum", histogram.lowest()},
            {"maximum", histogram.highest()},
            {"mean", histogram.mean()},
            {"standard_deviation", histogram.deviation()},
            {"share_of_zero", histogram.share_of_zero()},
            {"stated_bits", histogram.nbits},
            {"beyond_stated_bits", histogram.beyond()}};
}

void print(const band_histogram &histogram)
{
    std::printf("band %d\n"
                "  minimum    %d\n"
                "  maximum    %d\n"
                "  mean       %.3f\n"
                "  deviation  %.3f\n"
                "  zero       %.2f %%\n"
                "  beyond     %s samples beyond %d bits\n",
                histogram.band, histogram.lowest(), histogram.highest(), histogram.mean(),
                histogram.deviation(), 100 * histogram.share_of_zero(),
                grouped(static_cast<std::int64_t>(histogram.beyond())).c_str(), histogram.nbits);
    print_histogram(histogram, 20);
}

}  // namespace

int run_stats(const stats_options &options)
{
    if (!options.histogram.empty()) check_png_name(options.histogram);
    const auto image = open_reader(options.in);
    if (image->form.nsamples() == 0) throw failure(image->name, "has no samples");
    std::unique_ptr<output_file> out;
    if (!options.histogram.empty())
        out = std::make_unique<output_file>(options.histogram, options.overwrite, image->identity);
    const auto all = measure_histograms(*image);
    if (options.json) {
        json bands = json::array();
        for (const band_histogram &each : all) bands.push_back(facts_of(each));
        const json facts{{"file", options.in}, {"bands", bands}};
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
