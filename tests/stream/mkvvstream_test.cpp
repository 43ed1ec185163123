#include "stream/mkvvstream.h"

#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "host/heap_control.h"
#include "host/input_streams.h"

namespace {

std::vector<uint8_t> Pattern(size_t size) {
  std::vector<uint8_t> bytes(size);
  for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + (i >> 8));
  return bytes;
}

// One step on the stream: seek (answer), read n bytes (how many came, -1 for
// kVstreamFailed; they must be the file's), tell or bytes_available.
struct Step {
  char op;  // 'S', 'R', 'T', 'A'
  uint64_t arg;
  int64_t want;
};

TEST(VstreamTest, ModesBufferSeekAndReadAsConfigured) {
  constexpr int64_t kAny = -2;
  const struct {
    const char* name;
    size_t size;
    int64_t buffer;
    int read_through, fill, buffered;
    std::vector<Step> steps;
    int64_t reads, bytes_read, seeks;  // input counters afterwards; kAny: not checked
  } cases[] = {
      {"short file: a buffer of its length, nothing past its end", 100, 240, 1, kFillWithRead, 1,
       {{'S', 99, 0}, {'R', 1, 1}, {'R', 1, 0}, {'T', 0, 100}}, kAny, kAny, kAny},
      // The first buffer, one byte read straight through, then a whole buffer
      // refilled at 241 without seeking the input: it already stands there.
      {"seek to the buffer's end stays in it; the next read refills behind", 2000, 240, 1, kFillWithRead, 1,
       {{'S', 240, 0}, {'A', 0, 0}, {'R', 1, 1}, {'A', 0, 240}}, 3, 481, 0},
      {"without read-through only the buffered rest", 1000, 240, 0, kFillWithRead, 1,
       {{'S', 230, 0}, {'R', 32, 10}, {'R', 32, 0}}, kAny, kAny, kAny},
      {"peek mode reaches only the first buffer and consumes nothing", 1000, 500, 1, kFillWithPeek, 1,
       {{'S', 499, 0}, {'S', 500, -1}, {'S', 490, 0}, {'R', 20, -1}, {'R', 10, 10}}, kAny, 0, kAny},
      // 10000 bytes skipped in chunks of 4096; an element of unknown size asks
      // to skip about 2^56 bytes of a short input.
      {"unbuffered seeks only forward, by reading in chunks", 20000, 240, 1, kFillWithRead, 0,
       {{'R', 4, 4}, {'S', 10004, 0}, {'T', 0, 10004}, {'S', 10000, -1}, {'S', 10004, 0}, {'R', 4, 4},
        {'S', uint64_t{1} << 56, 0}, {'R', 1, 0}},
       kAny, kAny, 0},
  };
  for (const auto& c : cases) {
    std::vector<uint8_t> bytes = Pattern(c.size);
    auto input = host::MakeMemoryStream(bytes.data(), bytes.size(), true);
    mkvvstream stream{};
    ASSERT_EQ(mkvvstream_init(&stream, input->record(), c.buffer, c.read_through, c.fill, c.buffered), 0) << c.name;
    EXPECT_EQ(stream.buffer == nullptr, c.buffered == 0) << c.name;
    EXPECT_EQ(c.buffered ? stream.buffer_size : 0, c.buffered ? std::min<int64_t>(c.buffer, int64_t(c.size)) : 0) << c.name;
    for (const Step& s : c.steps) {
      uint64_t at = mkvvstream_tell(&stream);
      std::vector<uint8_t> out(s.op == 'R' ? s.arg + 1 : 0);
      int64_t got = s.op == 'S'   ? mkvvstream_seek(&stream, s.arg)
                    : s.op == 'T' ? static_cast<int64_t>(mkvvstream_tell(&stream))
                    : s.op == 'A' ? static_cast<int64_t>(mkvvstream_bytes_available(&stream))
                                  : static_cast<int64_t>(mkvvstream_read(&stream, out.data(), static_cast<int32_t>(s.arg)));
      EXPECT_EQ(got, s.want) << c.name << ": " << s.op << " " << s.arg;
      EXPECT_TRUE(s.op != 'R' || got <= 0 || std::memcmp(out.data(), bytes.data() + at, size_t(got)) == 0) << c.name;
    }
    const host::InputStream::Counters counters = input->counters();
    auto counted = [](int64_t want, uint64_t got) { return want == kAny ? kAny : static_cast<int64_t>(got); };
    EXPECT_EQ(counted(c.reads, counters.reads), c.reads) << c.name;
    EXPECT_EQ(counted(c.bytes_read, counters.bytes_read), c.bytes_read) << c.name;
    EXPECT_EQ(counted(c.seeks, counters.seeks), c.seeks) << c.name;
    EXPECT_LE(c.buffered ? 0 : counters.reads, 10u) << c.name;  // also past the 2^56 skip
    mkvvstream_destroy(&stream);
  }
}

TEST(VstreamInitTest, RefusesWhatCannotBeBufferedAndLeavesNothingBehind) {
  std::vector<uint8_t> bytes = Pattern(1000);
  auto known = host::MakeMemoryStream(bytes.data(), 1000, true);
  auto unknown_length = host::MakeMemoryStream(bytes.data(), 100, false);
  const struct {
    const char* name;
    const MmfInputStream* input;
    int64_t size;
    bool null_stream;
    uint64_t failing_allocation;
  } cases[] = {
      {"null stream record", known->record(), 240, true, 0},
      {"odd buffer size", known->record(), 241, false, 0},
      {"negative buffer size", known->record(), -2, false, 0},
      {"unknown length shorter than the buffer", unknown_length->record(), 240, false, 0},
      {"failed allocation", known->record(), 240, false, 1},
  };
  for (const auto& c : cases) {
    int64_t live = host::LiveBlockCount();
    mkvvstream stream{};
    host::FailNthAllocation(c.failing_allocation);
    EXPECT_EQ(mkvvstream_init(c.null_stream ? nullptr : &stream, c.input, c.size, 1, kFillWithRead, 1), -1) << c.name;
    host::FailNthAllocation(0);
    mkvvstream_destroy(c.null_stream ? nullptr : &stream);  // safe on what init refused
    EXPECT_EQ(stream.buffer, nullptr) << c.name;
    EXPECT_EQ(host::LiveBlockCount(), live) << c.name;
  }
}

}  // namespace
