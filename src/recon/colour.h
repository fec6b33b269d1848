// Colour conversion and pixel output: fused upsample-and-convert writers,
// resizing row converters and per-row pixel writers for every colour space
// and output format.
//
// Geometry contract (set by the decoder set-up before any writer runs):
// - The source picture is the reduced image; the part that reaches the
//   output is columns [crop_x, crop_x + cropped_reduced_width) and, after
//   crop_y rows that the row loop consumes without storing,
//   cropped_reduced_height rows. It is resized to visible_width x
//   visible_height output pixels. no_resize is 1 when the two sizes are
//   equal (then every source row and column maps to one output pixel).
// - output_ptr addresses the output pixel of the first source-order row and
//   first source-order column; consecutive pixels of a row are pixel_step
//   pixels apart and consecutive rows row_step bytes apart (rotation is
//   expressed through these steps). Each written row advances output_ptr by
//   row_step and output_rows by one.
// - Planar output (format 2) writes luma through the same cursor (one byte
//   per pixel) and chroma into u_plane/v_plane (c_stride bytes per row) for
//   every output pixel whose output coordinates are both even, from that
//   pixel. Unrotated output keeps u_ptr/v_ptr at the chroma row of the
//   current output row.
// - range_limit addresses the identity part of the clamping table:
//   range_limit[x] clamps x to 0..255 for -256 <= x < 640.
#ifndef VETAJ_RECON_COLOUR_H
#define VETAJ_RECON_COLOUR_H

#include <cstdint>

#include "drivers/decoder.h"

// Chooses the row converter for the decoder's colour space, output size and
// decode mode, and prepares the resampling state (resize tables,
// accumulators). Returns 200, or 201 for an unsupported colour space or when
// memory runs out.
int32_t vj_select_converter(DecoderInfo* decoder);
// Releases the resampling state.
void vj_release_converter(DecoderInfo* decoder);
// The fused writer for a chroma layout (fused code 1: 4:2:0, 2: 4:2:2
// horizontal, 3: 4:2:2 vertical, 4: 4:4:4) and output format.
FusedWriterFn vj_select_fused_writer(int32_t fused_code, int32_t output_format);

// Bytes per pixel of an output format in the packed layouts (0 for planar
// and for formats that are only counted).
int32_t vj_bytes_per_pixel(int32_t output_format);

#endif  // VETAJ_RECON_COLOUR_H
