// The links of a chain. Slots are plain records that share storage by kind: `kind` says which part
// holds, and what a link owns is freed here alone. Read chain.h, then chain_links.h.
#include "chain/chain_links.h"

#include "base/count.h"
#include "base/image_table.h"
#include "base/report.h"
#include "chain/chain_lut.h"

#include <algorithm>
#include <new>

namespace {

bool is_slot(std::int32_t link)
{
    return link >= 0 && link < IMG_CHAIN_LINKS;
}

bool is_width(std::int32_t bits)
{
    return bits >= 1 && bits <= IMG_CHAIN_MAX_BITS;
}

img_chain_link &link_of(img_handle handle, std::int32_t link)
{
    return img_chain_of(handle).links[img_count(link)];
}

img_chain_lut lut_record(std::int32_t bits_in, std::int32_t bits_out, std::uint16_t *lut,
                         std::int32_t owned)
{
    return {.bits_in = static_cast<std::uint8_t>(bits_in),
            .bits_out = static_cast<std::uint8_t>(bits_out),
            .size = std::int32_t{1} << bits_in,
            .lut = lut,
            .owned = owned};
}

// Frees a table. Links that would fill it forget it.
void free_table(img_chain &chain, std::uint16_t *table)
{
    for (img_chain_link &link : chain.links)
        if (link.kind == IMG_CHAIN_LUT_FCN && link.lut_fcn.lut == table) link.lut_fcn.lut = nullptr;
    delete[] table;
}

// Empties a slot and frees what its link owns.
void empty_slot(img_chain &chain, img_chain_link &link)
{
    if (link.kind == IMG_CHAIN_LUT && link.lut_def.owned != 0) free_table(chain, link.lut_def.lut);
    if (link.owns_arg != 0) {
        auto *const record = static_cast<img_chain_lut *>(link.arg);
        if (record->owned != 0) free_table(chain, record->lut);
        delete record;
    }
    link.arg = nullptr;
    link.owns_arg = 0;
    link.kind = IMG_CHAIN_EMPTY;
}

// Marks the chain as changed: a preparation for the earlier links no longer holds.
void link_added(img_handle handle)
{
    img_chain_of(handle).identity = 0;
    img_chain_of(handle).prepared = 0;
}

void put_remap_link(img_handle handle, std::int32_t link, const img_chain_remap_part &remap,
                    void *arg, std::int32_t owns_arg)
{
    img_chain_link &slot = link_of(handle, link);
    slot.kind = IMG_CHAIN_REMAP_FCN;
    slot.arg = arg;
    slot.owns_arg = owns_arg;
    slot.remap = remap;
    img_chain_update_out_bits(handle);
    link_added(handle);
}

}  // namespace

void img_chain_init(img_handle handle)
{
    img_chain &chain = img_chain_of(handle);
    img_chain_release(chain);
    for (img_chain_link &link : chain.links) empty_slot(chain, link);
    chain.identity = 1;
    chain.prepared = 0;
    chain.has_lut_link = 0;
    chain.lut_bits = 0;
    chain.out_bits = img_query_nbits(handle);
}

std::int32_t img_chain_add_remap_link(img_handle handle, std::int32_t link, std::int32_t out_bits,
                                      void *arg, img_chain_process_fn process_fn,
                                      img_chain_input_def_fn input_def_fn)
{
    if (img_validate_img_handle(handle) != 0 || !is_slot(link) || process_fn == nullptr) return -1;
    put_remap_link(handle, link,
                   {.out_bits = out_bits, .process_fn = process_fn, .input_def_fn = input_def_fn},
                   arg, 0);
    return 0;
}

std::int32_t img_chain_add_lut_link(img_handle handle, std::int32_t link, std::int32_t bits_in,
                                    std::int32_t bits_out, std::int32_t remap, std::uint16_t *lut,
                                    std::int32_t owned)
{
    if (img_validate_img_handle(handle) != 0 || !is_slot(link) || !is_width(bits_in) ||
        !is_width(bits_out) || lut == nullptr)
        return -1;
    if (remap == 0) {
        img_chain_link &slot = link_of(handle, link);
        slot.kind = IMG_CHAIN_LUT;
        slot.arg = nullptr;
        slot.owns_arg = 0;
        slot.lut_def = lut_record(bits_in, bits_out, lut, owned);
        link_added(handle);
        return 0;
    }
    auto *const record =
        new (std::nothrow) img_chain_lut(lut_record(bits_in, bits_out, lut, owned));
    if (record == nullptr) return -1;
    put_remap_link(handle, link,
                   {.out_bits = bits_out,
                    .process_fn = img_chain_lut_remap,
                    .input_def_fn = img_chain_lut_input_definition},
                   record, 1);
    return 0;
}

std::int32_t img_chain_add_lut_create_link(img_handle handle, std::int32_t link, void *arg,
                                           img_chain_create_fn create_fn, std::int32_t target,
                                           std::int32_t bits_in, std::int32_t bits_out,
                                           std::int32_t remap, std::uint16_t *lut,
                                           std::int32_t owned)
{
    if (img_validate_img_handle(handle) != 0 || !is_slot(link) || target <= link ||
        !is_slot(target) || create_fn == nullptr || !is_width(bits_in) || !is_width(bits_out))
        return -1;
    std::unique_ptr<std::uint16_t[]> made;
    if (lut == nullptr) {
        made.reset(new (std::nothrow) std::uint16_t[std::size_t{1} << bits_in]{});
        if (!made) return img_fail("img_chain_add_lut_create_link: error mallocing lut!!!\n");
        lut = made.get();
        owned = 1;
    }
    if (img_chain_add_lut_link(handle, target, bits_in, bits_out, remap, lut, owned) != 0)
        return -1;
    static_cast<void>(made.release());  // the target link owns it now
    img_chain_link &slot = link_of(handle, link);
    slot.kind = IMG_CHAIN_LUT_FCN;
    slot.arg = arg;
    slot.owns_arg = 0;
    slot.lut_fcn = {.create_fn = create_fn, .lut = lut, .target = target, .bits_in = bits_in};
    if (remap != 0) img_chain_update_out_bits(handle);
    link_added(handle);
    return 0;
}

std::int32_t img_chain_remove_link(img_handle handle, std::int32_t link)
{
    if (img_validate_img_handle(handle) != 0 || !is_slot(link)) return -1;
    img_chain &chain = img_chain_of(handle);
    while (link != -1) {
        img_chain_link &slot = link_of(handle, link);
        link = slot.kind == IMG_CHAIN_LUT_FCN ? slot.lut_fcn.target : -1;
        empty_slot(chain, slot);
    }
    img_chain_update_out_bits(handle);
    const bool empty = std::ranges::all_of(
        chain.links, [](const img_chain_link &each) { return each.kind == IMG_CHAIN_EMPTY; });
    chain.identity = empty ? 1 : 0;
    chain.prepared = 0;
    return 0;
}

void img_chain_update_out_bits(img_handle handle)
{
    img_chain &chain = img_chain_of(handle);
    const auto states_width = [](const img_chain_link &link) {
        return link.kind == IMG_CHAIN_REMAP_FCN && link.remap.out_bits > 0;
    };
    const auto last = std::find_if(chain.links.rbegin(), chain.links.rend(), states_width);
    chain.out_bits = last != chain.links.rend() ? last->remap.out_bits : img_query_nbits(handle);
}
