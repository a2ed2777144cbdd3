// Bytes that the default access method lends, and the file that they lie in.
#ifndef IMG_TEST_LENDING_H
#define IMG_TEST_LENDING_H

#include "io/io_method.h"
#include "io/platform.h"
#include "support/file_test.h"

#include <functional>

#include <fcntl.h>
#include <unistd.h>

class Lending : public FileTest {
protected:
    Lending() { write_file(m_file, m_content); }
    ~Lending() override
    {
        img_platform_close(m_fd);
        ::close(m_other);
    }

    // Opens the file instead of the one that is open.
    void open(std::int32_t oflags)
    {
        img_platform_close(m_fd);
        m_fd = img_platform_open(m_file.c_str(), oflags, 0600);
    }
    // Lends bytes to `use`. Returns the result; 1: refused without a use.
    std::int32_t lend(std::int32_t offset, std::int32_t count,
                      std::function<void(const std::uint8_t *)> use)
    {
        const img_io_use_fn call = [](void *arg, const std::uint8_t *lent) {
            std::exchange(*static_cast<decltype(use) *>(arg), nullptr)(lent);
        };
        const std::int32_t result = img_platform_lend(m_fd, offset, count, 0, call, &use);
        return !use ? result : result == -1 ? 1 : -2;
    }
    std::int32_t lend_and_compare(std::int32_t offset, std::int32_t count)
    {
        return lend(offset, count, [&](const std::uint8_t *lent) {
            EXPECT_TRUE(std::equal(lent, lent + count, &m_content[0] + offset));
        });
    }
    void cut(std::size_t length) const
    {
        ASSERT_EQ(::ftruncate(m_other, static_cast<off_t>(length)), 0);
    }
    void restore() const { ASSERT_NE(::pwrite(m_other, &m_content[0], m_content.size(), 0), -1); }

    static constexpr std::int32_t SIZE = 300'000;
    bytes m_content = numbered(bytes(SIZE), 0, SIZE);
    std::int32_t m_fd = -1;
    int m_other = ::open((m_folder / "scene").c_str(), O_RDWR | O_CREAT, 0600);
};

#endif
