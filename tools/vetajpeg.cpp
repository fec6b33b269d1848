// vetajpeg: command-line front end of libVetaJpegDecoder.
//
//   vetajpeg info FILE                      header summary and Exif fields
//   vetajpeg decode FILE -o OUT [options]   decode to a PNG (or the raw buffer)
#include <cstdarg>
#include <cstring>
#include <new>

#include "tool.h"

namespace vetajpeg {

void print_usage(FILE* out) {
  std::fputs(
      "usage: vetajpeg info FILE\n"
      "       vetajpeg decode FILE -o OUT.png [options]\n"
      "       vetajpeg --help | --version\n"
      "\n"
      "info identifies the picture (JPEG, also inside a TIFF file, PNG, BMP,\n"
      "GIF, WBMP) and prints its size; for a GIF the frame count and duration,\n"
      "for a JPEG the header summary (progressive, restart interval, largest\n"
      "sampling factors) and the Exif fields. decode reads JPEG pictures only.\n"
      "\n"
      "decode options:\n"
      "  -o, --output OUT      file to write: an 8-bit RGB(A) PNG, or the raw\n"
      "                        output buffer with --raw\n"
      "  --size WxH            size in pixels of the output BUFFER (default: the\n"
      "                        picture size, divided by the --scale denominator,\n"
      "                        with width and height swapped for a 90 or 270\n"
      "                        degree rotation). The picture is fitted into it;\n"
      "                        with --rotate 90/270 the buffer stays WxH and the\n"
      "                        turned picture is fitted into it\n"
      "  --scale 1/N           scale denominator N = 1, 2, 4, 8, 16, ...: the\n"
      "                        picture size divided by N, at most the buffer size\n"
      "  --fit MODE            how the picture fills the buffer:\n"
      "                          centre   fit inside, keep the aspect, centred (default)\n"
      "                          rowlen   fit inside, rows as long as the output\n"
      "                          topleft  fit inside, at the top-left corner\n"
      "                          fill     cover the buffer, crop the overhang\n"
      "                          stretch  exactly the buffer size\n"
      "  --rotate DEG          clockwise rotation: 0, 90, 180 or 270\n"
      "  --exif-orient         rotate as the Exif orientation tag says\n"
      "  --thumb P             embedded thumbnail policy:\n"
      "                          0  the thumbnail when it covers the buffer\n"
      "                          1  always the main picture (default)\n"
      "                          2  the thumbnail whenever there is one\n"
      "                          3  as 0, turning a thumbnail of the other orientation\n"
      "  --mode M              speed/quality: 0 best (default) .. 4 fastest\n"
      "  --format F            decode buffer format: rgba (default), bgra, argb,\n"
      "                        rgb565, rgb or yuv420 (planar 4:2:0)\n"
      "  --raw                 write the decode buffer as it is instead of a PNG\n"
      "  --progress            show a progress bar on stderr (shown anyway on a\n"
      "                        terminal for pictures above 1 megapixel)\n"
      "\n"
      "Parts of the buffer that the picture does not cover stay transparent\n"
      "(formats with alpha) or black.\n"
      "\n"
      "exit status: 0 success, 1 the input cannot be read or decoded or the\n"
      "output cannot be written, 2 bad command line\n",
      out);
}

namespace {

__attribute__((format(printf, 1, 0))) void vreport(const char* format, va_list args) {
  std::fputs("vetajpeg: ", stderr);
  std::vfprintf(stderr, format, args);
  std::fputc('\n', stderr);
}

}  // namespace

void report(const char* format, ...) {
  va_list args;
  va_start(args, format);
  vreport(format, args);
  va_end(args);
}

int usage_error(const char* format, ...) {
  va_list args;
  va_start(args, format);
  vreport(format, args);
  va_end(args);
  std::fputc('\n', stderr);
  print_usage(stderr);
  return kExitUsage;
}

}  // namespace vetajpeg

int main(int argc, char** argv) {
  using namespace vetajpeg;
  if (argc < 2) return usage_error("no command");
  const char* command = argv[1];
  if (std::strcmp(command, "-h") == 0 || std::strcmp(command, "--help") == 0 ||
      std::strcmp(command, "help") == 0) {
    print_usage(stdout);
    return kExitOk;
  }
  if (std::strcmp(command, "--version") == 0) {
    std::printf("vetajpeg, libVetaJpegDecoder %d\n", static_cast<int>(VETAJ_GetVersion()));
    return kExitOk;
  }
  // The library reports its failures by result codes; only the tool's own
  // containers can throw, when memory runs out.
  try {
    if (std::strcmp(command, "info") == 0) return run_info(argc - 1, argv + 1);
    if (std::strcmp(command, "decode") == 0) return run_decode(argc - 1, argv + 1);
  } catch (const std::bad_alloc&) {
    report("out of memory");
    return kExitFailure;
  }
  return usage_error("unknown command '%s'", command);
}
