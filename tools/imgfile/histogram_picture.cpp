// Drawing histograms with cairo: axes, a filled outline of the counts and a line for the stretch.
// Read histogram_picture.h first.
#include "histogram_picture.h"

#include "failure.h"

#include "common/grouped.h"

#include <algorithm>
#include <array>
#include <cairo.h>
#include <cmath>
#include <fontconfig/fontconfig.h>

namespace {

constexpr double WIDTH = 960, HEIGHT = 540;
constexpr double LEFT = 90, RIGHT = 70, TOP = 64, BOTTOM = 64;  // margins
constexpr double PLOT_WIDTH = WIDTH - LEFT - RIGHT, PLOT_HEIGHT = HEIGHT - TOP - BOTTOM;

struct color {
    double red, green, blue;
};
constexpr color dark{0.15, 0.17, 0.2}, faint{0.88, 0.89, 0.91};
constexpr std::array colors{color{0.80, 0.22, 0.20}, color{0.16, 0.55, 0.25},
                            color{0.13, 0.37, 0.75}};
constexpr color gray{0.36, 0.45, 0.56}, orange{0.85, 0.42, 0.05};

struct caption {
    std::string text;
    color ink;
};

// A picture with a plot of values in [0, high] and counts in [0, top].
class plot {
public:
    plot(std::int32_t high, double top)
        : m_surface(cairo_image_surface_create(CAIRO_FORMAT_RGB24, static_cast<int>(WIDTH),
                                               static_cast<int>(HEIGHT))),
          m_cairo(cairo_create(m_surface)), m_high(high), m_top(top)
    {
        use({1, 1, 1});
        cairo_paint(m_cairo);
        cairo_select_font_face(m_cairo, "sans-serif", CAIRO_FONT_SLANT_NORMAL,
                               CAIRO_FONT_WEIGHT_NORMAL);
    }
    ~plot()
    {
        cairo_destroy(m_cairo);
        cairo_surface_destroy(m_surface);
        cairo_debug_reset_static_data();  // frees the caches of fonts
        FcFini();
    }
    plot(const plot &) = delete;
    plot &operator=(const plot &) = delete;

    double x(std::int64_t value) const
    {
        return LEFT + static_cast<double>(value) / m_high * PLOT_WIDTH;
    }
    // `share` of the plot's height, from 0 to 1.
    static double y(double share) { return TOP + (1 - share) * PLOT_HEIGHT; }

    void use(color ink, double opacity = 1)
    {
        cairo_set_source_rgba(m_cairo, ink.red, ink.green, ink.blue, opacity);
    }
    // Returns the width of the text. `align`: the part of it that lies left of `text_x`.
    double write(const std::string &words, double text_x, double text_y, double align, double size)
    {
        cairo_set_font_size(m_cairo, size);
        cairo_text_extents_t extents;
        cairo_text_extents(m_cairo, words.c_str(), &extents);
        cairo_move_to(m_cairo, text_x - align * extents.x_advance, text_y);
        cairo_show_text(m_cairo, words.c_str());
        return extents.x_advance;
    }
    void line(double x0, double y0, double x1, double y1, double width)
    {
        cairo_set_line_width(m_cairo, width);
        cairo_move_to(m_cairo, x0, y0);
        cairo_line_to(m_cairo, x1, y1);
        cairo_stroke(m_cairo);
    }

    void axes(const std::string &title, const std::vector<caption> &captions)
    {
        use(dark);
        write(title, LEFT, 30, 0, 18);
        double left = LEFT;
        for (const caption &each : captions) {
            use(each.ink);
            left += write(each.text, left, 50, 0, 12) + 18;
        }
        use(dark);
        const std::int64_t step = rounded_step(m_high / 8.0);
        for (std::int64_t value = 0; value <= m_high; value += step) {
            use(faint);
            line(x(value), y(0), x(value), y(1), 1);
            use(dark);
            write(grouped(value), x(value), y(0) + 18, 0.5, 12);
        }
        const std::int64_t rise = rounded_step(m_top / 5);
        for (std::int64_t count = 0; static_cast<double>(count) <= m_top; count += rise) {
            const double height = y(static_cast<double>(count) / m_top);
            use(faint);
            line(LEFT, height, LEFT + PLOT_WIDTH, height, 1);
            use(dark);
            write(grouped(count), LEFT - 8, height + 4, 1, 12);
        }
        for (const int byte : {0, 64, 128, 192, 255})
            write(std::to_string(byte), LEFT + PLOT_WIDTH + 8, y(byte / 255.0) + 4, 0, 12);
        write("sample value", LEFT + PLOT_WIDTH / 2, HEIGHT - 18, 0.5, 13);
        write_upright("samples", 18);
        write_upright("byte after the stretch (line)", WIDTH - 14);
        line(LEFT, y(0), LEFT + PLOT_WIDTH, y(0), 1);
    }

