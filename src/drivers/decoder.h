// DecoderInfo: the state of one decode of one DecInfo.
//
// Fields are grouped by the stage that writes them. Another stage may read a
// group but asks its owner to change it.
#ifndef VETAJ_DRIVERS_DECODER_H
#define VETAJ_DRIVERS_DECODER_H

#include <cstdint>

#include "entropy/huffman.h"
#include "io/stream.h"
#include "platform/common.h"
#include "syntax/markers.h"

struct Upsampler;        // reconstruction: per-component upsampling record
struct Resampler;        // reconstruction: state of the resizing colour converters
struct ScanInfo;         // saved state of one progressive scan
struct EntropySnapshot;  // saved entropy-decoder position (scan index)

// Colour spaces of a frame.
constexpr int32_t kColourGrey = 1;
constexpr int32_t kColourRgb = 2;
constexpr int32_t kColourYcc = 3;
constexpr int32_t kColourCmyk = 4;
constexpr int32_t kColourYcck = 5;

// Decoder function types.
using McuDecodeFn = int32_t (*)(DecoderInfo* decoder, int16_t** blocks);
using RowDecodeFn = int32_t (*)(DecoderInfo* decoder, uint8_t*** row_buffers);
// Row converter: rows[c][i] is row i of the batch of component c (upsampled
// to the full sample grid); writes what the batch yields to the output.
using ConvertFn = void (*)(DecoderInfo* decoder, uint8_t* const* const* rows, uint32_t count);
// Fused upsample-and-convert writer: luma rows r and r+1, chroma rows, width.
using FusedWriterFn = void (*)(DecoderInfo* decoder, const uint8_t* y0, const uint8_t* y1,
                               const uint8_t* cb, const uint8_t* cr, uint32_t width);

// Colour converter record: the chosen conversion function and the fused writer.
struct ColourConverter {
  ConvertFn convert;
  FusedWriterFn fused;
};

// State of the current iMCU row.
struct IMcuRecord {
  uint32_t first_col;        // MCU column to resume at
  uint32_t mcu_row;          // MCU row within the iMCU row to resume at
  uint32_t mcu_rows;         // MCU rows in this iMCU row
  int16_t* blocks[10];       // coefficient blocks of one MCU
  RowDecodeFn decode_row;    // decodes one iMCU row
  RowDecodeFn partial_row;   // partial (region/strip) form
};

// Context-row controller of the whole-image row loop.
struct RowController {
  uint32_t buffer_full;      // the iMCU-row buffer holds an undelivered row
  uint32_t which_set;        // which of the two row-pointer list sets is current
  uint32_t groups_available; // row groups that may be emitted from the buffer
  uint32_t imcu_rows_done;   // iMCU rows decoded so far
  uint32_t group_counter;    // row group counter
  uint32_t context_state;    // 0 prepare, 1 process, 2 postponed
  uint32_t finished;         // the last iMCU row has been decoded
};

struct DecoderInfo {
  // --- Frame (written by the marker reader) ---
  uint8_t num_components;     // Nf
  uint8_t max_h_samp;
  uint8_t max_v_samp;
  uint8_t mcu_width_px;       // 8 * max_h_samp
  uint8_t mcu_height_px;      // 8 * max_v_samp
  int32_t colour_space;
  uint8_t comps_in_scan;      // Ns
  int32_t first_scan_comps;   // Ns of the first scan, -1 when it named every component
  uint16_t image_width;       // X
  uint16_t image_height;      // Y
  uint32_t restart_interval;  // in MCUs
  uint32_t mcus_per_row;
  uint32_t mcu_rows;
  uint8_t blocks_in_mcu;
  uint32_t mcu_membership[10];
  ComponentInfo* components;
  ComponentInfo* scan_components[4];
  QuantTable* quant_tables[4];
  HuffTable* dc_huff[4];
  HuffTable* ac_huff[4];
  HuffTable* huff_store[kMaxTableSpecs];
  uint32_t huff_store_count;
  uint32_t Ss, Se, Ah, Al;
  uint32_t scan_comp_index;   // frame index of the (last) scan component
  MarkerState* marker;

  // --- Input ---
  StreamWindow* window;
  IoStream* stream;
  uint8_t* window_buffer;
  DecInfo* owner;
  KOLVAVETA_CheckCallback check_callback;
  uint32_t unread_marker;     // marker met inside entropy data, 0 when none
  uint8_t* input_buffer;      // where KOLVAVETA_Read_IO2 refills the cursor

  // --- Entropy ---
  EntropyState* entropy;
  DerivedHuffTable** derived_tables;  // every derived table built (owned)
  uint32_t derived_count;
  uint32_t derived_capacity;
  uint32_t eob_run;           // end-of-band run of progressive AC scans
  int32_t last_nonzero[10];   // zig-zag index of the last coefficient of each block
  uint32_t error_count;       // MCU decode failures seen
  uint32_t current_mcu_row;   // MCU row of the current scan being decoded
  uint32_t current_mcu_col;   // MCU column being decoded

