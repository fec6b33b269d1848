// vetaj_bench: decoding speed of this library against libjpeg-turbo on the
// same JPEG files, read into memory once.
//
//   vetaj_bench entropy FILE [--runs N] [--once] [--side vetaj|libjpeg|both]
//   vetaj_bench decode FILE [--format rgba|rgb565] [--scale 1|2|4|8] [--runs N]
//                          [--side vetaj|libjpeg|both]
//   vetaj_bench all [DIR] [--runs N]
//
// Every figure is the median of N timed runs (default 7) after one untimed
// warm-up run; the runs of the contenders are interleaved so that noise from
// other jobs spreads over all of them. --once (entropy) runs each side once
// without warm-up, for instruction counting under callgrind. --side runs one
// side only, e.g. to count its cycles with perf stat on a busy machine.
#include <jpeglib.h>
#include <malloc.h>
#include <time.h>

#include <algorithm>
#include <csetjmp>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <initializer_list>
#include <string>
#include <utility>
#include <vector>

#include "VetaJpegDecoder.h"
#include "drivers/decoder.h"
#include "entropy/mcu.h"
#include "support/scan_harness.h"

// Declared weak: until the whole-image decoder is built, the bench still
// links and reports its modes as not supported.
#pragma weak KOLVAVETA_DecodeJPEG

namespace {

// ---------------------------------------------------------------------------
// Files, clock, statistics

struct JpegFile {
  std::string name;  // file name without directory
  std::vector<uint8_t> data;
  int width = 0;
  int height = 0;
  bool progressive = false;
};

double now_seconds() {
  timespec ts;
  clock_gettime(CLOCK_MONOTONIC, &ts);
  return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) * 1e-9;
}

double median(std::vector<double> v) {
  if (v.empty()) return 0.0;
  std::sort(v.begin(), v.end());
  const size_t n = v.size();
  return n % 2 == 1 ? v[n / 2] : 0.5 * (v[n / 2 - 1] + v[n / 2]);
}

// One output buffer for every decode of the run, grown (and touched, so its
// pages are mapped) only when a larger image needs it.
std::vector<uint8_t>& output_buffer(size_t bytes) {
  static std::vector<uint8_t> buffer;
  if (buffer.size() < bytes) {
    buffer.assign(bytes, 0);
  }
  return buffer;
}

// ---------------------------------------------------------------------------
// libjpeg-turbo

struct TurboError {
  jpeg_error_mgr mgr;
  jmp_buf jump;
};

void turbo_error_exit(j_common_ptr cinfo) {
  (*cinfo->err->output_message)(cinfo);
  std::longjmp(reinterpret_cast<TurboError*>(cinfo->err)->jump, 1);
}

// A decompressor on `file` with its header read. The caller destroys it.
// Returns false (and destroys it) when the header cannot be read.
bool turbo_open(jpeg_decompress_struct* cinfo, TurboError* err, const JpegFile& file) {
  cinfo->err = jpeg_std_error(&err->mgr);
  err->mgr.error_exit = turbo_error_exit;
  if (setjmp(err->jump)) {
    jpeg_destroy_decompress(cinfo);
    return false;
  }
  jpeg_create_decompress(cinfo);
  jpeg_mem_src(cinfo, file.data.data(), static_cast<unsigned long>(file.data.size()));
  jpeg_read_header(cinfo, TRUE);
  return true;
}

bool load_file(const std::string& path, JpegFile* file) {
  FILE* f = std::fopen(path.c_str(), "rb");
  if (f == nullptr) {
    std::fprintf(stderr, "cannot open %s\n", path.c_str());
    return false;
  }
  std::fseek(f, 0, SEEK_END);
  const long size = std::ftell(f);
  std::fseek(f, 0, SEEK_SET);
  file->data.resize(size > 0 ? static_cast<size_t>(size) : 0);
  const bool ok =
      size > 0 && std::fread(file->data.data(), 1, file->data.size(), f) == file->data.size();
  std::fclose(f);
  if (!ok) {
    std::fprintf(stderr, "cannot read %s\n", path.c_str());
    return false;
  }
  file->name = std::filesystem::path(path).filename().string();
  jpeg_decompress_struct cinfo;
  TurboError err;
  if (!turbo_open(&cinfo, &err, *file)) return false;
  file->width = static_cast<int>(cinfo.image_width);
  file->height = static_cast<int>(cinfo.image_height);
  file->progressive = cinfo.progressive_mode != 0;
  jpeg_destroy_decompress(&cinfo);
  return true;
}

