// Preparing a load. Definitions are worked out from slot 9 back to slot 0, then buffers are
// assigned from slot 0 on. Read chain.h, then chain_prepare.h.
#include "chain/chain_prepare.h"

#include "base/image_table.h"
#include "base/img_desc.h"
#include "base/report.h"

#include <algorithm>

namespace {

// Fails a preparation; its message, if any, has been printed.
std::uint8_t *fail_preparation(img_chain &chain)
{
    img_chain_release(chain);
    chain.prepared = 0;
    return nullptr;
}

// Works out the input of one link from its output. `def` describes the output on entry and the
// input on return; `placement` likewise says where a link puts its output.
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

// Links below the first one that changes the definition work in place on the work buffer, so they
// get its stride. They keep the width that they state, unless such samples would not fit.
void describe_links_in_place(img_chain &chain, const img_buffer_def &def)
{
    const auto first_change =
        std::ranges::find_if(chain.links, [](const auto &link) { return link.changes_def != 0; });
    if (first_change == chain.links.end()) return;
    std::for_each(chain.links.begin(), first_change, [&def](img_chain_link &link) {
        link.out_def.stride = def.stride;
        if (link.out_def.nbytes <= def.nbytes) return;
        link.out_def.nbytes = def.nbytes;
        link.out_def.nbits = def.nbits;
    });
}

// Decides which link frees which buffer. `temporary`: the buffer that the image type reads into is
// the chain's own.
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
    const img_desc *const desc = img_find_image(handle);
    if (desc == nullptr) return nullptr;
    return img_chain_prepare(img_chain_of(handle), desc, buffer, def, work_def);
}

std::uint8_t *img_chain_prepare(img_chain &chain, const img_desc *desc, std::uint8_t *buffer,
                                const img_buffer_def *def, img_buffer_def *work_def)
{
    if (chain.identity != 0) {
        *work_def = *def;
        return buffer;
    }
    img_chain_release(chain);  // an earlier load may not have come to its end
    chain.prepared = 1;
    if (def->nbits != chain.out_bits) {
        img_fail("img_chain_prepare_operations:  output bits of image chain dont match output "
                 "buffer!\n");
        return fail_preparation(chain);
    }
    chain.final_buffer = buffer;
    chain.final_def = def;
    chain.has_lut_link = 0;
    chain.lut_bits = def->nbits;

    img_buffer_def needed = *def;
    std::int32_t placement = IMG_CHAIN_OUT_FINAL;
    for (auto link = chain.links.rbegin(); link != chain.links.rend(); ++link)
        if (prepare_link(chain, *link, &needed, &placement) == -1) return fail_preparation(chain);
    needed.nbits = desc->nbits;
    needed.nbytes = desc->nbytes;
    chain.lut_bits = std::max(chain.lut_bits, needed.nbits);

    const bool direct = agree(needed, *def);
    if (direct)
        chain.work_buffer = buffer;
    else if (!take_work_buffer(chain, &needed))
        return fail_preparation(chain);
    describe_links_in_place(chain, needed);
    *work_def = needed;
    chain.work_def = work_def;
    settle_buffers(chain, !direct);
    return chain.work_buffer;
}
