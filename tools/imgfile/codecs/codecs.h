// The formats one by one. recognise.h chooses among the readers, output_format.h among the writers.
#ifndef TOOL_CODECS_H
#define TOOL_CODECS_H

#include "codecs/image.h"

#include <memory>

class output_file;

std::unique_ptr<image_reader> open_native(input_file file);  // VITec, Helava
std::unique_ptr<image_reader> open_pnm(input_file file);
std::unique_ptr<image_reader> open_png(input_file file);
std::unique_ptr<image_reader> open_tiff(input_file file);

std::unique_ptr<image_writer> create_native(output_file &out, file_format format, const shape &form,
                                            tile_size tiles);
std::unique_ptr<image_writer> create_pnm(output_file &out, file_format format, const shape &form);
std::unique_ptr<image_writer> create_png(output_file &out, const shape &form);
std::unique_ptr<image_writer> create_tiff(output_file &out, const shape &form, tile_size tiles);

#endif
