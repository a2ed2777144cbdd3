// Tests of io_method.cpp: the table of access methods, and the names that choose one.
#include "base/img_desc.h"
#include "io/io_default.h"
#include "io/io_method.h"
#include "support/guard.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <string>

namespace {

// Gives every test an empty table, and the process its own back afterwards.
class IoMethodTable : public testing::Test {
    const setting<decltype(img_io_method_table)> m_table{img_io_method_table, img_io_method_table};
    const setting<std::int32_t> m_count{img_io_method_count, 0};
};

std::int32_t add(const char *name, std::int32_t (*init_op)(const char *) = nullptr)
{
    return img_register_io_method(name, init_op, nullptr, nullptr, nullptr, nullptr, nullptr,
                                  nullptr, nullptr);
}

TEST_F(IoMethodTable, HoldsAHundredMethodsOfDifferentNames)
{
    std::array<std::string, 101> names;
    for (std::int32_t i = 0; i < 101; ++i) {
        auto &name = names[static_cast<std::size_t>(i)] = "tape" + std::to_string(i);
        EXPECT_EQ(add(name.c_str()), i < 100 ? 0 : -1);
        EXPECT_EQ(img_find_io_method(name.c_str()), i < 100 ? i : -1);
        EXPECT_EQ(add(names[0].c_str()), -1);
    }
    for (const char *unknown : {"Tape0", "tape", "tape00", ""})
        EXPECT_EQ(img_lookup_io_method(unknown), nullptr) << unknown;
}

TEST_F(IoMethodTable, NeverFindsAMethodThatCouldNotStart)
{
    const auto fails = [](const char *name) { return std::string_view(name) == "tape" ? 1 : 0; };
    for (const char *name : {"tape", "tape", "disk"}) EXPECT_EQ(add(name, fails), 0);
    EXPECT_EQ(img_find_io_method("tape"), -1);
    EXPECT_EQ(img_find_io_method("disk"), 2);
    EXPECT_EQ(add("tape"), 0);
    EXPECT_EQ(img_lookup_io_method("tape"), &img_io_method_table[3]);
}

TEST_F(IoMethodTable, AnswersForMissingOperations)
{
    add("bare");
    const img_io_method &bare = img_io_method_table[0];
    char byte = 0;
    EXPECT_EQ((std::array{bare.open("file", 0, 0), bare.close(3), bare.read(3, &byte, 1),
                          bare.write(3, &byte, 1), bare.seek(3, 0, 0), bare.unlink("file")}),
              (std::array{-1, -1, -1, -1, -1, -1}));
    EXPECT_EQ(errno, ENOSYS);
    EXPECT_EQ(img_offer_lending("bar", nullptr), -1);
    EXPECT_EQ(img_offer_positional_reads("bar", nullptr), -1);
    EXPECT_EQ(img_allow_merging("bar"), -1);
    EXPECT_EQ(add(nullptr), -1);
    EXPECT_EQ(img_register_default_io_method("bare"), -1);
    EXPECT_EQ(bare.lend, nullptr);
}

TEST_F(IoMethodTable, SplitsNamesAtTheirFirstAtSign)
{
    // A name, the file name and the method in it; null: a method that does not exist.
    const std::array<const char *, 3> cases[] = {{"a.img", "a.img", ""},
                                                 {"a.img@@b", "a.img", "@b"},
                                                 {"@@a.img@b", "a.img", "b"},
                                                 {"", "", ""},
                                                 {"@@", "@@", ""},
                                                 {"@mem@", "mem", ""},
                                                 {"a.img@b@", "a.img", nullptr}};
    for (const char *method : {"", "mem", "@b", "b"}) ASSERT_EQ(add(method), 0);
    for (const auto &[name, filename, method] : cases) {
        std::unique_ptr<char[]> split_filename;
        const img_io_method *split_method = &img_io_method_table[99];
        EXPECT_EQ(img_split_name(name, &split_filename, &split_method), 0);
        EXPECT_STREQ(split_filename.get(), filename) << name;
        EXPECT_EQ(split_method, method != nullptr ? img_lookup_io_method(method) : nullptr) << name;
    }
}

}  // namespace
