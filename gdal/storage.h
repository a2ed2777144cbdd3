// Where the drivers' files lie. Plain local files take the library's own way, which maps them; all
// others (/vsimem/, /vsizip/, /vsicurl/ ...) go through GDAL's virtual file system.
#ifndef GDAL_IMGFILE_STORAGE_H
#define GDAL_IMGFILE_STORAGE_H

#include "io/io_method.h"

#include <string>

// Returns the access method for a file name. The first call registers the method for virtual files.
const img_io_method *storage_of(const std::string &filename);

// Virtual files may report only while they are closed that what was written could not be stored.
// Returns the error number of such a close on this thread since the last call; 0 if there was none.
int take_close_error();

#endif
