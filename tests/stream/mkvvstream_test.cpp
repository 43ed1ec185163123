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

// A stream over Pattern(size) from a memory input whose reads and seeks are counted.
class VstreamTest : public ::testing::Test {
 protected:
  void Open(size_t size, int64_t buffer_size, int read_through, int fill, int buffered) {
    bytes_ = Pattern(size);
    input_ = host::MakeMemoryStream(bytes_.data(), bytes_.size(), true);
    ASSERT_EQ(mkvvstream_init(&stream_, input_->record(), buffer_size, read_through, fill, buffered), 0);
  }
  void TearDown() override { mkvvstream_destroy(&stream_); }
  std::vector<uint8_t> bytes_;
  std::unique_ptr<host::InputStream> input_;
  mkvvstream stream_{};
};

TEST_F(VstreamTest, ShortFileGetsBufferOfItsLengthAndReadPastEndDeliversNothing) {
  Open(100, 240, 1, kFillWithRead, 1);
  EXPECT_EQ(stream_.buffer_size, 100);
  uint8_t byte = 0;
  ASSERT_EQ(mkvvstream_seek(&stream_, 99), 0);
  EXPECT_EQ(mkvvstream_read(&stream_, &byte, 1), 1u);
  EXPECT_EQ(byte, bytes_[99]);
  EXPECT_EQ(mkvvstream_read(&stream_, &byte, 1), 0u);
  EXPECT_EQ(mkvvstream_tell(&stream_), 100u);
}

TEST_F(VstreamTest, SeekToBufferEndStaysInBufferAndNextReadRefillsBehindIt) {
  Open(2000, 240, 1, kFillWithRead, 1);
  ASSERT_EQ(mkvvstream_seek(&stream_, 240), 0);
  EXPECT_EQ(mkvvstream_bytes_available(&stream_), 0u);
  uint8_t byte = 0;
  ASSERT_EQ(mkvvstream_read(&stream_, &byte, 1), 1u);
  EXPECT_EQ(byte, bytes_[240]);
  // The first buffer, one byte read straight through, then a whole buffer
  // refilled at 241 without seeking the input: it already stands there.
  EXPECT_EQ(input_->counters().reads, 3u);
  EXPECT_EQ(input_->counters().bytes_read, 481u);
  EXPECT_EQ(input_->counters().seeks, 0u);
  EXPECT_EQ(stream_.buffer_start, 241u);
  EXPECT_EQ(mkvvstream_bytes_available(&stream_), 240u);
}

TEST_F(VstreamTest, ReadWithoutReadThroughDeliversOnlyTheBufferedRest) {
  Open(1000, 240, 0, kFillWithRead, 1);
  ASSERT_EQ(mkvvstream_seek(&stream_, 230), 0);
  uint8_t out[32];
  EXPECT_EQ(mkvvstream_read(&stream_, out, 32), 10u);
  EXPECT_EQ(mkvvstream_read(&stream_, out, 32), 0u);
}

TEST_F(VstreamTest, PeekModeReachesOnlyTheFirstBufferAndConsumesNothing) {
  Open(1000, 500, 1, kFillWithPeek, 1);
  EXPECT_EQ(mkvvstream_seek(&stream_, 499), 0);
  EXPECT_EQ(mkvvstream_seek(&stream_, 500), -1);
  ASSERT_EQ(mkvvstream_seek(&stream_, 490), 0);
  uint8_t out[20];
  EXPECT_EQ(mkvvstream_read(&stream_, out, 20), kVstreamFailed);
  EXPECT_EQ(mkvvstream_read(&stream_, out, 10), 10u);
  EXPECT_EQ(input_->Tell(), 0);
  EXPECT_EQ(input_->counters().bytes_read, 0u);
}

TEST_F(VstreamTest, UnbufferedSeeksOnlyForwardByReadingInChunks) {
  Open(20000, 240, 1, kFillWithRead, 0);
  EXPECT_EQ(stream_.buffer, nullptr);
  uint8_t out[4];
  ASSERT_EQ(mkvvstream_read(&stream_, out, 4), 4u);
  ASSERT_EQ(mkvvstream_seek(&stream_, 10004), 0);
  EXPECT_EQ(input_->counters().reads, 4u);  // 10000 bytes skipped in chunks of 4096
  EXPECT_EQ(mkvvstream_tell(&stream_), 10004u);
  EXPECT_EQ(mkvvstream_seek(&stream_, 10000), -1);
  EXPECT_EQ(mkvvstream_seek(&stream_, 10004), 0);
  ASSERT_EQ(mkvvstream_read(&stream_, out, 4), 4u);
  EXPECT_EQ(0, std::memcmp(out, bytes_.data() + 10004, 4));
  EXPECT_EQ(input_->counters().seeks, 0u);

  // An element of unknown size asks to skip about 2^56 bytes of a short input.
  EXPECT_EQ(mkvvstream_seek(&stream_, uint64_t{1} << 56), 0);
  EXPECT_LE(input_->counters().reads, 10u);
  EXPECT_EQ(mkvvstream_read(&stream_, out, 1), 0u);
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
    EXPECT_EQ(stream.buffer, nullptr) << c.name;
    EXPECT_EQ(host::LiveBlockCount(), live) << c.name;
  }
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
