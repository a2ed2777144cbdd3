// The colours of the ground, the light on it, and both pictures. Read scene.h and terrain.h first.
#include "scene.h"

#include "noise.h"
#include "terrain.h"

#include <algorithm>
#include <array>
#include <cmath>

namespace {

constexpr int nlines = 1210, nsamps = 1530;  // not multiples of a tile size

// The share of light that the ground reflects: red, green, blue, near infrared.
using colour = std::array<double, 4>;

constexpr colour grass{0.30, 0.36, 0.17, 0.46}, forest{0.10, 0.17, 0.08, 0.34};
constexpr colour meadow{0.42, 0.40, 0.25, 0.38}, rock{0.43, 0.38, 0.34, 0.30};
constexpr colour snow{0.93, 0.95, 0.98, 0.78}, sand{0.72, 0.65, 0.48, 0.50};
constexpr colour shallow{0.16, 0.42, 0.42, 0.07}, deep{0.02, 0.09, 0.17, 0.02};
constexpr colour stream{0.12, 0.24, 0.26, 0.05};
constexpr std::array<colour, 6> crops{{{0.66, 0.57, 0.33, 0.48},
                                       {0.25, 0.38, 0.14, 0.58},
                                       {0.44, 0.33, 0.23, 0.28},
                                       {0.36, 0.44, 0.20, 0.52},
                                       {0.56, 0.50, 0.28, 0.42},
                                       {0.18, 0.31, 0.12, 0.64}}};

// Returns a mixture of two colours; `share`: that of `added`, 0 to 1.
colour mix(const colour &ground, const colour &added, double share)
{
    colour result;
    for (std::size_t i = 0; i < result.size(); ++i)
        result[i] = std::lerp(ground[i], added[i], share);
    return result;
}

// Returns the colour of farmland: parcels are the cells of a rotated, irregular grid, each with a
// crop and furrows, and hedges lie between them.
colour farmland(double line, double samp)
{
    constexpr double size = 23;
    const double v =
        (0.9 * line - 0.44 * samp) / size + 4 * fractal_noise(line / 500, samp / 500, 2, 61);
    const double u =
        (0.44 * line + 0.9 * samp) / size * 0.7 + 4 * fractal_noise(line / 500, samp / 500, 2, 65);
    double nearest = 9, second = 9, parcel = 0;
    for (int l = static_cast<int>(std::floor(v)) - 1; l <= std::floor(v) + 1; ++l) {
        for (int s = static_cast<int>(std::floor(u)) - 1; s <= std::floor(u) + 1; ++s) {
            const double away = std::max(std::abs(l + 0.2 + 0.6 * hash_noise(l, s, 62) - v),
                                         std::abs(s + 0.2 + 0.6 * hash_noise(l, s, 63) - u));
            if (away < nearest) parcel = hash_noise(l, s, 64);
            second = std::clamp(away, nearest, second);
            nearest = std::min(nearest, away);
        }
    }
    const colour &crop = crops[static_cast<std::size_t>(parcel * 6)];
    const double furrows = 0.08 * std::sin((parcel > 0.5 ? u : v) * 40) * (parcel * 7.3 - 3);
    const double hedge = 1 - smooth_step(0.02, 0.07, second - nearest);
    return mix(mix(crop, forest, 0.25 * parcel + 0.2 * furrows), forest, 0.8 * hedge);
}

struct ground {
    explicit ground(const terrain &shape) : land{shape} {}
    double height(int line, int samp) const
    {
        return land.height.at(std::clamp(line, 0, nlines - 1), std::clamp(samp, 0, nsamps - 1));
    }
    double slope(int line, int samp) const
    {
        return std::hypot(height(line + 1, samp) - height(line - 1, samp),
                          height(line, samp + 1) - height(line, samp - 1)) /
               2;
    }
    colour cover(int line, int samp) const;
    double sunlight(int line, int samp) const;

