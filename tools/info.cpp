// `vetajpeg info FILE`: the header summary and the Exif fields of a picture.
#include <cinttypes>
#include <cstring>

#include "tool.h"

namespace vetajpeg {

namespace {

void field(const char* name, const std::string& value) {
  std::printf("  %-17s %s\n", name, value.c_str());
}

// Text from the file, with control and non-ASCII bytes shown as '?'.
std::string printable(const char* text) {
  std::string out;
  for (const char* p = text; *p != '\0'; ++p) {
    const unsigned char c = static_cast<unsigned char>(*p);
    out += (c >= 0x20 && c < 0x7F) ? static_cast<char>(c) : '?';
  }
  // Camera strings are often padded with spaces.
  while (!out.empty() && out.back() == ' ') out.pop_back();
  return out;
}

void string_field(const char* name, const char* text) {
  if (text != nullptr && *text != '\0') field(name, printable(text));
}

// A number with a fixed count of decimals.
std::string decimal(double value, int decimals) {
  char text[64];
  std::snprintf(text, sizeof text, "%.*f", decimals, value);
  return text;
}

// A rational as a number, or false for a zero denominator.
bool rational(const uint32_t* r, double* value) {
  if (r[1] == 0) return false;
  *value = static_cast<double>(r[0]) / r[1];
  return true;
}

const char* orientation_meaning(uint32_t orientation) {
  switch (orientation) {
    case 1: return "upright";
    case 2: return "mirror horizontally to view";
    case 3: return "rotate 180 degrees to view";
    case 4: return "mirror vertically to view";
    case 5: return "mirror horizontally, then rotate 270 degrees clockwise to view";
    case 6: return "rotate 90 degrees clockwise to view";
    case 7: return "mirror horizontally, then rotate 90 degrees clockwise to view";
    case 8: return "rotate 270 degrees clockwise to view";
    default: return "not a valid orientation";
  }
}

std::string exposure_text(const uint32_t* r) {
  if (r[0] == 0 || r[1] == 0) return "invalid";
  if (r[0] < r[1] && r[1] % r[0] == 0) return "1/" + std::to_string(r[1] / r[0]) + " s";
  return decimal(static_cast<double>(r[0]) / r[1], 2) + " s";
}

// Degrees, minutes and seconds (three rationals) with their reference letter.
void gps_angle(const char* name, const uint32_t* dms, const char* ref) {
  if (dms[1] == 0 && dms[3] == 0 && dms[5] == 0) return;  // not recorded
  double d = 0, m = 0, s = 0;
  if (!rational(dms, &d) || !rational(dms + 2, &m) || !rational(dms + 4, &s)) {
    field(name, "invalid");
    return;
  }
  std::string text = decimal(d + m / 60 + s / 3600, 6);
  if (ref[0] != '\0') {
    text += ' ';
    text.append(printable(ref));
  }
  field(name, text);
}

void print_gps(const GpsInfo& gps) {
  gps_angle("GPS latitude:", gps.latitude, gps.latitude_ref);
  gps_angle("GPS longitude:", gps.longitude, gps.longitude_ref);
  if (gps.altitude[1] != 0) {
    double metres = 0;
    rational(gps.altitude, &metres);
    field("GPS altitude:", decimal(metres, 1) + " m " +
                               (gps.altitude_ref == 1 ? "below sea level" : "above sea level"));
  }
}

void print_thumbnail(const ThumbnailInfo& t) {
  if (t.present == 0) return;
  char size[32] = "";
  if (t.width > 0 && t.height > 0)
    std::snprintf(size, sizeof size, " %" PRId32 "x%" PRId32, t.width, t.height);
  char text[128];
  std::snprintf(text, sizeof text, "%s%s, %" PRIu32 " bytes at offset %" PRIu32,
                t.format == kThumbJpeg ? "JPEG" : "uncompressed", size, t.length, t.offset);
  field("thumbnail:", text);
}

void print_exif(const ExifInfo* exif) {
  if (exif == nullptr) {
    std::printf("Exif:               none\n");
    return;
  }
  std::printf("Exif:\n");
  if (exif->orientation != 0)
    field("orientation:",
          std::to_string(exif->orientation) + " (" + orientation_meaning(exif->orientation) + ")");
  string_field("make:", exif->make);
  string_field("model:", exif->model);
  string_field("software:", exif->software);
  string_field("date/time:", exif->date_time_original);
  if (exif->date_time_digitized != nullptr &&
      (exif->date_time_original == nullptr ||
       std::strcmp(exif->date_time_original, exif->date_time_digitized) != 0))
    string_field("digitized:", exif->date_time_digitized);
  if (exif->exposure_time[1] != 0) field("exposure:", exposure_text(exif->exposure_time));
  double value = 0;
  if (rational(exif->f_number, &value)) field("f-number:", "f/" + decimal(value, 1));
  if (exif->iso_speed_ratings != 0) field("ISO:", std::to_string(exif->iso_speed_ratings));
  if (rational(exif->focal_length, &value)) field("focal length:", decimal(value, 1) + " mm");
  if (exif->gps != nullptr) print_gps(*exif->gps);
  print_thumbnail(exif->thumbnail);
}

}  // namespace

int run_info(int argc, char** argv) {
  const char* path = nullptr;
  for (int i = 1; i < argc; ++i) {
    if (std::strcmp(argv[i], "-h") == 0 || std::strcmp(argv[i], "--help") == 0) {
      print_usage(stdout);
      return kExitOk;
    }
    if (argv[i][0] == '-' && argv[i][1] != '\0')
      return usage_error("info: unknown option '%s'", argv[i]);
    if (path != nullptr) return usage_error("info: more than one input file");
    path = argv[i];
  }
  if (path == nullptr) return usage_error("info: no input file");

  Decoder decoder;
  if (!decoder.open(path, KOLVAVETA_FMT_RGBA8888, KOLVAVETA_OPT_THUMB_NEVER)) return kExitFailure;
  JpegInfo info{};
  const int32_t type = decoder.read_summary(&info);
  if (type == KOLVAVETA_IMAGE_UNKNOWN) return kExitFailure;

  DecInfo* object = decoder.get();
  const bool in_tiff = type == KOLVAVETA_IMAGE_JPEG && object->jpeg_offset != 0;
  std::printf("file:               %s\n", path);
  std::printf("type:               %s%s\n", image_type_name(type),
              in_tiff ? " (in a TIFF file)" : "");
  std::printf("width:              %" PRId32 "\n", info.width);
  std::printf("height:             %" PRId32 "\n", info.height);
  if (type == KOLVAVETA_IMAGE_GIF || type == KOLVAVETA_IMAGE_GIF_ANIMATED) {
    std::printf("frames:             %" PRId32 "\n", info.image_count);
    std::printf("duration:           %" PRId32 " ms\n", object->gif_duration);
  } else if (type == KOLVAVETA_IMAGE_PNG) {
    std::printf("interlaced:         %s\n", info.progressive != 0 ? "yes" : "no");
  } else if (type == KOLVAVETA_IMAGE_JPEG) {
    std::printf("progressive:        %s\n", info.progressive != 0 ? "yes" : "no");
    std::printf("restart interval:   %" PRId32 "\n", info.restart_interval);
    std::printf("max sampling:       %" PRId32 "x%" PRId32 "\n", info.max_h_samp,
                info.max_v_samp);
    uint32_t offset = 0, length = 0;
    if (in_tiff && KOLVAVETA_GetJpegOffset(object, &offset, &length) != 0)
      std::printf("JPEG stream:        %" PRIu32 " bytes at offset %" PRIu32 "\n", length, offset);
  }
  std::printf("input size:         %" PRIu32 " bytes\n", info.input_size);
  if (type == KOLVAVETA_IMAGE_JPEG) {
    const std::string problem = diagnose_jpeg(path);
    if (!problem.empty()) std::printf("note:               %s\n", problem.c_str());
    const ExifRecord exif(decoder.get());
    print_exif(exif.get());
  }
  return kExitOk;
}

}  // namespace vetajpeg
