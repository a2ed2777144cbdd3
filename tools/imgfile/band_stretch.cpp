#include "band_stretch.h"

#include "walk.h"

#include "chain/chain.h"
#include "chain/stretch.h"

#include <algorithm>
#include <new>

stretch::stretch(std::int32_t nbits)
    : m_nbits(nbits), m_counts(std::size_t{1} << static_cast<unsigned>(nbits))
{
}

stretch stretch::straight(std::int32_t nbits)
{
    stretch made(nbits);
    for (std::size_t value = 0; value < made.m_counts.size(); ++value)
        made.m_table.push_back(
            static_cast<std::uint8_t>(value >> static_cast<unsigned>(nbits - 8)));
    return made;
}

void stretch::count(const block &samples, std::int32_t band, std::int32_t first)
{
    const std::int32_t skipped = (4 - first % 4) % 4;
    for (std::int32_t line = 0; line < samples.nlines; ++line)
        samples.use_row(band, line, [&](const auto *row) {
            for (std::int32_t i = skipped; i < samples.nsamps; i += 4)
                if (row[i] < m_counts.size()) ++m_counts[row[i]];
        });
}

void stretch::finish()
{
    m_counts[0] = 0;
    std::vector<std::uint16_t> table(m_counts.size());
    const img_chain_lut wanted{.bits_in = static_cast<std::uint8_t>(m_nbits),
                               .bits_out = 8,
                               .size = static_cast<std::int32_t>(table.size()),
                               .lut = table.data(),
                               .owned = 0};
    img_chain_compute_stretch_lut(m_counts.data(), m_nbits, &wanted, table.data());
    m_table.assign(table.begin(), table.end());
}

block stretched(const block &from, const std::vector<stretch> &by)
{
    block to(from.nlines, from.nsamps, from.nbands, 1);
    from.for_each_row([&](std::int32_t band, std::int32_t line, const auto *row) {
        const stretch &own = by[static_cast<std::size_t>(band)];
        std::transform(row, row + from.nsamps, to.row(band, line),
                       [&](int value) { return own(static_cast<std::uint32_t>(value)); });
    });
    return to;
}

std::vector<stretch> measure_stretches(image_reader &from, const window &part,
                                       const band_list &bands)
{
    std::vector<stretch> all(bands.size(), stretch(from.form.nbits));
    walk(from, part, bands, {}, [&](const window &place, const block &samples) {
        for (std::size_t i = 0; i < all.size(); ++i)
            all[i].count(samples, static_cast<std::int32_t>(i), place.samp);
    });
    for (stretch &each : all) each.finish();
    return all;
}

std::int64_t count_beyond(const block &samples, std::int32_t highest)
{
    std::int64_t beyond = 0;
    samples.for_each_row([&](std::int32_t, std::int32_t, const auto *row) {
        beyond += std::count_if(row, row + samples.nsamps,
                                [=](std::int32_t value) { return value > highest; });
    });
    return beyond;
}