    const terrain &land;
};

colour ground::cover(int line, int samp) const
{
    const double high = height(line, samp), steep = slope(line, samp);
    if (high < 0) return mix(shallow, deep, 1 - std::exp(high / 22));
    const double patch = fractal_noise(line / 60.0, samp / 60.0, 5, 71);
    const double grain = fractal_noise(line / 4.0, samp / 4.0, 2, 72);
    const double cold = high / 120 + 0.25 * patch;

    colour result = mix(grass, meadow, smooth_step(0.2, 0.6, cold));
    const double flat = (1 - smooth_step(0.05, 0.16, steep)) * (1 - smooth_step(18, 30, high));
    result =
        mix(result, farmland(line, samp), flat * smooth_step(8, 12, land.shore.at(line, samp)));
    const double trees = smooth_step(0.0, 0.12,
                                     0.9 * patch + 0.3 * smooth_step(14, 30, high) -
                                         smooth_step(0.4, 0.75, cold) - 0.06);
    result = mix(result, mix(forest, grass, 0.25 + 0.5 * grain), trees);
    result = mix(result, rock, smooth_step(0.5, 0.75, steep + 0.3 * cold + 0.2 * grain - 0.1));
    result = mix(result, snow, smooth_step(0.56, 0.68, cold + 0.1 * grain - 0.25 * steep));
    result = mix(sand, result, smooth_step(1.5, 5, land.shore.at(line, samp) + 4 * patch));
    for (double &part : result) part *= 1 + 0.12 * grain;
    return mix(result, stream, land.river.at(line, samp));
}

// Returns 0 in a shadow, 1 on level ground, and more on a slope that faces the sun in the
// north-west.
double ground::sunlight(int line, int samp) const
{
    constexpr double rise = 0.72;  // height that the light loses per sample
    const double high = std::max(height(line, samp), 0.0);
    double shade = 0;
    for (int away = 2; away < 90; away += 3) {
        const double over = height(line - away * 7 / 10, samp - away * 7 / 10) - high;
        shade = std::max(shade, over - rise * away);
    }
    const double dl = std::max(height(line + 1, samp), 0.) - std::max(height(line - 1, samp), 0.);
    const double ds = std::max(height(line, samp + 1), 0.) - std::max(height(line, samp - 1), 0.);
    const double facing = (rise + 0.7 * (dl + ds) / 2) / std::hypot(dl / 2, ds / 2, 1.0) / rise;
    return std::max(facing, 0.0) * (1 - smooth_step(0, 4, shade));
}

// Whether a point lies in the frame of the near-infrared sensor, which is rotated in the picture.
bool in_frame(int line, int samp)
{
    const double y = line - nlines / 2.0, x = samp - nsamps / 2.0;
    return std::abs(x + 0.17 * y) < nsamps * 0.40 && std::abs(y - 0.17 * x) < nlines * 0.385;
}

}  // namespace

scene make_scene()
{
    const terrain land = make_terrain(nlines, nsamps);
    const ground view{land};
    scene result{picture{nlines, nsamps, 3, 255}, picture{nlines, nsamps, 1, 4095}};
    // The light of the sun and of the sky in red, green and blue. The reflected light is mapped to
    // samples by a curve like that of film.
    constexpr std::array<double, 3> sun{1.16, 1.08, 0.98}, sky{0.22, 0.27, 0.36};
    for (int line = 0; line < nlines; ++line) {
        for (int samp = 0; samp < nsamps; ++samp) {
            const colour ground_colour = view.cover(line, samp);
            const double light = view.sunlight(line, samp);
            for (int band = 0; band < 3; ++band) {
                const auto b = static_cast<std::size_t>(band);
                const double seen = ground_colour[b] * (sun[b] * light + sky[b]) + 0.02 * sky[b];
                const double shown = std::pow(1 - std::exp(-1.4 * seen), 1 / 1.15);
                result.rgb.set_sample(band, line, samp,
                                      static_cast<int>(255 * std::clamp(shown, 0.0, 1.0)));
            }
            if (!in_frame(line, samp)) continue;
            const double noise = hash_noise(line, samp, 81) + hash_noise(line, samp, 82) - 1;
            const double gain = 1 + 0.012 * (hash_noise(0, samp, 83) - 0.5);  // per detector
            const double seen = ground_colour[3] * (light + 0.12) * gain * 3100 + 130 + 25 * noise;
            result.gray12.set_sample(0, line, samp, std::clamp(static_cast<int>(seen), 1, 4095));
        }
    }
    return result;
}