// Time of jpeg_read_coefficients (entropy decoding of every scan into the
// coefficient buffer), header read beforehand. Negative on failure.
double turbo_entropy(const JpegFile& file, uint32_t* mcus) {
  jpeg_decompress_struct cinfo;
  TurboError err;
  if (!turbo_open(&cinfo, &err, file)) return -1.0;
  if (setjmp(err.jump)) {
    jpeg_destroy_decompress(&cinfo);
    return -1.0;
  }
  const double t0 = now_seconds();
  jpeg_read_coefficients(&cinfo);
  const double t1 = now_seconds();
  *mcus = cinfo.MCUs_per_row * cinfo.MCU_rows_in_scan;
  jpeg_finish_decompress(&cinfo);
  jpeg_destroy_decompress(&cinfo);
  return t1 - t0;
}

enum class Format { kRgba, kRgb565 };

int bytes_per_pixel(Format f) { return f == Format::kRgba ? 4 : 2; }
const char* format_name(Format f) { return f == Format::kRgba ? "RGBA" : "RGB565"; }

// Time of one whole decode (header included) into `out`, rows of `stride`
// bytes. Accurate integer transform, no dithering. Negative on failure.
double turbo_decode(const JpegFile& file, Format format, int scale, bool fancy, uint8_t* out,
                    size_t capacity, size_t stride) {
  jpeg_decompress_struct cinfo;
  TurboError err;
  const double t0 = now_seconds();
  if (!turbo_open(&cinfo, &err, file)) return -1.0;
  if (setjmp(err.jump)) {
    jpeg_destroy_decompress(&cinfo);
    return -1.0;
  }
  cinfo.out_color_space = format == Format::kRgba ? JCS_EXT_RGBA : JCS_RGB565;
  cinfo.dct_method = JDCT_ISLOW;
  cinfo.dither_mode = JDITHER_NONE;
  cinfo.scale_num = 1;
  cinfo.scale_denom = static_cast<unsigned int>(scale);
  cinfo.do_fancy_upsampling = fancy ? TRUE : FALSE;
  jpeg_start_decompress(&cinfo);
  if (static_cast<size_t>(cinfo.output_width) * bytes_per_pixel(format) > stride ||
      stride * cinfo.output_height > capacity) {
    jpeg_destroy_decompress(&cinfo);
    return -1.0;
  }
  JSAMPROW rows[16];
  while (cinfo.output_scanline < cinfo.output_height) {
    const JDIMENSION first = cinfo.output_scanline;
    const JDIMENSION count = std::min<JDIMENSION>(16, cinfo.output_height - first);
    for (JDIMENSION i = 0; i < count; ++i) rows[i] = out + (first + i) * stride;
    jpeg_read_scanlines(&cinfo, rows, count);
  }
  jpeg_finish_decompress(&cinfo);
  jpeg_destroy_decompress(&cinfo);
  return now_seconds() - t0;
}

// ---------------------------------------------------------------------------
// This library

// One entropy-only pass over the first scan: every MCU decoded into cleared
// blocks, nothing transformed. Returns the MCUs decoded (fewer on an error).
__attribute__((noinline)) uint32_t vetaj_entropy_pass(vjtest::ScanHarness& h) {
  DecoderInfo* d = h.d();
  int16_t** blocks = h.blocks();
  const size_t block_bytes = size_t{d->blocks_in_mcu} * 64 * sizeof(int16_t);
  uint32_t done = 0;
  for (uint32_t row = 0; row < d->mcu_rows; ++row) {
    d->current_mcu_row = row;
    for (uint32_t col = 0; col < d->mcus_per_row; ++col) {
      d->current_mcu_col = col;
      std::memset(blocks[0], 0, block_bytes);  // the harness's blocks are contiguous
      if (VETAJ_DecodeMcu(d, blocks) != 1) return done;
      ++done;
    }
  }
  return done;
}

// Time of the entropy pass (scan set up beforehand). Negative on failure.
double vetaj_entropy(const JpegFile& file, uint32_t* mcus) {
  vjtest::ScanHarness h;
  if (!h.open(file.data) || h.d()->entropy == nullptr) return -1.0;
  const double t0 = now_seconds();
  const uint32_t done = vetaj_entropy_pass(h);
  const double t1 = now_seconds();
  *mcus = h.total_mcus();
  return done == *mcus ? t1 - t0 : -1.0;
}

