// The header parse's byte source over a memory input: buffered or not, read
// through or not, filled by reads or by peeks, and what it refuses to set up.

#include "stream/mkvvstream.h"

#include <gtest/gtest.h>

#include <cstring>
#include <vector>

#include "host/heap_control.h"
#include "host/input_streams.h"

namespace {

// One step: 'S'eek (its answer), 'R'ead n bytes (how many came, -1 for
// kVstreamFailed; they must be the file's), 'T'ell, bytes 'A'vailable, or the
// input's counters so far: 'N' reads, 'B' bytes read, 'K' seeks.
struct Step { char op; uint64_t arg; int64_t want; };

TEST(VstreamTest, ModesBufferSeekAndReadAsConfigured) {
  const struct {
    const char* name;
    size_t size;
    int64_t buffer;
    int read_through, fill, buffered;
    std::vector<Step> steps;
    int init = 0;  // -1: refused, and nothing is left behind
    bool seekable = true, null_stream = false;
    uint64_t failing_allocation = 0;
  } cases[] = {
      {"short file: a buffer of its length, nothing past its end", 100, 240, 1, kFillWithRead, 1,
       {{'S', 99, 0}, {'R', 1, 1}, {'R', 1, 0}, {'T', 0, 100}}},
      // The first buffer, one byte read straight through, then a whole buffer
      // refilled at 241 without seeking the input: it already stands there.
      {"seek to the buffer's end stays in it; the next read refills behind", 2000, 240, 1, kFillWithRead, 1,
       {{'S', 240, 0}, {'A', 0, 0}, {'R', 1, 1}, {'A', 0, 240}, {'N', 0, 3}, {'B', 0, 481}, {'K', 0, 0}}},
      {"without read-through only the buffered rest", 1000, 240, 0, kFillWithRead, 1,
       {{'S', 230, 0}, {'R', 32, 10}, {'R', 32, 0}}},
      {"peek mode reaches only the first buffer and consumes nothing", 1000, 500, 1, kFillWithPeek, 1,
       {{'S', 499, 0}, {'S', 500, -1}, {'S', 490, 0}, {'R', 20, -1}, {'R', 10, 10}, {'B', 0, 0}}},
      // 10000 bytes skipped in chunks of 4096; an element of unknown size asks
      // to skip about 2^56 bytes of a short input.
      {"unbuffered seeks only forward, by reading in chunks", 20000, 240, 1, kFillWithRead, 0,
       {{'R', 4, 4}, {'S', 10004, 0}, {'T', 0, 10004}, {'S', 10000, -1}, {'S', 10004, 0}, {'R', 4, 4},
        {'S', uint64_t{1} << 56, 0}, {'R', 1, 0}, {'K', 0, 0}}},
      {"null stream record", 1000, 240, 1, kFillWithRead, 1, {}, -1, true, true},
      {"odd buffer size", 1000, 241, 1, kFillWithRead, 1, {}, -1},
      {"negative buffer size", 1000, -2, 1, kFillWithRead, 1, {}, -1},
      {"unknown length shorter than the buffer", 100, 240, 1, kFillWithRead, 1, {}, -1, false},
      {"failed allocation", 1000, 240, 1, kFillWithRead, 1, {}, -1, true, false, 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::vector<uint8_t> bytes(c.size);
    for (size_t i = 0; i < c.size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + (i >> 8));
    auto input = host::MakeMemoryStream(bytes.data(), bytes.size(), c.seekable);
    const int64_t live = host::LiveBlockCount();
    mkvvstream stream{};
    host::FailNthAllocation(c.failing_allocation);
    const int init = mkvvstream_init(c.null_stream ? nullptr : &stream, input->record(), c.buffer, c.read_through,
                                     c.fill, c.buffered);
    host::FailNthAllocation(0);
    ASSERT_EQ(init, c.init);
    EXPECT_EQ(stream.buffer == nullptr, c.buffered == 0 || init != 0);
    EXPECT_EQ(c.buffered ? stream.buffer_size : 0, c.buffered && !init ? std::min<int64_t>(c.buffer, c.size) : 0);
    for (const Step& s : c.steps) {
      const uint64_t at = mkvvstream_tell(&stream);
      const host::InputStream::Counters counted = input->counters();
      std::vector<uint8_t> out(s.op == 'R' ? s.arg + 1 : 0);
      const int64_t got = s.op == 'S'   ? mkvvstream_seek(&stream, s.arg)
                          : s.op == 'T' ? int64_t(mkvvstream_tell(&stream))
                          : s.op == 'A' ? int64_t(mkvvstream_bytes_available(&stream))
                          : s.op == 'N' ? int64_t(counted.reads)
                          : s.op == 'B' ? int64_t(counted.bytes_read)
                          : s.op == 'K' ? int64_t(counted.seeks)
                                        : int64_t(mkvvstream_read(&stream, out.data(), static_cast<int32_t>(s.arg)));
      EXPECT_EQ(got, s.want) << s.op << " " << s.arg;
      EXPECT_TRUE(s.op != 'R' || got <= 0 || std::memcmp(out.data(), bytes.data() + at, size_t(got)) == 0);
    }
    EXPECT_LE(input->counters().reads, 10u);  // also past the 2^56 skip
    mkvvstream_destroy(c.null_stream ? nullptr : &stream);  // also safe on what init refused
    EXPECT_EQ(host::LiveBlockCount(), live);
  }
}

}  // namespace
