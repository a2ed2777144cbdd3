// Each call to the access method goes wrong and each request for memory is denied, one after the
// other. Whatever it was: a call of the library that answers 0 has done its work, one that answers
// -1 has said so, nothing stored is lost but what was being written, and afterwards the file is as
// good as ever.
#include "support/fault_memory.h"
#include "support/fault_method.h"
#include "support/files.h"
#include "support/test_image.h"

#include <cerrno>
#include <gtest/gtest.h>
#include <optional>

#include <unistd.h>

namespace {

struct fault_plan {
    std::optional<io_call> call;  // none: a request for memory
    fault what = fault::fails;
};
constexpr fault_plan PLANS[] = {{io_call::open},
                                {io_call::close},
                                {io_call::read},
                                {io_call::read, fault::moves_none},
                                {io_call::read, fault::moves_one},
                                {io_call::read, fault::moves_half},
                                {io_call::write},
                                {io_call::write, fault::moves_none},
                                {io_call::write, fault::moves_one},
                                {io_call::write, fault::moves_half},
                                {io_call::seek},
                                {io_call::seek, fault::stands_off},
                                {std::nullopt}};

void arm(const fault_plan &plan, int nth, bool lasting)
{
    fault_arm(plan.call.value_or(io_call::open), plan.call ? nth : 0, plan.what, lasting);
    memory_arm(plan.call ? 0 : nth, lasting);
}

bool went_wrong()
{
    return fault_fired() || memory_denied();
}

struct step {
    bool writes;
    std::int32_t band, line, samp, nlines, nsamps;
};

// The life of one file, and what it must hold by then.
class life {
public:
    life(const std::string &name, const test_geometry &geometry)
        : m_name(name), m_geometry(geometry), m_model(geometry), m_doubtful(geometry)
    {
    }

    void run(bool faults_last)
    {
        m_image = create_test_file(m_name + "@fault", m_geometry);
        m_created = m_image != -1;
        EXPECT_TRUE(m_created || went_wrong());
        run({{true, 1, 3, 2, 2, 5},
             {false, 1, 3, 2, 2, 5},
             {true, 0, 1, 0, 2, 3},
             {false, 0, 1, 0, 2, 3}},
            faults_last);
        if (!m_created) return;
        const auto printed_before = printed();
        m_image = open_test_file(m_name + "@fault", IMG_OPEN_READ_WRITE);
        EXPECT_TRUE(m_image != -1 || memory_denied() ||
                    (fault_fired() && errno == 22 && printed() == printed_before));
        run({{true, 1, 1, 1, 3, 4}, {false, 0, 0, 0, 5, 7}}, faults_last);
    }
    // Once nothing goes wrong any more.
    void verify()
    {
        EXPECT_EQ(open_descriptors(), 0);
        m_image = m_created ? open_test_file(m_name, IMG_OPEN_READ_WRITE)
                            : create_test_file(m_name, m_geometry);
        run({}, false);  // which completes the file
        m_image = open_test_file(m_name, IMG_OPEN_READ_ONLY);
        EXPECT_NE(m_image, -1);
        run({{false, 0, 0, 0, 5, 7}, {false, 1, 0, 0, 5, 7}}, false);
    }

private:
    static off_t printed() { return ::lseek(STDERR_FILENO, 0, SEEK_CUR); }

    // Goes through the steps and closes the image.
    void run(const std::vector<step> &steps, bool faults_last)
    {
        for (const step &each : steps)
            if (m_image != -1) run(each);
        const bool wrong_before = went_wrong();
        EXPECT_EQ(img_closefile(m_image), 0);
        // What cannot be written back from the cache by now goes unreported.
        if (went_wrong() && (faults_last || !wrong_before))
            for (const step &each : steps)
                for_each_sample(each, [&](auto, auto... place) {
                    if (each.writes) m_doubtful.at(place...) = 1;
                });
    }
    void run(const step &at)
    {
        bytes buffer(static_cast<std::size_t>(at.nlines * at.nsamps * m_geometry.nbytes));
        if (at.writes)
            for (auto &byte : buffer) byte = ++m_last_byte;
        const auto printed_before = printed();
        const bool done =
            (at.writes ? img_dump_buffer(m_image, at.line, at.samp, at.nlines, at.nsamps, at.band,
                                         buffer.data(), at.nsamps, nullptr)
                       : img_load_buffer(m_image, at.line, at.samp, at.nlines, at.nsamps, at.band,
                                         buffer.data(), at.nsamps, nullptr)) == 0;
        EXPECT_TRUE(done || went_wrong());
        // The reading of virtual tiles speaks of lines that are not there yet.
        EXPECT_TRUE(done == (printed() == printed_before) || memory_denied() ||
                    img_find_image(m_image)->virtual_tiled != 0);
        for_each_sample(at, [&](std::size_t i, auto... place) {
            const auto value = static_cast<std::uint16_t>(
                m_geometry.nbytes == 1 ? buffer[i] : buffer[2 * i] | buffer[2 * i + 1] << 8);
            if (at.writes) m_doubtful.at(place...) = done ? 0 : 1;
            if (at.writes && done) m_model.at(place...) = value;
            EXPECT_TRUE(!done || m_doubtful.at(place...) != 0 || value == m_model.at(place...));
        });
    }
    template <typename Visit>
    static void for_each_sample(const step &at, Visit visit)
    {
        for (std::int32_t i = 0; i < at.nlines * at.nsamps; ++i)
            visit(static_cast<std::size_t>(i), at.band, at.line + i / at.nsamps,
                  at.samp + i % at.nsamps);
    }

    std::string m_name;
    test_geometry m_geometry;
    bool m_created = false;
    img_handle m_image = -1;
    std::uint8_t m_last_byte = 0;
    model_image m_model;
    model_image m_doubtful;  // 1: of a write that failed
};

class Faults : public testing::TestWithParam<std::int32_t> {};  // its parameter is the layout

TEST_P(Faults, AreReportedAndLoseNothing)
{
    const scratch_folder folder;
    const stderr_capture quiet;
    img_default_tile_nsamps = 4;
    img_default_tile_nlines = 2;
    const bool tiled = GetParam() >= IMG_LAYOUT_TILED;
    test_geometry geometry{5, 7, 2, 1, tiled ? 4 : 0, tiled ? 2 : 0, GetParam()};
    for (geometry.nbytes = 1; geometry.nbytes < 3; ++geometry.nbytes)
        for (img_cache_mb = 0; img_cache_mb < 2; ++img_cache_mb)
            for (const fault_plan &plan : PLANS)
                for (const bool lasting : {false, true})
                    for (int nth = 1;; ++nth) {
                        life file(folder / "scene", geometry);
                        arm(plan, nth, lasting);
                        file.run(lasting);
                        if (!went_wrong()) break;
                        arm(plan, 0, false);
                        file.verify();
                        ASSERT_FALSE(HasFailure())
                            << geometry.nbytes << " bytes, cache " << img_cache_mb << ", plan "
                            << &plan - PLANS << (lasting ? " from " : " at ") << nth;
                    }
    img_cache_mb = 0;
}

INSTANTIATE_TEST_SUITE_P(Layouts, Faults, testing::Range(0, 5));

}  // namespace
