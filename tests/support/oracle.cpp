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
// jump back to the decode driver instead of ending the process.
struct ErrorManager {
  jpeg_error_mgr pub;
  std::jmp_buf jump;
};

[[noreturn]] void error_exit(j_common_ptr cinfo) {
  std::longjmp(reinterpret_cast<ErrorManager*>(cinfo->err)->jump, 1);
}

void emit_message(j_common_ptr, int) {}
void output_message(j_common_ptr) {}

// Offset of the first SOI followed by a marker, or 0 when there is none (the
// decode then fails on the first bytes as libjpeg would).
size_t stream_start(const std::vector<uint8_t>& bytes) {
  for (size_t i = 0; i + 2 < bytes.size(); ++i)
    if (bytes[i] == 0xFF && bytes[i + 1] == 0xD8 && bytes[i + 2] == 0xFF) return i;
  return 0;
}

enum class Job { kHeader, kCoefficients, kPlanes, kTruncate };

struct Request {
  Job job;
  int scale_denom = 1;
  int out_color_space = -1;  // -1: the stream's own colour space
  OracleHeader* header = nullptr;
  std::vector<OracleComponent>* components = nullptr;
  OraclePlanes* planes = nullptr;
  int keep = 63;                              // kTruncate: last zig-zag index kept
  bool one_scan_per_component = false;        // kTruncate: sequential scans, one per component
  std::vector<uint8_t>* transcoded = nullptr; // kTruncate: the rewritten stream
};

// The step functions below run between setjmp and a possible longjmp: they
// keep no local objects with destructors and write only into the caller's
// output records.

void fill_header(const jpeg_decompress_struct& d, OracleHeader* h) {
  *h = OracleHeader{};
  h->width = static_cast<int>(d.image_width);
  h->height = static_cast<int>(d.image_height);
  h->num_components = d.num_components;
  h->progressive = d.progressive_mode ? 1 : 0;
  h->restart_interval = static_cast<int>(d.restart_interval);
  h->max_h = d.max_h_samp_factor;
  h->max_v = d.max_v_samp_factor;
  h->jpeg_color_space = static_cast<int>(d.jpeg_color_space);
  h->saw_jfif = d.saw_JFIF_marker ? 1 : 0;
  h->saw_adobe = d.saw_Adobe_marker ? 1 : 0;
  h->adobe_transform = d.Adobe_transform;
  for (int c = 0; c < d.num_components && c < 4; ++c) {
    h->comp_id[c] = d.comp_info[c].component_id;
    h->h_samp[c] = d.comp_info[c].h_samp_factor;
    h->v_samp[c] = d.comp_info[c].v_samp_factor;
  }
}

int round_up(int value, int multiple) { return (value + multiple - 1) / multiple * multiple; }

void read_coefficients(jpeg_decompress_struct* d, std::vector<OracleComponent>* out) {
  jvirt_barray_ptr* arrays = jpeg_read_coefficients(d);
  out->clear();
  out->resize(static_cast<size_t>(d->num_components));
  for (int ci = 0; ci < d->num_components; ++ci) {
    const jpeg_component_info& comp = d->comp_info[ci];
    OracleComponent& oc = (*out)[static_cast<size_t>(ci)];
    oc.id = comp.component_id;
    oc.h_samp = comp.h_samp_factor;
    oc.v_samp = comp.v_samp_factor;
    oc.width_in_blocks = static_cast<int>(comp.width_in_blocks);
    oc.height_in_blocks = static_cast<int>(comp.height_in_blocks);
    // The coefficient controller pads its arrays to whole MCUs of the component.
    oc.stride_blocks = round_up(oc.width_in_blocks, oc.h_samp);
    oc.rows_blocks = round_up(oc.height_in_blocks, oc.v_samp);
    if (comp.quant_table != nullptr)
      for (int k = 0; k < 64; ++k) oc.quant[k] = comp.quant_table->quantval[k];
    oc.blocks.assign(static_cast<size_t>(oc.stride_blocks) * static_cast<size_t>(oc.rows_blocks) * 64, 0);
    for (int row = 0; row < oc.rows_blocks; ++row) {
      JBLOCKARRAY rows = d->mem->access_virt_barray(reinterpret_cast<j_common_ptr>(d), arrays[ci],
                                                    static_cast<JDIMENSION>(row), 1, FALSE);
      int16_t* dst = oc.blocks.data() + static_cast<size_t>(row) * static_cast<size_t>(oc.stride_blocks) * 64;
      for (int col = 0; col < oc.stride_blocks; ++col)
        for (int k = 0; k < 64; ++k) dst[col * 64 + k] = rows[0][col][k];
    }
  }
}

