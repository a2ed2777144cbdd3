// Heights eroded on a coarse grid, refined to samples, with rivers drawn along the drainage. Read
// terrain.h first.
#include "terrain.h"

#include "noise.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <functional>
#include <queue>
#include <utility>

namespace {

constexpr int cell = 3;     // samples per cell of the coarse grid
constexpr int margin = 32;  // cells above the picture and on its left, from which water flows in

struct drainage {
    std::vector<std::size_t> order;     // cells; each follows the cell that it flows into
    std::vector<std::size_t> receiver;  // per cell: the next one downstream; the deepest has itself
    std::vector<double> area;           // per cell: number of cells whose water passes it
};

// Signed distance from the shore of the lake in the lower right, positive on land; 1 is the width
// of the picture.
double shore_distance(double y, double x)
{
    return std::hypot((x - 1.02) * 1.1, (y - 0.72) * 1.5) - 0.40 +
           0.11 * fractal_noise(y * 4, x * 4, 5, 11);
}

// Floods the land from the deepest cell, lowest cells first: every cell is reached from its lowest
// neighbour, and pits are filled.
drainage drain(field &height)
{
    const std::size_t ncells = height.values.size();
    drainage flow{{}, std::vector<std::size_t>(ncells, ncells), std::vector<double>(ncells, 1.0)};
    flow.order.reserve(ncells);
    using entry = std::pair<double, std::size_t>;
    std::priority_queue<entry, std::vector<entry>, std::greater<>> rising;
    const auto deepest = std::min_element(height.values.begin(), height.values.end());
    const auto spring = static_cast<std::size_t>(deepest - height.values.begin());
    flow.receiver[spring] = spring;
    rising.emplace(*deepest, spring);
    while (!rising.empty()) {
        const std::size_t here = rising.top().second;
        rising.pop();
        flow.order.push_back(here);
        const int line = static_cast<int>(here) / height.nsamps;
        const int samp = static_cast<int>(here) % height.nsamps;
        for (int l = std::max(line - 1, 0); l <= std::min(line + 1, height.nlines - 1); ++l) {
            for (int s = std::max(samp - 1, 0); s <= std::min(samp + 1, height.nsamps - 1); ++s) {
                const std::size_t next = height.index(l, s);
                if (flow.receiver[next] != ncells) continue;
                flow.receiver[next] = here;
                height.values[next] = std::max(height.values[next], height.values[here] + 1e-4);
                rising.emplace(height.values[next], next);
            }
        }
    }
    for (std::size_t i = ncells; i-- > 0;) {
        const std::size_t here = flow.order[i];
        if (flow.receiver[here] != here) flow.area[flow.receiver[here]] += flow.area[here];
    }
    return flow;
}

// Lifts the land and cuts rivers into it, deeper where more water flows and where the rock is
// softer. Slopes are limited to that of loose rock. Each round lifts unevenly, so that rivers do
// not follow the directions of the grid.
void erode(field &height, const field &uplift, const field &hardness, const drainage &flow,
           int round)
{
    const auto nsamps = static_cast<std::size_t>(height.nsamps);
    for (const std::size_t here : flow.order) {
        double &value = height.values[here];
        if (value < 0) continue;
        const std::size_t next = flow.receiver[here];
        const bool diagonal = here / nsamps != next / nsamps && here % nsamps != next % nsamps;
        const double distance = diagonal ? 1.4142 : 1.0, hard = hardness.values[here];
        const double lift =
            uplift.values[here] * (6 + 1.2 * hash_noise(round, static_cast<int>(here), 77));
        const double cut = 0.6 * std::sqrt(flow.area[here]) / distance / hard;
        value = (value + lift + cut * height.values[next]) / (1 + cut);
        value = std::min(value, height.values[next] + 0.62 * hard * distance);
    }
}

void stamp_disc(field &river, double line, double samp, double radius)
{
    const double reach = radius + 1.5;
    const int l0 = std::max(static_cast<int>(line - reach), 0);
    const int s0 = std::max(static_cast<int>(samp - reach), 0);
    for (int l = l0; l < line + reach && l < river.nlines; ++l) {
        for (int s = s0; s < samp + reach && s < river.nsamps; ++s) {
            const double cover = std::clamp(radius + 0.5 - std::hypot(l - line, s - samp), 0., 1.);
            river.at(l, s) = std::max(river.at(l, s), cover);
        }
    }
}

// Draws the rivers that carry enough water. Each point is moved towards the next one downstream, so
// that the grid is not visible.
field draw_rivers(int nlines, int nsamps, const field &height, const drainage &flow)
{
    std::vector<double> lines(flow.order.size()), samps(flow.order.size());
    for (const std::size_t here : flow.order) {
        const int line = static_cast<int>(here) / height.nsamps;
        const int samp = static_cast<int>(here) % height.nsamps;
        lines[here] = (line - margin + hash_noise(line, samp, 5)) * cell;
        samps[here] = (samp - margin + hash_noise(line, samp, 6)) * cell;
    }
    for (int round = 0; round < 8; ++round) {
        for (std::size_t i = flow.order.size(); i-- > 0;) {
            const std::size_t here = flow.order[i], next = flow.receiver[here];
            lines[here] = (lines[here] + lines[next]) / 2;
            samps[here] = (samps[here] + samps[next]) / 2;
        }
    }
    field river(nlines, nsamps);
    for (const std::size_t here : flow.order) {
        if (flow.area[here] < 900 || height.values[here] < -12) continue;
        const std::size_t next = flow.receiver[here];
        const double radius = std::min(0.012 * std::sqrt(flow.area[here]), 4.5);
        for (int step = 0; step < 5; ++step) {
            const double t = step * 0.2;
            stamp_disc(river, std::lerp(lines[here], lines[next], t),
                       std::lerp(samps[here], samps[next], t), radius);
        }
    }
    return river;
}

}  // namespace