    void draw(const band_histogram &histogram, color bars, color curve, std::int32_t bin)
    {
        cairo_move_to(m_cairo, x(0), y(0));
        for (std::int32_t first = 0; first < m_high; first += bin) {
            const double share = std::min(sum(histogram, first, bin) / m_top, 1.0);
            cairo_line_to(m_cairo, x(first), y(share));
            cairo_line_to(m_cairo, x(first + bin), y(share));
        }
        cairo_line_to(m_cairo, x(m_high), y(0));
        cairo_close_path(m_cairo);
        use(bars, 0.45);
        cairo_fill(m_cairo);

        const auto &table = histogram.stretch.table();
        for (std::int32_t value = 0; value < m_high; value += bin) {
            const auto index = std::min(static_cast<std::size_t>(value), table.size() - 1);
            cairo_line_to(m_cairo, x(value), y(table[index] / 255.0));
        }
        use(curve);
        cairo_set_line_width(m_cairo, 2);
        cairo_stroke(m_cairo);
    }

    std::string as_png() const
    {
        if (const cairo_status_t status = cairo_status(m_cairo); status != CAIRO_STATUS_SUCCESS)
            throw std::runtime_error(cairo_status_to_string(status));
        std::string bytes;
        const auto append = [](void *target, const unsigned char *data, unsigned count) {
            static_cast<std::string *>(target)->append(reinterpret_cast<const char *>(data), count);
            return CAIRO_STATUS_SUCCESS;
        };
        if (cairo_surface_write_to_png_stream(m_surface, append, &bytes) != CAIRO_STATUS_SUCCESS)
            throw std::bad_alloc();
        return bytes;
    }

    // Samples with values in [first, first + bin).
    static double sum(const band_histogram &histogram, std::int32_t first, std::int32_t bin)
    {
        const auto begin = static_cast<std::size_t>(first);
        const auto end = std::min(static_cast<std::size_t>(first + bin), histogram.counts.size());
        double all = 0;
        for (std::size_t value = begin; value < end; ++value)
            all += static_cast<double>(histogram.counts[value]);
        return all;
    }

private:
    // Returns the next number that is 1, 2 or 5 times a power of ten, at least 1.
    static std::int64_t rounded_step(double least)
    {
        const double power = std::pow(10, std::floor(std::log10(std::max(least, 1.0))));
        for (const double factor : {1.0, 2.0, 5.0})
            if (factor * power >= least) return static_cast<std::int64_t>(factor * power);
        return static_cast<std::int64_t>(10 * power);
    }
    void write_upright(const std::string &words, double text_x)
    {
        cairo_save(m_cairo);
        cairo_translate(m_cairo, text_x, TOP + PLOT_HEIGHT / 2);
        cairo_rotate(m_cairo, -std::acos(0.0));
        write(words, 0, 0, 0.5, 13);
        cairo_restore(m_cairo);
    }

    cairo_surface_t *m_surface;
    cairo_t *m_cairo;
    std::int32_t m_high;
    double m_top;
};

// A name that is not UTF-8 cannot be drawn; its other bytes become "?".
std::string drawable(std::string name)
{
    int characters, widest;
    if (FcUtf8Len(reinterpret_cast<const FcChar8 *>(name.data()), static_cast<int>(name.size()),
                  &characters, &widest) == FcFalse)
        std::ranges::replace_if(
            name, [](unsigned char c) { return c >= 0x80; }, '?');
    return in_one_line(name);
}

// To tenths.
double rounded(double number)
{
    return std::round(number * 10) / 10;
}

}  // namespace

std::string draw_histograms(const std::vector<band_histogram> &histograms, const std::string &title)
{
    std::int32_t high = 0;
    for (const band_histogram &each : histograms) high = std::max(high, each.highest() + 1);
    const std::int32_t bin = std::max(high / 400, 1);
    high = (high + bin - 1) / bin * bin;
    // Zeros are often most of an image; the other values decide the height of the plot.
    double top = 1;
    for (const band_histogram &each : histograms)
        for (std::int32_t first = 0; first < high; first += bin)
            top = std::max(
                top, plot::sum(each, std::max(first, 1), first == 0 ? std::max(bin - 1, 0) : bin));
    plot picture(high, top * 1.05);
    const bool is_alone = histograms.size() == 1;
    const auto own = [](std::size_t i) { return colors.at(i % colors.size()); };
    std::vector<caption> captions;
    for (std::size_t i = 0; i < histograms.size(); ++i) {
        const band_histogram &each = histograms[i];
        captions.push_back(
            {text("band ", each.band, ": ", each.lowest(), " to ", each.highest(), ", mean ",
                  rounded(each.mean()), ", ", rounded(100 * each.share_of_zero()), " % zero"),
             is_alone ? dark : own(i)});
    }
    picture.axes(drawable(title), captions);
    for (std::size_t i = 0; i < histograms.size(); ++i)
        picture.draw(histograms[i], is_alone ? gray : own(i), is_alone ? orange : own(i), bin);
    return picture.as_png();
}
