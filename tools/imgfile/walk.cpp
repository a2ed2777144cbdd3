// Choosing the pieces of a walk: as large as memory allows, and of whole tiles on both sides where
// that is possible. Read walk.h first.
#include "walk.h"

#include "failure.h"
#include "progress.h"

#include "common/grouped.h"

#include <algorithm>
#include <numeric>

namespace {

constexpr std::int64_t BUDGET = std::int64_t{8} << 20U;        // bytes of a piece
constexpr std::int64_t LARGEST_ROW = std::int64_t{40} << 20U;  // of tiles that must be whole

constexpr std::int64_t LARGEST_LINE = std::int64_t{64} << 20U;  // of lines that must be whole

struct piece_size {
    std::int32_t nlines, nsamps;
};

// The smallest size that is made of whole tiles of both, unless that is very large.
std::int64_t common(std::int32_t a, std::int32_t b)
{
    const std::int64_t both = std::lcm(std::max<std::int64_t>(a, 1), std::max<std::int64_t>(b, 1));
    return both <= 65536 ? both : std::max<std::int64_t>({a, b, 1});
}

std::int32_t as_size(std::int64_t size, std::int32_t extent)
{
    return static_cast<std::int32_t>(std::clamp<std::int64_t>(size, 1, std::max(extent, 1)));
}

void check_lines(const image_reader &reader, const window &part, std::int64_t pixel,
                 const access_needs &target)
{
    const shape &form = reader.form;
    const std::int64_t read = reader.in_order ? form.bytes() / form.nlines : 0;
    const std::int64_t longest = std::max(read, target.in_order ? part.nsamps * pixel : 0);
    if (longest > LARGEST_LINE)
        throw failure(reader.name, text("has lines of ", grouped(longest),
                                        " bytes; at most 64 MiB fit in memory"));
}

piece_size choose_pieces(const image_reader &reader, const window &part, std::int64_t pixel,
                         const access_needs &target)
{
    const bool must_fit = target.whole_tiles;
    const std::int64_t high =
        must_fit ? target.tiles.nlines : common(reader.tiles.nlines, target.tiles.nlines);
    const std::int64_t wide =
        must_fit ? target.tiles.nsamps : common(reader.tiles.nsamps, target.tiles.nsamps);
    const std::int64_t line = std::max<std::int64_t>(part.nsamps * pixel, 1);
    if (high * line <= BUDGET)
        return {as_size(BUDGET / line / high * high, part.nlines),
                as_size(part.nsamps, part.nsamps)};
    if (!reader.in_order && !target.in_order) {
        const std::int64_t count = std::max<std::int64_t>(BUDGET / (high * pixel) / wide, 1) * wide;
        if (must_fit || count * high * pixel <= 4 * BUDGET)
            return {as_size(high, part.nlines), as_size(count, part.nsamps)};
    }
    if (must_fit) {
        if (high * line > LARGEST_ROW)
            throw failure(reader.name,
                          "must be read in whole lines; a row of tiles would take too much "
                          "memory; choose a smaller tile height");
        return {as_size(high, part.nlines), as_size(part.nsamps, part.nsamps)};
    }
    return {as_size(BUDGET / line, part.nlines), as_size(part.nsamps, part.nsamps)};
}

}  // namespace

void walk(image_reader &reader, const window &part, const band_list &bands,
          const access_needs &target,
          const std::function<void(const window &piece, const block &samples)> &use)
{
    const auto nbands = static_cast<std::int32_t>(bands.size());
    const std::int64_t pixel = std::int64_t{nbands} * reader.form.nbytes;
    if (pixel == 0 || part.nlines == 0 || part.nsamps == 0) return;
    check_lines(reader, part, pixel, target);
    const piece_size size = choose_pieces(reader, part, pixel, target);
    progress shown(std::int64_t{part.nlines} * part.nsamps * pixel);
    for (std::int64_t top = 0; top < part.nlines; top += size.nlines)
        for (std::int64_t left = 0; left < part.nsamps; left += size.nsamps) {
            const window piece{
                static_cast<std::int32_t>(top), static_cast<std::int32_t>(left),
                static_cast<std::int32_t>(std::min<std::int64_t>(size.nlines, part.nlines - top)),
                static_cast<std::int32_t>(std::min<std::int64_t>(size.nsamps, part.nsamps - left))};
            block samples(piece.nlines, piece.nsamps, nbands, reader.form.nbytes);
            reader.read(
                {part.line + piece.line, part.samp + piece.samp, piece.nlines, piece.nsamps}, bands,
                samples);
            use(piece, samples);
            shown.add(static_cast<std::int64_t>(samples.bytes.size()));
        }
}
