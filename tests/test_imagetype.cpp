// Image type detection: hand-built PNG, BMP, GIF and WBMP headers, and JPEG
// streams inside TIFF containers identified and decoded through every input
// kind.
#include <gtest/gtest.h>

#include <algorithm>
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
constexpr int32_t kNotImage = KOLVAVETA_ERR_NOT_IMAGE;

void le16(Bytes* b, uint32_t v) { b->insert(b->end(), {uint8_t(v), uint8_t(v >> 8)}); }
void le32(Bytes* b, uint32_t v) { le16(b, v & 0xFFFF), le16(b, v >> 16); }
Bytes cat(Bytes a, const Bytes& b) {
  a.insert(a.end(), b.begin(), b.end());
  return a;
}
Bytes cut(Bytes b, size_t n) {
  b.resize(n);
  return b;
}

// What KOLVAVETA_Parser reports for an input.
struct Parsed {
  int32_t type = -1, error = -1;
  JpegInfo info{};
  uint32_t jpeg_offset = 0;
};

Parsed parse(const Bytes& data, InputKind kind = InputKind::kMemory) {
  Parsed p;
  InputHolder in(kind, data);
  DecInfo* o = in.object();
  if (o == nullptr) return p;
  p.type = KOLVAVETA_Parser(o, &p.info);
  p.error = gKOLVAVETA_Error;
  p.jpeg_offset = o->jpeg_offset;
  return p;
}

// ------------------------------------------------------------ builders

Bytes png(uint32_t width, uint32_t height) {
  Bytes b = {0x89, 'P', 'N', 'G', 0x0D, 0x0A, 0x1A, 0x0A, 0, 0, 0, 13, 'I', 'H', 'D', 'R'};
  vjtest::put32(&b, width);
  vjtest::put32(&b, height);
  return cat(b, {8, 2, 0, 0, 0});
}

// A BMP whose bitmap header has `header_size` bytes; 12 is the 16-bit layout.
Bytes bmp(uint8_t header_size, uint32_t width, uint32_t height) {
  Bytes b = {'B', 'M'};
  for (uint32_t v : {1000u, 0u, 14u + header_size, uint32_t(header_size)}) le32(&b, v);
  for (uint32_t v : {width, height}) header_size == 12 ? le16(&b, v) : le32(&b, v);
  return cut(b, 64);
}

// A GIF built block by block.
struct Gif {
  Bytes b;
  Gif(uint32_t width, uint32_t height, uint8_t flags = 0) {
    b = {'G', 'I', 'F', '8', '9', 'a'};
    le16(&b, width), le16(&b, height);
    raw({flags, 0, 0}).table(flags);
  }
  Gif& raw(const Bytes& more) {
    b.insert(b.end(), more.begin(), more.end());
    return *this;
  }
  Gif& table(uint8_t flags) {
    if (flags & 0x80) b.resize(b.size() + (3u << ((flags & 7) + 1)), 0x11);
    return *this;
  }
  Gif& delay(uint8_t hundredths) { return raw({0x21, 0xF9, 4, 0, hundredths, 0, 0, 0}); }
  // An image descriptor and `blocks` sub-blocks of `size` bytes that look
  // like image separators.
  Gif& image(uint8_t flags = 0, uint32_t blocks = 2, uint8_t size = 10) {
    raw({0x2C, 0, 0, 0, 0, 1, 0, 1, 0, flags}).table(flags).raw({2});  // LZW code size
    for (uint32_t i = 0; i < blocks; ++i) raw(cat({size}, Bytes(size, 0x2C)));
    return raw({0});
  }
  Gif& comment(uint32_t blocks) {  // 255-byte sub-blocks of trailer bytes
    raw({0x21, 0xFE});
    for (uint32_t i = 0; i < blocks; ++i) raw(cat({255}, Bytes(255, 0x3B)));
    return raw({0});
  }
  Bytes trailer() { return raw({0x3B}).b; }
};

