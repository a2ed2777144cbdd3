#include "walk.h"

#include "failure.h"

#include <algorithm>
#include <cstdio>

#include <unistd.h>

namespace {

constexpr std::int64_t BUDGET = std::int64_t{8} << 20U;        // bytes of a piece
constexpr std::int64_t LARGEST_ROW = std::int64_t{40} << 20U;  // of tiles that must be whole

constexpr std::int64_t LARGEST_LINE = std::int64_t{64} << 20U;  // of lines that must be whole

struct piece_size {
    std::int32_t nlines, nsamps;
};

// The smallest size that fills whole tiles of both, as far as that makes sense.
std::int64_t common(std::int32_t a, std::int32_t b)
{
    const std::int64_t both = std::lcm(std::max<std::int64_t>(a, 1), std::max<std::int64_t>(b, 1));
    return both <= 65536 ? both : std::max<std::int64_t>({a, b, 1});
}

std::int32_t as_size(std::int64_t size, std::int32_t extent)
{
    return static_cast<std::int32_t>(std::clamp<std::int64_t>(size, 1, std::max(extent, 1)));
}

void check_lines(const image_reader &from, const window &part, std::int64_t pixel,
                 const access_needs &to)
{
    const shape &form = from.form;
    const std::int64_t read = from.in_order ? form.bytes() / form.nlines : 0;
    const std::int64_t longest = std::max(read, to.in_order ? part.nsamps * pixel : 0);
    if (longest > LARGEST_LINE)
        throw failure(from.name, text("has lines of ", grouped(longest),
                                      " bytes; where they must be whole, 64 MiB are the most"));
}

piece_size choose_pieces(const image_reader &from, const window &part, std::int64_t pixel,
                         const access_needs &to)
{
    const bool must_fit = to.whole_tiles;
    const std::int64_t high =
        must_fit ? to.tiles.nlines : common(from.tiles.nlines, to.tiles.nlines);
    const std::int64_t wide =
        must_fit ? to.tiles.nsamps : common(from.tiles.nsamps, to.tiles.nsamps);
    const std::int64_t line = std::max<std::int64_t>(part.nsamps * pixel, 1);
    if (high * line <= BUDGET)
        return {as_size(BUDGET / line / high * high, part.nlines),
                as_size(part.nsamps, part.nsamps)};
    if (!from.in_order && !to.in_order) {
        const std::int64_t count = std::max<std::int64_t>(BUDGET / (high * pixel) / wide, 1) * wide;
        if (must_fit || count * high * pixel <= 4 * BUDGET)
            return {as_size(high, part.nlines), as_size(count, part.nsamps)};
    }
    if (must_fit) {
        if (high * line > LARGEST_ROW)
            throw failure(from.name,
                          "is read in whole lines, of which a row of tiles takes too much "
                          "memory; ask for lower tiles");
        return {as_size(high, part.nlines), as_size(part.nsamps, part.nsamps)};
    }
    return {as_size(BUDGET / line, part.nlines), as_size(part.nsamps, part.nsamps)};
}

}  // namespace

progress::progress(std::int64_t bytes_in_all)
    : m_all(bytes_in_all), m_wanted(!quiet && ::isatty(STDERR_FILENO) == 1)
{
}

progress::~progress()
{
    if (m_is_shown) std::fputs("\r\033[K", stderr);
}

void progress::add(std::int64_t bytes)
{
    m_done += bytes;
    const auto now = clock::now();
    if (!m_wanted || m_done == 0 || now - m_start < std::chrono::milliseconds(500) ||
        (m_is_shown && now - m_shown < std::chrono::milliseconds(100)))
        return;
    m_shown = now;
    m_is_shown = true;
    const double taken = std::chrono::duration<double>(now - m_start).count();
    const double done = static_cast<double>(m_done), all = static_cast<double>(m_all);
    std::fprintf(stderr, "\r\033[K%3.0f %%  %.0f MB/s  %.0f s left", 100 * done / all,
                 done / taken / 1e6, taken / done * (all - done));
}

void walk(image_reader &from, const window &part, const band_list &bands, const access_needs &to,
          const std::function<void(const window &place, const block &samples)> &use)
{
    const auto nbands = static_cast<std::int32_t>(bands.size());
    const std::int64_t pixel = std::int64_t{nbands} * from.form.nbytes;
    if (pixel == 0 || part.nlines == 0 || part.nsamps == 0) return;
    check_lines(from, part, pixel, to);
    const piece_size size = choose_pieces(from, part, pixel, to);
    progress shown(std::int64_t{part.nlines} * part.nsamps * pixel);
    for (std::int64_t top = 0; top < part.nlines; top += size.nlines)
        for (std::int64_t left = 0; left < part.nsamps; left += size.nsamps) {
            const window place{
                static_cast<std::int32_t>(top), static_cast<std::int32_t>(left),
                static_cast<std::int32_t>(std::min<std::int64_t>(size.nlines, part.nlines - top)),
                static_cast<std::int32_t>(std::min<std::int64_t>(size.nsamps, part.nsamps - left))};
            block samples(place.nlines, place.nsamps, nbands, from.form.nbytes);
            from.read({part.line + place.line, part.samp + place.samp, place.nlines, place.nsamps},
                      bands, samples);
            use(place, samples);
            shown.add(static_cast<std::int64_t>(samples.bytes.size()));
        }
}

void note(const std::string &file, const std::string &what)
{
    if (!quiet)
        std::fprintf(stderr, "imgfile: %s: note: %s\n", in_one_line(file).c_str(), what.c_str());
}

std::string grouped(std::int64_t number)
{
    std::string digits = std::to_string(number);
    for (auto at = static_cast<std::ptrdiff_t>(digits.size()) - 3; at > 0; at -= 3)
        digits.insert(static_cast<std::size_t>(at), 1, ',');
    return digits;
}