  // --- Geometry ---
  int32_t output_width;
  int32_t output_height;
  uint32_t no_resize;         // reduced picture already has the output size
  uint32_t scale_shift;       // r: transform scale 1/2^r
  uint32_t scale_num;         // n: 1, or 3 for the 3/8 path
  uint16_t reduced_width;     // (n * X) >> r
  uint16_t reduced_height;
  uint32_t scale_factor;      // 2^r, or 3 on the 3/8 path
  int32_t requested_width;    // buffer row length
  int32_t requested_height;   // buffer row count
  int32_t crop_x;
  int32_t crop_y;
  int32_t visible_width;
  int32_t visible_height;
  int32_t cropped_reduced_width;
  int32_t cropped_reduced_height;
  uint32_t* resize_tables[2];
  uint32_t block_out_size[4];

  // --- Output cursor ---
  int32_t output_format;
  uint32_t output_rows;       // rows written so far
  uint32_t rotation;          // 0, 4, 8, 12
  uint8_t* output_ptr;        // first pixel of the next output row
  uint8_t* u_ptr;             // format 2: Cb plane cursor
  uint8_t* v_ptr;             // format 2: Cr plane cursor
  int32_t pixel_step;         // in pixels
  int32_t row_step;           // in bytes
  // Planar output (format 2): plane bases and row lengths, so that rotated
  // output can place chroma by output coordinates.
  uint8_t* y_plane;
  uint8_t* u_plane;
  uint8_t* v_plane;
  uint32_t y_stride;          // luma row length in bytes (the buffer width)
  uint32_t c_stride;          // chroma row length in bytes: (width + 1) / 2
  uint32_t plane_height;      // luma rows of the buffer
  uint32_t path_code;         // decode-path code: selects the region column mask
  uint32_t fused_rows;        // rows one fused writer call produces (0: no fused writer)
  Resampler* resampler;       // owned by the colour converters

  // --- Progress checkpoints ---
  uint32_t progress_points[4];

  // --- Mode ---
  int32_t decode_mode;
  uint32_t fine_quant;
  uint32_t region_map_flag;   // options & 0x10000
  uint32_t index_use_state;   // 0 none, 1 owns an index, 2 borrows one
  uint32_t mcu_group_size;
  uint32_t scaled_blocks;     // per-component scaled block mode

  // --- Per scan ---
  uint32_t scan_counter;      // scans set up so far
  IMcuRecord imcu;
  McuDecodeFn decode_mcu;
  McuDecodeFn decode_mcu_reduced;
  uint32_t fast_reduced;
  int16_t* coef_area;         // 10 blocks of 64 coefficients
  int16_t* prog_workspace;    // progressive: one MCU row of coefficients
  uint32_t prog_workspace_bytes;
  uint32_t prog_offset[4];    // first block of each component's area
  uint32_t prog_stride[4];    // blocks across each component's area
  ScanInfo* scans[30];
  uint32_t scan_count;
  EntropySnapshot* snapshot;

  // --- Reconstruction ---
  uint8_t* range_limit_alloc; // clamping table allocation
  uint8_t* range_limit;       // its identity part
  uint8_t* range_limit_chroma;
  uint8_t* range_limit_chroma_alloc;
  ColourConverter* converter;
  Upsampler* upsampler;
  VETAJ_IdctFn idct_slots[29];
  RowController controller;

  // --- Sample buffers: one iMCU row of every component, reached through
  // two row-pointer lists that let the previous row group survive the
  // decode of the next iMCU row ---
  uint8_t** sample_rows[4];        // the rows (one block per component)
  uint8_t** sample_lists[4][2];    // list heads (G entries in front of each)
  uint8_t** sample_list_alloc[4];  // both lists of a component in one block
  uint32_t imcu_row;               // iMCU rows decoded so far
  uint32_t total_imcu_rows;
  uint32_t skip_output;            // rows are consumed without being written
  uint32_t progress_row;           // row counter of the progress checkpoints
  int32_t* dc_sums;                // DC sums of the averaging drivers beyond 1/8
};

// Releases everything the decoder owns (not the DecoderInfo itself).
void VETAJ_DeleteDecoderInfo(DecoderInfo* decoder);

// Appends a derived table to the decoder's list (growing it). Returns false
// when memory runs out.
bool vj_register_derived_table(DecoderInfo* decoder, DerivedHuffTable* table);

// Fills each component's block and sample geometry from the frame header:
// blocks across and down, sampled width and height, reduced sampled width,
// and the MCU rows of the frame.
void vj_setup_component_geometry(DecoderInfo* decoder);

#endif  // VETAJ_DRIVERS_DECODER_H
