// Reference decoding with libjpeg for the tests (see oracle.h).
#include "support/oracle.h"

#include "support/files.h"

#if VETAJ_HAVE_LIBJPEG

#include <csetjmp>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <jpeglib.h>

namespace vjtest {
namespace {

// libjpeg reports fatal errors through error_exit, which must not return:
// jump back to run() instead of ending the process.
struct Session {
  jpeg_decompress_struct d;
  jpeg_compress_struct c;
  jpeg_error_mgr err;
  std::jmp_buf jump;
  unsigned char* mem = nullptr;  // a stream written by the compressor
  unsigned long mem_size = 0;
};

[[noreturn]] void error_exit(j_common_ptr cinfo) {
  std::longjmp(static_cast<Session*>(cinfo->client_data)->jump, 1);
}
void output_message(j_common_ptr) {}
void emit_message(j_common_ptr, int) {}

int round_up(int value, int multiple) { return (value + multiple - 1) / multiple * multiple; }

// Reads the header, then runs `step` on the session. The steps run between
// setjmp and a possible longjmp: they keep no local objects with destructors
// and write only into the caller's output records.
template <class Step>
bool run(const std::vector<uint8_t>& jpeg, Step step) {
  Session s;
  std::memset(&s.d, 0, sizeof s.d);
  std::memset(&s.c, 0, sizeof s.c);
  s.d.err = s.c.err = jpeg_std_error(&s.err);
  s.err.error_exit = error_exit;
  s.err.emit_message = emit_message;
  s.err.output_message = output_message;
  bool ok = false;
  if (setjmp(s.jump) == 0) {
    jpeg_create_decompress(&s.d);
    s.d.client_data = &s;
    size_t start = 0;  // the first SOI followed by a marker
    while (start + 2 < jpeg.size() && !(jpeg[start] == 0xFF && jpeg[start + 1] == 0xD8 && jpeg[start + 2] == 0xFF))
      ++start;
    if (start + 2 >= jpeg.size()) start = 0;
    jpeg_mem_src(&s.d, jpeg.data() + start, static_cast<unsigned long>(jpeg.size() - start));
    jpeg_read_header(&s.d, TRUE);
    step(s);
    ok = true;
  }
  jpeg_destroy_decompress(&s.d);
  jpeg_destroy_compress(&s.c);
  std::free(s.mem);
  return ok;
}

// Zeroes every coefficient past zig-zag index `keep` and writes the
// coefficients back as a sequential stream (one scan per component when asked).
void transcode(Session& s, int keep, bool one_scan_per_component, std::vector<uint8_t>* out) {
  int order[64];  // zig-zag index -> natural position, from the scan pattern
  for (int diag = 0, k = 0; diag < 15; ++diag)
    for (int i = 0; i <= diag; ++i) {
      const int row = diag % 2 == 0 ? diag - i : i, col = diag - row;
      if (row < 8 && col < 8) order[k++] = row * 8 + col;
    }
  jpeg_decompress_struct* d = &s.d;
  jvirt_barray_ptr* arrays = jpeg_read_coefficients(d);
  for (int ci = 0; ci < d->num_components; ++ci) {
    const jpeg_component_info& comp = d->comp_info[ci];
    for (int row = 0; row < round_up(int(comp.height_in_blocks), comp.v_samp_factor); ++row) {
      JBLOCKARRAY blocks = d->mem->access_virt_barray(j_common_ptr(d), arrays[ci], JDIMENSION(row), 1, TRUE);
      for (int col = 0; col < round_up(int(comp.width_in_blocks), comp.h_samp_factor); ++col)
        for (int k = keep + 1; k < 64; ++k) blocks[0][col][order[k]] = 0;
    }
  }
  s.c.client_data = &s;
  jpeg_create_compress(&s.c);
  jpeg_copy_critical_parameters(d, &s.c);
  jpeg_scan_info scans[4];
  if (one_scan_per_component) {
    for (int ci = 0; ci < d->num_components && ci < 4; ++ci)
      scans[ci] = jpeg_scan_info{1, {ci}, 0, 63, 0, 0};
    s.c.scan_info = scans;
    s.c.num_scans = d->num_components;
  }
  jpeg_mem_dest(&s.c, &s.mem, &s.mem_size);
  jpeg_write_coefficients(&s.c, arrays);
  jpeg_finish_compress(&s.c);
  out->assign(s.mem, s.mem + s.mem_size);
}

}  // namespace

bool oracle_header(const std::vector<uint8_t>& jpeg, OracleHeader* h) {
  return run(jpeg, [h](Session& s) {
    const jpeg_decompress_struct& d = s.d;
    *h = OracleHeader{int(d.image_width), int(d.image_height), d.num_components,
                      d.progressive_mode ? 1 : 0, int(d.restart_interval),
                      d.max_h_samp_factor, d.max_v_samp_factor, int(d.jpeg_color_space)};
  });
}

bool oracle_coefficients(const std::vector<uint8_t>& jpeg, std::vector<OracleComponent>* out) {
  return run(jpeg, [out](Session& s) {
    jpeg_decompress_struct* d = &s.d;
    jvirt_barray_ptr* arrays = jpeg_read_coefficients(d);
    out->assign(size_t(d->num_components), OracleComponent{});
    for (int ci = 0; ci < d->num_components; ++ci) {
      const jpeg_component_info& comp = d->comp_info[ci];
      OracleComponent& oc = (*out)[size_t(ci)];
      oc.width_in_blocks = int(comp.width_in_blocks);
      oc.height_in_blocks = int(comp.height_in_blocks);
      // The coefficient controller pads its arrays to whole MCUs of the component.
      oc.stride_blocks = round_up(oc.width_in_blocks, comp.h_samp_factor);
      oc.rows_blocks = round_up(oc.height_in_blocks, comp.v_samp_factor);
      for (int k = 0; k < 64 && comp.quant_table != nullptr; ++k) oc.quant[k] = comp.quant_table->quantval[k];
      oc.blocks.resize(size_t(oc.stride_blocks) * size_t(oc.rows_blocks) * 64);
      for (int row = 0; row < oc.rows_blocks; ++row) {
        JBLOCKARRAY rows = d->mem->access_virt_barray(j_common_ptr(d), arrays[ci], JDIMENSION(row), 1, FALSE);
        std::memcpy(&oc.blocks[size_t(row) * size_t(oc.stride_blocks) * 64], rows[0],
                    size_t(oc.stride_blocks) * sizeof(JBLOCK));
      }
    }
  });
}

bool oracle_planes(const std::vector<uint8_t>& jpeg, int scale_denom, OraclePlanes* out) {
  return run(jpeg, [scale_denom, out](Session& s) {
    jpeg_decompress_struct* d = &s.d;
    d->out_color_space = d->jpeg_color_space;
    d->dct_method = JDCT_ISLOW;
    d->do_fancy_upsampling = FALSE;
    d->do_block_smoothing = FALSE;
    d->scale_num = 1;
    d->scale_denom = unsigned(scale_denom);
    jpeg_start_decompress(d);
    out->width = int(d->output_width);
    out->height = int(d->output_height);
    out->components = d->output_components;
    const size_t stride = size_t(out->width) * size_t(out->components);
    out->data.assign(stride * size_t(out->height), 0);
    while (d->output_scanline < d->output_height) {
      JSAMPROW row = out->data.data() + size_t(d->output_scanline) * stride;
      jpeg_read_scanlines(d, &row, 1);
    }
    jpeg_finish_decompress(d);
  });
}

bool oracle_truncated_planes(const std::vector<uint8_t>& jpeg, int keep, int scale_denom,
                             OraclePlanes* out) {
  std::vector<uint8_t> transcoded;
  return run(jpeg, [&](Session& s) { transcode(s, keep, false, &transcoded); }) &&
         oracle_planes(transcoded, scale_denom, out);
}

bool oracle_sequential_scans(const std::vector<uint8_t>& jpeg, std::vector<uint8_t>* out) {
  return run(jpeg, [out](Session& s) { transcode(s, 63, true, out); });
}

std::vector<std::string> fixtures_where(
    const std::function<bool(const std::string& name, const OracleHeader& header)>& keep) {
  std::vector<std::string> out;
  for (const auto& name : list_fixtures(".jpg")) {
    OracleHeader h;
    if (name.rfind("bad_", 0) != 0 && oracle_header(read_fixture(name), &h) && keep(name, h))
      out.push_back(name);
  }
  return out;
}

::testing::AssertionResult same_luma(const std::vector<uint8_t>& buffer, int width, int height,
                                     const OraclePlanes& ref) {
  if (buffer.size() < size_t(width) * height || ref.width < width || ref.height < height)
    return ::testing::AssertionFailure() << "sizes differ: " << ref.width << "x" << ref.height;
  for (int y = 0; y < height; ++y)
    for (int x = 0; x < width; ++x)
      if (buffer[size_t(y) * width + x] != ref.at(x, y, 0))
        return ::testing::AssertionFailure() << "luma differs at " << x << "," << y << " of "
                                             << width << "x" << height;
  return ::testing::AssertionSuccess();
}

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG
