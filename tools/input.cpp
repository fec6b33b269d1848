// Opening an input file, reading its header summary and explaining why a
// file cannot be read or decoded.
#include <sys/stat.h>

#include <cerrno>
#include <cstring>

#include "tool.h"

namespace vetajpeg {

namespace {

// Largest input the decoder's 32-bit stream positions can address.
constexpr uint64_t kMaxInputBytes = 0x7FFFFFFFu;

// Closes a FILE* on scope exit.
struct FileCloser {
  FILE* file;
  ~FileCloser() {
    if (file != nullptr) std::fclose(file);
  }
};

bool starts_with(const uint8_t* data, size_t size, const char* prefix, size_t length) {
  return size >= length && std::memcmp(data, prefix, length) == 0;
}

bool is_tiff(const uint8_t* head, size_t size) {
  return starts_with(head, size, "II*\0", 4) || starts_with(head, size, "MM\0*", 4);
}

// The kind of a file that is not a JPEG stream, from its first bytes.
const char* other_format(const uint8_t* head, size_t size) {
  if (starts_with(head, size, "\x89PNG\r\n\x1a\n", 8)) return "a PNG image";
  if (starts_with(head, size, "GIF87a", 6) || starts_with(head, size, "GIF89a", 6))
    return "a GIF image";
  if (starts_with(head, size, "BM", 2)) return "a BMP image";
  if (is_tiff(head, size)) return "a TIFF file";
  if (starts_with(head, size, "RIFF", 4)) return "a RIFF file (e.g. WebP)";
  return nullptr;
}

// Position just past the first start-of-image marker within `size` bytes,
// or 0 when there is none.
size_t find_soi(const uint8_t* data, size_t size) {
  for (size_t i = 0; i + 1 < size; ++i) {
    if (data[i] == 0xFF && data[i + 1] == 0xD8) return i + 2;
  }
  return 0;
}

// What a start-of-frame marker other than the supported ones means.
const char* frame_problem(uint8_t marker) {
  switch (marker) {
    case 0xC1: return "extended sequential frame (SOF1)";
    case 0xC3: return "lossless frame (SOF3)";
    case 0xC5:
    case 0xC6:
    case 0xC7: return "hierarchical frame";
    case 0xC9:
    case 0xCA:
    case 0xCB: return "arithmetic-coded frame";
    case 0xCD:
    case 0xCE:
    case 0xCF: return "hierarchical arithmetic-coded frame";
    default: return nullptr;
  }
}

bool is_frame_marker(uint8_t marker) {
  return marker >= 0xC0 && marker <= 0xCF && marker != 0xC4 && marker != 0xC8 && marker != 0xCC;
}

// Walks the marker segments from the start-of-image marker at `position` to
// the first frame header and judges it.
std::string judge_frame(FILE* file, long position) {
  if (std::fseek(file, position, SEEK_SET) != 0) return "cannot read the file";
  // The walk ends at the frame header; the bound only stops hostile files
  // made of endless empty segments or stray bytes.
  for (int steps = 0; steps < 1000000; ++steps) {
    int c = std::fgetc(file);
    if (c == EOF) return "the JPEG data ends before a frame header (truncated file)";
    if (c != 0xFF) continue;  // stray byte between segments
    do {
      c = std::fgetc(file);
    } while (c == 0xFF);
    if (c == EOF) return "the JPEG data ends before a frame header (truncated file)";
    const uint8_t marker = static_cast<uint8_t>(c);
    if (marker == 0x00 || marker == 0x01 || marker == 0xD8 || (marker >= 0xD0 && marker <= 0xD7))
      continue;  // no segment follows
    if (marker == 0xD9) return "the JPEG data ends before a frame header";
    const int hi = std::fgetc(file);
    const int lo = std::fgetc(file);
    if (hi == EOF || lo == EOF)
      return "the JPEG data ends inside a marker segment (truncated file)";
    const long length = (hi << 8) | lo;
    if (length < 2) return "corrupt JPEG header (bad marker segment length)";
    if (marker == 0xDA) return "corrupt JPEG header (scan without a frame header)";
    if (is_frame_marker(marker)) {
      const int precision = std::fgetc(file);
      if (precision == EOF || length < 8) return "corrupt JPEG frame header";
      if (const char* problem = frame_problem(marker))
        return std::string("unsupported JPEG: ") + problem;
      if (precision != 8)
        return "unsupported JPEG: " + std::to_string(precision) +
               "-bit samples (only 8-bit samples are decoded)";
      return {};
    }
    if (std::fseek(file, length - 2, SEEK_CUR) != 0) return "cannot read the file";
  }
  return "corrupt JPEG header (no frame header found)";
}

}  // namespace

const char* image_type_name(int32_t type) {
  switch (type) {
    case KOLVAVETA_IMAGE_JPEG: return "JPEG";
    case KOLVAVETA_IMAGE_BMP: return "BMP";
    case KOLVAVETA_IMAGE_PNG: return "PNG";
    case KOLVAVETA_IMAGE_GIF: return "GIF";
    case KOLVAVETA_IMAGE_WBMP: return "WBMP";
    case KOLVAVETA_IMAGE_GIF_ANIMATED: return "animated GIF";
    default: return "unknown";
  }
}

uint32_t rotation_for_orientation(uint32_t orientation) {
  switch (orientation) {
    case 3: return KOLVAVETA_OPT_ROTATE_180;
    case 6: return KOLVAVETA_OPT_ROTATE_90;
    case 8: return KOLVAVETA_OPT_ROTATE_270;
    default: return KOLVAVETA_OPT_ROTATE_0;
  }
}

std::string diagnose_jpeg(const char* path) {
  FileCloser closer{std::fopen(path, "rb")};
  FILE* file = closer.file;
  if (file == nullptr) return std::string("cannot read the file: ") + std::strerror(errno);
  uint8_t head[65536];
  const size_t size = std::fread(head, 1, sizeof head, file);
  if (size == 0) return "the file is empty";
  // A TIFF file may carry a JPEG stream: the decoder finds its start the
  // same way.
  const char* kind = other_format(head, size);
  const size_t soi = find_soi(head, size);
  if (kind != nullptr && (soi == 0 || !is_tiff(head, size)))
    return std::string("not a JPEG file (it is ") + kind + ")";
  if (soi == 0) return "not a JPEG file (no start-of-image marker)";
  return judge_frame(file, static_cast<long>(soi));
}

Decoder::~Decoder() {
  if (object_ != nullptr) {
    KOLVAVETA_DestroyJpegInfo(object_);
    KOLVAVETA_DestroyDecInfo(object_);
  }
}

bool Decoder::open(const char* path, int32_t output_format, uint32_t options) {
  path_ = path;
  // The decoder only says that a file cannot be opened; stat says why.
  struct stat st;
  if (::stat(path, &st) != 0) {
    report("cannot open '%s': %s", path, std::strerror(errno));
    return false;
  }
  if (S_ISDIR(st.st_mode)) {
    report("cannot open '%s': it is a directory", path);
    return false;
  }
  if (S_ISREG(st.st_mode) && static_cast<uint64_t>(st.st_size) > kMaxInputBytes) {
    report("'%s' is too large (the decoder reads inputs below 2 GiB)", path);
    return false;
  }
  errno = 0;
  object_ = KOLVAVETA_CreateDecInfo(KOLVAVETA_IO_FILE_PATH, const_cast<char*>(path), 0,
                                    output_format, options);
  if (object_ == nullptr) {
    switch (gKOLVAVETA_Error) {
      case KOLVAVETA_ERR_NO_MEMORY: report("cannot open '%s': out of memory", path); break;
      case KOLVAVETA_ERR_OPEN_FILE:
        report("cannot open '%s': %s", path, errno != 0 ? std::strerror(errno) : "open failed");
        break;
      default:
        report("cannot open '%s' (error %d)", path, static_cast<int>(gKOLVAVETA_Error));
        break;
    }
    return false;
  }
  return true;
}

int32_t Decoder::read_summary(JpegInfo* info) {
  const int32_t type = KOLVAVETA_Parser(object_, info);
  if (type == KOLVAVETA_IMAGE_UNKNOWN) {
    if (gKOLVAVETA_Error == KOLVAVETA_ERR_NO_MEMORY) {
      report("%s: out of memory", path());
    } else if (KOLVAVETA_GetImageType(object_) == KOLVAVETA_IMAGE_GIF) {
      report("%s: cannot read the GIF (damaged, or wider or higher than 5000 pixels)", path());
    } else {
      std::string reason = diagnose_jpeg(path());
      if (reason.empty()) reason = "cannot read the JPEG header";
      report("%s: %s", path(), reason.c_str());
    }
  }
  return type;
}

void Decoder::report_decode_failure() const {
  std::string reason = diagnose_jpeg(path());
  if (reason.empty()) {
    switch (gKOLVAVETA_Error) {
      case KOLVAVETA_ERR_NO_MEMORY: reason = "out of memory"; break;
      case KOLVAVETA_ERR_SETUP:
        reason = "the decoder does not support this picture (tables, sampling or colour space)";
        break;
      default: reason = "corrupt or truncated JPEG data"; break;
    }
  }
  report("%s: decoding failed: %s", path(), reason.c_str());
}

}  // namespace vetajpeg
