// The input is a file. Opens it on the memory disk and through the operating system, reads it and,
// where it is opened for writing, writes it. Compares every result with the model.
#include "checked_image.h"
#include "support/random.h"

#include <sys/mman.h>
#include <unistd.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    static const int fd = memfd_create("open_read", 0);
    static const std::string real = "/proc/self/fd/" + std::to_string(fd);
    require(ftruncate(fd, 0) == 0 && pwrite(fd, data, size, 0) == static_cast<ssize_t>(size),
            "a file in memory can be written");
    const fuzz_run run;
    random_numbers random(static_cast<std::uint32_t>(size));
    for (const auto &[name, oflags] : {std::pair{real, IMG_OPEN_READ_ONLY},
                                       {"file@memory", IMG_OPEN_READ_ONLY},
                                       {"file@memory", IMG_OPEN_READ_WRITE},
                                       {"file@lending", IMG_OPEN_READ_WRITE}}) {
        disk.files[name.substr(0, name.find('@'))].assign(data, data + size);
        const open_image image = checked_open(name, oflags, 0);
        if (image.handle == -1) continue;
        bytes choices(150);
        for (auto &each : choices) each = static_cast<std::uint8_t>(random.below(256));
        for (fuzz_input in(choices); !in.ended();) checked_transfer(in, image);
        checked_close(image);
    }
    bytes after(size + 1);
    after.resize(static_cast<std::size_t>(pread(fd, after.data(), after.size(), 0)));
    require(std::ranges::equal(after, std::span(data, size)), "reading changes no file");
    return 0;
}
