// Copying the mapdown. Read mapdown.h first, then stretch.h and chain_lut.h for its two links.
#include "chain/mapdown.h"

#include "base/count.h"
#include "base/settings.h"
#include "chain/chain_lut.h"
#include "chain/stretch.h"

#include <algorithm>

namespace {

// The table that the second link applies.
const img_chain_lut &table_of(const img_chain &chain)
{
    return *static_cast<const img_chain_lut *>(chain.links[img_count(img_mapdown_slot)].arg);
}

}  // namespace

bool img_is_mapdown(const img_chain &chain)
{
    const img_chain_link &computes = chain.links[img_count(img_mapdown_src_slot)];
    const img_chain_link &applies = chain.links[img_count(img_mapdown_slot)];
    return computes.kind == IMG_CHAIN_LUT_FCN && applies.kind == IMG_CHAIN_REMAP_FCN &&
           computes.lut_fcn.create_fn == img_chain_create_16to8_lut && applies.owns_arg != 0 &&
           table_of(chain).owned != 0 && table_of(chain).lut == computes.lut_fcn.lut &&
           std::ranges::count(chain.links, std::int32_t{IMG_CHAIN_EMPTY}, &img_chain_link::kind) ==
               IMG_CHAIN_LINKS - 2;
}

img_mapdown_copy::img_mapdown_copy(const img_chain &chain)
    : m_table(img_take_scratch(img_count(table_of(chain).size) * sizeof(std::uint16_t))),
      m_lut(table_of(chain))
{
    m_lut.lut = reinterpret_cast<std::uint16_t *>(m_table.get());
    m_chain.out_bits = chain.out_bits;
    for (const std::int32_t slot : {img_mapdown_src_slot, img_mapdown_slot})
        m_chain.links[img_count(slot)] = chain.links[img_count(slot)];
    m_chain.links[img_count(img_mapdown_src_slot)].lut_fcn.lut = m_lut.lut;
    m_chain.links[img_count(img_mapdown_slot)].arg = &m_lut;
}
