#include "core/header/ebml_read.h"

#include <gtest/gtest.h>

#include "core/status.h"
#include "tests/support/header_parse.h"

namespace {

using ebml::Bytes;
using testing_support::HeaderParse;

// IDs keep their marker bits; sizes lose them, and the all-ones "unknown" size
// is an ordinary number to this reader.
TEST(EbmlReadTest, IdsAndSizesFromTheirFirstByte) {
  const struct {
    const char* name;
    bool id;
    Bytes bytes;
    int status;
    uint64_t value;
  } cases[] = {
      {"one-byte ID", true, {0xA3, 0x00}, kStatusOk, 0xA3},
      {"three-byte ID", true, {0x2A, 0xD7, 0xB1, 0x00}, kStatusOk, 0x2AD7B1},
      {"four-byte ID", true, {0x1A, 0x45, 0xDF, 0xA3}, kStatusOk, 0x1A45DFA3},
      {"five-byte ID marker", true, {0x0F, 0x01, 0x02, 0x03, 0x04, 0x05}, kStatusMalformed, 0},
      {"ID first byte 0x00", true, {0x00, 0x80}, kStatusMalformed, 0},
      {"ID cut in the middle", true, {0x1A, 0x45, 0xDF}, kStatusReadFailed, 0},
      {"one-byte size all ones", false, {0xFF}, kStatusOk, 0x7F},
      {"two-byte size", false, {0x41, 0x02}, kStatusOk, 0x102},
      {"eight-byte size", false, {0x01, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x00}, kStatusOk, 0x100000000},
      {"eight-byte all ones", false, {0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, kStatusOk, 0x00FFFFFFFFFFFFFF},
      {"size first byte 0x00", false, {0x00, 0x81}, kStatusMalformed, 0},
      {"eight-byte size cut", false, {0x01, 0x00, 0x00}, kStatusReadFailed, 0},
  };
  for (const auto& c : cases) {
    HeaderParse source(c.bytes);
    uint32_t id = 0;
    uint64_t size = 0;
    EXPECT_EQ(c.id ? ebml_read_id(&source.stream(), &id) : ebml_read_size(&source.stream(), &size), c.status) << c.name;
    if (c.status == kStatusOk) {
      EXPECT_EQ(c.id ? id : size, c.value) << c.name;
    }
  }
}

}  // namespace