double field::between(double line, double samp) const
{
    const int l0 = static_cast<int>(std::floor(line)), s0 = static_cast<int>(std::floor(samp));
    const auto weights = [](double t) {  // of four neighbours: a cubic B-spline, without creases
        return std::array{(1 - t) * (1 - t) * (1 - t) / 6, (3 * t * t * t - 6 * t * t + 4) / 6,
                          (-3 * t * t * t + 3 * t * t + 3 * t + 1) / 6, t * t * t / 6};
    };
    const auto wl = weights(line - l0), ws = weights(samp - s0);
    double sum = 0;
    for (int l = 0; l < 4; ++l)
        for (int s = 0; s < 4; ++s)
            sum += wl[static_cast<std::size_t>(l)] * ws[static_cast<std::size_t>(s)] *
                   at(std::clamp(l0 + l - 1, 0, nlines - 1), std::clamp(s0 + s - 1, 0, nsamps - 1));
    return sum;
}

terrain make_terrain(int nlines, int nsamps)
{
    field coarse(nlines / cell + margin + 2, nsamps / cell + margin + 2);
    field uplift = coarse, hardness = coarse, shore = coarse;
    for (int l = 0; l < coarse.nlines; ++l) {
        for (int s = 0; s < coarse.nsamps; ++s) {
            const double y = (l - margin) * 1.0 * cell / nsamps;
            const double x = (s - margin) * 1.0 * cell / nsamps;
            const double off = shore_distance(y, x);
            const double range = off + 0.35 * fractal_noise(y * 3, x * 3, 4, 21);
            const double hills = 12 + 12 * fractal_noise(l / 24.0, s / 24.0, 5, 3);
            shore.at(l, s) = off * nsamps;
            coarse.at(l, s) =
                off < 0 ? 90 * off
                        : 2 + 30 * off + hills * smooth_step(0, 0.3, off) + hash_noise(l, s, 9);
            uplift.at(l, s) = 0.008 + 0.75 * smooth_step(0.16, 0.62, range);
            hardness.at(l, s) =
                0.7 + 0.4 * hash_noise(l, s, 41) + 0.5 * fractal_noise(l / 30.0, s / 30.0, 3, 43);
        }
    }
    drainage flow;
    for (int round = 0; round < 50; ++round) {
        flow = drain(coarse);
        erode(coarse, uplift, hardness, flow, round);
    }

    terrain land{field(nlines, nsamps), draw_rivers(nlines, nsamps, coarse, flow),
                 field(nlines, nsamps)};
    for (int l = 0; l < nlines; ++l) {
        for (int s = 0; s < nsamps; ++s) {
            const double line = l * 1.0 / cell + margin - 0.5;
            const double samp = s * 1.0 / cell + margin - 0.5;
            const double base = cell * coarse.between(line, samp);
            const double rough = smooth_step(0, 160, base);
            land.height.at(l, s) = base + rough * 9 * fractal_noise(l / 24.0, s / 24.0, 5, 31);
            land.shore.at(l, s) = shore.between(line, samp);
        }
    }
    return land;
}