// A WBMP with the given integer bytes after the type and header bytes.
Bytes wbmp(const Bytes& integers, size_t pad_to = 40) {
  Bytes b = cat({0, 0}, integers);
  b.resize(std::max(b.size(), pad_to), 0xFF);
  return b;
}

// A little- or big-endian TIFF holding `jpeg` after `pad` bytes, named by
// tags 513/514 in IFD0 (the value of tag 513 is at byte 18).
Bytes wrap_in_tiff(const Bytes& jpeg, bool le, uint32_t pad = 0) {
  Bytes b = le ? Bytes{'I', 'I'} : Bytes{'M', 'M'};
  auto u16 = [&](uint32_t v) { le ? le16(&b, v) : vjtest::put16(&b, v); };
  auto u32 = [&](uint32_t v) { le ? le32(&b, v) : vjtest::put32(&b, v); };
  const uint32_t at = 8 + 2 + 2 * 12 + 4 + pad;
  u16(42), u32(8), u16(2);
  u16(513), u16(4), u32(1), u32(at);
  u16(514), u16(4), u32(1), u32(uint32_t(jpeg.size()));
  u32(0);
  return cat(cut(b, at), jpeg);
}

Bytes small_tiff(std::initializer_list<std::pair<size_t, uint8_t>> patches = {}) {
  Bytes b = wrap_in_tiff(vjtest::small_baseline(16, 16), true);
  for (auto [at, v] : patches) b[at] = v;
  return b;
}

// ------------------------------------------------------------ signatures

TEST(ImageType, FirstEightBytesDecideTheSignature) {
  const std::pair<Bytes, int32_t> cases[] = {
      {cat(cut(png(1, 1), 7), {0}), 0},
      {{'x', 'M', 0, 0, 0, 0, 0, 0}, 2},
      {{0, 0x7F, 0, 0, 0, 0, 0, 0}, 5},
      {{0, 0x80, 0, 0, 0, 0, 0, 0}, 0},
      // TIFF is not recognised by the signature alone.
      {{'M', 'M', 0, 42, 0, 0, 0, 8}, 2},
      {{'I', 'I', 42, 0, 8, 0, 0, 0}, 0}};
  for (const auto& [head, type] : cases) {
    InputHolder in(InputKind::kMemory, head);
    EXPECT_EQ(KOLVAVETA_GetImageType(in.object()), type) << int(head[0]) << "," << int(head[1]);
    EXPECT_EQ(gKOLVAVETA_Error, 0);
  }
  InputHolder short_input(InputKind::kMemory, {0xFF, 0xD8, 0xFF, 0xE0, 0, 0, 0});
  EXPECT_EQ(KOLVAVETA_GetImageType(short_input.object()), 0);
  EXPECT_EQ(gKOLVAVETA_Error, kNotImage);
}

// ------------------------------------------------------- identification

struct IdentifyCase {
  const char* name;
  Bytes file;
  int32_t type, width, height, images, error;
};
class Identify : public ::testing::TestWithParam<std::tuple<IdentifyCase, InputKind>> {};

TEST_P(Identify, TypeSizeAndImageCount) {
  const auto& [c, kind] = GetParam();
  const Parsed p = parse(c.file, kind);
  EXPECT_EQ(std::vector<int32_t>({p.type, p.info.width, p.info.height, p.info.image_count,
                                  p.error}),
            std::vector<int32_t>({c.type, c.width, c.height, c.images, c.error}));
  EXPECT_TRUE(p.type == KOLVAVETA_IMAGE_JPEG || p.jpeg_offset == 0);
}

// A GIF header, one image() and the start of a second image (whose
// sub-blocks of 200 bytes take 201 each).
constexpr size_t kTwo = 13 + 34 + 11;

