// Counting samples, and the stretch table, which the library computes from the counts. Read
// band_stretch.h and chain/stretch.h first.
#include "band_stretch.h"

#include "walk.h"

#include "chain/chain.h"
#include "chain/stretch.h"

#include <algorithm>
#include <new>

band_stretch::band_stretch(std::int32_t nbits)
    : m_nbits(nbits), m_counts(std::size_t{1} << static_cast<unsigned>(nbits))
{
}

band_stretch band_stretch::straight(std::int32_t nbits)
{
    band_stretch made(nbits);
    for (std::size_t value = 0; value < made.m_counts.size(); ++value)
        made.m_table.push_back(
            static_cast<std::uint8_t>(value >> static_cast<unsigned>(nbits - 8)));
    return made;
}

void band_stretch::count(const block &samples, std::int32_t band, std::int32_t first_samp)
{
    const std::int32_t skipped = (4 - first_samp % 4) % 4;
    for (std::int32_t line = 0; line < samples.nlines; ++line)
        samples.use_row(band, line, [&](const auto *row) {
            for (std::int32_t i = skipped; i < samples.nsamps; i += 4)
                if (row[i] < m_counts.size()) ++m_counts[row[i]];
        });
}

void band_stretch::finish()
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

block stretched(const block &samples, const std::vector<band_stretch> &stretches)
{
    block result(samples.nlines, samples.nsamps, samples.nbands, 1);
    samples.for_each_row([&](std::int32_t band, std::int32_t line, const auto *row) {
        const band_stretch &own = stretches[static_cast<std::size_t>(band)];
        std::transform(row, row + samples.nsamps, result.row(band, line),
                       [&](int value) { return own(static_cast<std::uint32_t>(value)); });
    });
    return result;
}

std::vector<band_stretch> measure_stretches(image_reader &reader, const window &part,
                                            const band_list &bands)
{
    std::vector<band_stretch> stretches(bands.size(), band_stretch(reader.form.nbits));
    walk(reader, part, bands, {}, [&](const window &piece, const block &samples) {
        for (std::size_t i = 0; i < stretches.size(); ++i)
            stretches[i].count(samples, static_cast<std::int32_t>(i), piece.samp);
    });
    for (band_stretch &each : stretches) each.finish();
    return stretches;
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
