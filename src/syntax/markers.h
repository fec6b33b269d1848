// Records of the parsed JPEG stream: frame components, tables, marker flags
// and thumbnail location, and the marker readers that fill them.
#ifndef VETAJ_SYNTAX_MARKERS_H
#define VETAJ_SYNTAX_MARKERS_H

#include <cstdint>

#include "platform/common.h"

struct DecoderInfo;
struct StreamWindow;

// Quantisation table: 64 values in natural order, then 64 per-coefficient
// ratios (Q13) filled by the decoder set-up in its fine-quantisation mode.
struct QuantTable {
  uint16_t values[64];
  uint32_t ratios[64];
};

// One Huffman table as read from a DHT segment.
struct HuffTable {
  uint8_t bits[17];      // entries 1..16: number of codes of each length
  uint8_t huffval[256];  // symbol values in the order of the segment
};

// One frame component.
struct ComponentInfo {
  uint8_t id;                // Ci from the frame header
  uint8_t index;             // position 0..Nf-1 in the frame
  uint8_t h_samp;            // horizontal sampling factor 1..4
  uint8_t v_samp;            // vertical sampling factor 1..4
  uint8_t quant_no;          // Tq as read
  uint8_t dc_no;             // DC table number from the scan header
  uint8_t ac_no;             // AC table number from the scan header
  uint32_t block_size;       // per-component block size in samples (scaled-block mode)
  uint16_t width_samples;    // ceil(X * h / max_h)
  uint16_t height_samples;   // ceil(Y * v / max_v)
  int32_t output_width;      // width in samples after the output scale
  uint32_t width_blocks;     // ceil(X * h / (max_h * 8))
  uint32_t height_blocks;    // ceil(Y * v / (max_v * 8))
  uint32_t mcu_width;        // blocks across in one MCU
  uint32_t mcu_height;       // blocks down in one MCU
  uint32_t mcu_blocks;       // mcu_width * mcu_height
  uint32_t mcu_sample_width; // samples across in one MCU
  uint32_t last_col_width;   // blocks across in the last MCU column
  uint32_t last_row_height;  // blocks down in the last MCU row
  QuantTable* quant;         // table in use for this component
  uint32_t* multipliers;     // 64 dequantisation multipliers for the transform
  // Reconstruction geometry (set with the upsampler).
  uint32_t dct_scaled_w;     // DCT output width per block (8 unless scaled per component)
  uint32_t dct_scaled_h;     // DCT output height per block
};

// Flags gathered while reading markers: 16 bytes.
struct MarkerState {
  uint32_t discarded;        // bytes discarded while searching for restart markers
  uint8_t next_restart;      // number 0..7 of the next expected RSTn
  uint8_t frame_kind;        // 0 none yet, 1 baseline, 2 progressive
  uint8_t seen_sos;
  uint8_t seen_dht;
  uint8_t seen_dqt;
  uint8_t seen_app0;
  uint8_t seen_adobe;
  uint8_t adobe_transform;   // Adobe colour transform byte (default 1)
  uint8_t component_ids[4];  // component ids in frame order
};
static_assert(sizeof(MarkerState) == 16, "MarkerState is 16 bytes");

constexpr uint8_t kFrameNone = 0;
constexpr uint8_t kFrameBaseline = 1;
constexpr uint8_t kFrameProgressive = 2;

// Location of an embedded thumbnail (15 words).
struct ThumbnailInfo {
  int32_t present;     // 1 when a thumbnail was found
  int32_t width;
  int32_t height;
  int32_t format;      // 0 strips, 1 raw RGB, 6 JPEG, 7 JPEG from an image resource
  int32_t colour;      // photometric interpretation, 2 for raw RGB
  uint32_t length;     // data length in bytes
  int32_t vendor;      // Exif IFD1 tag 0x104D
  int32_t planar;      // Exif planar configuration
  uint32_t offset;     // absolute offset of the data in the input
  int32_t unused9;
  uint8_t* data;       // owned copy of the data (Exif reader only)
  uint32_t x_resolution[2];
  uint32_t y_resolution[2];
};

constexpr int32_t kThumbStrips = 0;
constexpr int32_t kThumbRawRgb = 1;
constexpr int32_t kThumbJpeg = 6;
constexpr int32_t kThumbJpegResource = 7;

// Result of the light header pre-scan.
struct FileHeaderInfo {
  int32_t width;
  int32_t height;
  int32_t progressive;  // set to 1 on SOF2, never cleared
  int32_t unused[3];
  ThumbnailInfo thumbnail;
};

// Number of table specifications one decode accepts.
constexpr uint32_t kMaxTableSpecs = 120;

// Reads marker segments from the decoder's window up to and including the
// next SOS header, filling the frame, table and scan fields. On success sets
// *status to 200 and returns 0xDA with the window at the first byte of
// entropy-coded data. On any failure (input ending included) sets *status to
// 201 and returns the last marker code read, or 0 when the scan header itself
// was faulty: 0xDA is returned only for a scan header that was read.
uint8_t VETAJ_ParseNextMarker(DecoderInfo* decoder, int32_t* status);

// Pre-scan of a stream from the window's position (at or before SOI):
// picture size, progressive flag and any thumbnail (JFIF, JFXX, Exif IFD1,
// image resource 0x040C) whose data lies inside the input. `mode` must be 8
// or 2. Returns 200 when an SOS is reached after an SOF0 or SOF2 frame
// header, 201 otherwise.
int32_t VETAJ_ParseFileHeader(StreamWindow* window, int32_t mode, FileHeaderInfo* header);

#endif  // VETAJ_SYNTAX_MARKERS_H
