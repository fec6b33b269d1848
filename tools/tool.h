// The command-line tool vetajpeg: declarations shared by its source files.
#ifndef VETAJPEG_TOOL_H
#define VETAJPEG_TOOL_H

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>

#include "VetaJpegDecoder.h"
#include "meta/exif.h"

namespace vetajpeg {

// Exit status of the tool.
constexpr int kExitOk = 0;
constexpr int kExitFailure = 1;  // input, decoding or output failure
constexpr int kExitUsage = 2;    // bad command line

// Prints "vetajpeg: " and the formatted message on stderr.
void report(const char* format, ...) __attribute__((format(printf, 1, 2)));
// Reports a command-line error, prints the usage on stderr and returns
// kExitUsage.
int usage_error(const char* format, ...) __attribute__((format(printf, 1, 2)));
void print_usage(FILE* out);

// Commands: argv[0] is the command name.
int run_info(int argc, char** argv);
int run_decode(int argc, char** argv);

// ---------------------------------------------------------------------------
// Input (input.cpp)

// Owns one decoder object opened on a file path and releases it with every
// record it keeps.
class Decoder {
 public:
  Decoder() = default;
  Decoder(const Decoder&) = delete;
  Decoder& operator=(const Decoder&) = delete;
  ~Decoder();

  // Opens `path` with the given output format and option word. Reports the
  // reason and returns false when the file cannot be used.
  bool open(const char* path, int32_t output_format, uint32_t options);
  // Identifies the input, reads its summary into `info` and returns the
  // image type code, or reports why the input cannot be read and returns
  // KOLVAVETA_IMAGE_UNKNOWN.
  int32_t read_summary(JpegInfo* info);
  // Explains a decode failure on stderr: an unsupported or unreadable frame,
  // or corrupt data.
  void report_decode_failure() const;

  DecInfo* get() const { return object_; }
  const char* path() const { return path_.c_str(); }

 private:
  DecInfo* object_ = nullptr;
  std::string path_;
};

// Name of an image type code ("JPEG", "PNG", ...).
const char* image_type_name(int32_t type);

// Why a file that the decoder could not read is unusable: the kind of a
// non-JPEG file, an unsupported frame (arithmetic coding, 12-bit samples,
// lossless, ...), or an unreadable header. Empty when the header looks
// decodable.
std::string diagnose_jpeg(const char* path);

// The Exif record of an object's input, released on scope exit. Null when
// the input has no readable Exif block.
class ExifRecord {
 public:
  explicit ExifRecord(DecInfo* object) : exif_(VETAJ_CreatExifInfo(object)) {}
  ExifRecord(const ExifRecord&) = delete;
  ExifRecord& operator=(const ExifRecord&) = delete;
  ~ExifRecord() { VETAJ_DestroyExifInfo(exif_); }
  const ExifInfo* get() const { return exif_; }

 private:
  ExifInfo* exif_;
};

// Rotation option bits for an Exif orientation value, as the decoder applies
// them (0 for values without a pure rotation).
uint32_t rotation_for_orientation(uint32_t orientation);

// ---------------------------------------------------------------------------
// Output images (image_out.cpp)

// How the pixels of an output format are laid out in the decode buffer.
enum class Layout { kPacked32, kRgb565, kRgb24, kYuv420 };

struct OutputFormat {
  const char* name;
  int32_t code;  // KOLVAVETA_FMT_ code
  Layout layout;
  uint8_t channel[4];  // kPacked32: byte offsets of red, green, blue, alpha
};

// Bytes per pixel of a packed layout; 1 (the luma plane) for planar output.
uint32_t bytes_per_pixel(Layout layout);
// The format named `name`, or null.
const OutputFormat* find_output_format(const char* name);

// The picture area of a decode buffer.
struct BufferGeometry {
  uint32_t width;          // pixels per row of the picture to write out
  uint32_t height;         // rows
  size_t row_bytes;        // bytes between rows (packed layouts), luma row bytes (planar)
  uint32_t planes_width;   // planar: luma plane size from which the chroma
  uint32_t planes_height;  // planes' place and size follow
};

// Bytes of a buffer of width x height pixels in `format`; 0 when the size
// cannot be represented.
size_t buffer_bytes(const OutputFormat& format, uint32_t width, uint32_t height);

// Fills a fresh buffer so that parts the decoder leaves alone read as black
// (planar chroma at its mid value); packed formats stay zero (transparent).
void clear_buffer(const OutputFormat& format, uint8_t* buffer, size_t bytes, uint32_t planes_width,
                  uint32_t planes_height);

// 8-bit RGB or RGBA picture for viewing.
struct Picture {
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t channels = 0;  // 3 or 4
  std::string pixels;     // rows of width x channels bytes
};

// Converts the picture area of a decode buffer of `bytes` bytes. Returns
// false when the geometry does not fit in the buffer.
bool convert_buffer(const OutputFormat& format, const uint8_t* buffer, size_t bytes,
                    const BufferGeometry& geometry, Picture* picture);

// Write `picture` as a PNG file, or `bytes` bytes as they are. Both report
// the reason on failure and return false.
bool write_png(const char* path, const Picture& picture);
bool write_raw(const char* path, const uint8_t* data, size_t bytes);

}  // namespace vetajpeg

#endif  // VETAJPEG_TOOL_H