// Time of one decode (object creation, header and KOLVAVETA_DecodeJPEG) into
// a buffer of the reduced size. Negative when the call is missing or fails.
double vetaj_decode(const JpegFile& file, Format format, int scale, uint8_t* out) {
  if (KOLVAVETA_DecodeJPEG == nullptr) return -1.0;
  const int32_t code = format == Format::kRgba ? KOLVAVETA_FMT_RGBA8888 : KOLVAVETA_FMT_RGB565;
  const double t0 = now_seconds();
  DecInfo* obj = KOLVAVETA_CreateDecInfo(
      KOLVAVETA_IO_MEMORY, const_cast<uint8_t*>(file.data.data()),
      static_cast<uint32_t>(file.data.size()), code, KOLVAVETA_OPT_THUMB_NEVER);
  if (obj == nullptr) return -1.0;
  const int32_t ok = KOLVAVETA_DecodeJPEG(obj, out, file.width / scale, file.height / scale);
  const double t1 = now_seconds();
  KOLVAVETA_DestroyDecInfo(obj);
  return ok == 1 ? t1 - t0 : -1.0;
}

// ---------------------------------------------------------------------------
// Measurement of several contenders

// Runs every contender once untimed (a failure there marks it unsupported),
// then `runs` interleaved timed rounds. Each contender returns its time in
// seconds or a negative value on failure. Returns the medians, negative for
// the unsupported.
using Contender = std::function<double()>;

std::vector<double> measure(const std::vector<Contender>& contenders, int runs) {
  const size_t n = contenders.size();
  std::vector<bool> works(n);
  for (size_t i = 0; i < n; ++i) works[i] = contenders[i]() >= 0.0;
  std::vector<std::vector<double>> times(n);
  for (int r = 0; r < runs; ++r) {
    for (size_t i = 0; i < n; ++i) {
      if (!works[i]) continue;
      const double t = contenders[i]();
      if (t < 0.0) {
        works[i] = false;
      } else {
        times[i].push_back(t);
      }
    }
  }
  std::vector<double> out(n, -1.0);
  for (size_t i = 0; i < n; ++i)
    if (works[i]) out[i] = median(times[i]);
  return out;
}

void print_setting(int runs) {
  const char* simd = std::getenv("JSIMD_FORCENONE");
  const bool simd_off = simd != nullptr && std::strcmp(simd, "1") == 0;
  std::printf("libjpeg-turbo %d.%d.%d, SIMD %s; median of %d runs after a warm-up\n",
              LIBJPEG_TURBO_VERSION_NUMBER / 1000000, LIBJPEG_TURBO_VERSION_NUMBER / 1000 % 1000,
              LIBJPEG_TURBO_VERSION_NUMBER % 1000,
              simd_off ? "off (JSIMD_FORCENONE=1)" : "on (JSIMD_FORCENONE not set)", runs);
}

// Entropy-coded bytes of the first scan: from the end of its header to the
// first marker that is not a restart marker. 0 when there is no scan.
size_t first_scan_bytes(const std::vector<uint8_t>& d) {
  size_t pos = 2;  // after SOI
  while (pos + 4 <= d.size()) {
    if (d[pos] != 0xFF) return 0;
    const uint8_t m = d[pos + 1];
    if (m == 0xFF) {  // fill byte
      ++pos;
      continue;
    }
    if (m == 0x01 || (m >= 0xD0 && m <= 0xD8)) {  // no length
      pos += 2;
      continue;
    }
    const size_t length = (size_t{d[pos + 2]} << 8) | d[pos + 3];
    if (length < 2) return 0;
    pos += 2 + length;
    if (m != 0xDA) continue;
    const size_t begin = pos;
    while (pos + 1 < d.size()) {
      if (d[pos] == 0xFF && d[pos + 1] != 0x00 && !(d[pos + 1] >= 0xD0 && d[pos + 1] <= 0xD7))
        break;
      ++pos;
    }
    return std::min(pos, d.size()) - std::min(begin, d.size());
  }
  return 0;
}

void print_speed(const char* who, double seconds, double megabytes, double mcus) {
  if (seconds < 0.0) {
    std::printf("  %-14s not supported\n", who);
    return;
  }
  std::printf("  %-14s %8.2f ms %9.1f MB/s %9.2f M MCUs/s\n", who, seconds * 1e3,
              megabytes / seconds, mcus * 1e-6 / seconds);
}

// ---------------------------------------------------------------------------
// Modes

enum class Side { kBoth, kVetaj, kTurbo };

