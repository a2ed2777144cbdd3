// Creates, writes, reads and closes an image again and again on a disk that fails in between. Bytes
// that no failing call was writing must be unchanged.
#include "checked_image.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    const fuzz_run run;
    fuzz_input in({data, size});
    const std::string name = "file@memory";
    open_image image = checked_create(in, name, 0);
    while (!in.ended() && image.handle != -1) {
        for (int left = in.below(8); left > 0; --left) {
            const std::int32_t calls_before = in.below(32);
            disk.faults.emplace_back(calls_before, in.below(DISK_FAULTS));
        }
        for (int left = in.below(8); left > 0; --left) checked_transfer(in, image, true);
        checked_close(image, true);
        image = in.below(4) == 0 ? checked_create(in, name, 0, true)
                                 : checked_open(name, IMG_OPEN_READ_WRITE, 0, true);
        checked_transfer(in, image, true);
        disk.faults.clear();
        if (image.handle != -1) checked_close(image);
        image = checked_open(name, IMG_OPEN_READ_WRITE, 0);
        for (int left = in.below(4); left > 0; --left) checked_transfer(in, image);
    }
    return 0;
}
