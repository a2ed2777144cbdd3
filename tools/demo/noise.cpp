// Hashes of cell positions, and gradient noise between them. Read noise.h first.
#include "noise.h"

#include <algorithm>
#include <cmath>
#include <cstdint>

double hash_noise(int line, int samp, unsigned seed)
{
    auto h = static_cast<std::uint32_t>(line) * 0x9E3779B9U ^
             static_cast<std::uint32_t>(samp) * 0x6A09E667U ^ (seed + 1U) * 0xBB67AE85U;
    h = (h ^ h >> 15) * 0x9E3779B9U;
    h = (h ^ h >> 12) * 0xA54FF53BU;
    return static_cast<double>(h ^ h >> 15) / 4294967296.0;
}

namespace {

// Each corner of a cell has a slope of its own.
double gradient_noise(double line, double samp, unsigned seed)
{
    const int l0 = static_cast<int>(std::floor(line)), s0 = static_cast<int>(std::floor(samp));
    const double dl = line - l0, ds = samp - s0;
    const auto corner = [&](int l, int s) {
        return (hash_noise(l0 + l, s0 + s, seed) - 0.5) * (dl - l) +
               (hash_noise(l0 + l, s0 + s, ~seed) - 0.5) * (ds - s);
    };
    const auto ease = [](double t) { return t * t * t * (t * (t * 6 - 15) + 10); };
    return 3.6 * std::lerp(std::lerp(corner(0, 0), corner(0, 1), ease(ds)),
                           std::lerp(corner(1, 0), corner(1, 1), ease(ds)), ease(dl));
}

}  // namespace

double fractal_noise(double line, double samp, int noctaves, unsigned seed)
{
    double sum = 0, strength = 0.5;
    for (int octave = 0; octave < noctaves; ++octave) {
        sum += strength * gradient_noise(line, samp, seed + static_cast<unsigned>(octave));
        strength /= 2;
        line *= 2;
        samp *= 2;
    }
    return sum;
}

double smooth_step(double low, double high, double value)
{
    const double t = std::clamp((value - low) / (high - low), 0.0, 1.0);
    return t * t * (3 - 2 * t);
}
