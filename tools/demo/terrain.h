// A generated landscape: heights eroded by water, a lake, and the rivers that feed it.
#ifndef DEMO_TERRAIN_H
#define DEMO_TERRAIN_H

#include <cstddef>
#include <vector>

// A plane of real numbers.
struct field {
    field(int lines, int samps)
        : nlines{lines}, nsamps{samps},
          values(static_cast<std::size_t>(lines) * static_cast<std::size_t>(samps))
    {
    }
    std::size_t index(int line, int samp) const
    {
        return static_cast<std::size_t>(line) * static_cast<std::size_t>(nsamps) +
               static_cast<std::size_t>(samp);
    }
    double &at(int line, int samp) { return values[index(line, samp)]; }
    double at(int line, int samp) const { return values[index(line, samp)]; }
    double between(double line, double samp) const;  // interpolated; outside, that of the border

    int nlines, nsamps;
    std::vector<double> values;
};

struct terrain {
    field height;  // above the lake, in samples; below 0: the lake's floor
    field river;   // 0: dry .. 1: covered by a river
    field shore;   // approximate distance from the lake, in samples
};

terrain make_terrain(int nlines, int nsamps);

#endif
