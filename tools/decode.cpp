// `vetajpeg decode FILE -o OUT [options]`: decodes a picture into a buffer
// of the requested size and format and writes it as a PNG (or as it is).
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>

#include "tool.h"

namespace vetajpeg {

namespace {

// Largest buffer side accepted on the command line (the decoder's picture
// size limit).
constexpr uint32_t kMaxSide = 50000;
// Largest --scale denominator.
constexpr uint32_t kMaxScale = 1u << 15;
// Pictures above this many pixels get a progress bar on a terminal.
constexpr uint64_t kProgressPixels = 1000000;

struct DecodeRequest {
  const char* input = nullptr;
  const char* output = nullptr;
  bool has_size = false;
  uint32_t width = 0;  // buffer size
  uint32_t height = 0;
  uint32_t scale = 0;  // sample_size; 0 for none
  uint32_t fit = KOLVAVETA_OPT_FIT_CENTRE;
  uint32_t rotation = KOLVAVETA_OPT_ROTATE_0;
  bool exif_orient = false;
  uint32_t thumb = KOLVAVETA_OPT_THUMB_NEVER;
  int32_t mode = KOLVAVETA_MODE_BEST;
  const OutputFormat* format = find_output_format("rgba");
  bool raw = false;
  bool progress = false;
};

// Parses a decimal number in [low, high] that makes up the whole text.
bool parse_number(const char* text, uint32_t low, uint32_t high, uint32_t* out) {
  if (*text < '0' || *text > '9') return false;
  errno = 0;
  char* end = nullptr;
  const unsigned long value = std::strtoul(text, &end, 10);
  if (errno != 0 || *end != '\0' || value < low || value > high) return false;
  *out = static_cast<uint32_t>(value);
  return true;
}

bool parse_size(DecodeRequest* r, const char* text) {
  const char* x = std::strpbrk(text, "xX");
  if (x == nullptr) return false;
  const std::string width(text, x);
  r->has_size = true;
  return parse_number(width.c_str(), 1, kMaxSide, &r->width) &&
         parse_number(x + 1, 1, kMaxSide, &r->height);
}

bool parse_scale(DecodeRequest* r, const char* text) {
  if (std::strncmp(text, "1/", 2) == 0) text += 2;
  uint32_t n = 0;
  if (!parse_number(text, 1, kMaxScale, &n) || (n & (n - 1)) != 0) return false;
  r->scale = n;
  return true;
}

// A word chosen from a table of names.
template <class T, size_t N>
bool parse_choice(const char* text, const std::pair<const char*, T> (&choices)[N], T* out) {
  for (const auto& [name, value] : choices) {
    if (std::strcmp(text, name) == 0) {
      *out = value;
      return true;
    }
  }
  return false;
}

bool parse_fit(DecodeRequest* r, const char* text) {
  static const std::pair<const char*, uint32_t> kFits[] = {
      {"centre", KOLVAVETA_OPT_FIT_CENTRE}, {"center", KOLVAVETA_OPT_FIT_CENTRE},
      {"rowlen", KOLVAVETA_OPT_FIT_ROWLEN}, {"topleft", KOLVAVETA_OPT_FIT_TOPLEFT},
      {"fill", KOLVAVETA_OPT_FIT_FILL},     {"stretch", KOLVAVETA_OPT_FIT_STRETCH}};
  return parse_choice(text, kFits, &r->fit);
}

bool parse_rotate(DecodeRequest* r, const char* text) {
  static const std::pair<const char*, uint32_t> kRotations[] = {{"0", KOLVAVETA_OPT_ROTATE_0},
                                                                {"90", KOLVAVETA_OPT_ROTATE_90},
                                                                {"180", KOLVAVETA_OPT_ROTATE_180},
                                                                {"270", KOLVAVETA_OPT_ROTATE_270}};
  return parse_choice(text, kRotations, &r->rotation);
}

bool parse_thumb(DecodeRequest* r, const char* text) {
  return parse_number(text, 0, KOLVAVETA_OPT_THUMB_MASK, &r->thumb);
}

bool parse_mode(DecodeRequest* r, const char* text) {
  uint32_t mode = 0;
  if (!parse_number(text, KOLVAVETA_MODE_BEST, KOLVAVETA_MODE_FASTEST, &mode)) return false;
  r->mode = static_cast<int32_t>(mode);
  return true;
}

bool parse_format(DecodeRequest* r, const char* text) {
  r->format = find_output_format(text);
  return r->format != nullptr;
}

bool parse_output(DecodeRequest* r, const char* text) {
  r->output = text;
  return *text != '\0';
}

bool set_exif_orient(DecodeRequest* r, const char*) { return r->exif_orient = true; }
bool set_raw(DecodeRequest* r, const char*) { return r->raw = true; }
bool set_progress(DecodeRequest* r, const char*) { return r->progress = true; }

struct OptionRule {
  const char* name;
  const char* alias;     // short form, or null
  const char* expected;  // what the value must be; null for a flag
  bool (*apply)(DecodeRequest*, const char* value);
};

const OptionRule kOptions[] = {
    {"--output", "-o", "a file name", parse_output},
    {"--size", nullptr, "WxH with sides from 1 to 50000", parse_size},
    {"--scale", nullptr, "1/N with N a power of two (1, 2, 4, 8, ...)", parse_scale},
    {"--fit", nullptr, "centre, rowlen, topleft, fill or stretch", parse_fit},
    {"--rotate", nullptr, "0, 90, 180 or 270", parse_rotate},
    {"--exif-orient", nullptr, nullptr, set_exif_orient},
    {"--thumb", nullptr, "0, 1, 2 or 3", parse_thumb},
    {"--mode", nullptr, "a number from 0 to 4", parse_mode},
    {"--format", nullptr, "rgba, bgra, argb, rgb565, rgb or yuv420", parse_format},
    {"--raw", nullptr, nullptr, set_raw},
    {"--progress", nullptr, nullptr, set_progress},
};

// Result of parsing the command line: go on, stop successfully (--help) or
// stop with the usage status.
enum class Parsed { kGo, kHelp, kError };

Parsed parse_arguments(int argc, char** argv, DecodeRequest* r) {
  for (int i = 1; i < argc; ++i) {
    const char* arg = argv[i];
    if (std::strcmp(arg, "-h") == 0 || std::strcmp(arg, "--help") == 0) return Parsed::kHelp;
    if (arg[0] != '-' || arg[1] == '\0') {
      if (r->input != nullptr) {
        usage_error("decode: more than one input file ('%s', '%s')", r->input, arg);
        return Parsed::kError;
      }
      r->input = arg;
      continue;
    }
    // "--name=value" or "--name value".
    const char* eq = std::strchr(arg, '=');
    const std::string name = eq != nullptr ? std::string(arg, eq) : std::string(arg);
    const OptionRule* rule = nullptr;
    for (const OptionRule& s : kOptions) {
      if (name == s.name || (s.alias != nullptr && name == s.alias)) rule = &s;
    }
    if (rule == nullptr) {
      usage_error("decode: unknown option '%s'", arg);
      return Parsed::kError;
    }
    const char* value = nullptr;
    if (rule->expected == nullptr) {
      if (eq != nullptr) {
        usage_error("decode: %s takes no value", rule->name);
        return Parsed::kError;
      }
    } else if (eq != nullptr) {
      value = eq + 1;
    } else if (i + 1 < argc) {
      value = argv[++i];
    } else {
      usage_error("decode: %s needs a value (%s)", rule->name, rule->expected);
      return Parsed::kError;
    }
    if (!rule->apply(r, value)) {
      usage_error("decode: bad value '%s' for %s: expected %s", value, rule->name, rule->expected);
      return Parsed::kError;
    }
  }
  if (r->input == nullptr) {
    usage_error("decode: no input file");
    return Parsed::kError;
  }
  if (r->output == nullptr) {
    usage_error("decode: no output file (-o OUT)");
    return Parsed::kError;
  }
  if (r->exif_orient && r->rotation != KOLVAVETA_OPT_ROTATE_0) {
    usage_error("decode: --rotate and --exif-orient cannot be combined");
    return Parsed::kError;
  }
  return Parsed::kGo;
}

bool quarter_turn(uint32_t rotation) {
  return rotation == KOLVAVETA_OPT_ROTATE_90 || rotation == KOLVAVETA_OPT_ROTATE_270;
}

// A progress bar on stderr, drawn by the decoder's progress callback.
struct ProgressBar {
  int32_t shown = -1;  // last percentage drawn

