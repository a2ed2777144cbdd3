// Start-up of the library: what is registered before the first image.
#ifndef IMG_LIBRARY_H
#define IMG_LIBRARY_H

// Fills the tables of types and access methods and makes the handle pool, once per process. Does
// nothing afterwards. Without memory for the pool the next call tries again.
void img_library_init();

#endif
