// Images in any layout, in files and in memory, and the plain model that they are held against.
#ifndef IMG_TEST_IMAGE_H
#define IMG_TEST_IMAGE_H

#include "base/img_desc.h"
#include "imgfile/img.h"

#include <cstdint>
#include <string>
#include <vector>

// Slot of a type that exists in tests alone: a header of TEST_HEADER_LENGTH bytes that can state
// any geometry, layout and byte order, then pixels that the standard driver lays out. Whole tiles
// are stored, as in VITec files.
inline constexpr std::int32_t TEST_TYPE = 40;
inline constexpr std::int32_t TEST_HEADER_LENGTH = 36;

struct test_geometry {
    std::int32_t nlines = 1, nsamps = 1, nbands = 1, nbytes = 1;
    std::int32_t tile_nsamps = 0, tile_nlines = 0;
    std::int32_t layout = IMG_LAYOUT_BSQ;
    std::int32_t swap = 0;
};

// Registers the type; later calls do nothing.
void test_type_register();

// Creates a file of that geometry and leaves it open for reading and writing; -1 on failure.
// Two-byte images have no chain: loads deliver their samples as they are.
img_handle create_test_file(const std::string &name, const test_geometry &geometry);
// Opens such a file again, likewise without a chain.
img_handle open_test_file(const std::string &name, std::int32_t flags);
// Makes an in-memory image, released with img_closefile.
img_handle create_test_memory(const test_geometry &geometry);

// An image as a plain table of samples; outside of it lies the fill.
class model_image {
public:
    explicit model_image(const test_geometry &geometry)
        : m_geometry(geometry), m_samples(static_cast<std::size_t>(geometry.nbands) *
                                          static_cast<std::size_t>(geometry.nlines) *
                                          static_cast<std::size_t>(geometry.nsamps))
    {
    }
    const test_geometry &geometry() const { return m_geometry; }
    bool has(std::int64_t line, std::int64_t samp) const
    {
        return line >= 0 && line < m_geometry.nlines && samp >= 0 && samp < m_geometry.nsamps;
    }
    std::uint16_t &at(std::int64_t band, std::int64_t line, std::int64_t samp)
    {
        const auto index = (band * m_geometry.nlines + line) * m_geometry.nsamps + samp;
        return m_samples[static_cast<std::size_t>(index)];
    }

private:
    test_geometry m_geometry;
    std::vector<std::uint16_t> m_samples;
};

#endif