  void draw(int32_t percent) {
    percent = percent < 0 ? 0 : (percent > 100 ? 100 : percent);
    if (percent == shown) return;
    shown = percent;
    constexpr int kCells = 40;
    char cells[kCells + 1];
    const int full = percent * kCells / 100;
    for (int i = 0; i < kCells; ++i) cells[i] = i < full ? '#' : '.';
    cells[kCells] = '\0';
    std::fprintf(stderr, "\rdecoding [%s] %3d%%", cells, static_cast<int>(percent));
    std::fflush(stderr);
  }
  void finish(bool complete) {
    if (shown < 0) return;
    if (complete) draw(100);
    std::fputc('\n', stderr);
  }
};

int32_t on_progress(void* user, int32_t percent) {
  static_cast<ProgressBar*>(user)->draw(percent);
  return 1;
}

// Installs the progress record in the object, which owns it from then on.
bool attach_progress(DecInfo* object, ProgressBar* bar) {
  auto* record = static_cast<KOLVAVETA_Progress*>(KOLVAVETA_OsMalloc(sizeof(KOLVAVETA_Progress)));
  if (record == nullptr) return false;
  record->progress_user = bar;
  record->progress_callback = on_progress;
  object->progress = record;
  return true;
}

struct FreeDeleter {
  void operator()(uint8_t* p) const { std::free(p); }
};

}  // namespace

int run_decode(int argc, char** argv) {
  DecodeRequest r;
  switch (parse_arguments(argc, argv, &r)) {
    case Parsed::kHelp: print_usage(stdout); return kExitOk;
    case Parsed::kError: return kExitUsage;
    case Parsed::kGo: break;
  }
  const OutputFormat& format = *r.format;
  const uint32_t options =
      r.thumb | r.rotation | r.fit | (r.exif_orient ? KOLVAVETA_OPT_EXIF_ORIENT : 0);

  Decoder decoder;
  if (!decoder.open(r.input, format.code, options)) return kExitFailure;
  DecInfo* object = decoder.get();
  JpegInfo info{};
  const int32_t type = decoder.read_summary(&info);
  if (type == KOLVAVETA_IMAGE_UNKNOWN) return kExitFailure;
  if (type != KOLVAVETA_IMAGE_JPEG) {
    const char* name = image_type_name(type);
    report("%s: not a JPEG file (it is %s %s image); only JPEG pictures are decoded", r.input,
           std::strchr("AEIOUaeiou", name[0]) != nullptr ? "an" : "a", name);
    return kExitFailure;
  }
  KOLVAVETA_SetDecMode(object, r.mode);
  object->sample_size = r.scale;

  // Without --size the buffer holds the whole picture, reduced by --scale and
  // turned by a quarter-turn rotation.
  if (!r.has_size) {
    uint32_t rotation = r.rotation;
    if (r.exif_orient) {
      const ExifRecord exif(object);
      if (exif.get() != nullptr) rotation = rotation_for_orientation(exif.get()->orientation);
    }
    const uint32_t s = r.scale != 0 ? r.scale : 1;
    const uint32_t w = std::max<uint32_t>(1, static_cast<uint32_t>(info.width) / s);
    const uint32_t h = std::max<uint32_t>(1, static_cast<uint32_t>(info.height) / s);
    r.width = quarter_turn(rotation) ? h : w;
    r.height = quarter_turn(rotation) ? w : h;
  }

  const size_t bytes = buffer_bytes(format, r.width, r.height);
  if (bytes == 0) {
    report("an output buffer of %ux%u %s pixels is too large", r.width, r.height, format.name);
    return kExitFailure;
  }
  std::unique_ptr<uint8_t, FreeDeleter> buffer(static_cast<uint8_t*>(std::malloc(bytes)));
  if (buffer == nullptr) {
    report("out of memory for an output buffer of %zu bytes", bytes);
    return kExitFailure;
  }
  clear_buffer(format, buffer.get(), bytes, r.width, r.height);
  if (format.layout == Layout::kYuv420 && r.fit != KOLVAVETA_OPT_FIT_ROWLEN) {
    // The planes of format 2 cover the whole buffer.
    object->region_width = r.width;
    object->region_height = r.height;
  }

  ProgressBar bar;
  const uint64_t pixels =
      uint64_t(static_cast<uint32_t>(info.width)) * static_cast<uint32_t>(info.height);
  if (r.progress || (pixels > kProgressPixels && isatty(STDERR_FILENO))) {
    if (!attach_progress(object, &bar)) {
      report("out of memory");
      return kExitFailure;
    }
    bar.draw(0);
  }

  const int32_t decoded = KOLVAVETA_DecodeJPEG(object, buffer.get(), static_cast<int32_t>(r.width),
                                               static_cast<int32_t>(r.height));
  bar.finish(decoded != 0);
  if (decoded == 0) {
    decoder.report_decode_failure();
    return kExitFailure;
  }

  if (r.raw) return write_raw(r.output, buffer.get(), bytes) ? kExitOk : kExitFailure;

  // The picture to view: the whole buffer, or, when the fit takes the output
  // size as the buffer size, the output area (turned by a quarter-turn
  // rotation) packed at its start.
  BufferGeometry geometry{r.width, r.height, 0, r.width, r.height};
  if (r.fit == KOLVAVETA_OPT_FIT_ROWLEN) {
    const bool turned = quarter_turn(object->options & KOLVAVETA_OPT_ROTATE_MASK);
    const auto out_w = static_cast<uint32_t>(object->output_width);
    const auto out_h = static_cast<uint32_t>(object->output_height);
    geometry.width = geometry.planes_width = turned ? out_h : out_w;
    geometry.height = geometry.planes_height = turned ? out_w : out_h;
  }
  geometry.row_bytes = size_t(geometry.width) * bytes_per_pixel(format.layout);
  Picture picture;
  if (!convert_buffer(format, buffer.get(), bytes, geometry, &picture)) {
    report("%s: the decoder reported an output area of %ux%u that does not fit the %ux%u buffer",
           r.input, geometry.width, geometry.height, r.width, r.height);
    return kExitFailure;
  }
  return write_png(r.output, picture) ? kExitOk : kExitFailure;
}

}  // namespace vetajpeg
