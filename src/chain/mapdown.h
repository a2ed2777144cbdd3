// The automatic mapdown, as the chain of one load. Its links share a table that every window fills
// anew. A load that works on a copy of the chain, with a table of its own, needs no lock.
#ifndef IMG_MAPDOWN_H
#define IMG_MAPDOWN_H

#include "chain/chain.h"

// True for a chain that consists of the mapdown alone, as it was installed.
bool img_is_mapdown(const img_chain &chain);

// A copy of such a chain for one load.
class img_mapdown_copy {
public:
    explicit img_mapdown_copy(const img_chain &chain);
    img_mapdown_copy(const img_mapdown_copy &) = delete;
    img_mapdown_copy &operator=(const img_mapdown_copy &) = delete;

    // Null: memory is short.
    img_chain *chain() { return m_table ? &m_chain : nullptr; }

private:
    img_scratch m_table;
    img_chain_lut m_lut;
    img_chain m_chain{};
};

#endif