const IdentifyCase kIdentifyCases[] = {
    {"png", png(70000, 3), 3, 70000, 3, 1, 0},
    {"png_beyond_int32", png(0x80000000u, 1), 0, 0, 0, 0, kNotImage},
    // BMP: the bitmap header size decides the layout; sizes are magnitudes.
    {"bmp40_top_down", bmp(40, 300, uint32_t(-200)), 2, 300, 200, 1, 0},
    {"bmp12", bmp(12, 0x1234, 0x0567), 2, 0x1234, 0x567, 1, 0},
    {"bmp124", bmp(124, 7, 8), 0, 0, 0, 0, 0},
    {"bmp_most_negative", bmp(40, 7, 0x80000000u), 0, 0, 0, 0, kNotImage},
    // GIF: images counted to the trailer, extensions and sub-blocks skipped.
    {"gif_three_images", Gif(320, 200, 0x87).image().image(0x81).image().trailer(), 6, 320, 200,
     3, 0},
    {"gif_extensions",
     Gif(320, 200)
         .comment(3)
         .raw({0x21, 0xFF, 11, 'N', 'E', 'T', 'S', 'C', 'A', 'P', 'E', '2', '.', '0', 3, 1, 0, 0})
         .raw(cat({0, 0x21, 0x01, 12}, cat(Bytes(12, 0x2C), {0})))
         .raw({0, 1, 0xAB})  // stray bytes
         .image()
         .trailer(),
     4, 320, 200, 1, 0},
    // Only the label of an unknown extension is read: the separator after it
    // is not taken for a sub-block length.
    {"gif_unknown_label", Gif(320, 200).raw({0x21, 0x77}).image().trailer(), 4, 320, 200, 1, 0},
    // Without a trailer the count stands when the whole input was read, and
    // when the input ends between blocks.
    {"gif_no_trailer", Gif(320, 200).image().image().b, 6, 320, 200, 2, 0},
    {"gif_cut_between_sub_blocks", cut(Gif(320, 200).image().image(0, 3, 200).b, kTwo + 402), 6,
     320, 200, 2, 0},
    // Tables and sub-blocks that claim more than the input holds.
    {"gif_cut_in_sub_block", cut(Gif(320, 200).image().image(0, 3, 200).b, kTwo + 452), 0, 320,
     200, 2, 0},
    {"gif_local_table_past_end",
     Gif(320, 200).image().raw({0x2C, 0, 0, 0, 0, 1, 0, 1, 0, 0x87, 1, 2, 3}).b, 0, 320, 200, 1,
     0},
    {"gif_6000x10", Gif(6000, 10).image().trailer(), 0, 0, 0, 0, 0},
    {"gif_5000x5000", Gif(5000, 5000).image().trailer(), 4, 5000, 5000, 1, 0},
    // WBMP: 7-bit groups, most significant first.
    {"wbmp_5000", wbmp({0xA7, 0x08, 0xA7, 0x08}), 5, 5000, 5000, 1, 0},
    {"wbmp_5001", wbmp({0xA7, 0x09, 0x01}), 0, 0, 0, 1, 0},
    {"wbmp_huge_saturates", wbmp(cat(Bytes(9, 0xFF), {0x7F, 1})), 0, 0, 0, 1, 0},
    // An integer that never ends is refused at offset 20; one cut by the end
    // of the input is unreadable.
    {"wbmp_endless_width", wbmp(Bytes(30, 0x80)), 0, 0, 0, 1, 0},
    {"wbmp_input_ends", wbmp(Bytes(10, 0x80), 0), 0, 0, 0, 1, kNotImage},
    // TIFF containers whose JPEG stream cannot be used.
    {"tiff_offset_past_end", small_tiff({{21, 0x10}}), 0, 0, 0, 0, 0},
    {"tiff_no_jpeg_tag", small_tiff({{10, 0x11}, {11, 0x01}}), 0, 0, 0, 0, 0},
    {"tiff_jpeg_cut", cut(small_tiff(), 38 + 20), 0, 0, 0, 0, kNotImage},
};

INSTANTIATE_TEST_SUITE_P(
    ImageType, Identify,
    ::testing::Combine(::testing::ValuesIn(kIdentifyCases),
                       ::testing::Values(InputKind::kMemory, InputKind::kPath, InputKind::kStream)),
    [](const auto& p) {
      return std::string(std::get<0>(p.param).name) + "_" +
             vjtest::input_kind_name(std::get<1>(p.param));
    });

