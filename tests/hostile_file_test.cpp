// Untrusted files: headers and trailers of any numbers, files truncated anywhere, images that end
// where offsets do. What is opened delivers exactly what the file has, or reports that it ends.
#include "support/effort.h"
#include "support/file_test.h"

#include <fstream>

namespace {

constexpr std::array<std::int32_t, 12> NUMBERS{0,     1,     -1,    7,       8,         255,
                                               46341, 65535, 65536, 1 << 30, INT32_MAX, INT32_MIN};

class HostileFile : public FileTest {
protected:
    // Calls `visit` with as many of the numbers below `all` as the effort asks for.
    template <typename Visit>
    static void for_some(std::size_t all, Visit visit)
    {
        const auto count = static_cast<std::size_t>(rounds(static_cast<int>(all)));
        for (std::size_t i = 0; i < count && !HasFailure(); ++i)
            visit(i * 7919 % all);  // a prime: no number comes twice
    }

    // Opens the file, which is to be taken or refused, reads of it what is where mistakes would
    // show, and closes it.
    void check_open(const file_model &model, bool taken) const
    {
        for (const std::int32_t flags : {IMG_OPEN_READ_ONLY, IMG_OPEN_READ_WRITE}) {
            std::filesystem::remove(m_file);  // far quicker than truncating it
            write_file(m_file, model.content);
            const auto written = std::filesystem::last_write_time(m_file) - std::chrono::hours(1);
            std::filesystem::last_write_time(m_file, written);
            memory_arm(0);
            const outcome seen = opening(m_file, flags);
            EXPECT_LT(shortage.requested, 1U << 20U);
            EXPECT_TRUE(taken ? seen.result == 0 : seen == REFUSED_QUIETLY) << seen;
            if (seen.result == 0) expect_reads(model, seen.result);
            img_closefile(seen.result);
            const bool completed = taken && flags == IMG_OPEN_READ_WRITE;
            bytes expected = model.content;
            const std::size_t end =
                completed ? static_cast<std::size_t>(model.data_offset) + stored_bytes(model.image)
                          : 0;
            EXPECT_EQ(std::filesystem::file_size(m_file), std::max(expected.size(), end));
            EXPECT_TRUE(completed || std::filesystem::last_write_time(m_file) == written);
            expected.resize(std::max(expected.size(), std::min<std::size_t>(end, 4096)));
            std::filesystem::resize_file(m_file, expected.size());  // it may be huge
            EXPECT_EQ(read_file(m_file), expected);
            if (HasFailure()) FAIL() << flags << ' ' << testing::PrintToString(model.content);
        }
    }
    // Creates an image of any geometry, and if it is possible, writes and reads its last sample.
    void check_create(std::int32_t type, const test_geometry &image,
                      std::int32_t header_length) const
    {
        const std::string objection = type == IMG_TYPE_VITEC ? vitec_objection(image) : "";
        const bool possible = can_be_created(image, type, header_length);
        std::filesystem::remove(m_file);
        outcome seen = creating(m_file, type, image);
        EXPECT_EQ(seen.result, possible ? 0 : -1);
        EXPECT_EQ(seen.text, possible ? "" : objection + could_not_create(m_file));
        transfer at{};
        if (possible) at = {image.nbands - 1, image.nlines - 1, image.nsamps - 1};
        const bytes last{0xAB, 0xCD};
        bytes got(2);
        const bool writes = possible && stored_bytes(image) > 0 &&
                            std::int64_t{image.tile_nlines} * image.tile_nsamps < 1 << 16;
        EXPECT_TRUE(!writes || dump(seen.result, at, last.data()) == 0);
        img_closefile(seen.result);
        seen = opening(m_file, IMG_OPEN_READ_ONLY);
        EXPECT_TRUE(possible ? std::filesystem::file_size(m_file) ==
                                   static_cast<std::size_t>(header_length) + stored_bytes(image)
                             : seen == REFUSED_QUIETLY);
        if (writes) img_chain_init(seen.result);
        EXPECT_TRUE(!writes || (load(seen.result, at, got.data()) == 0 &&
                                std::equal(&last[0], &last[0] + image.nbytes, &got[0])));
        img_closefile(seen.result);
    }
};

TEST_F(HostileFile, MayHaveAnyNumbersInItsHeader)
{
    // header_length, lines, samples, bands, bytes per sample less 1, tile width and height
    constexpr std::array<std::int32_t, 7> bases[] = {{132, 1, 5, 1, 0, 0, 0},
                                                     {132, 7, 9, 3, 1, 0, 0},
                                                     {132, 7, 9, 2, 1, 4, 2},
                                                     {132, 7, 9, 0, 0, 8, 8}};
    for_some(4 * 7 * 7 * 12 * 12, [&](std::size_t index) {
        if (index / 4 % 7 > index / 28 % 7) return;  // each pair once
        auto fields = bases[index % 4];
        fields[index / 4 % 7] = NUMBERS[index / 196 % 12];
        fields[index / 28 % 7] = NUMBERS[index / 196 / 12];
        const auto [header_length, nlines, nsamps, nbands, code, tile_nsamps, tile_nlines] = fields;
        const auto nbytes = static_cast<std::int32_t>(static_cast<std::uint32_t>(code) + 1);
        const test_geometry image{nlines, nsamps, nbands, nbytes, tile_nsamps, tile_nlines};
        const file_model file = vitec(image, 500, {.header_length = header_length});
        check_open(file, is_within_limits(image, file.data_offset));
        check_create(IMG_TYPE_VITEC, image, VITEC_HEADER);
    });
}

TEST_F(HostileFile, MayHaveItsPartsAnywhereAndInEitherByteOrder)
{
    for (const std::int32_t link : {108, 44, 296, 532, 533, -5, INT32_MIN, INT32_MAX})
        for (const std::int32_t header_length : {132, 68, -90, -300, -301, INT32_MIN, INT32_MAX})
            for (const std::int32_t version : {7, 6, 8, 7 << 24})
                for (const bool little_endian : {false, true}) {
                    const file_model file = vitec({2, 3, 4, 2, 8, 16}, 604,
                                                  {link, header_length, version, little_endian});
                    check_open(file, link > 0 && link < 533 && version == 7 &&
                                         is_within_limits(file.image, file.data_offset));
                }
}

TEST_F(HostileFile, MayHaveAnyNumbersInItsTrailer)
{
    for_some(12 * 12 * 12, [&](std::size_t index) {
        test_geometry image{NUMBERS[index % 12], NUMBERS[index / 12 % 12], NUMBERS[index / 144]};
        check_open({image, 0, numbered(helava_file(image, 40, index % 2 == 0), 0, 40)},
                   is_within_limits(image, 0));
        check_create(IMG_TYPE_HELAVA, image, HELAVA_TRAILER);
        image.nbytes = index % 5 == 0 ? 0 : 2;  // for which the trailer has no field
        check_create(IMG_TYPE_HELAVA, image, HELAVA_TRAILER);
    });
    const bytes trailer = helava_file({3, 5}, 48);
    for (std::ptrdiff_t length = 0; length <= 64; ++length) {
        const bytes content(trailer.end() - length, trailer.end());
        check_open({{3, 5}, 0, content}, length >= HELAVA_TRAILER);
    }
}

TEST_F(HostileFile, IsReadAsFarAsItGoes)
{
    std::vector<file_model> files;
    for (const std::int32_t nbytes : {1, 2}) {
        test_geometry image{3, 5, 2, nbytes};
        for (; image.layout <= IMG_LAYOUT_TILED_BIP; ++image.layout) {
            image.tile_nsamps = image.layout >= IMG_LAYOUT_TILED ? 4 : 0;
            image.tile_nlines = image.layout >= IMG_LAYOUT_TILED ? 2 : 0;
            image.swap = image.layout % 2;
            files.push_back(
                vitec(image, 244 + stored_bytes(image), {.little_endian = image.swap == 0}));
            img_closefile(create_test_file(m_file, image));
            const bytes file = read_file(m_file);
            files.push_back(
                {image, TEST_HEADER_LENGTH, numbered(file, TEST_HEADER_LENGTH, file.size())});
        }
    }
    for_some(files.size() * 400, [&](std::size_t index) {
        file_model file = files[index % files.size()];
        if (index / files.size() > file.content.size()) return;
        file.content.resize(index / files.size());
        const std::size_t needed = file.data_offset == TEST_HEADER_LENGTH ? 36 : 180;
        check_open(file, file.content.size() >= needed);
    });
}

TEST_F(HostileFile, MayEndWhereOffsetsDo)
{
    constexpr std::int32_t own = TEST_HEADER_LENGTH;
    constexpr std::array<std::int32_t, 4> cases[] = {
        // type, bytes of its header, layout, tile size
        {IMG_TYPE_VITEC, 244, 0, 0}, {IMG_TYPE_VITEC, 244, 2, 8}, {IMG_TYPE_HELAVA, 16, 0, 0},
        {TEST_TYPE, own, 0, 0},      {TEST_TYPE, own, 1, 0},      {TEST_TYPE, own, 2, 1},
        {TEST_TYPE, own, 3, 1},      {TEST_TYPE, own, 4, 1}};
    for (const auto &[type, header_length, layout, tile] : cases)
        for (std::int32_t nbytes = 1; nbytes <= (type == IMG_TYPE_HELAVA ? 1 : 2); ++nbytes)
            for (const std::int32_t nbands : {1, 2, 3})
                for (const std::int32_t more : {-1, 0, 1}) {  // than fit
                    const std::int32_t side = std::max(1, tile);
                    test_geometry image{side, side, nbands, nbytes, tile, tile, layout};
                    const auto unit = static_cast<std::int32_t>(stored_bytes(image));
                    image.nsamps *= (INT32_MAX - header_length) / unit + more;
                    check_create(type, image, header_length);
                    EXPECT_EQ(is_within_limits(image, header_length), more < 1);
                }
    const bytes trailer = helava_file({3, 5}, 0);
    for (const std::streamoff more : {0, 1}) {  // the same of another writer
        std::ofstream(m_file)
            .seekp(INT32_MAX - 16 + more)
            .write(reinterpret_cast<const char *>(trailer.data()), 16);
        const outcome seen = opening(m_file);
        EXPECT_TRUE(more == 0 ? seen.result == 0 : seen == REFUSED_QUIETLY);
        img_closefile(seen.result);
    }
}

}  // namespace
