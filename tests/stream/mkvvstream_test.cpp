#include "stream/mkvvstream.h"

#include <gtest/gtest.h>

#include <cstring>
#include <random>
#include <vector>

#include "host/heap_control.h"
#include "host/input_streams.h"

namespace {

std::vector<uint8_t> Pattern(size_t size) {
  std::vector<uint8_t> bytes(size);
  for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + (i >> 8));
  return bytes;
}

// An input that records the size of every read the stream makes of it.
struct RecordingInput {
  std::vector<uint8_t> bytes;
  uint64_t offset = 0;
  bool report_length = true;
  std::vector<uint64_t> reads;
  int seeks = 0;
  MmfInputStreamOps ops{};
  MmfInputStream record{};

  explicit RecordingInput(std::vector<uint8_t> data) : bytes(std::move(data)) {
    ops.Peek = [](void* h, void* out, uint64_t n) -> int64_t {
      auto* self = static_cast<RecordingInput*>(h);
      uint64_t got = std::min<uint64_t>(n, self->bytes.size() - self->offset);
      std::memcpy(out, self->bytes.data() + self->offset, got);
      return static_cast<int64_t>(got);
    };
    ops.Read = [](void* h, void* out, uint64_t n) -> int64_t {
      auto* self = static_cast<RecordingInput*>(h);
      self->reads.push_back(n);
      uint64_t left = self->offset < self->bytes.size() ? self->bytes.size() - self->offset : 0;
      uint64_t got = std::min<uint64_t>(n, left);
      std::memcpy(out, self->bytes.data() + self->offset, got);
      self->offset += got;
      return static_cast<int64_t>(got);
    };
    ops.Seek = [](void* h, uint64_t to, int) -> int64_t {
      auto* self = static_cast<RecordingInput*>(h);
      ++self->seeks;
      self->offset = to;
      return static_cast<int64_t>(to);
    };
    ops.Length = [](void* h) -> uint64_t {
      auto* self = static_cast<RecordingInput*>(h);
      return self->report_length ? self->bytes.size() : 0;
    };
    record.Name = "recording";
    record.Ops = &ops;
    record.Handle = this;
  }
};

class VstreamTest : public ::testing::Test {
 protected:
  void TearDown() override { mkvvstream_destroy(&stream_); }
  mkvvstream stream_{};
};

TEST_F(VstreamTest, ShortFileGetsBufferOfItsLengthAndReadPastEndDeliversNothing) {
  RecordingInput input(Pattern(100));
  ASSERT_EQ(mkvvstream_init(&stream_, &input.record, 240, 1, kFillWithRead, 1), 0);
  EXPECT_EQ(stream_.buffer_size, 100);
  uint8_t byte = 0;
  ASSERT_EQ(mkvvstream_seek(&stream_, 99), 0);
  EXPECT_EQ(mkvvstream_read(&stream_, &byte, 1), 1u);
  EXPECT_EQ(byte, input.bytes[99]);
  EXPECT_EQ(mkvvstream_read(&stream_, &byte, 1), 0u);
  EXPECT_EQ(mkvvstream_tell(&stream_), 100u);
}

TEST_F(VstreamTest, SeekToBufferEndStaysInBufferAndNextReadRefillsBehindIt) {
  RecordingInput input(Pattern(2000));
  ASSERT_EQ(mkvvstream_init(&stream_, &input.record, 240, 1, kFillWithRead, 1), 0);
  ASSERT_EQ(mkvvstream_seek(&stream_, 240), 0);
  EXPECT_EQ(input.seeks, 0);
  EXPECT_EQ(mkvvstream_bytes_available(&stream_), 0u);

  uint8_t byte = 0;
  ASSERT_EQ(mkvvstream_read(&stream_, &byte, 1), 1u);
  EXPECT_EQ(byte, input.bytes[240]);
  // One byte read straight through, then a whole buffer refilled at 241,
  // without seeking the input: it already stands there.
  EXPECT_EQ(input.reads, (std::vector<uint64_t>{240, 1, 240}));
  EXPECT_EQ(input.seeks, 0);
  EXPECT_EQ(stream_.buffer_start, 241u);
  EXPECT_EQ(mkvvstream_bytes_available(&stream_), 240u);
}

TEST_F(VstreamTest, ReadWithoutReadThroughDeliversOnlyTheBufferedRest) {
  RecordingInput input(Pattern(1000));
  ASSERT_EQ(mkvvstream_init(&stream_, &input.record, 240, 0, kFillWithRead, 1), 0);
  ASSERT_EQ(mkvvstream_seek(&stream_, 230), 0);
  uint8_t out[32];
  EXPECT_EQ(mkvvstream_read(&stream_, out, 32), 10u);
  EXPECT_EQ(mkvvstream_read(&stream_, out, 32), 0u);
}

TEST_F(VstreamTest, PeekModeReachesOnlyTheFirstBufferAndConsumesNothing) {
  std::vector<uint8_t> bytes = Pattern(1000);
  auto input = host::MakeMemoryStream(bytes.data(), bytes.size(), true);
  ASSERT_EQ(mkvvstream_init(&stream_, input->record(), 500, 1, kFillWithPeek, 1), 0);
  EXPECT_EQ(mkvvstream_seek(&stream_, 499), 0);
  EXPECT_EQ(mkvvstream_seek(&stream_, 500), -1);
  ASSERT_EQ(mkvvstream_seek(&stream_, 490), 0);
  uint8_t out[20];
  EXPECT_EQ(mkvvstream_read(&stream_, out, 20), kVstreamFailed);
  EXPECT_EQ(mkvvstream_read(&stream_, out, 10), 10u);
  EXPECT_EQ(input->Tell(), 0);
  EXPECT_EQ(input->counters().bytes_read, 0u);
}

