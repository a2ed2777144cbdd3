// Histograms as a picture for a report.
#ifndef TOOL_HISTOGRAM_PICTURE_H
#define TOOL_HISTOGRAM_PICTURE_H

#include "histogram.h"

#include <string>
#include <vector>

// Returns the bytes of a PNG file that shows the histograms and their stretches.
std::string draw_histograms(const std::vector<band_histogram> &histograms,
                            const std::string &title);

#endif
