// Start-up and clean-up. This file alone knows which formats and access methods there are. Read
// library.h first.
#include "api/library.h"

#include "base/image_table.h"
#include "base/scratch.h"
#include "base/types.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "io/io_default.h"

#include <utility>

namespace {

using type_registration = std::int32_t (*)(std::int32_t slot, img_type_desc *slot_record);

// One registration per static slot; null: the slot stays empty. A file that two types would accept
// belongs to the one in the lower slot.
constexpr std::array<type_registration, IMG_STATIC_TYPES> img_static_types = [] {
    std::array<type_registration, IMG_STATIC_TYPES> list{};
    list[IMG_TYPE_VITEC] = img_vitec_register;
    list[IMG_TYPE_HELAVA] = img_helava_register;
    return list;
}();

// Registered after the types.
constexpr std::array<std::pair<const char *, std::int32_t (*)(const char *name)>, 1>
    img_late_registrations{{{"", img_register_default_io_method}}};

bool initialised = false;

}  // namespace

void img_library_init()
{
    if (initialised) return;
    img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
    for (std::int32_t slot = 0; slot < IMG_MAX_TYPES; ++slot) {
        img_type_slot(slot).enabled = 0;
        img_type_slot(slot).spare = {};
    }
    for (std::size_t slot = 0; slot < img_static_types.size(); ++slot)
        if (img_static_types[slot] != nullptr)
            img_static_types[slot](static_cast<std::int32_t>(slot), &img_type_table[slot]);
    for (const auto &[name, registration] : img_late_registrations) registration(name);

    // Without a pool this call fails as with no free handle, and the next one tries again.
    // Registering twice changes nothing.
    initialised = img_handle_pool != nullptr;
}

std::int32_t img_mgr_cleanup()
{
    img_pool_free(std::exchange(img_handle_pool, nullptr));
    img_free_scratch();
    return 0;
}