int run_entropy(const JpegFile& file, int runs, bool once, Side side) {
  if (file.progressive) {
    std::printf("entropy %s: progressive file; the entropy pass measures baseline scans only\n",
                file.name.c_str());
    return 1;
  }
  struct Pass {
    const char* who;
    double (*fn)(const JpegFile&, uint32_t*);
    uint32_t mcus;
  };
  std::vector<Pass> passes;
  if (side != Side::kTurbo) passes.push_back({"vetaj", vetaj_entropy, 0});
  if (side != Side::kVetaj) passes.push_back({"libjpeg-turbo", turbo_entropy, 0});
  std::vector<Contender> contenders;
  for (Pass& p : passes) contenders.push_back([&file, &p] { return p.fn(file, &p.mcus); });
  std::vector<double> seconds;
  if (once) {
    for (const Contender& c : contenders) seconds.push_back(c());
  } else {
    seconds = measure(contenders, runs);
  }
  uint32_t mcus = 0;
  for (const Pass& p : passes) mcus = std::max(mcus, p.mcus);
  const size_t bytes = first_scan_bytes(file.data);
  if (once) {
    // Read by callgrind.sh.
    std::printf("entropy-once file=%s mcus=%u entropy_bytes=%zu\n", file.name.c_str(), mcus, bytes);
    return *std::min_element(seconds.begin(), seconds.end()) < 0.0 ? 1 : 0;
  }
  std::printf("entropy %s: %dx%d, %u MCUs, %zu entropy-coded bytes\n", file.name.c_str(),
              file.width, file.height, mcus, bytes);
  for (size_t i = 0; i < passes.size(); ++i)
    print_speed(passes[i].who, seconds[i], static_cast<double>(bytes) * 1e-6, mcus);
  if (passes.size() == 2 && seconds[0] > 0.0 && seconds[1] > 0.0)
    std::printf("  speed ratio vetaj / libjpeg-turbo: %.2f\n", seconds[1] / seconds[0]);
  std::fflush(stdout);
  return 0;
}

void print_decode_header() {
  std::printf("%-22s %-13s %13s %13s %6s %13s %6s\n", "file", "output", "vetaj", "turbo fancy",
              "ratio", "turbo plain", "ratio");
}

// One decode case: this library against libjpeg-turbo with and without fancy
// upsampling. Speeds in Mpixel/s of source pixels; ratios vetaj / turbo.
void run_decode(const JpegFile& file, Format format, int scale, int runs, Side side) {
  const size_t stride = static_cast<size_t>((file.width + scale - 1) / scale) *
                        static_cast<size_t>(bytes_per_pixel(format));
  const size_t capacity = stride * static_cast<size_t>((file.height + scale - 1) / scale);
  uint8_t* out = output_buffer(capacity).data();
  const bool vetaj = side != Side::kTurbo;
  const bool turbo = side != Side::kVetaj;
  const std::vector<Contender> contenders = {
      [&] { return vetaj ? vetaj_decode(file, format, scale, out) : -1.0; },
      [&] { return turbo ? turbo_decode(file, format, scale, true, out, capacity, stride) : -1.0; },
      [&] {
        return turbo ? turbo_decode(file, format, scale, false, out, capacity, stride) : -1.0;
      },
  };
  const std::vector<double> m = measure(contenders, runs);
  const double mpix = static_cast<double>(file.width) * file.height * 1e-6;
  char output[32];
  std::snprintf(output, sizeof output, "%s 1/%d", format_name(format), scale);
  char cells[3][16];
  for (int i = 0; i < 3; ++i) {
    if (m[i] < 0.0) {
      const bool ran = i == 0 ? vetaj : turbo;
      std::snprintf(cells[i], sizeof cells[i], "%s",
                    !ran     ? "-"
                    : i == 0 ? "unsupported"
                             : "failed");
    } else {
      std::snprintf(cells[i], sizeof cells[i], "%.1f", mpix / m[i]);
    }
  }
  char ratios[2][16];
  for (int i = 0; i < 2; ++i) {
    if (m[0] < 0.0 || m[i + 1] < 0.0) {
      std::snprintf(ratios[i], sizeof ratios[i], "-");
    } else {
      std::snprintf(ratios[i], sizeof ratios[i], "%.2f", m[i + 1] / m[0]);
    }
  }
  std::printf("%-22s %-13s %13s %13s %6s %13s %6s\n", file.name.c_str(), output, cells[0], cells[1],
              ratios[0], cells[2], ratios[1]);
  std::fflush(stdout);
}