TEST_F(VstreamTest, UnbufferedSeeksOnlyForwardInChunksOf4096) {
  RecordingInput input(Pattern(20000));
  ASSERT_EQ(mkvvstream_init(&stream_, &input.record, 240, 1, kFillWithRead, 0), 0);
  EXPECT_EQ(stream_.buffer, nullptr);
  uint8_t out[4];
  ASSERT_EQ(mkvvstream_read(&stream_, out, 4), 4u);
  input.reads.clear();
  ASSERT_EQ(mkvvstream_seek(&stream_, 10004), 0);
  EXPECT_EQ(input.reads, (std::vector<uint64_t>{4096, 4096, 1808}));
  EXPECT_EQ(mkvvstream_tell(&stream_), 10004u);
  EXPECT_EQ(mkvvstream_seek(&stream_, 10000), -1);
  EXPECT_EQ(mkvvstream_seek(&stream_, 10004), 0);
  ASSERT_EQ(mkvvstream_read(&stream_, out, 4), 4u);
  EXPECT_EQ(0, std::memcmp(out, input.bytes.data() + 10004, 4));
  EXPECT_EQ(input.seeks, 0);
}

TEST_F(VstreamTest, UnbufferedSeekFarBeyondTheEndReturnsPromptly) {
  // An element of unknown size asks to skip about 2^56 bytes of a short input.
  RecordingInput input(Pattern(5000));
  ASSERT_EQ(mkvvstream_init(&stream_, &input.record, 240, 1, kFillWithRead, 0), 0);
  EXPECT_EQ(mkvvstream_seek(&stream_, uint64_t{1} << 56), 0);
  EXPECT_LE(input.reads.size(), 3u);
  uint8_t byte;
  EXPECT_EQ(mkvvstream_read(&stream_, &byte, 1), 0u);
}

TEST(VstreamInitTest, RefusesWhatCannotBeBuffered) {
  std::vector<uint8_t> bytes = Pattern(100);
  RecordingInput unknown_length(bytes);
  unknown_length.report_length = false;
  RecordingInput known(bytes);
  struct Case {
    const char* name;
    const MmfInputStream* input;
    int64_t size;
    bool null_stream;
  } cases[] = {
      {"null stream record", &known.record, 240, true},
      {"odd buffer size", &known.record, 241, false},
      {"negative buffer size", &known.record, -2, false},
      {"unknown length shorter than the buffer", &unknown_length.record, 240, false},
  };
  for (const Case& c : cases) {
    mkvvstream stream{};
    EXPECT_EQ(mkvvstream_init(c.null_stream ? nullptr : &stream, c.input, c.size, 1, kFillWithRead, 1), -1) << c.name;
    EXPECT_EQ(stream.buffer, nullptr) << c.name;
  }
}

TEST(VstreamInitTest, FailedAllocationLeavesNothingBehind) {
  RecordingInput input(Pattern(1000));
  int64_t live = host::LiveBlockCount();
  host::FailNthAllocation(1);
  mkvvstream stream{};
  EXPECT_EQ(mkvvstream_init(&stream, &input.record, 240, 1, kFillWithRead, 1), -1);
  host::FailNthAllocation(0);
  EXPECT_EQ(stream.buffer, nullptr);
  EXPECT_EQ(host::LiveBlockCount(), live);
}

TEST(VstreamNullTest, TellAndLengthOfNullStream) {
  EXPECT_EQ(mkvvstream_tell(nullptr), kVstreamFailed);
  EXPECT_EQ(mkvvstream_length(nullptr), 0u);
  EXPECT_EQ(mkvvstream_seek(nullptr, 0), -1);
  EXPECT_EQ(mkvvstream_read(nullptr, nullptr, 1), 0u);
}

// Random reads and seeks compared with the bytes themselves, for buffered and
// unbuffered streams and buffer sizes around the read sizes.
TEST(VstreamDifferentialTest, RandomReadsAndSeeksDeliverTheFileBytes) {
  std::vector<uint8_t> bytes = Pattern(50000);
  std::mt19937 random(1234);
  for (bool buffered : {true, false}) {
    for (int64_t buffer_size : {2, 16, 240, 480, 500}) {
      auto input = host::MakeMemoryStream(bytes.data(), bytes.size(), buffered);
      mkvvstream stream{};
      ASSERT_EQ(mkvvstream_init(&stream, input->record(), buffer_size, 1, kFillWithRead, buffered ? 1 : 0), 0);
      uint64_t position = 0;
      for (int step = 0; step < 3000 && position < bytes.size(); ++step) {
        if (random() % 4 == 0) {
          uint64_t target = buffered ? random() % bytes.size() : position + random() % 700;
          target = std::min<uint64_t>(target, bytes.size());
          ASSERT_EQ(mkvvstream_seek(&stream, target), 0);
          position = target;
        } else {
          int32_t count = static_cast<int32_t>(random() % 600);
          std::vector<uint8_t> out(static_cast<size_t>(count) + 1);
          uint64_t expected = std::min<uint64_t>(static_cast<uint64_t>(count), bytes.size() - position);
          ASSERT_EQ(mkvvstream_read(&stream, out.data(), count), expected)
              << "buffered " << buffered << " size " << buffer_size << " at " << position;
          ASSERT_EQ(0, std::memcmp(out.data(), bytes.data() + position, static_cast<size_t>(expected)));
          position += expected;
        }
        ASSERT_EQ(mkvvstream_tell(&stream), position);
      }
      mkvvstream_destroy(&stream);
    }
  }
}

}  // namespace
