// The drivers without the plugin, for builds that check addresses and threads: create, read,
// update, copy, fail, and all of it on eight threads.
#include <cpl_conv.h>
#include <gdal_priv.h>
#include <gtest/gtest.h>

#include <array>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

extern "C" void GDALRegister_IMGFILE();

namespace {

constexpr int NLINES = 37, NSAMPS = 53;

struct kind {
    const char *name, *driver;
    int nbands;
    GDALDataType type;
    int tile;  // side of the tiles; 0: none
};
constexpr std::array KINDS{
    kind{"untiled", "VITec", 3, GDT_Byte, 0}, kind{"two_bytes", "VITec", 1, GDT_UInt16, 0},
    kind{"tiled", "VITec", 2, GDT_Byte, 16}, kind{"tiled_two_bytes", "VITec", 3, GDT_UInt16, 8},
    kind{"helava", "Helava", 5, GDT_Byte, 0}};

using samples = std::vector<GUInt16>;  // band after band

samples new_samples(const kind &each, unsigned seed)
{
    samples result(static_cast<std::size_t>(NLINES * NSAMPS * each.nbands));
    for (GUInt16 &sample : result) {
        seed = seed * 1664525U + 1013904223U;
        sample = static_cast<GUInt16>(seed >> (each.type == GDT_Byte ? 24U : 16U));
    }
    return result;
}

// Keeps the text of the last error of its thread.
class quiet {
public:
    quiet() { CPLPushErrorHandler(CPLQuietErrorHandler); }
    ~quiet() { CPLPopErrorHandler(); }
    quiet(const quiet &) = delete;
    quiet &operator=(const quiet &) = delete;

    static std::string text() { return CPLGetLastErrorMsg(); }
};

GDALDriver *driver_of(const kind &each)
{
    static const bool registered = (GDALRegister_IMGFILE(), true);
    return registered ? GetGDALDriverManager()->GetDriverByName(each.driver) : nullptr;
}

GDALDatasetUniquePtr open_image(const std::string &path, unsigned flags)
{
    return GDALDatasetUniquePtr(GDALDataset::Open(path.c_str(), flags | GDAL_OF_RASTER));
}

CPLErr move(GDALDataset &image, GDALRWFlag direction, samples &content, GDALDataType type)
{
    // as the type of the file where it can be, else by GDAL's blocks
    std::vector<GByte> bytes(content.begin(), content.end());
    const bool is_narrow = type == GDT_Byte;
    const CPLErr result = image.RasterIO(
        direction, 0, 0, NSAMPS, NLINES,
        is_narrow ? static_cast<void *>(bytes.data()) : static_cast<void *>(content.data()), NSAMPS,
        NLINES, type, image.GetRasterCount(), nullptr, 0, 0, 0, nullptr);
    if (is_narrow && direction == GF_Read) content.assign(bytes.begin(), bytes.end());
    return result;
}

samples read_all(GDALDataset &image, GDALDataType type)
{
    samples content(static_cast<std::size_t>(NLINES * NSAMPS * image.GetRasterCount()));
    EXPECT_EQ(move(image, GF_Read, content, type), CE_None) << quiet::text();
    return content;
}

GDALDatasetUniquePtr create(const kind &each, const std::string &path)
{
    CPLStringList options;
    if (each.tile != 0) {
        options.SetNameValue("BLOCKXSIZE", std::to_string(each.tile).c_str());
        options.SetNameValue("BLOCKYSIZE", std::to_string(each.tile).c_str());
    }
    return GDALDatasetUniquePtr(driver_of(each)->Create(path.c_str(), NSAMPS, NLINES, each.nbands,
                                                        each.type, options.List()));
}

// Creates, reads, updates and copies an image, and fails on a truncated one. `seed` makes its
// samples.
void exercise(const kind &each, const std::string &path, unsigned seed)
{
    const quiet errors;
    samples expected = new_samples(each, seed);
    {
        const GDALDatasetUniquePtr image = create(each, path);
        ASSERT_NE(image, nullptr) << quiet::text();
        ASSERT_EQ(move(*image, GF_Write, expected, each.type), CE_None);
    }
    {
        const GDALDatasetUniquePtr image = open_image(path, GDAL_OF_UPDATE);
        ASSERT_NE(image, nullptr) << quiet::text();
        EXPECT_EQ(read_all(*image, each.type), expected);
        EXPECT_EQ(read_all(*image, GDT_UInt16), expected);
        expected = new_samples(each, seed + 1);
        ASSERT_EQ(move(*image, GF_Write, expected, GDT_UInt16), CE_None);
        EXPECT_EQ(read_all(*image, each.type), expected);
    }
    const std::string copied = path + "_copy";
    {
        const GDALDatasetUniquePtr image = open_image(path, 0);
        ASSERT_NE(image, nullptr) << quiet::text();
        const GDALDatasetUniquePtr copy(driver_of(each)->CreateCopy(
            copied.c_str(), image.get(), TRUE, nullptr, nullptr, nullptr));
        ASSERT_NE(copy, nullptr) << quiet::text();
        EXPECT_EQ(read_all(*copy, each.type), expected);
    }
    EXPECT_EQ(driver_of(each)->Delete(copied.c_str()), CE_None);

    VSILFILE *const file = VSIFOpenL(path.c_str(), "rb+");
    // a Helava file keeps its trailer, which then states more than the file holds
    std::array<GByte, 16> trailer{};
    VSIFSeekL(file, 0, SEEK_END);
    VSIFSeekL(file, VSIFTellL(file) - trailer.size(), SEEK_SET);
    VSIFReadL(trailer.data(), 1, trailer.size(), file);
    VSIFSeekL(file, 700, SEEK_SET);
    VSIFWriteL(trailer.data(), 1, trailer.size(), file);
    ASSERT_EQ(VSIFTruncateL(file, 700 + trailer.size()), 0);
    VSIFCloseL(file);
    const GDALDatasetUniquePtr image = open_image(path, 0);
    ASSERT_NE(image, nullptr) << quiet::text();
    samples before(expected.size(), 77), found = before;
    EXPECT_EQ(move(*image, GF_Read, found, GDT_UInt16), CE_Failure);
    EXPECT_NE(quiet::text().find(path), std::string::npos) << quiet::text();
    EXPECT_EQ(found, before);
    VSIUnlink(path.c_str());
}

class folder {
public:
    folder()
        : m_path(std::filesystem::temp_directory_path() /
                 ("gdal_core_" + std::to_string(CPLGetPID())))
    {
        std::filesystem::create_directory(m_path);
    }
    ~folder() { std::filesystem::remove_all(m_path); }
    folder(const folder &) = delete;
    folder &operator=(const folder &) = delete;

