// Start-up and clean-up of the library.
#include "api/img_desc.h"
#include "api/scratch.h"
#include "api/types.h"
#include "formats/helava.h"
#include "formats/vitec.h"
#include "io/io_method.h"

#include <utility>

namespace {

using type_registration = std::int32_t (*)(std::int32_t slot, img_type_desc *slot_record);

// One registration per static slot; null: the slot stays empty. Slot order decides which type
// a file belongs to that two of them would accept.
constexpr std::array<type_registration, IMG_STATIC_TYPES> img_static_types = [] {
    std::array<type_registration, IMG_STATIC_TYPES> list{};
    list[IMG_TYPE_VITEC] = img_vitec_register;
    list[IMG_TYPE_HELAVA] = img_helava_register;
    return list;
}();

// What is registered once the types are known.
constexpr std::array<std::pair<const char *, std::int32_t (*)(const char *name)>, 1>
    img_late_registrations{{{"", img_register_default_io_method}}};

bool initialised = false;

}  // namespace

void img_library_init()
{
    if (initialised) return;
    img_handle_pool = img_pool_create(0, IMG_MAX_HANDLES);
    for (std::size_t slot = 0; slot < IMG_MAX_TYPES; ++slot) {
        img_type_table[slot].enabled = 0;
        img_type_table[slot].spare = {};
    }
    for (std::size_t slot = 0; slot < img_static_types.size(); ++slot)
        if (img_static_types[slot] != nullptr)
            img_static_types[slot](static_cast<std::int32_t>(slot), &img_type_table[slot]);
    for (const auto &[name, registration] : img_late_registrations) registration(name);

    // Without memory for the handles this call fails for want of one, and the next tries again;
    // registering twice changes nothing.
    initialised = img_handle_pool != nullptr;
}

std::int32_t img_mgr_cleanup()
{
    img_pool_free(std::exchange(img_handle_pool, nullptr));
    img_free_scratch();
    return 0;
}

const img_type_desc &img_type_of(const img_desc *desc)
{
    return img_type_table[static_cast<std::size_t>(desc->type)];
}
