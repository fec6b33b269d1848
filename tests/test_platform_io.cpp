// Platform wrappers, input streams and the byte window.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <tuple>
#include <vector>

#include "io/stream.h"
#include "support/files.h"
#include "support/segments.h"

namespace {

using vjtest::CallbackSource;

TEST(Platform, FakeMallocAlignsAndKeepsTheRawAddressInside) {
  for (uint32_t size : {0u, 1u, 15u, 16u, 17u, 1000u}) {
    uint8_t* p = static_cast<uint8_t*>(VETA_FakeMalloc(nullptr, size));
    ASSERT_NE(p, nullptr);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(p) % 16, 0u);
    // The raw address sits just before the block, which lies inside the raw
    // allocation (size + 32, rounded).
    uint8_t* raw = static_cast<uint8_t*>(*(reinterpret_cast<void**>(p) - 1));
    EXPECT_GE(p - raw, static_cast<ptrdiff_t>(sizeof(void*)));
    EXPECT_LE(p + size, raw + ((size + 32 + 15) & ~15u));
    std::memset(p, 0xAB, size);
    VETA_FakeFree(p);
  }
  VETA_FakeFree(nullptr);
}

std::vector<uint8_t> bytes(size_t n) {
  std::vector<uint8_t> v(n);
  for (size_t i = 0; i < n; ++i) v[i] = static_cast<uint8_t>(i * 7 + 1);
  return v;
}

TEST(Stream, MemoryReadsAndSeeksStayWithinTheBlock) {
  auto data = bytes(100);
  IoStream* s = KOLVAVETA_Open_IO(1, data.data(), 100);
  ASSERT_NE(s, nullptr);
  uint8_t out[32];
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, 90, 0), 90);
  EXPECT_EQ(KOLVAVETA_Read_IO(s, out, 20), 10);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, 150, 0), 100);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, -1, 0), -1);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, -105, 1), 100);  // before the start: lands at the end
  // Window reads never copy: the pointer moves through the block.
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, 40, 0), 40);
  uint8_t* p = nullptr;
  EXPECT_EQ(KOLVAVETA_Read_IO2(s, &p, 50), 50);
  EXPECT_EQ(p, data.data() + 40);
  EXPECT_EQ(KOLVAVETA_Read_IO2(s, &p, 50), 10);
  EXPECT_EQ(KOLVAVETA_Close_IO(s), 1);
}

// Bad kinds, empty memory and paths that are not files are refused; a file
// measures its size only when not given one.
TEST(Stream, OpenRefusesWhatCannotBeReadAndMeasuresFiles) {
  uint8_t b = 0;
  for (auto [kind, source, size] : {std::tuple<int, void*, uint32_t>{3, &b, 1}, {1, &b, 0},
                                    {0, const_cast<char*>("/tmp"), 0}, {2, nullptr, 0}})
    EXPECT_EQ(KOLVAVETA_Open_IO(kind, source, size), nullptr) << kind;
  const auto data = bytes(300);
  vjtest::TempFile f(data);
  for (uint32_t size : {0u, 123u}) {
    IoStream* s = KOLVAVETA_Open_IO(0, const_cast<char*>(f.path().c_str()), size);
    ASSERT_NE(s, nullptr);
    EXPECT_EQ(s->size, size ? size : 300u);
    KOLVAVETA_Close_IO(s);
  }
  // A handle records where the caller left it, and is rewound when its size
  // is unknown; the caller's handle stays open.
  FILE* fp = std::fopen(f.path().c_str(), "rb");
  ASSERT_NE(fp, nullptr);
  std::fseek(fp, 17, SEEK_SET);
  IoStream* s = KOLVAVETA_Open_IO(2, fp, 0);
  ASSERT_NE(s, nullptr);
  EXPECT_EQ(s->origin, 17u);
  EXPECT_EQ(std::ftell(fp), 0);
  KOLVAVETA_Close_IO(s);
  std::fclose(fp);
}