    std::string file(const std::string &name) const { return m_path / name; }

private:
    std::filesystem::path m_path;
};

class Kinds : public testing::TestWithParam<kind> {};

TEST_P(Kinds, AreCreatedReadUpdatedAndCopied)
{
    const folder local;
    exercise(GetParam(), local.file(GetParam().name) + ".d", 1);
    exercise(GetParam(), std::string("/vsimem/") + GetParam().name + ".d", 2);
}

INSTANTIATE_TEST_SUITE_P(All, Kinds, testing::ValuesIn(KINDS),
                         [](const auto &each) { return each.param.name; });

TEST(Threads, HaveImagesOfTheirOwn)
{
    const folder local;
    std::vector<std::thread> threads;
    for (unsigned number = 0; number < 8; ++number)
        threads.emplace_back([&local, number] {
            for (unsigned turn = 0; turn < 10; ++turn) {
                const kind &each = KINDS[(number + turn) % KINDS.size()];
                const std::string name = std::to_string(number) + each.name + ".d";
                exercise(each, number % 2 == 0 ? local.file(name) : "/vsimem/" + name,
                         number * 100 + turn);
            }
        });
    for (std::thread &thread : threads) thread.join();
}

TEST(Threads, ReadOneFileEach)
{
    const folder local;
    for (const kind &each : KINDS)
        for (const std::string &path :
             {local.file(each.name), std::string("/vsimem/") + each.name}) {
            samples expected = new_samples(each, 5);
            {
                const GDALDatasetUniquePtr image = create(each, path);
                ASSERT_EQ(move(*image, GF_Write, expected, each.type), CE_None);
            }
            std::vector<std::thread> threads;
            for (int number = 0; number < 8; ++number)
                threads.emplace_back([&each, &path, &expected] {
                    for (int turn = 0; turn < 5; ++turn) {
                        const GDALDatasetUniquePtr image = open_image(path, 0);
                        ASSERT_NE(image, nullptr);
                        EXPECT_EQ(read_all(*image, turn % 2 == 0 ? each.type : GDT_UInt16),
                                  expected);
                    }
                });
            for (std::thread &thread : threads) thread.join();
            VSIUnlink(path.c_str());
        }
}

TEST(FullDisk, IsReportedAndLeavesNoFile)
{
    const quiet errors;
    for (const kind &each : KINDS) {
        const int size = NLINES * NSAMPS * each.nbands * GDALGetDataTypeSizeBytes(each.type);
        for (int room = 0; room < size; room += 97) {
            const std::string path = "/vsimem/full||maxlength=" + std::to_string(room) + "||";
            EXPECT_EQ(create(each, path), nullptr) << path;
            VSIStatBufL status;
            EXPECT_NE(VSIStatL(path.c_str(), &status), 0) << path;
        }
    }
}

}  // namespace
