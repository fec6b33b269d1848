// Output formats of the tool, conversion of a decode buffer to an 8-bit RGB
// or RGBA picture, and writing PNG or raw files.
#include <png.h>

#include <cerrno>
#include <csetjmp>
#include <cstdint>
#include <cstring>

#include "tool.h"

namespace vetajpeg {

namespace {

// clang-format off
constexpr OutputFormat kFormats[] = {
    {"rgba",   KOLVAVETA_FMT_RGBA8888, Layout::kPacked32, {0, 1, 2, 3}},
    {"bgra",   KOLVAVETA_FMT_BGRA8888, Layout::kPacked32, {2, 1, 0, 3}},
    {"argb",   KOLVAVETA_FMT_ARGB8888, Layout::kPacked32, {1, 2, 3, 0}},
    {"rgb565", KOLVAVETA_FMT_RGB565,   Layout::kRgb565,   {}},
    {"rgb",    KOLVAVETA_FMT_RGB888,   Layout::kRgb24,    {}},
    {"yuv420", KOLVAVETA_FMT_YUV420,   Layout::kYuv420,   {}},
};
// clang-format on

// Largest decode buffer the tool asks for: the decoder computes row offsets
// in 32-bit arithmetic.
constexpr uint64_t kMaxBufferBytes = 0x7FFFFFFFu;

// Place of the two chroma planes after a luma plane of pw x ph bytes.
struct ChromaPlanes {
  uint64_t u_offset;
  uint64_t v_offset;
  uint64_t stride;  // (pw + 1) / 2
  uint64_t end;     // bytes of all three planes
};

ChromaPlanes chroma_planes(uint64_t pw, uint64_t ph) {
  const uint64_t cw = (pw + 1) / 2;
  const uint64_t ch = (ph + 1) / 2;
  const uint64_t luma = pw * ph;
  return {luma, luma + cw * ch, cw, luma + 2 * cw * ch};
}

uint8_t clamp_byte(int32_t v) { return static_cast<uint8_t>(v < 0 ? 0 : (v > 255 ? 255 : v)); }

// YCbCr (full range, as in JFIF) to RGB in 16-bit fixed point.
void ycbcr_to_rgb(int32_t y, int32_t cb, int32_t cr, uint8_t* rgb) {
  constexpr int32_t kCrToR = 91881;   // 1.40200 * 65536
  constexpr int32_t kCbToG = 22554;   // 0.34414 * 65536
  constexpr int32_t kCrToG = 46802;   // 0.71414 * 65536
  constexpr int32_t kCbToB = 116130;  // 1.77200 * 65536
  constexpr int32_t kHalf = 1 << 15;
  cb -= 128;
  cr -= 128;
  rgb[0] = clamp_byte(y + ((kCrToR * cr + kHalf) >> 16));
  rgb[1] = clamp_byte(y + ((kHalf - kCbToG * cb - kCrToG * cr) >> 16));
  rgb[2] = clamp_byte(y + ((kCbToB * cb + kHalf) >> 16));
}

// Expands a 5- or 6-bit value to 8 bits.
uint8_t expand5(uint32_t v) { return static_cast<uint8_t>((v << 3) | (v >> 2)); }
uint8_t expand6(uint32_t v) { return static_cast<uint8_t>((v << 2) | (v >> 4)); }

void convert_row(const OutputFormat& format, const uint8_t* src, uint32_t width, uint8_t* out) {
  switch (format.layout) {
    case Layout::kPacked32:
      for (uint32_t x = 0; x < width; ++x, src += 4, out += 4) {
        for (int c = 0; c < 4; ++c) out[c] = src[format.channel[c]];
      }
      break;
    case Layout::kRgb565:
      for (uint32_t x = 0; x < width; ++x, src += 2, out += 3) {
        const uint32_t v = src[0] | (uint32_t(src[1]) << 8);  // little-endian word
        out[0] = expand5(v >> 11);
        out[1] = expand6((v >> 5) & 0x3F);
        out[2] = expand5(v & 0x1F);
      }
      break;
    case Layout::kRgb24: std::memcpy(out, src, size_t(width) * 3); break;
    case Layout::kYuv420: break;  // planar: see convert_buffer
  }
}

[[noreturn]] void png_failed(png_structp png, png_const_charp message) {
  report("PNG: %s", message);
  png_longjmp(png, 1);
}

void png_warned(png_structp, png_const_charp) {}

}  // namespace

uint32_t bytes_per_pixel(Layout layout) {
  switch (layout) {
    case Layout::kPacked32: return 4;
    case Layout::kRgb565: return 2;
    case Layout::kRgb24: return 3;
    case Layout::kYuv420: return 1;  // luma plane
  }
  return 0;
}

const OutputFormat* find_output_format(const char* name) {
  for (const OutputFormat& f : kFormats) {
    if (std::strcmp(f.name, name) == 0) return &f;
  }
  return nullptr;
}

size_t buffer_bytes(const OutputFormat& format, uint32_t width, uint32_t height) {
  const uint64_t bytes = format.layout == Layout::kYuv420
                             ? chroma_planes(width, height).end
                             : uint64_t(width) * height * bytes_per_pixel(format.layout);
  return bytes <= kMaxBufferBytes ? static_cast<size_t>(bytes) : 0;
}

void clear_buffer(const OutputFormat& format, uint8_t* buffer, size_t bytes, uint32_t planes_width,
                  uint32_t planes_height) {
  std::memset(buffer, 0, bytes);
  if (format.layout != Layout::kYuv420) return;
  const ChromaPlanes planes = chroma_planes(planes_width, planes_height);
  if (planes.end <= bytes)
    std::memset(buffer + planes.u_offset, 128, static_cast<size_t>(planes.end - planes.u_offset));
}

bool convert_buffer(const OutputFormat& format, const uint8_t* buffer, size_t bytes,
                    const BufferGeometry& g, Picture* picture) {
  if (g.width == 0 || g.height == 0) return false;
  picture->width = g.width;
  picture->height = g.height;
  picture->channels = format.layout == Layout::kPacked32 ? 4 : 3;
  if (uint64_t(g.width) * g.height * picture->channels > SIZE_MAX / 2) return false;
  const size_t out_row = size_t(g.width) * picture->channels;

  if (format.layout == Layout::kYuv420) {
    const ChromaPlanes planes = chroma_planes(g.planes_width, g.planes_height);
    if (g.width > g.planes_width || g.height > g.planes_height || planes.end > bytes) return false;
    picture->pixels.assign(out_row * g.height, '\0');
    for (uint32_t y = 0; y < g.height; ++y) {
      const uint8_t* luma = buffer + size_t(y) * g.planes_width;
      const uint8_t* u = buffer + planes.u_offset + size_t(y / 2) * planes.stride;
      const uint8_t* v = buffer + planes.v_offset + size_t(y / 2) * planes.stride;
      auto* out = reinterpret_cast<uint8_t*>(&picture->pixels[y * out_row]);
      for (uint32_t x = 0; x < g.width; ++x, out += 3)
        ycbcr_to_rgb(luma[x], u[x / 2], v[x / 2], out);
    }
    return true;
  }

  const uint64_t used_row = uint64_t(g.width) * bytes_per_pixel(format.layout);
  if (g.row_bytes < used_row || uint64_t(g.height - 1) * g.row_bytes + used_row > bytes)
    return false;
  picture->pixels.assign(out_row * g.height, '\0');
  for (uint32_t y = 0; y < g.height; ++y) {
    convert_row(format, buffer + y * g.row_bytes, g.width,
                reinterpret_cast<uint8_t*>(&picture->pixels[y * out_row]));
  }
  return true;
}

bool write_raw(const char* path, const uint8_t* data, size_t bytes) {
  FILE* file = std::fopen(path, "wb");
  if (file == nullptr) {
    report("cannot create '%s': %s", path, std::strerror(errno));
    return false;
  }
  const bool written = std::fwrite(data, 1, bytes, file) == bytes;
  const int saved = errno;
  if (std::fclose(file) != 0 || !written) {
    report("cannot write '%s': %s", path, std::strerror(written ? errno : saved));
    return false;
  }
  return true;
}

bool write_png(const char* path, const Picture& picture) {
  FILE* file = std::fopen(path, "wb");
  if (file == nullptr) {
    report("cannot create '%s': %s", path, std::strerror(errno));
    return false;
  }
  png_structp png = png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, png_failed, png_warned);
  png_infop info = png != nullptr ? png_create_info_struct(png) : nullptr;
  if (info == nullptr) {
    png_destroy_write_struct(&png, nullptr);
    std::fclose(file);
    report("cannot write '%s': out of memory", path);
    return false;
  }
  // Nothing with a destructor lives between here and the rows loop: libpng
  // reports errors by jumping back here.
  if (setjmp(png_jmpbuf(png)) != 0) {
    png_destroy_write_struct(&png, &info);
    std::fclose(file);
    report("cannot write '%s'", path);
    return false;
  }
  png_init_io(png, file);
  png_set_IHDR(png, info, picture.width, picture.height, 8,
               picture.channels == 4 ? PNG_COLOR_TYPE_RGBA : PNG_COLOR_TYPE_RGB, PNG_INTERLACE_NONE,
               PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
  png_write_info(png, info);
  const size_t row = size_t(picture.width) * picture.channels;
  const auto* pixels = reinterpret_cast<const uint8_t*>(picture.pixels.data());
  for (uint32_t y = 0; y < picture.height; ++y) png_write_row(png, pixels + y * row);
  png_write_end(png, info);
  png_destroy_write_struct(&png, &info);
  if (std::fclose(file) != 0) {
    report("cannot write '%s': %s", path, std::strerror(errno));
    return false;
  }
  return true;
}

}  // namespace vetajpeg
