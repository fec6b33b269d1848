#include "support/segments.h"

#include <cstring>

#include "support/files.h"

namespace vjtest {

void put16(Bytes* b, uint32_t v) {
  b->push_back(static_cast<uint8_t>(v >> 8));
  b->push_back(static_cast<uint8_t>(v));
}

void put32(Bytes* b, uint32_t v) {
  put16(b, v >> 16);
  put16(b, v & 0xFFFF);
}

JpegBuilder& JpegBuilder::raw(const Bytes& bytes) {
  bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
  return *this;
}

JpegBuilder& JpegBuilder::segment(uint8_t code, const Bytes& payload) {
  bytes_.push_back(0xFF);
  bytes_.push_back(code);
  put16(&bytes_, static_cast<uint32_t>(payload.size() + 2));
  return raw(payload);
}

JpegBuilder& JpegBuilder::sof(uint8_t code, uint32_t width, uint32_t height,
                              const std::vector<FrameComp>& comps, uint8_t precision) {
  Bytes p{precision};
  put16(&p, height);
  put16(&p, width);
  p.push_back(static_cast<uint8_t>(comps.size()));
  for (const FrameComp& c : comps) {
    p.push_back(c.id);
    p.push_back(static_cast<uint8_t>(c.h << 4 | c.v));
    p.push_back(c.tq);
  }
  return segment(code, p);
}

JpegBuilder& JpegBuilder::dqt(uint8_t number, uint8_t first) {
  Bytes p{number};
  for (int k = 0; k < 64; ++k) p.push_back(static_cast<uint8_t>(first + k));
  return segment(0xDB, p);
}

Bytes dht_table(uint8_t class_number, const Bytes& counts, const Bytes& symbols) {
  Bytes p;
  p.reserve(1 + counts.size() + symbols.size());
  p.push_back(class_number);
  for (uint8_t c : counts) p.push_back(c);
  for (uint8_t s : symbols) p.push_back(s);
  return p;
}

JpegBuilder& JpegBuilder::dht(uint8_t class_number, const Bytes& counts, const Bytes& symbols) {
  return segment(0xC4, dht_table(class_number, counts, symbols));
}

JpegBuilder& JpegBuilder::dri(uint32_t interval) {
  Bytes p;
  put16(&p, interval);
  return segment(0xDD, p);
}

JpegBuilder& JpegBuilder::sos(const std::vector<ScanComp>& comps, uint8_t ss, uint8_t se,
                              uint8_t ahal) {
  Bytes p{static_cast<uint8_t>(comps.size())};
  for (const ScanComp& c : comps) {
    p.push_back(c.id);
    p.push_back(c.tables);
  }
  p.push_back(ss);
  p.push_back(se);
  p.push_back(ahal);
  return segment(0xDA, p);
}

JpegBuilder& JpegBuilder::com(uint32_t payload_bytes, uint8_t fill) {
  return segment(0xFE, Bytes(payload_bytes, fill));
}

namespace {

const Bytes kCounts{0, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 1, 0, 0, 0, 0};
const Bytes kSymbols{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10};

JpegBuilder& tables(JpegBuilder& b) {
  b.dqt(0, 2).dqt(1, 3);
  Bytes p = dht_table(0x00, kCounts, kSymbols);
  for (uint8_t cls : {0x10, 0x01, 0x11}) {
    Bytes more = dht_table(cls, kCounts, kSymbols);
    p.insert(p.end(), more.begin(), more.end());
  }
  return b.segment(0xC4, p);
}

const Bytes kEntropy{0x12, 0x34, 0xFF, 0x00, 0x56, 0xFF, 0xD0, 0x78, 0x9A};

}  // namespace

Bytes small_baseline(uint32_t width, uint32_t height, uint8_t h, uint8_t v, uint32_t restart) {
  JpegBuilder b;
  b.soi();
  tables(b);
  b.sof(0xC0, width, height, {{1, h, v, 0}, {2, 1, 1, 1}, {3, 1, 1, 1}});
  if (restart != 0) b.dri(restart);
  b.sos({{1, 0x00}, {2, 0x11}, {3, 0x11}}).raw(kEntropy).eoi();
  return b.bytes();
}

Bytes small_progressive(uint32_t width, uint32_t height) {
  JpegBuilder b;
  b.soi();
  tables(b);
  b.sof(0xC2, width, height, {{1, 2, 2, 0}, {2, 1, 1, 1}, {3, 1, 1, 1}});
  b.sos({{1, 0x00}, {2, 0x10}, {3, 0x10}}, 0, 0, 0x01).raw(kEntropy);
  tables(b);
  b.sos({{1, 0x00}}, 1, 63, 0x00).raw(kEntropy).eoi();
  return b.bytes();
}

std::vector<size_t> cut_lengths(size_t size, size_t dense, size_t spread) {
  std::vector<size_t> out;
  for (size_t n = 1; n <= size && n <= dense; ++n) out.push_back(n);
  if (size > dense) {
    const size_t step = (size - dense) / spread + 1;
    for (size_t n = dense + step; n + 8 < size; n += step) out.push_back(n);
    for (size_t n = size > dense + 8 ? size - 8 : dense + 1; n <= size; ++n) out.push_back(n);
  }
  return out;
}

int32_t CallbackSource::read(void* self, void* buffer, uint32_t count) {
  auto* s = static_cast<CallbackSource*>(self);
  const size_t left = s->pos < s->data.size() ? s->data.size() - s->pos : 0;
  const uint32_t n = static_cast<uint32_t>(count < left ? count : left);
  if (n > 0) std::memcpy(buffer, s->data.data() + s->pos, n);
  s->pos += n;
  return static_cast<int32_t>(n);
}

int32_t CallbackSource::skip(void* self, void*, uint32_t count) {
  auto* s = static_cast<CallbackSource*>(self);
  s->pos += count;
  return static_cast<int32_t>(s->pos);
}

int32_t CallbackSource::rewind(void* self, void*, uint32_t) {
  static_cast<CallbackSource*>(self)->pos = 0;
  return 0;
}

const char* input_kind_name(InputKind kind) {
  static const char* const kNames[] = {"path", "handle", "memory", "owned_memory", "stream"};
  return kNames[static_cast<int>(kind)];
}

InputHolder::InputHolder(InputKind kind, const Bytes& bytes, int32_t output_format)
    : bytes_(bytes) {
  const uint32_t size = static_cast<uint32_t>(bytes_.size());
  switch (kind) {
    case InputKind::kPath:
      file_ = std::make_unique<TempFile>(bytes_);
      object_ = KOLVAVETA_CreateDecInfo(0, const_cast<char*>(file_->path().c_str()), 0,
                                        output_format, 0);
      break;
    case InputKind::kHandle:
      file_ = std::make_unique<TempFile>(bytes_);
      handle_ = std::fopen(file_->path().c_str(), "rb");
      object_ = KOLVAVETA_CreateDecInfo(2, handle_, size, output_format, 0);
      break;
    case InputKind::kMemory:
      object_ = KOLVAVETA_CreateDecInfo(1, bytes_.data(), size, output_format, 0);
      break;
    case InputKind::kOwnedMemory: {
      void* block = KOLVAVETA_OsMalloc(size);
      if (size > 0) std::memcpy(block, bytes_.data(), size);
      object_ = KOLVAVETA_CreateDecInfo(5, block, size, output_format, 0);
      if (object_ == nullptr) KOLVAVETA_OsFree(block);
      break;
    }
    case InputKind::kStream:
      source_.data = bytes_;
      object_ = KOLVAVETA_CreateDecInfoWithStream(&source_, size, CallbackSource::read,
                                                  CallbackSource::skip,
                                                  CallbackSource::rewind, output_format, 0);
      break;
  }
}

InputHolder::~InputHolder() {
  if (object_ != nullptr) {
    KOLVAVETA_DestroyJpegInfo(object_);
    KOLVAVETA_DestroyDecInfo(object_);
  }
  if (handle_ != nullptr) std::fclose(handle_);
}

}  // namespace vjtest