TEST(Stream, CallbackStreamSeeksThroughSkipAndRewind) {
  CallbackSource src{bytes(1000)};
  IoStream* s = KOLVAVETA_Open_Stream(&src, CallbackSource::read, CallbackSource::skip,
                                      CallbackSource::rewind, 1000);
  ASSERT_NE(s, nullptr);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, 200, 0), 200);
  uint8_t out[4];
  EXPECT_EQ(KOLVAVETA_Read_IO(s, out, 4), 4);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, 10, 1), 214);
  EXPECT_EQ(KOLVAVETA_Seek_IO(s, -100, 2), 900);
  EXPECT_EQ(src.pos, 900u);
  KOLVAVETA_Close_IO(s);
  // Without a rewind callback absolute seeks answer 0 and do not move.
  IoStream* t =
      KOLVAVETA_Open_Stream(&src, CallbackSource::read, CallbackSource::skip, nullptr, 1000);
  EXPECT_EQ(KOLVAVETA_Read_IO(t, out, 4), 4);
  EXPECT_EQ(KOLVAVETA_Seek_IO(t, 50, 0), 0);
  EXPECT_EQ(t->position, 4u);
  KOLVAVETA_Close_IO(t);
}

// A window over every input kind yields the same bytes, and refills keep
// the consumed position consistent.
TEST(Window, RefillDeliversTheInputInOrderForEveryKind) {
  auto data = bytes(40000);
  vjtest::TempFile f(data);
  CallbackSource src{data};
  const uint32_t size = static_cast<uint32_t>(data.size());
  for (IoStream* s : {KOLVAVETA_Open_IO(1, data.data(), size),
                      KOLVAVETA_Open_IO(0, const_cast<char*>(f.path().c_str()), 0),
                      KOLVAVETA_Open_Stream(&src, CallbackSource::read, CallbackSource::skip,
                                            CallbackSource::rewind, size)}) {
    ASSERT_NE(s, nullptr);
    StreamWindow w;
    ASSERT_TRUE(vj::window_open(&w, s));
    // Read in irregular chunks, asking for a few bytes at a time.
    for (size_t pos = 0; pos < data.size();) {
      const uint32_t need = static_cast<uint32_t>(std::min<size_t>(1 + pos % 23, data.size() - pos));
      ASSERT_NE(VETAJ_CheckBuffer(&w, need), 0) << "at " << pos;
      for (uint32_t i = 0; i < need; ++i, ++pos, ++w.index, --w.remaining)
        ASSERT_EQ(w.window[w.index], data[pos]) << "kind " << s->kind << " at " << pos;
      ASSERT_EQ(vj::window_tell(&w), pos);
    }
    EXPECT_EQ(VETAJ_CheckBuffer(&w, 1), 0);  // end of input
    // Skipping past the window seeks the stream.
    ASSERT_TRUE(vj::window_seek(&w, 0));
    ASSERT_TRUE(vj::window_skip(&w, 20000));
    EXPECT_EQ(vj::window_byte(&w), data[20000]);
    // Past the end: a memory input refuses; files and streams land beyond the
    // end and the next read finds nothing.
    if (s->kind == 1) {
      EXPECT_FALSE(vj::window_skip(&w, 30000));
    } else if (vj::window_skip(&w, 30000)) {
      EXPECT_EQ(vj::window_byte(&w), -1);
    }
    vj::window_close(&w);
    KOLVAVETA_Close_IO(s);
  }
  // Requests beyond the input fail instead of overrunning, keeping what exists.
  IoStream* s = KOLVAVETA_Open_IO(1, data.data(), 10);
  StreamWindow w;
  ASSERT_TRUE(vj::window_open(&w, s));
  EXPECT_EQ(VETAJ_CheckBuffer(&w, 17), 0);
  EXPECT_EQ(w.remaining, 10u);
  EXPECT_EQ(VETAJ_CheckBuffer(&w, 10), 2);
  vj::window_close(&w);
  KOLVAVETA_Close_IO(s);
}

}  // namespace