void read_planes(jpeg_decompress_struct* d, int scale_denom, int out_color_space, OraclePlanes* out) {
  d->out_color_space = out_color_space < 0 ? d->jpeg_color_space : static_cast<J_COLOR_SPACE>(out_color_space);
  d->dct_method = JDCT_ISLOW;
  d->do_fancy_upsampling = FALSE;
  d->do_block_smoothing = FALSE;
  d->scale_num = 1;
  d->scale_denom = static_cast<unsigned>(scale_denom);
  jpeg_start_decompress(d);
  out->width = static_cast<int>(d->output_width);
  out->height = static_cast<int>(d->output_height);
  out->components = d->output_components;
  const size_t stride = static_cast<size_t>(out->width) * static_cast<size_t>(out->components);
  out->data.assign(stride * static_cast<size_t>(out->height), 0);
  while (d->output_scanline < d->output_height) {
    JSAMPROW row = out->data.data() + static_cast<size_t>(d->output_scanline) * stride;
    jpeg_read_scanlines(d, &row, 1);
  }
  jpeg_finish_decompress(d);
}

// Zig-zag index -> natural position, built from the scan pattern.
void zigzag_order(int order[64]) {
  int k = 0;
  for (int s = 0; s < 15; ++s) {
    for (int i = 0; i <= s; ++i) {
      const int row = (s % 2 == 0) ? s - i : i;
      const int col = s - row;
      if (row < 8 && col < 8) order[k++] = row * 8 + col;
    }
  }
}

// Zeroes every coefficient past zig-zag index `keep` and writes the
// coefficients back as a sequential stream.
void truncate_coefficients(jpeg_decompress_struct* d, jpeg_compress_struct* c, int keep,
                           bool one_scan_per_component, unsigned char** mem,
                           unsigned long* size) {
  int order[64];
  zigzag_order(order);
  jvirt_barray_ptr* arrays = jpeg_read_coefficients(d);
  for (int ci = 0; ci < d->num_components; ++ci) {
    const jpeg_component_info& comp = d->comp_info[ci];
    const int rows = round_up(static_cast<int>(comp.height_in_blocks), comp.v_samp_factor);
    const int cols = round_up(static_cast<int>(comp.width_in_blocks), comp.h_samp_factor);
    for (int row = 0; row < rows; ++row) {
      JBLOCKARRAY blocks = d->mem->access_virt_barray(reinterpret_cast<j_common_ptr>(d), arrays[ci],
                                                      static_cast<JDIMENSION>(row), 1, TRUE);
      for (int col = 0; col < cols; ++col)
        for (int k = keep + 1; k < 64; ++k) blocks[0][col][order[k]] = 0;
    }
  }
  jpeg_create_compress(c);
  jpeg_copy_critical_parameters(d, c);
  static jpeg_scan_info scans[4];
  if (one_scan_per_component) {
    for (int ci = 0; ci < d->num_components && ci < 4; ++ci) {
      scans[ci].comps_in_scan = 1;
      scans[ci].component_index[0] = ci;
      scans[ci].Ss = 0;
      scans[ci].Se = 63;
      scans[ci].Ah = 0;
      scans[ci].Al = 0;
    }
    c->scan_info = scans;
    c->num_scans = d->num_components;
  }
  jpeg_mem_dest(c, mem, size);
  jpeg_write_coefficients(c, arrays);
  jpeg_finish_compress(c);
}