TEST(ImageType, GifDurationHonoursTheMinimumDelay) {
  const Bytes file = Gif(320, 200).delay(5).image().delay(50).image().trailer();
  for (InputKind kind : {InputKind::kMemory, InputKind::kStream}) {
    SCOPED_TRACE(vjtest::input_kind_name(kind));
    InputHolder in(kind, file);
    JpegInfo info;
    for (int repeat = 0; repeat < 2; ++repeat) {  // a repeated summary gives the same total
      EXPECT_EQ(KOLVAVETA_SimpleParserGIF(in.object(), &info, 100), KOLVAVETA_IMAGE_GIF_ANIMATED);
      EXPECT_EQ(in.object()->gif_duration, 600);
      EXPECT_EQ(info.image_count, 2);
    }
    EXPECT_EQ(KOLVAVETA_Parser(in.object(), &info), KOLVAVETA_IMAGE_GIF_ANIMATED);
    EXPECT_EQ(in.object()->gif_duration, 550);  // no minimum
  }
}

// Inputs far larger than a window: every byte is read once, so these end.
TEST(ImageType, GifHugeBlockChainsEnd) {
  Gif many(320, 200);
  many.image(0, 40000, 255);  // one image of 10 MB in 255-byte sub-blocks
  for (int i = 0; i < 100000; ++i) many.raw({0x21, 0x99});  // unknown extensions
  const Bytes file = many.comment(4000).image().trailer();
  for (InputKind kind : {InputKind::kMemory, InputKind::kPath, InputKind::kStream}) {
    const Parsed p = parse(file, kind);
    EXPECT_EQ(p.type, KOLVAVETA_IMAGE_GIF_ANIMATED) << vjtest::input_kind_name(kind);
    EXPECT_EQ(p.info.image_count, 2);
  }
}

// Every truncation of a GIF with tables and extensions gives a result.
TEST(ImageType, GifTruncationsNeverReadOutside) {
  const Bytes full = Gif(320, 200, 0x82).delay(7).image(0x81, 3, 40).comment(1).image().trailer();
  for (size_t n = 1; n <= full.size(); ++n) {
    const int32_t type = parse(cut(full, n)).type;
    EXPECT_TRUE(type == 0 || type == 4 || type == 6) << n;
  }
}

// ------------------------------------------------------------------ TIFF

// Little and big endian, the stream named in IFD0 or in a SubIFD.
const char* const kTiffFixtures[] = {"tiff_le_jpeg_64x48.tif", "tiff_be_jpeg_64x48.tif",
                                     "tiff_subifd_le_jpeg_64x48.tif",
                                     "tiff_subifd_be_jpeg_64x48.tif"};

