// Creates, writes, reads and closes an image of any geometry, then opens and reads it again.
#include "checked_image.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size)
{
    const fuzz_run run;
    fuzz_input in({data, size});
    open_image image = checked_create(in, "file@memory", 0);
    if (image.handle == -1) return 0;
    for (int left = in.below(16); left > 0; --left) checked_transfer(in, image);
    checked_close(image);
    image = checked_open("file@memory", in.below(2) * IMG_OPEN_READ_WRITE, 0);
    while (!in.ended()) checked_transfer(in, image);
    checked_close(image);
    return 0;
}