int run_all(const std::string& dir, int runs) {
  std::vector<std::string> photos;
  std::error_code ec;
  for (const auto& entry : std::filesystem::directory_iterator(dir, ec)) {
    const std::string n = entry.path().filename().string();
    const std::string suffix = "_420.jpg";
    if (n.size() > suffix.size() && n.compare(n.size() - suffix.size(), suffix.size(), suffix) == 0)
      photos.push_back(n.substr(0, n.size() - suffix.size()));
  }
  if (photos.empty()) {
    std::fprintf(stderr, "no photographs in %s: run bench/fetch_photos.sh\n", dir.c_str());
    return 1;
  }
  std::sort(photos.begin(), photos.end());
  struct Case {
    const char* variant;
    Format format;
    int scale;
  };
  static const Case kCases[] = {
      {"420", Format::kRgba, 1},     {"420", Format::kRgb565, 1},   {"422", Format::kRgba, 1},
      {"422", Format::kRgb565, 1},   {"444", Format::kRgba, 1},     {"444", Format::kRgb565, 1},
      {"grey", Format::kRgba, 1},    {"grey", Format::kRgb565, 1},  {"420", Format::kRgba, 2},
      {"420", Format::kRgba, 4},     {"420", Format::kRgba, 8},     {"rst420", Format::kRgba, 1},
      {"prog420", Format::kRgba, 1}, {"prog420", Format::kRgba, 8},
  };
  static const char* const kEntropyVariants[] = {"420", "rst420"};
  print_setting(runs);
  std::printf("decode speeds in Mpixel/s of source pixels; ratio = vetaj speed / turbo speed\n");
  for (const auto& photo : photos) {
    std::printf("\n");
    print_decode_header();
    for (const Case& c : kCases) {
      JpegFile file;
      if (!load_file(dir + "/" + photo + "_" + c.variant + ".jpg", &file)) continue;
      run_decode(file, c.format, c.scale, runs, Side::kBoth);
    }
    for (const char* v : kEntropyVariants) {
      JpegFile file;
      if (!load_file(dir + "/" + photo + "_" + v + ".jpg", &file)) continue;
      run_entropy(file, runs, false, Side::kBoth);
    }
  }
  return 0;
}

// Sets *out to the value named by `word` among `choices`; false if none is.
template <class T>
bool pick(const std::string& word, std::initializer_list<std::pair<const char*, T>> choices,
          T* out) {
  for (const auto& [name, value] : choices) {
    if (word == name) {
      *out = value;
      return true;
    }
  }
  return false;
}

int usage() {
  std::fprintf(stderr,
               "usage: vetaj_bench entropy FILE [--runs N] [--once] [--side vetaj|libjpeg|both]\n"
               "       vetaj_bench decode FILE [--format rgba|rgb565] [--scale 1|2|4|8] "
               "[--runs N]\n"
               "                          [--side vetaj|libjpeg|both]\n"
               "       vetaj_bench all [DIR] [--runs N]\n");
  return 2;
}

}  // namespace

int main(int argc, char** argv) {
  // Freed memory stays in the process (no mmap for large blocks, no trimming),
  // so repeated decodes reuse mapped pages on both sides instead of paying
  // for first touches of fresh memory in every run.
  mallopt(M_MMAP_MAX, 0);
  mallopt(M_TRIM_THRESHOLD, 0x7FFFFFFF);

  if (argc < 2) return usage();
  const std::string mode = argv[1];
  std::string path;
  int runs = 7;
  bool once = false;
  Side side = Side::kBoth;
  Format format = Format::kRgba;
  int scale = 1;
  for (int i = 2; i < argc; ++i) {
    const std::string a = argv[i];
    const bool has_value = i + 1 < argc;
    if (a == "--runs" && has_value) {
      runs = std::atoi(argv[++i]);
      if (runs < 1) return usage();
    } else if (a == "--once") {
      once = true;
    } else if (a == "--side" && has_value) {
      if (!pick(argv[++i],
                {{"vetaj", Side::kVetaj}, {"libjpeg", Side::kTurbo}, {"both", Side::kBoth}}, &side))
        return usage();
    } else if (a == "--format" && has_value) {
      if (!pick(argv[++i], {{"rgba", Format::kRgba}, {"rgb565", Format::kRgb565}}, &format))
        return usage();
    } else if (a == "--scale" && has_value) {
      scale = std::atoi(argv[++i]);
      if (scale != 1 && scale != 2 && scale != 4 && scale != 8) return usage();
    } else if (a.rfind("--", 0) != 0 && path.empty()) {
      path = a;
    } else {
      return usage();
    }
  }

  if (mode == "all") return run_all(path.empty() ? VETAJ_BENCH_PHOTOS : path, runs);
  if (path.empty()) return usage();
  JpegFile file;
  if (!load_file(path, &file)) return 1;
  if (mode == "entropy") {
    if (!once) print_setting(runs);
    return run_entropy(file, runs, once, side);
  }
  if (mode == "decode") {
    print_setting(runs);
    std::printf("decode speeds in Mpixel/s of source pixels; ratio = vetaj speed / turbo speed\n");
    print_decode_header();
    run_decode(file, format, scale, runs, side);
    return 0;
  }
  return usage();
}
