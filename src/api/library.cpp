// Start-up and clean-up. This file alone knows which formats and access methods there are. Read
// library.h first.
#include "api/library.h"

#include "api/calls.h"
#include "base/image_table.h"
#include "base/scratch.h"
#include "base/shared_lock.h"
#include "base/types.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "io/io_default.h"

#include <atomic>
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

img_mutex start_mutex;
std::atomic<bool> initialised = false;

// Fills the tables. Types and methods that a test or a host has registered before stay.
void register_all()
{
    for (std::int32_t slot = 0; slot < IMG_MAX_TYPES; ++slot) {
        img_type_slot(slot).enabled = 0;
        img_type_slot(slot).spare = {};
    }
    for (std::size_t slot = 0; slot < img_static_types.size(); ++slot)
        if (img_static_types[slot] != nullptr)
            img_static_types[slot](static_cast<std::int32_t>(slot), &img_type_table[slot]);
    for (const auto &[name, registration] : img_late_registrations) registration(name);
}

}  // namespace

void img_library_init()
{
    if (initialised.load(std::memory_order_acquire)) return;
    const img_mutex_lock lock(start_mutex);
    if (initialised) return;  // uncounted: another thread was faster
    img_start_scratch();
    register_all();
    // Without a pool this call fails as with no free handle, and the next one tries again.
    // Registering twice changes nothing.
    initialised = img_make_handle_pool();
}

std::int32_t img_mgr_cleanup()
{
    const img_pause pause;
    img_free_handle_pool();
    if (pause.is_alone()) img_free_scratch();
    return 0;
}
