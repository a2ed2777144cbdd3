// The constants of img.h are no part of any function's type. One variable of each enumeration
// brings them into the interface that is described.
#include "imgfile/img.h"

extern "C" {
IMG_EXPORT extern const decltype(IMG_TYPE_VITEC) img_image_types{};
IMG_EXPORT extern const decltype(IMG_OPEN_READ_ONLY) img_flags_of_openfile{};
}
