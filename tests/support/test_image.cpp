#include "support/test_image.h"

#include "api/library.h"
#include "api/open.h"
#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/types.h"
#include "chain/chain_links.h"
#include "formats/header_file.h"
#include "formats/vitec.h"
#include "imgfile/img.h"
#include "std/std.h"

namespace {

constexpr std::int32_t TEST_MAGIC = 0x54455354;

// The header, in the byte order of the host.
struct test_header {
    std::int32_t magic = 0, nlines = 0, nsamps = 0, nbands = 0, nbytes = 0, tile_nsamps = 0,
                 tile_nlines = 0, layout = 0, swap = 0;
};
static_assert(sizeof(test_header) == TEST_HEADER_LENGTH);

std::span<std::uint8_t> as_bytes(test_header &header)
{
    return {reinterpret_cast<std::uint8_t *>(&header), sizeof header};
}

test_geometry wanted;  // what write_header stores that img_createfile has no argument for

// Returns what the file begins with, zeros where that is no header.
test_header header_of(const img_desc *desc)
{
    test_header header;
    const img_header_file file = img_header_file_of(desc);
    const bool is_read =
        img_header_seek(file, 0, 0) == 0 && img_header_read(file, as_bytes(header));
    return is_read && header.magic == TEST_MAGIC ? header : test_header{};
}

std::int32_t probe(img_desc *desc)
{
    return header_of(desc).magic != 0 ? 1 : 0;
}

std::int32_t read_header(img_desc *desc)
{
    const test_header header = header_of(desc);
    if (header.magic == 0) return -1;
    desc->swap = header.swap;
    img_set_image_params(desc, header.nlines, header.nsamps, header.tile_nsamps, header.tile_nlines,
                         header.nbands, header.nbytes, -1, header.layout, 0, nullptr, nullptr,
                         nullptr);
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
                      read_header, write_header, img_vitec_padded_nlines, img_vitec_padded_nsamps,
                      img_no_type_op, &img_type_table[TEST_TYPE]);
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
