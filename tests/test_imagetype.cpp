// Image type detection: hand-built PNG, BMP, GIF and WBMP headers, and JPEG
// streams inside TIFF containers identified and decoded through every input
// kind.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "VetaJpegDecoder.h"
#include "io/stream.h"
#include "support/files.h"
#include "support/manifest.h"
#include "support/segments.h"

namespace {

using vjtest::Bytes;
using vjtest::InputHolder;
using vjtest::InputKind;

const InputKind kAllKinds[] = {InputKind::kPath, InputKind::kHandle, InputKind::kMemory,
                               InputKind::kOwnedMemory, InputKind::kStream};

void le16(Bytes* b, uint32_t v) {
  b->push_back(uint8_t(v));
  b->push_back(uint8_t(v >> 8));
}
void le32(Bytes* b, uint32_t v) {
  le16(b, v & 0xFFFF);
  le16(b, v >> 16);
}
Bytes cat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& p : parts) out.insert(out.end(), p.begin(), p.end());
  return out;
}

// Result of identifying a memory input with KOLVAVETA_Parser.
struct Parsed {
  int32_t type = -1;
  int32_t error = -1;
  JpegInfo info{};
  int32_t width = 0, height = 0, duration = 0;
  uint32_t jpeg_offset = 0;
};

Parsed parse(const Bytes& data, InputKind kind = InputKind::kMemory) {
  Parsed p;
  InputHolder in(kind, data);
  DecInfo* o = in.object();
  if (o == nullptr) return p;
  p.type = KOLVAVETA_Parser(o, &p.info);
  p.error = gKOLVAVETA_Error;
  p.width = o->image_width;
  p.height = o->image_height;
  p.duration = o->gif_duration;
  p.jpeg_offset = o->jpeg_offset;
  EXPECT_EQ(o->image_type, p.type);
  EXPECT_EQ(p.info.width, p.width);
  EXPECT_EQ(p.info.height, p.height);
  EXPECT_EQ(p.info.input_size, data.size());
  return p;
}

// ------------------------------------------------------------ signatures

struct SignatureCase {
  const char* name;
  Bytes head;
  int32_t type;
};

class Signature : public ::testing::TestWithParam<SignatureCase> {};

TEST_P(Signature, FirstEightBytesDecide) {
  const SignatureCase& c = GetParam();
  InputHolder in(InputKind::kMemory, c.head);
  ASSERT_NE(in.object(), nullptr);
  EXPECT_EQ(KOLVAVETA_GetImageType(in.object()), c.type);
  EXPECT_EQ(in.object()->image_type, c.type);
  EXPECT_EQ(gKOLVAVETA_Error, 0);
}

INSTANTIATE_TEST_SUITE_P(
    ImageType, Signature,
    ::testing::Values(
        SignatureCase{"gif", {'G', 'I', 'F', '8', '9', 'a', 0, 0}, 4},
        SignatureCase{"png", {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A}, 3},
        SignatureCase{"png_bad_tail", {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0B}, 0},
        SignatureCase{"jpeg", {0xFF, 0xD8, 0xFF, 0xE0, 0, 0, 0, 0}, 1},
        SignatureCase{"bmp", {'B', 'M', 0, 0, 0, 0, 0, 0}, 2},
        SignatureCase{"bmp_by_b0", {'B', 'A', 0, 0, 0, 0, 0, 0}, 2},
        SignatureCase{"bmp_by_b1", {'x', 'M', 0, 0, 0, 0, 0, 0}, 2},
        SignatureCase{"wbmp", {0, 0, 0x81, 0, 0x10, 0, 0, 0}, 5},
        SignatureCase{"wbmp_b1_high", {0, 0x80, 0, 0, 0, 0, 0, 0}, 0},
        // TIFF is not recognised by the signature alone.
        SignatureCase{"tiff_mm", {'M', 'M', 0, 42, 0, 0, 0, 8}, 2},
        SignatureCase{"tiff_ii", {'I', 'I', 42, 0, 8, 0, 0, 0}, 0},
        SignatureCase{"other", {'R', 'I', 'F', 'F', 0, 0, 0, 0}, 0}),
    [](const auto& p) { return std::string(p.param.name); });

