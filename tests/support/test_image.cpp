#include "support/test_image.h"

#include "api/library.h"
#include "api/open.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/types.h"
#include "chain/chain_links.h"
#include "formats/header_file.h"
#include "imgfile/img.h"
#include "std/std.h"

#include <array>

namespace {

// The words of the header, in host order.
enum word : std::size_t {
    MAGIC,
    NLINES,
    NSAMPS,
    NBANDS,
    NBYTES,
    TILE_NSAMPS,
    TILE_NLINES,
    LAYOUT,
    SWAP,
    WORDS
};
constexpr std::int32_t TEST_MAGIC = 0x54455354;
static_assert(WORDS * 4 == TEST_HEADER_LENGTH);
using test_header = std::array<std::int32_t, WORDS>;

std::span<std::uint8_t> as_bytes(test_header &header)
{
    return {reinterpret_cast<std::uint8_t *>(header.data()), sizeof header};
}

test_geometry wanted;  // what write_header stores that img_createfile has no argument for

std::int32_t probe(img_desc *desc)
{
    test_header header{};
    const img_header_file file = img_header_file_of(desc);
    img_header_seek(file, 0, 0);
    return img_header_read(file, as_bytes(header)) && header[MAGIC] == TEST_MAGIC ? 1 : 0;
}

std::int32_t read_header(img_desc *desc)
{
    test_header header{};
    const img_header_file file = img_header_file_of(desc);
    if (img_header_seek(file, 0, 0) != 0 || !img_header_read(file, as_bytes(header))) return -1;
    desc->swap = header[SWAP];
    img_set_image_params(desc, header[NLINES], header[NSAMPS], header[TILE_NSAMPS],
                         header[TILE_NLINES], header[NBANDS], header[NBYTES], -1, header[LAYOUT], 0,
                         nullptr, nullptr, nullptr);
    desc->std_file->data_offset = TEST_HEADER_LENGTH;
    return 0;
}

std::int32_t write_header(img_desc *desc)
{
    test_header header{TEST_MAGIC,        desc->nlines,  desc->nsamps,
                       desc->nbands,      desc->nbytes,  desc->tile_nsamps,
                       desc->tile_nlines, wanted.layout, wanted.swap};
    desc->layout = wanted.layout;
    desc->swap = wanted.swap;
    desc->std_file->data_offset = TEST_HEADER_LENGTH;
    return img_header_write(img_header_file_of(desc), as_bytes(header)) ? 0 : -1;
}

std::int32_t padded(std::int32_t extent, std::int32_t tile_extent)
{
    return tile_extent == 0 ? extent : (extent + tile_extent - 1) / tile_extent * tile_extent;
}

std::int32_t padded_nlines(img_desc *desc)
{
    return padded(desc->nlines, desc->tile_nlines);
}

std::int32_t padded_nsamps(img_desc *desc)
{
    return padded(desc->nsamps, desc->tile_nsamps);
}

img_handle without_chain(img_handle handle)
{
    if (handle != -1) img_chain_init(handle);
    return handle;
}

}  // namespace

void test_type_register()
{
    img_library_init();
    img_std_fill_type(TEST_TYPE, "Test", ".test", IMG_LAYOUT_TILED, IMG_LAYOUT_BSQ, probe,
                      read_header, write_header, padded_nlines, padded_nsamps, img_no_type_op,
                      &img_type_table[TEST_TYPE]);
}

img_handle create_test_file(const std::string &name, const test_geometry &geometry)
{
    test_type_register();
    wanted = geometry;
    return without_chain(img_createfile(name.c_str(), geometry.nlines, geometry.nsamps,
                                        geometry.nbands, TEST_TYPE, geometry.tile_nsamps,
                                        geometry.tile_nlines, geometry.nbytes));
}

img_handle open_test_file(const std::string &name, std::int32_t flags)
{
    test_type_register();
    return without_chain(img_openfile(name.c_str(), flags));
}

img_handle create_test_memory(const test_geometry &geometry)
{
    test_type_register();
    const img_handle handle = img_alloc_image("memory", IMG_OPEN_READ_WRITE);
    if (handle == -1) return -1;
    img_desc *const desc = img_find_image(handle);
    desc->type = TEST_TYPE;
    img_set_image_params(desc, geometry.nlines, geometry.nsamps, geometry.tile_nsamps,
                         geometry.tile_nlines, geometry.nbands, geometry.nbytes, -1,
                         geometry.layout, 0, nullptr, nullptr, nullptr);
    desc->swap = geometry.swap;
    if (img_type_table[TEST_TYPE].create_mem(desc) == -1) {
        img_release_image(handle, 0);
        return -1;
    }
    return without_chain(handle);
}
