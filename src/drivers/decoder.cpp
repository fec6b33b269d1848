// Life cycle of a DecoderInfo's owned memory.
#include "drivers/decoder.h"

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
  for (uint32_t i = 0; i < d->derived_count; ++i) vj::os_free(d->derived_tables[i]);
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
}
