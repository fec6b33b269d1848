// Life cycle of a DecoderInfo's owned memory.
#include "drivers/decoder.h"

#include "drivers/init.h"
#include "recon/colour.h"
#include "recon/upsample.h"

bool vj_register_derived_table(DecoderInfo* d, DerivedHuffTable* table) {
  if (d->derived_count == d->derived_capacity) {
    const uint32_t capacity = d->derived_capacity == 0 ? 32 : d->derived_capacity * 2;
    auto** grown = vj::alloc_zeroed<DerivedHuffTable*>(capacity);
    if (grown == nullptr) return false;
    for (uint32_t i = 0; i < d->derived_count; ++i) grown[i] = d->derived_tables[i];
    vj::os_free(d->derived_tables);
    d->derived_tables = grown;
    d->derived_capacity = capacity;
  }
  d->derived_tables[d->derived_count++] = table;
  return true;
}

void VETAJ_DeleteDecoderInfo(DecoderInfo* d) {
  if (d == nullptr) return;
  for (uint32_t i = 0; i < d->derived_count; ++i) vj_free_derived_table(d->derived_tables[i]);
  vj::os_free(d->derived_tables);
  d->derived_count = d->derived_capacity = 0;
  if (d->entropy != nullptr) {
    for (auto*& t : d->entropy->ac_skip) vj::os_free(t);
    for (auto*& t : d->entropy->ac_skip_copy) t = nullptr;
    vj::os_free(d->entropy);
  }
  for (uint32_t i = 0; i < d->huff_store_count && i < kMaxTableSpecs; ++i)
    vj::os_free(d->huff_store[i]);
  d->huff_store_count = 0;
  for (auto*& q : d->quant_tables) vj::os_free(q);
  if (d->components != nullptr) {
    for (uint32_t i = 0; i < d->num_components; ++i) vj::fake_free(d->components[i].multipliers);
    vj::os_free(d->components);
  }
  vj::fake_free(d->marker);
  vj_release_upsampler(d);
  for (uint32_t ci = 0; ci < 4; ++ci) {
    vj::free_sample_array(d->sample_rows[ci]);
    vj::fake_free(d->sample_list_alloc[ci]);
    d->sample_lists[ci][0] = d->sample_lists[ci][1] = nullptr;
  }
  if (d->converter != nullptr) {
    vj_release_converter(d);
    vj::os_free(d->converter);
  }
  vj::fake_free(d->range_limit_alloc);
  vj::fake_free(d->range_limit_chroma_alloc);
  d->range_limit = d->range_limit_chroma = nullptr;
  vj::fake_free(d->coef_area);
  vj::fake_free(d->prog_workspace);
  vj::os_free(d->dc_sums);
  for (uint32_t i = 0; i < d->scan_count && i < 30; ++i) vj::os_free(d->scans[i]);
  d->scan_count = 0;
}

void vj_setup_component_geometry(DecoderInfo* d) {
  const uint32_t W = d->image_width;
  const uint32_t H = d->image_height;
  const uint32_t mh = d->max_h_samp != 0 ? d->max_h_samp : 1;
  const uint32_t mv = d->max_v_samp != 0 ? d->max_v_samp : 1;
  const uint32_t n = d->scale_num != 0 ? d->scale_num : 1;
  const uint32_t r = d->scale_shift;
  for (uint32_t i = 0; i < d->num_components; ++i) {
    ComponentInfo* c = &d->components[i];
    c->width_blocks = (W * c->h_samp + 8 * mh - 1) / (8 * mh);
    c->height_blocks = (H * c->v_samp + 8 * mv - 1) / (8 * mv);
    c->width_samples = static_cast<uint16_t>((W * c->h_samp + mh - 1) / mh);
    c->height_samples = static_cast<uint16_t>((H * c->v_samp + mv - 1) / mv);
    c->output_width = static_cast<int32_t>((n * c->width_samples + (1u << r) - 1) >> r);
  }
  d->mcu_rows = (H + 8 * mv - 1) / (8 * mv);
}
