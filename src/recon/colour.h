// Colour conversion and pixel output: fused upsample-and-convert writers,
// resizing row converters and per-row pixel writers for every colour space
// and output format.
//
// Geometry contract (set by the decoder set-up before any writer runs):
// - The source picture is the reduced image; the part that reaches the
//   output is columns [crop_x, crop_x + cropped_reduced_width) and, after
//   crop_y rows that the row loop consumes without storing,
//   cropped_reduced_height rows. It is resized to visible_width x
//   visible_height output pixels. When the two sizes are equal (no_resize)
//   every source row and column maps to one output pixel; the converters
//   compare the sizes themselves.
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
// - output_rows starts at 0 and counts rows written through the cursor. No
//   writer writes more than visible_height rows or more than visible_width
//   pixels per row (in region mode also no more than region_height rows and
//   region_width pixels); rows past that limit leave the cursor unchanged.
// - Every packed format is written through the pixel step (rotation by 90,
//   180 and 270 degrees works for all of them); the output pointer must be
//   set for formats 0, 1, 3, 5 to 12 (2, 3 or 4 bytes per pixel, see
//   vj_bytes_per_pixel). Format 4 only counts rows.
//
// Columns: a writer reads a source row from its first source column,
// crop_x + the region column. The region column is 0 outside region mode;
// in region mode (owner->region_mode) it is region_left AND a mask chosen
// by path_code, and the source rows handed to the writers must begin at the
// region's aligned left edge. When that column is odd, the fused writers
// convert the first pixel alone (with the chroma sample of its pair) and
// then go on in pairs.
//
// Region mode: the geometry describes the region. visible_width x
// visible_height is the region's output size, cropped_reduced_width x
// cropped_reduced_height its size in source pixels (equal unless the region
// is resized), crop_x = crop_y = 0, and the cursor addresses the region's
// own buffer. Source rows are numbered in the reduced image: the resampler's
// source-row counter (Resampler::src_row) holds the number of the next row
// handed to a converter or the first luma row of the next fused call. The
// row driver sets it with vj_converter_set_row when the first row it hands
// over is not row 0 or when it skips rows; converters and fused writers
// advance it by the rows they receive. Rows
// outside [region_top, region_top + cropped_reduced_height) are consumed
// without output; a two-row fused call writes only its rows inside
// [region_top, region_top + region_height).
#ifndef VETAJ_RECON_COLOUR_H
#define VETAJ_RECON_COLOUR_H

#include <cstdint>

#include "drivers/decoder.h"

// Resampling state of the row converters, owned by the decoder
// (DecoderInfo::resampler) and built by vj_select_converter.
struct Resampler {
  uint32_t src_width;    // S: source columns per row (cropped_reduced_width)
  uint32_t src_height;   // source rows (cropped_reduced_height)
  uint32_t dst_width;    // D: output pixels per row (visible_width)
  uint32_t dst_height;   // output rows (visible_height)
  uint32_t src_row;      // number of the next source row
  uint32_t out_row;      // next output row the resampler produces
  uint32_t more_output;  // set by the row driver before converting; the
                         // converters produce every row a batch completes
                         // and always clear it
  uint32_t* col_a;       // per output column: source column (centre
                         // sampling) or the 1/4-point column (averaging)
  uint32_t* col_b;       // averaging: the 3/4-point column
  uint32_t* acc;         // averaging: packed sums of output row out_row
  uint32_t* hsum;        // packed two-column sums of the current source row
};

// Chooses the row converter for the decoder's colour space, output size and
// decode mode, and prepares the resampling state (resize tables,
// accumulators). Returns 200, or 201 for an unsupported colour space, a
// source window outside the reduced picture, an empty or oversized size, or
// when memory runs out. The decoder's ColourConverter must be allocated.
int32_t vj_select_converter(DecoderInfo* decoder);
// Sets the number of the next source row (see "Region mode" above).
void vj_converter_set_row(DecoderInfo* decoder, uint32_t row);
// Releases the resampling state (VETAJ_DeleteDecoderInfo must call it).
void vj_release_converter(DecoderInfo* decoder);
// The fused writer for a chroma layout (fused code 1: 4:2:0, 2: 4:2:2
// horizontal, 3: 4:2:2 vertical, 4: 4:4:4) and output format.
FusedWriterFn vj_select_fused_writer(int32_t fused_code, int32_t output_format);

// Bytes per pixel of an output format in the packed layouts (0 for planar
// and for formats that are only counted).
int32_t vj_bytes_per_pixel(int32_t output_format);

#endif  // VETAJ_RECON_COLOUR_H