// The offset and length of the embedded stream, as the manifest records them.
std::pair<uint32_t, uint32_t> recorded_stream(const char* name) {
  const vjtest::ManifestEntry* e = vjtest::manifest_entry(name);
  if (e == nullptr) return {0, 0};
  return {uint32_t(e->number("jpeg_offset")), uint32_t(e->number("jpeg_length"))};
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

TEST(ImageType, TiffFixturesAreMeasuredAtTheirStreamThroughEveryKind) {
  for (const char* name : kTiffFixtures) {
    const auto recorded = recorded_stream(name);
    ASSERT_GT(recorded.first, 0u) << name;
    const Bytes file = vjtest::read_fixture(name);
    for (InputKind kind : kAllKinds) {
      SCOPED_TRACE(std::string(name) + " " + vjtest::input_kind_name(kind));
      InputHolder in(kind, file);
      JpegInfo info;
      ASSERT_EQ(KOLVAVETA_Parser(in.object(), &info), KOLVAVETA_IMAGE_JPEG);
      EXPECT_EQ(std::make_pair(info.width, info.height), std::make_pair(64, 48));
      uint32_t offset = 0, length = 0;
      EXPECT_EQ(KOLVAVETA_GetJpegOffset(in.object(), &offset, &length), 1);
      EXPECT_EQ(std::make_pair(offset, length), recorded);
    }
  }
}

// Thumbnail positions and the Exif block are found relative to the
// embedded stream: a wrapped file decodes as the plain file does.
TEST(ImageType, WrappedJpegDecodesAsThePlainFile) {
  struct Case {
    const char* file;
    uint32_t options;
    int32_t width, height;
  };
  for (const Case& c :
       {Case{"exif_thumb_ii_640x480.jpg", KOLVAVETA_OPT_THUMB_ALWAYS, 160, 120},
        Case{"exif_orient6_ii_48x32.jpg", KOLVAVETA_OPT_EXIF_ORIENT | 1, 32, 48}}) {
    const Bytes plain = vjtest::read_fixture(c.file);
    const Bytes expected = decode_bytes(plain, InputKind::kMemory, c.width, c.height, c.options);
    ASSERT_FALSE(expected.empty());
    for (bool le : {true, false}) {
      const Bytes wrapped = wrap_in_tiff(plain, le, 20000);
      for (InputKind kind : kAllKinds)
        EXPECT_EQ(decode_bytes(wrapped, kind, c.width, c.height, c.options), expected)
            << c.file << " " << vjtest::input_kind_name(kind);
    }
  }
}
// A caller's stream without a rewind callback cannot reach the embedded
// stream by seeking: the decode refuses instead of reading from elsewhere
// (here a decoy JPEG stored before the real one).
TEST(ImageType, StreamThatCannotSeekBackIsRefused) {
  const Bytes decoy = vjtest::read_fixture("base_444_q90_64x48.jpg");
  const Bytes real = vjtest::read_fixture("base_420_q75_64x48.jpg");
  Bytes file = wrap_in_tiff(real, true, uint32_t(decoy.size()));
  std::copy(decoy.begin(), decoy.end(), file.begin() + 38);
  for (bool identify_first : {false, true}) {
    vjtest::CallbackSource source;
    source.data = file;
    DecInfo* o = KOLVAVETA_CreateDecInfoWithStream(
        &source, uint32_t(file.size()), vjtest::CallbackSource::read,
        vjtest::CallbackSource::skip, nullptr, 7, KOLVAVETA_OPT_THUMB_NEVER);
    ASSERT_NE(o, nullptr);
    if (identify_first) {
      JpegInfo info;
      EXPECT_EQ(KOLVAVETA_Parser(o, &info), 0);
      EXPECT_EQ(o->jpeg_offset, 0u);
    }
    o->jpeg_offset = uint32_t(file.size() - real.size());
    EXPECT_TRUE(decode(o, 64, 48).empty());
    KOLVAVETA_DestroyDecInfo(o);
  }
  // With the callback it decodes the real stream.
  EXPECT_EQ(decode_bytes(file, InputKind::kStream, 64, 48),
            decode_bytes(real, InputKind::kMemory, 64, 48));
}

// Every truncation and every single-byte change of the container part of a
// fixture gives a result without reading outside the input.
TEST(ImageType, DamagedContainersNeverReadOutside) {
  for (const char* name : kTiffFixtures) {
    SCOPED_TRACE(name);
    const Bytes file = vjtest::read_fixture(name);
    const uint32_t offset = recorded_stream(name).first;
    for (size_t n = 1; n < offset + 40; ++n) EXPECT_EQ(parse(cut(file, n)).type, 0) << n;
    for (size_t at = 0; at < offset; ++at) {
      for (uint8_t v : {0x00, 0x01, 0x80, 0xFF}) {
        Bytes b = file;
        b[at] = v;
        const Parsed p = parse(b);
        // A changed first byte may make it a BMP or WBMP signature.
        EXPECT_TRUE(p.type == 0 || p.type == 1 || (at < 2 && p.type != 3 && p.type != 4)) << at;
        EXPECT_TRUE(p.type != 1 || b[p.jpeg_offset] == 0xFF) << at;
      }
    }
  }
}

}  // namespace
