// The table of chains, one per handle, and what all parts of the chain share. Read chain.h first.
#include "chain/chain.h"

#include "base/count.h"
#include "base/image_table.h"

namespace {

std::array<img_chain, IMG_MAX_HANDLES> chains;

}  // namespace

img_chain &img_chain_of(img_handle handle)
{
    return chains[img_count(handle)];
}

void img_chain_release(img_chain &chain)
{
    chain.work_memory.reset();
    chain.work_buffer = nullptr;
    chain.work_def = nullptr;
    chain.final_buffer = nullptr;
    chain.final_def = nullptr;
}

void img_chain_release(img_handle handle)
{
    img_chain_release(img_chain_of(handle));
}

std::int32_t img_chain_out_bits(img_handle handle)
{
    return img_chain_of(handle).out_bits;
}

std::int32_t img_chain_out_nbytes(img_handle handle)
{
    return img_chain_nbytes(img_chain_out_bits(handle));
}

std::int32_t img_chain_nbytes(std::int32_t nbits)
{
    return ((nbits - 1) >> 3) + 1;
}

img_scratch img_chain_new_buffer(std::int32_t nlines, std::int32_t stride, std::int32_t nbytes)
{
    if (nlines < 0 || stride < 0 || nbytes < 0) return nullptr;
    const auto samples =
        std::uint64_t{static_cast<std::uint32_t>(nlines)} * static_cast<std::uint32_t>(stride);
    return img_take_scratch(samples * static_cast<std::uint32_t>(nbytes));
}
