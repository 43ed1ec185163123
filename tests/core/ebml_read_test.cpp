#include "core/header/ebml_read.h"

#include <gtest/gtest.h>

#include <vector>

#include "core/status.h"
#include "host/input_streams.h"

namespace {

// Reads from `bytes` through a buffered stream, as the header parse does.
class ByteSource {
 public:
  explicit ByteSource(std::vector<uint8_t> bytes) : bytes_(std::move(bytes)) {
    input_ = host::MakeMemoryStream(bytes_.data(), bytes_.size(), true);
    ready_ = mkvvstream_init(&stream_, input_->record(), 16, 1, kFillWithRead, 1) == 0;
  }
  ~ByteSource() {
    if (ready_) mkvvstream_destroy(&stream_);
  }
  mkvvstream* stream() { return &stream_; }

 private:
  std::vector<uint8_t> bytes_;
  std::unique_ptr<host::InputStream> input_;
  mkvvstream stream_{};
  bool ready_ = false;
};

struct HeaderCase {
  const char* name;
  std::vector<uint8_t> bytes;
  int status;
  uint64_t value;
};

TEST(EbmlReadIdTest, KeepsMarkerBitsAndRefusesLongIds) {
  const HeaderCase cases[] = {
      {"one byte", {0xA3, 0x00}, kStatusOk, 0xA3},
      {"two bytes", {0x42, 0x86, 0x00}, kStatusOk, 0x4286},
      {"three bytes", {0x2A, 0xD7, 0xB1, 0x00}, kStatusOk, 0x2AD7B1},
      {"four bytes", {0x1A, 0x45, 0xDF, 0xA3}, kStatusOk, 0x1A45DFA3},
      {"five-byte marker", {0x0F, 0x01, 0x02, 0x03, 0x04, 0x05}, kStatusMalformed, 0},
      {"zero byte", {0x00, 0x80}, kStatusMalformed, 0},
      {"cut after first byte", {0x1A}, kStatusReadFailed, 0},
      {"cut in the middle", {0x1A, 0x45, 0xDF}, kStatusReadFailed, 0},
  };
  for (const HeaderCase& c : cases) {
    ByteSource source(c.bytes);
    uint32_t id = 0;
    EXPECT_EQ(ebml_read_id(source.stream(), &id), c.status) << c.name;
    if (c.status == kStatusOk) {
      EXPECT_EQ(id, c.value) << c.name;
    }
  }
}

TEST(EbmlReadSizeTest, ReadsOneToEightBytesWithoutSpecialUnknownSize) {
  const HeaderCase cases[] = {
      {"one byte", {0x85}, kStatusOk, 5},
      {"one byte all ones", {0xFF}, kStatusOk, 0x7F},
      {"two bytes", {0x41, 0x02}, kStatusOk, 0x102},
      {"four bytes", {0x10, 0x12, 0x34, 0x56}, kStatusOk, 0x123456},
      {"eight bytes", {0x01, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x00}, kStatusOk, 0x100000000},
      {"unknown size reads as a number", {0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, kStatusOk,
       0x00FFFFFFFFFFFFFF},
      {"zero first byte", {0x00, 0x81}, kStatusMalformed, 0},
      {"cut eight-byte size", {0x01, 0x00, 0x00}, kStatusReadFailed, 0},
  };
  for (const HeaderCase& c : cases) {
    ByteSource source(c.bytes);
    uint64_t size = 0;
    EXPECT_EQ(ebml_read_size(source.stream(), &size), c.status) << c.name;
    if (c.status == kStatusOk) {
      EXPECT_EQ(size, c.value) << c.name;
    }
  }
}

TEST(EbmlReadValueTest, SignedValuesAreSignExtendedFromTheirWidth) {
  const struct {
    std::vector<uint8_t> bytes;
    int64_t value;
  } cases[] = {
      {{0xFF}, -1},
      {{0x7F}, 127},
      {{0xFF, 0x00}, -256},
      {{0x80, 0, 0, 0, 0, 0, 0, 0}, INT64_MIN},
      {{}, 0},
  };
  for (const auto& c : cases) {
    ByteSource source(c.bytes);
    int64_t value = 42;
    EXPECT_EQ(ebml_read_signed(source.stream(), c.bytes.size(), &value), kStatusOk);
    EXPECT_EQ(value, c.value) << c.bytes.size() << " bytes";
  }
}

TEST(EbmlReadValueTest, FloatsOfFourAndEightBytes) {
  ByteSource single({0x45, 0xFA, 0x00, 0x00});
  double value = 0;
  EXPECT_EQ(ebml_read_float(single.stream(), 4, &value), kStatusOk);
  EXPECT_EQ(value, 8000.0);

  ByteSource twice({0x40, 0x09, 0x21, 0xFB, 0x54, 0x44, 0x2D, 0x18});
  EXPECT_EQ(ebml_read_float(twice.stream(), 8, &value), kStatusOk);
  EXPECT_DOUBLE_EQ(value, 3.141592653589793);

  ByteSource odd({0x45, 0xFA});
  EXPECT_EQ(ebml_read_float(odd.stream(), 2, &value), kStatusMalformed);

  ByteSource cut({0x45, 0xFA});
  EXPECT_EQ(ebml_read_float(cut.stream(), 4, &value), kStatusReadFailed);
}

}  // namespace