bool run(const std::vector<uint8_t>& jpeg, const Request& req) {
  jpeg_compress_struct c;
  std::memset(&c, 0, sizeof c);
  unsigned char* mem = nullptr;
  unsigned long mem_size = 0;
  jpeg_decompress_struct d;
  ErrorManager err;
  std::memset(&d, 0, sizeof d);
  d.err = jpeg_std_error(&err.pub);
  err.pub.error_exit = error_exit;
  err.pub.emit_message = emit_message;
  err.pub.output_message = output_message;
  c.err = &err.pub;
  if (setjmp(err.jump) != 0) {
    jpeg_destroy_decompress(&d);
    jpeg_destroy_compress(&c);
    std::free(mem);
    return false;
  }
  jpeg_create_decompress(&d);
  const size_t start = stream_start(jpeg);
  jpeg_mem_src(&d, jpeg.data() + start, static_cast<unsigned long>(jpeg.size() - start));
  jpeg_read_header(&d, TRUE);
  switch (req.job) {
    case Job::kHeader:
      fill_header(d, req.header);
      break;
    case Job::kCoefficients:
      read_coefficients(&d, req.components);
      break;
    case Job::kPlanes:
      read_planes(&d, req.scale_denom, req.out_color_space, req.planes);
      break;
    case Job::kTruncate:
      truncate_coefficients(&d, &c, req.keep, req.one_scan_per_component, &mem, &mem_size);
      req.transcoded->assign(mem, mem + mem_size);
      break;
  }
  jpeg_destroy_decompress(&d);
  jpeg_destroy_compress(&c);
  std::free(mem);
  return true;
}

}  // namespace

bool oracle_header(const std::vector<uint8_t>& jpeg, OracleHeader* out) {
  Request req{Job::kHeader};
  req.header = out;
  return run(jpeg, req);
}

bool oracle_coefficients(const std::vector<uint8_t>& jpeg, std::vector<OracleComponent>* out) {
  Request req{Job::kCoefficients};
  req.components = out;
  return run(jpeg, req);
}

bool oracle_planes(const std::vector<uint8_t>& jpeg, int scale_denom, OraclePlanes* out) {
  return oracle_planes_as(jpeg, scale_denom, -1, out);
}

bool oracle_planes_as(const std::vector<uint8_t>& jpeg, int scale_denom, int out_color_space, OraclePlanes* out) {
  Request req{Job::kPlanes};
  req.scale_denom = scale_denom;
  req.out_color_space = out_color_space;
  req.planes = out;
  return run(jpeg, req);
}

bool oracle_truncated_planes(const std::vector<uint8_t>& jpeg, int keep, int scale_denom,
                             OraclePlanes* out) {
  std::vector<uint8_t> transcoded;
  Request req{Job::kTruncate};
  req.keep = keep;
  req.transcoded = &transcoded;
  if (!run(jpeg, req)) return false;
  return oracle_planes(transcoded, scale_denom, out);
}

std::vector<std::string> fixtures_where(
    const std::function<bool(const std::string& name, const OracleHeader& header)>& keep) {
  std::vector<std::string> out;
  for (const auto& name : list_fixtures(".jpg")) {
    OracleHeader h;
    if (name.rfind("bad_", 0) == 0 || !oracle_header(read_fixture(name), &h)) continue;
    if (keep(name, h)) out.push_back(name);
  }
  return out;
}

bool oracle_sequential_scans(const std::vector<uint8_t>& jpeg, std::vector<uint8_t>* out) {
  Request req{Job::kTruncate};
  req.one_scan_per_component = true;
  req.transcoded = out;
  return run(jpeg, req);
}

}  // namespace vjtest

#endif  // VETAJ_HAVE_LIBJPEG
