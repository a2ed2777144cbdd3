// Makes the requests of tasks. Read task.h first.
#include "task.h"

#include "base/count.h"

#include <algorithm>
#include <random>

namespace {

constexpr std::uint32_t SEED = 20'061;

std::size_t affordable(const image_set &images, std::size_t count)
{
    return images.side < FULL_SIDE ? 5 : count;
}

}  // namespace

std::vector<request> windows_anywhere(const image_set &images, std::size_t count,
                                      std::int32_t nlines, std::int32_t nsamps)
{
    std::mt19937 random(SEED);
    const auto position = [&](std::int32_t extent) {
        return static_cast<std::int32_t>(random() %
                                         static_cast<std::uint32_t>(images.side - extent + 1));
    };
    std::vector<request> all(affordable(images, count));
    for (request &each : all) {
        each = {0, 0, std::min(nlines, images.side), std::min(nsamps, images.side)};
        each.line = position(each.nlines);
        each.samp = position(each.nsamps);
    }
    return all;
}

std::vector<request> strips(const image_set &images, std::int32_t nlines)
{
    nlines = std::min(nlines, images.side);
    std::vector<request> all;
    for (std::int32_t line = 0; line < images.side; line += nlines)
        all.push_back({line, 0, nlines, images.side});
    return all;
}

std::vector<request> tile_runs(const image_set &images, std::size_t count, std::int32_t ntiles)
{
    const std::int32_t across = images.side / images.tile;
    ntiles = std::min(ntiles, across);
    std::mt19937 random(SEED);
    std::vector<request> all(affordable(images, count));
    for (request &each : all) {
        const auto first = random() % static_cast<std::uint32_t>(across * across - ntiles + 1);
        each = {static_cast<std::int32_t>(first), 0, ntiles, 0};
    }
    return all;
}

void add_candidate(std::vector<task> &tasks, std::string_view name, candidate added)
{
    std::ranges::find(tasks, name, &task::name)->candidates.push_back(std::move(added));
}