TEST(ImageType, ShortInputsAndNullObjects) {
  const Bytes seven = {0xFF, 0xD8, 0xFF, 0xE0, 0, 0, 0};
  InputHolder in(InputKind::kMemory, seven);
  EXPECT_EQ(KOLVAVETA_GetImageType(in.object()), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NOT_IMAGE);
  JpegInfo info;
  EXPECT_EQ(KOLVAVETA_Parser(in.object(), &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NOT_IMAGE);

  EXPECT_EQ(KOLVAVETA_GetImageType(nullptr), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NULL_OBJECT);
  EXPECT_EQ(KOLVAVETA_Parser(nullptr, &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NULL_OBJECT);
  EXPECT_EQ(KOLVAVETA_SimpleParserGIF(nullptr, &info, 0), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NULL_OBJECT);
  uint32_t offset = 7, length = 7;
  EXPECT_EQ(KOLVAVETA_GetJpegOffset(nullptr, &offset, &length), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NULL_OBJECT);
  EXPECT_EQ(offset, 0u);
  EXPECT_EQ(length, 0u);
}

// ------------------------------------------------------------------ PNG

Bytes png(uint32_t width, uint32_t height, uint8_t interlace) {
  Bytes b = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A, 0, 0, 0, 13, 'I', 'H', 'D', 'R'};
  vjtest::put32(&b, width);
  vjtest::put32(&b, height);
  b.insert(b.end(), {8, 2, 0, 0, interlace});
  return b;
}

TEST(ImageType, PngSizeAndInterlace) {
  const Parsed p = parse(png(70000, 3, 1));
  EXPECT_EQ(p.type, KOLVAVETA_IMAGE_PNG);
  EXPECT_EQ(p.width, 70000);
  EXPECT_EQ(p.height, 3);
  EXPECT_EQ(p.info.image_count, 1);
  EXPECT_EQ(p.info.progressive, 1);

  // The JPEG header reader refuses the same file.
  const Bytes file = png(20, 10, 0);
  InputHolder in(InputKind::kMemory, file);
  JpegInfo info;
  EXPECT_EQ(KOLVAVETA_JpgParser(in.object(), &info), 0);
  EXPECT_EQ(gKOLVAVETA_Error, KOLVAVETA_ERR_NOT_IMAGE);

  Bytes cut = png(20, 10, 0);
  cut.pop_back();
  const Parsed q = parse(cut);
  EXPECT_EQ(q.type, 0);
  EXPECT_EQ(q.error, KOLVAVETA_ERR_NOT_IMAGE);
  EXPECT_EQ(parse(png(0x80000000u, 1, 0)).type, 0);
}

// ------------------------------------------------------------------ BMP

Bytes bmp(uint8_t header_size, uint32_t width, uint32_t height, bool os2 = false) {
  Bytes b = {'B', 'M'};
  le32(&b, 1000);
  le32(&b, 0);
  le32(&b, 14 + header_size);
  le32(&b, header_size);
  if (os2) {
    le16(&b, width);
    le16(&b, height);
    le32(&b, 0x00180001);
  } else {
    le32(&b, width);
    le32(&b, height);
  }
  b.resize(64, 0);
  return b;
}

struct BmpCase {
  const char* name;
  Bytes file;
  int32_t type, width, height;
};
class Bmp : public ::testing::TestWithParam<BmpCase> {};

TEST_P(Bmp, HeaderSizeDecidesTheLayout) {
  const BmpCase& c = GetParam();
  const Parsed p = parse(c.file);
  EXPECT_EQ(p.type, c.type);
  EXPECT_EQ(p.width, c.width);
  EXPECT_EQ(p.height, c.height);
  EXPECT_EQ(p.info.image_count, c.type == 0 ? 0 : 1);
}

INSTANTIATE_TEST_SUITE_P(
    ImageType, Bmp,
    ::testing::Values(BmpCase{"info40_top_down", bmp(40, 300, uint32_t(-200)), 2, 300, 200},
                      BmpCase{"info40_negative_width", bmp(40, uint32_t(-5), 6), 2, 5, 6},
                      BmpCase{"core12", bmp(12, 0x1234, 0x0567, true), 2, 0x1234, 0x567},
                      BmpCase{"v3_56", bmp(56, 7, 8), 2, 7, 8},
                      BmpCase{"v4_64", bmp(64, 7, 8), 2, 7, 8},
                      BmpCase{"v4_108", bmp(108, 7, 8), 0, 0, 0},
                      BmpCase{"v5_124", bmp(124, 7, 8), 0, 0, 0},
                      BmpCase{"most_negative", bmp(40, 7, 0x80000000u), 0, 0, 0}),
    [](const auto& p) { return std::string(p.param.name); });

TEST(ImageType, TruncatedBmpIsUnreadable) {
  Bytes b = bmp(40, 10, 10);
  b.resize(25);
  const Parsed p = parse(b);
  EXPECT_EQ(p.type, 0);
  EXPECT_EQ(p.error, KOLVAVETA_ERR_NOT_IMAGE);
}

// ------------------------------------------------------------------ GIF

// A GIF built block by block.
class Gif {
 public:
  Gif(uint32_t width, uint32_t height, uint8_t flags = 0) {
    bytes_ = {'G', 'I', 'F', '8', '9', 'a'};
    le16(&bytes_, width);
    le16(&bytes_, height);
    bytes_.insert(bytes_.end(), {flags, 0, 0});
    if (flags & 0x80) bytes_.resize(bytes_.size() + (3u << ((flags & 7) + 1)), 0x11);
  }
  Gif& raw(const Bytes& b) {
    bytes_.insert(bytes_.end(), b.begin(), b.end());
    return *this;
  }
  Gif& delay(uint32_t hundredths) {
    raw({0x21, 0xF9, 4, 0});
    le16(&bytes_, hundredths);
    return raw({0, 0});
  }
  // An image descriptor and `data_blocks` sub-blocks of `block_size` bytes.
  Gif& image(uint8_t flags = 0, uint32_t data_blocks = 2, uint8_t block_size = 10) {
    raw({0x2C, 0, 0, 0, 0, 1, 0, 1, 0, flags});
    if (flags & 0x80) bytes_.resize(bytes_.size() + (3u << ((flags & 7) + 1)), 0x22);
    bytes_.push_back(2);  // LZW minimum code size
    for (uint32_t i = 0; i < data_blocks; ++i) {
      bytes_.push_back(block_size);
      bytes_.resize(bytes_.size() + block_size, 0x2C);  // data bytes that look like blocks
    }
    bytes_.push_back(0);
    return *this;
  }
  Gif& trailer() { return raw({0x3B}); }
  const Bytes& bytes() const { return bytes_; }

 private:
  Bytes bytes_;
};

struct GifCase {
  const char* name;
  Bytes file;
  int32_t type, images;
};
class GifBlocks : public ::testing::TestWithParam<GifCase> {};

TEST_P(GifBlocks, CountsImagesAndStopsAtTheTrailerOrTheEnd) {
  const GifCase& c = GetParam();
  for (InputKind kind : {InputKind::kMemory, InputKind::kPath, InputKind::kStream}) {
    SCOPED_TRACE(vjtest::input_kind_name(kind));
    const Parsed p = parse(c.file, kind);
    EXPECT_EQ(p.type, c.type);
    EXPECT_EQ(p.info.image_count, c.images);
    if (c.type != 0) {
      EXPECT_EQ(p.width, 320);
      EXPECT_EQ(p.height, 200);
    }
  }
}

Bytes with_comment(uint32_t blocks) {
  Bytes b = {0x21, 0xFE};
  for (uint32_t i = 0; i < blocks; ++i) {
    b.push_back(255);
    b.resize(b.size() + 255, 0x3B);  // comment bytes that look like a trailer
  }
  b.push_back(0);
  return b;
}

INSTANTIATE_TEST_SUITE_P(
    ImageType, GifBlocks,
    ::testing::Values(
        GifCase{"three_images", Gif(320, 200, 0x87).image().image(0x81).image().trailer().bytes(),
                6, 3},
        GifCase{"one_image", Gif(320, 200).image().trailer().bytes(), 4, 1},
        GifCase{"no_image", Gif(320, 200).trailer().bytes(), 0, 0},
        GifCase{"extensions_skipped",
                Gif(320, 200)
                    .raw(with_comment(3))
                    .raw({0x21, 0xFF, 11, 'N', 'E', 'T', 'S', 'C', 'A', 'P', 'E', '2', '.', '0',
                          3, 1, 0, 0, 0})
                    .raw({0x21, 0x01, 12, 0x2C, 0x2C, 0x2C, 0x2C, 0x2C, 0x2C, 0x2C, 0x2C, 0x2C,
                          0x2C, 0x2C, 0x2C, 0})
                    .image()
                    .trailer()
                    .bytes(),
                4, 1},
        // An unknown label: only the label is consumed, so the image separator
        // after it is not taken for a sub-block length.
        GifCase{"unknown_extension", Gif(320, 200).raw({0x21, 0x77}).image().trailer().bytes(),
                4, 1},
        GifCase{"stray_bytes", Gif(320, 200).raw({0, 1, 2, 0xAB}).image().raw({0x00}).trailer()
                .bytes(), 4, 1},
        // Without a trailer the result stands when the whole input was read.
        GifCase{"no_trailer", Gif(320, 200).image().image().bytes(), 6, 2},
        GifCase{"cut_in_data", [] {
                  Bytes b = Gif(320, 200).image().image(0, 3, 200).bytes();
                  b.resize(b.size() - 150);
                  return b;
                }(), 0, 2},
        GifCase{"cut_between_blocks", [] {
                  Bytes b = Gif(320, 200).image().image(0, 3, 200).bytes();
                  b.resize(b.size() - 1 - 201);
                  return b;
                }(), 6, 2},
        GifCase{"cut_in_descriptor", [] {
                  Bytes b = Gif(320, 200).image().image().bytes();
                  const size_t second = b.size() - 1 - 2 * 11 - 1 - 10;
                  b.resize(second + 5);
                  return b;
                }(), 4, 1},
        // Tables and sub-blocks that claim more than the input holds.
        GifCase{"global_table_past_end", [] {
                  Bytes b = Gif(320, 200, 0x87).bytes();
                  b.resize(13 + 700);
                  return b;
                }(), 0, 0},
        GifCase{"local_table_past_end", [] {
                  Bytes b = Gif(320, 200).image().bytes();
                  b.insert(b.end(), {0x2C, 0, 0, 0, 0, 1, 0, 1, 0, 0x87, 1, 2, 3});
                  return b;
                }(), 0, 1},
        GifCase{"graphic_control_size_5", Gif(320, 200).image().raw({0x21, 0xF9, 5, 0, 0, 0, 0,
                0, 0}).trailer().bytes(), 0, 1}),
    [](const auto& p) { return std::string(p.param.name); });

TEST(ImageType, GifSizeLimits) {
  for (auto [w, h, type] : {std::tuple{6000, 10, 0}, std::tuple{10, 5001, 0},
                            std::tuple{5000, 5000, 4}, std::tuple{0, 10, 0}}) {
    const Parsed p = parse(Gif(w, h).image().trailer().bytes());
    EXPECT_EQ(p.type, type) << w << "x" << h;
  }
  Bytes cut = Gif(10, 10).bytes();
  cut.resize(12);
  const Parsed p = parse(cut);
  EXPECT_EQ(p.type, 0);
  EXPECT_EQ(p.error, KOLVAVETA_ERR_NOT_IMAGE);
}

TEST(ImageType, GifDurationHonoursTheMinimumDelay) {
  const Bytes file = Gif(320, 200).delay(5).image().delay(50).image().trailer().bytes();
  for (InputKind kind : kAllKinds) {
    SCOPED_TRACE(vjtest::input_kind_name(kind));
    InputHolder in(kind, file);
    JpegInfo info;
    for (int repeat = 0; repeat < 2; ++repeat) {  // a repeated summary gives the same total
      EXPECT_EQ(KOLVAVETA_SimpleParserGIF(in.object(), &info, 100), KOLVAVETA_IMAGE_GIF_ANIMATED);
      EXPECT_EQ(in.object()->gif_duration, 600);
      EXPECT_EQ(info.width, 320);
      EXPECT_EQ(info.height, 200);
      EXPECT_EQ(info.input_size, file.size());
      EXPECT_EQ(info.image_count, 2);
    }
    // The identification reads the delays as they are.
    EXPECT_EQ(KOLVAVETA_Parser(in.object(), &info), KOLVAVETA_IMAGE_GIF_ANIMATED);
    EXPECT_EQ(in.object()->gif_duration, 550);
  }
  // The GIF summary refuses other files.
  const Bytes other = bmp(40, 320, 200);
  InputHolder in(InputKind::kMemory, other);
  JpegInfo info;
  EXPECT_EQ(KOLVAVETA_SimpleParserGIF(in.object(), &info, 0), 0);
  EXPECT_EQ(in.object()->image_type, 0);
}

// Inputs far larger than a window: every byte is read once, so these end.
TEST(ImageType, GifHugeBlockChainsEnd) {
  Gif many(320, 200);
  many.image(0, 40000, 255);  // one image of 10 MB in 255-byte sub-blocks
  for (int i = 0; i < 100000; ++i) many.raw({0x21, 0x99});  // unknown extensions
  many.raw(with_comment(4000)).image().trailer();
  for (InputKind kind : {InputKind::kMemory, InputKind::kPath, InputKind::kStream}) {
    SCOPED_TRACE(vjtest::input_kind_name(kind));
    const Parsed p = parse(many.bytes(), kind);
    EXPECT_EQ(p.type, KOLVAVETA_IMAGE_GIF_ANIMATED);
    EXPECT_EQ(p.info.image_count, 2);
  }
}

// Every truncation of a GIF with tables and extensions gives a result.
TEST(ImageType, GifTruncationsNeverReadOutside) {
  const Bytes full = Gif(320, 200, 0x82).delay(7).image(0x81, 3, 40).raw(with_comment(1))
                         .image().trailer().bytes();
  for (size_t n = 1; n <= full.size(); ++n) {
    const Parsed p = parse(Bytes(full.begin(), full.begin() + n));
    EXPECT_TRUE(p.type == 0 || p.type == 4 || p.type == 6) << n;
  }
}

// ------------------------------------------------------------------ WBMP

struct WbmpCase {
  const char* name;
  Bytes file;
  int32_t type, width, height, error;
};
class Wbmp : public ::testing::TestWithParam<WbmpCase> {};

TEST_P(Wbmp, MultiByteIntegers) {
  const WbmpCase& c = GetParam();
  Bytes file = c.file;
  const Parsed p = parse(file);
  EXPECT_EQ(p.type, c.type);
  EXPECT_EQ(p.error, c.error);
  EXPECT_EQ(p.width, c.width);
  EXPECT_EQ(p.height, c.height);
  EXPECT_EQ(p.info.image_count, 1);
}

Bytes wbmp(Bytes integers, size_t pad_to = 40) {
  Bytes b = {0, 0};
  b.insert(b.end(), integers.begin(), integers.end());
  if (b.size() < pad_to) b.resize(pad_to, 0xFF);
  return b;
}

INSTANTIATE_TEST_SUITE_P(
    ImageType, Wbmp,
    ::testing::Values(
        WbmpCase{"two_byte_width", wbmp({0x81, 0x00, 0x20}), 5, 128, 32, 0},
        WbmpCase{"three_byte_height", wbmp({0x05, 0x80, 0x80, 0x07}), 5, 5, 7, 0},
        WbmpCase{"limit", wbmp({0xA7, 0x08, 0xA7, 0x08}), 5, 5000, 5000, 0},
        WbmpCase{"too_wide", wbmp({0xA7, 0x09, 0x01}), 0, 0, 0, 0},
        // An integer that never ends: refused at offset 20 even with more input.
        WbmpCase{"endless", wbmp(Bytes(30, 0x80)), 0, 0, 0, 0},
        WbmpCase{"endless_height", wbmp(cat({{0x01}, Bytes(30, 0x81)})), 0, 0, 0, 0},
        // The same integer cut by the end of the input is unreadable.
        WbmpCase{"input_ends", wbmp(Bytes(10, 0x80), 0), 0, 0, 0, KOLVAVETA_ERR_NOT_IMAGE},
        WbmpCase{"huge_value_saturates",
                 wbmp({0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0x7F, 1}), 0, 0,
                 0, 0}),
    [](const auto& p) { return std::string(p.param.name); });

TEST(ImageType, WbmpReaderNeedsFourBytes) {
  const Bytes three = {0, 0, 1};
  InputHolder in(InputKind::kMemory, three);
  StreamWindow w;
  ASSERT_TRUE(vj::window_open(&w, in.object()->stream));
  EXPECT_EQ(__VETA_ParserWBMP(in.object(), &w), 0);
  vj::window_close(&w);
}

// ------------------------------------------------------------------ TIFF

struct TiffFixture {
  std::string name;
  uint32_t jpeg_offset, jpeg_length;
};

std::vector<TiffFixture> tiff_fixtures() {
  std::vector<TiffFixture> out;
  for (const std::string& n : vjtest::list_fixtures(".tif")) {
    const vjtest::ManifestEntry* e = vjtest::manifest_entry(n);
    if (e == nullptr) continue;
    out.push_back({n, uint32_t(e->number("jpeg_offset")), uint32_t(e->number("jpeg_length"))});
  }
  return out;
}

Bytes embedded_stream(const TiffFixture& f) {
  const Bytes file = vjtest::read_fixture(f.name);
  return Bytes(file.begin() + f.jpeg_offset, file.begin() + f.jpeg_offset + f.jpeg_length);
}

// Decodes the object's input into RGBA; empty on failure.
Bytes decode(DecInfo* o, int32_t width, int32_t height) {
  Bytes out(size_t(width) * height * 4, 0xAA);
  if (KOLVAVETA_DecodeJPEG(o, out.data(), width, height) != 1) return {};
  return out;
}

Bytes decode_bytes(const Bytes& data, InputKind kind, int32_t width, int32_t height,
                   uint32_t options = KOLVAVETA_OPT_THUMB_NEVER) {
  InputHolder in(kind, data);
  if (in.object() == nullptr) return {};
  KOLVAVETA_SetDecOption(in.object(), options);
  JpegInfo info;
  if (KOLVAVETA_Parser(in.object(), &info) != KOLVAVETA_IMAGE_JPEG) return {};
  return decode(in.object(), width, height);
}

class TiffContainer
    : public ::testing::TestWithParam<std::tuple<TiffFixture, InputKind>> {};

TEST_P(TiffContainer, IdentifiedMeasuredAndDecodedFromItsOffset) {
  const auto& [f, kind] = GetParam();
  const Bytes file = vjtest::read_fixture(f.name);
  ASSERT_FALSE(file.empty());
  ASSERT_GT(f.jpeg_offset, 0u);
  InputHolder in(kind, file);
  DecInfo* o = in.object();
  ASSERT_NE(o, nullptr);

  // The signature test alone does not see the JPEG stream.
  EXPECT_EQ(KOLVAVETA_GetImageType(o), file[0] == 'M' ? KOLVAVETA_IMAGE_BMP : 0);

  JpegInfo info;
  ASSERT_EQ(KOLVAVETA_Parser(o, &info), KOLVAVETA_IMAGE_JPEG);
  EXPECT_EQ(o->jpeg_offset, f.jpeg_offset);
  EXPECT_EQ(info.jpeg_offset, f.jpeg_offset);
  EXPECT_EQ(info.width, 64);
  EXPECT_EQ(info.height, 48);
  EXPECT_EQ(info.image_count, 1);
  EXPECT_EQ(info.max_h_samp, 2);
  EXPECT_EQ(info.input_size, file.size());

  uint32_t offset = 0, length = 0;
  EXPECT_EQ(KOLVAVETA_GetJpegOffset(o, &offset, &length), 1);
  EXPECT_EQ(offset, f.jpeg_offset);
  EXPECT_EQ(length, f.jpeg_length);

  // Decoding starts at the recorded offset and gives the pixels of the
  // stream decoded on its own.
  const Bytes alone = decode_bytes(embedded_stream(f), InputKind::kMemory, 64, 48);
  ASSERT_FALSE(alone.empty());
  EXPECT_EQ(decode(o, 64, 48), alone);
  EXPECT_EQ(decode(o, 64, 48), alone) << "a second decode of the same object";
  EXPECT_EQ(o->jpeg_offset, f.jpeg_offset);
}

INSTANTIATE_TEST_SUITE_P(
    Fixtures, TiffContainer,
    ::testing::Combine(::testing::ValuesIn(tiff_fixtures()), ::testing::ValuesIn(kAllKinds)),
    [](const auto& p) {
      return vjtest::fixture_test_name(std::get<0>(p.param).name) + "_" +
             vjtest::input_kind_name(std::get<1>(p.param));
    });

TEST(ImageType, EmbeddedStreamMeasuredToItsEnd) {
  for (const TiffFixture& f : tiff_fixtures()) {
    SCOPED_TRACE(f.name);
    const Bytes file = vjtest::read_fixture(f.name);
    InputHolder in(InputKind::kMemory, file);
    for (auto parser : {VETA_Parse, VETA_ParseJPEGOffset}) {
      StreamWindow w;
      ASSERT_TRUE(vj::window_open(&w, in.object()->stream));
      ASSERT_TRUE(vj::window_seek(&w, 0));
      JpegInfo info{};
      EXPECT_EQ(parser(in.object(), &w, &info), KOLVAVETA_IMAGE_JPEG);
      EXPECT_EQ(in.object()->image_width, 64);
      EXPECT_EQ(in.object()->image_height, 48);
      vj::window_close(&w);
    }
  }
}

// A little- or big-endian TIFF holding `jpeg` after `pad` bytes, named by
// tags 513/514 in IFD0.
Bytes wrap_in_tiff(const Bytes& jpeg, bool le, uint32_t pad = 0) {
  Bytes b;
  auto u16 = [&](uint32_t v) { le ? le16(&b, v) : vjtest::put16(&b, v); };
  auto u32 = [&](uint32_t v) { le ? le32(&b, v) : vjtest::put32(&b, v); };
  b = le ? Bytes{'I', 'I'} : Bytes{'M', 'M'};
  u16(42);
  u32(8);
  const uint32_t at = 8 + 2 + 2 * 12 + 4 + pad;
  u16(2);
  u16(513), u16(4), u32(1), u32(at);
  u16(514), u16(4), u32(1), u32(uint32_t(jpeg.size()));
  u32(0);
  b.resize(at, 0);
  b.insert(b.end(), jpeg.begin(), jpeg.end());
  return b;
}

class WrappedJpeg : public ::testing::TestWithParam<InputKind> {};

// Thumbnail positions and the Exif block are found relative to the
// embedded stream: a wrapped file decodes as the plain file does.
TEST_P(WrappedJpeg, DecodesAsThePlainFile) {
  const InputKind kind = GetParam();
  struct Case {
    const char* file;
    uint32_t options;
    int32_t width, height;
  };
  for (const Case& c :
       {Case{"exif_thumb_ii_640x480.jpg", KOLVAVETA_OPT_THUMB_IF_LARGE, 160, 120},
        Case{"exif_thumb_ii_640x480.jpg", KOLVAVETA_OPT_THUMB_ALWAYS, 160, 120},
        Case{"exif_thumb_mm_320x240.jpg", KOLVAVETA_OPT_THUMB_IF_LARGE, 320, 240},
        Case{"exif_orient6_ii_48x32.jpg", KOLVAVETA_OPT_EXIF_ORIENT | 1, 32, 48},
        Case{"thumb_jfxx_jpeg_128x96.jpg", KOLVAVETA_OPT_THUMB_ALWAYS, 32, 24}}) {
    SCOPED_TRACE(c.file);
    const Bytes plain = vjtest::read_fixture(c.file);
    ASSERT_FALSE(plain.empty());
    const Bytes expected = decode_bytes(plain, InputKind::kMemory, c.width, c.height, c.options);
    ASSERT_FALSE(expected.empty());
    for (bool le : {true, false}) {
      const Bytes wrapped = wrap_in_tiff(plain, le, 20000);
      EXPECT_EQ(decode_bytes(wrapped, kind, c.width, c.height, c.options), expected);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(ImageType, WrappedJpeg, ::testing::ValuesIn(kAllKinds),
                         [](const auto& p) {
                           return std::string(vjtest::input_kind_name(p.param));
                         });

// A caller's stream without a rewind callback cannot reach the embedded
// stream by seeking: the decode refuses instead of reading from elsewhere
// (here a decoy JPEG stored before the real one).
TEST(ImageType, StreamThatCannotSeekBackIsRefused) {
  const Bytes decoy = vjtest::read_fixture("base_444_q90_64x48.jpg");
  const Bytes real = vjtest::read_fixture("base_420_q75_64x48.jpg");
  ASSERT_FALSE(decoy.empty());
  ASSERT_FALSE(real.empty());
  Bytes file = wrap_in_tiff(real, true, uint32_t(decoy.size()));
  const uint32_t real_at = uint32_t(file.size() - real.size());
  std::copy(decoy.begin(), decoy.end(), file.begin() + 38);
  for (bool identify_first : {false, true}) {
    vjtest::CallbackSource source;
    source.data = file;
    DecInfo* o = KOLVAVETA_CreateDecInfoWithStream(&source, uint32_t(file.size()),
                                                   vjtest::CallbackSource::read,
                                                   vjtest::CallbackSource::skip, nullptr, 7,
                                                   KOLVAVETA_OPT_THUMB_NEVER);
    ASSERT_NE(o, nullptr);
    if (identify_first) {
      JpegInfo info;
      EXPECT_EQ(KOLVAVETA_Parser(o, &info), 0);
      EXPECT_EQ(o->jpeg_offset, 0u);
    }
    o->jpeg_offset = real_at;
    EXPECT_TRUE(decode(o, 64, 48).empty());
    KOLVAVETA_DestroyDecInfo(o);
  }
  // With the callback it decodes the real stream.
  EXPECT_EQ(decode_bytes(file, InputKind::kStream, 64, 48),
            decode_bytes(real, InputKind::kMemory, 64, 48));
}

struct BadTiffCase {
  const char* name;
  Bytes file;
  int32_t error;
};
class BadTiff : public ::testing::TestWithParam<BadTiffCase> {};

TEST_P(BadTiff, GivesZeroAndNoOffset) {
  const BadTiffCase& c = GetParam();
  for (InputKind kind : kAllKinds) {
    SCOPED_TRACE(vjtest::input_kind_name(kind));
    const Parsed p = parse(c.file, kind);
    EXPECT_EQ(p.type, 0);
    EXPECT_EQ(p.error, c.error);
    EXPECT_EQ(p.jpeg_offset, 0u);
    InputHolder in(kind, c.file);
    uint32_t offset = 1, length = 1;
    EXPECT_EQ(KOLVAVETA_GetJpegOffset(in.object(), &offset, &length), 0);
    EXPECT_EQ(offset, 0u);
    EXPECT_EQ(length, 0u);
  }
}

Bytes patched(Bytes b, size_t at, std::initializer_list<uint8_t> bytes) {
  for (uint8_t v : bytes) b[at++] = v;
  return b;
}

Bytes small_wrapped(bool le) { return wrap_in_tiff(vjtest::small_baseline(16, 16), le); }

INSTANTIATE_TEST_SUITE_P(
    ImageType, BadTiff,
    ::testing::Values(
        BadTiffCase{"ifd_past_end", patched(small_wrapped(true), 4, {0xF0, 0xFF, 0xFF,
                    0x7F}), 0},
        BadTiffCase{"offset_past_end", patched(small_wrapped(true), 18, {0, 0, 0, 0x10}),
                    0},
        BadTiffCase{"offset_at_last_byte",
                    [] {
                      Bytes b = small_wrapped(false);
                      const uint32_t last = uint32_t(b.size() - 1);
                      return patched(b, 18, {uint8_t(last >> 24), uint8_t(last >> 16),
                                             uint8_t(last >> 8), uint8_t(last)});
                    }(),
                    0},
        BadTiffCase{"offset_not_at_soi", patched(small_wrapped(true), 18, {8}), 0},
        BadTiffCase{"no_jpeg_tag", patched(small_wrapped(true), 10, {0x11, 0x01}), 0},
        BadTiffCase{"entry_count_past_end", patched(small_wrapped(true), 8, {0xFF, 0xFF}),
                    0},
        BadTiffCase{"bad_magic", patched(small_wrapped(true), 2, {43}), 0},
        BadTiffCase{"header_only", Bytes{'I', 'I', 42, 0, 8, 0, 0, 0}, 0},
        // The stream is found but its header cannot be read.
        BadTiffCase{"embedded_cut", [] {
                      Bytes b = small_wrapped(true);
                      b.resize(38 + 20);
                      return b;
                    }(), KOLVAVETA_ERR_NOT_IMAGE}),
    [](const auto& p) { return std::string(p.param.name); });

// Every truncation and every single-byte change of the container part of a
// fixture gives a result without reading outside the input.
TEST(ImageType, DamagedContainersNeverReadOutside) {
  for (const TiffFixture& f : tiff_fixtures()) {
    SCOPED_TRACE(f.name);
    const Bytes file = vjtest::read_fixture(f.name);
    for (size_t n = 1; n < f.jpeg_offset + 40 && n < file.size(); ++n) {
      const Parsed p = parse(Bytes(file.begin(), file.begin() + n));
      EXPECT_EQ(p.type, 0) << n;
    }
    for (size_t at = 0; at < f.jpeg_offset; ++at) {
      for (uint8_t v : {0x00, 0x01, 0x80, 0xFF}) {
        Bytes b = file;
        b[at] = v;
        const Parsed p = parse(b);
        // A changed first byte may make it a BMP or WBMP signature.
        EXPECT_TRUE(p.type == 0 || p.type == 1 || (at < 2 && p.type != 3 && p.type != 4)) << at;
        if (p.type == 1) {
          EXPECT_EQ(b[p.jpeg_offset], 0xFF);
        }
      }
    }
  }
}

}  // namespace
