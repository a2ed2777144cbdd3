// The first half of a load: what the image type must deliver, and where each link works.
#include "api/img_desc.h"
#include "api/report.h"
#include "chain/chain.h"

#include <algorithm>

namespace {

// Fails a preparation; its message, if any, has been printed.
std::uint8_t *not_prepared(img_chain &chain)
{
    chain.prepared = 0;
    return nullptr;
}

// Works out, for one link, what it gets for what follows it. `def` is the latter on entry and the
// former on return, `placement` likewise where a link would put its output.
std::int32_t prepare_link(img_chain &chain, img_chain_link &link, img_buffer_def *def,
                          std::int32_t *placement)
{
    link.out_def = *def;
    link.placement = *placement;
    link.changes_def = 0;
    if (link.kind == IMG_CHAIN_LUT) {
        chain.has_lut_link = 1;
        chain.lut_bits = std::max(chain.lut_bits, std::int32_t{link.lut_def.bits_in});
    }
    if (link.kind != IMG_CHAIN_REMAP_FCN) return 0;

    const img_chain_remap_part &remap = link.remap;
    if (remap.out_bits != 0 && remap.out_bits != def->nbits)
        return img_fail("img_chain_prepare_operations: Inconsistent output bits in image "
                        "chain!\n");
    if (remap.input_def_fn == nullptr) return 0;
    img_buffer_def in_def = *def;
    link.changes_def = remap.input_def_fn(link.arg, def, &in_def);
    if (link.changes_def < 0)
        return img_fail("img_chain_prepare_operations: get_input_definition() failed!!\n");
    *def = in_def;
    chain.lut_bits = std::max(chain.lut_bits, def->nbits);
    if (link.changes_def != 0) *placement = IMG_CHAIN_OUT_UNDECIDED;
    return 0;
}

// Gives the chain a packed buffer of its own for the image type to read into. Returns false when
// memory is short.
bool take_work_buffer(img_chain &chain, img_buffer_def *def)
{
    def->stride = def->nsamps;
    if (def->nbytes > chain.final_def->nbytes) def->fill = chain.final_def->fill;
    chain.work_memory = img_chain_new_buffer(def->nlines, def->nsamps, def->nbytes);
    chain.work_buffer = chain.work_memory.get();
    return chain.work_buffer != nullptr;
}

// Links before the first that changes the definition work in place on what the image type reads.
void describe_links_in_place(img_chain &chain, const img_buffer_def &def)
{
    const auto first_change =
        std::ranges::find_if(chain.links, [](const auto &link) { return link.changes_def != 0; });
    if (first_change == chain.links.end()) return;
    std::for_each(chain.links.begin(), first_change, [&def](img_chain_link &link) {
        link.out_def.stride = def.stride;
        link.out_def.nbytes = def.nbytes;
        link.out_def.nbits = def.nbits;
    });
}

// Settles who frees what, now that it is known whether the first buffer is a temporary one.
void settle_buffers(img_chain &chain, bool temporary)
{
    for (img_chain_link &link : chain.links) {
        const bool changes = link.changes_def != 0;
        link.release_input = changes && temporary ? IMG_CHAIN_FREE_INPUT : IMG_CHAIN_KEEP_INPUT;
        if (changes) temporary = false;
        if (link.placement != IMG_CHAIN_OUT_UNDECIDED) continue;
        link.placement = changes ? IMG_CHAIN_OUT_ALLOC : IMG_CHAIN_OUT_IN_PLACE;
        if (changes) temporary = true;
    }
}

bool agree(const img_buffer_def &a, const img_buffer_def &b)
{
    return a.nlines == b.nlines && a.nsamps == b.nsamps && a.nbytes == b.nbytes &&
           a.stride == b.stride;
}

}  // namespace

std::uint8_t *img_chain_prepare_operations(img_handle handle, std::uint8_t *buffer,
                                           const img_buffer_def *def, img_buffer_def *work_def)
{
    img_chain &chain = img_chain_of(handle);
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return nullptr;
    if (chain.identity != 0) {
        *work_def = *def;
        return buffer;
    }
    img_chain_release(handle);  // what is left of an earlier load that did not come to its end
    chain.prepared = 1;
    if (def->nbits != chain.out_bits) {
        img_fail("img_chain_prepare_operations:  output bits of image chain dont match output "
                 "buffer!\n");
        return not_prepared(chain);
    }
    chain.final_buffer = buffer;
    chain.final_def = def;
    chain.has_lut_link = 0;
    chain.lut_bits = def->nbits;

    img_buffer_def needed = *def;
    std::int32_t placement = IMG_CHAIN_OUT_FINAL;
    for (auto link = chain.links.rbegin(); link != chain.links.rend(); ++link)
        if (prepare_link(chain, *link, &needed, &placement) == -1) return not_prepared(chain);
    needed.nbits = desc->nbits;
    needed.nbytes = desc->nbytes;
    chain.lut_bits = std::max(chain.lut_bits, needed.nbits);

    const bool direct = agree(needed, *def);
    if (direct)
        chain.work_buffer = buffer;
    else if (!take_work_buffer(chain, &needed))
        return not_prepared(chain);
    describe_links_in_place(chain, needed);
    *work_def = needed;
    chain.work_def = work_def;
    settle_buffers(chain, !direct);
    return chain.work_buffer;
}

img_scratch img_chain_new_buffer(std::int32_t nlines, std::int32_t stride, std::int32_t nbytes)
{
    if (nlines < 0 || stride < 0 || nbytes < 0) return nullptr;
    const auto samples =
        std::uint64_t{static_cast<std::uint32_t>(nlines)} * static_cast<std::uint32_t>(stride);
    return img_take_scratch(samples * static_cast<std::uint32_t>(nbytes));
}
