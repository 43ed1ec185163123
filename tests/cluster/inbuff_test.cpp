// The byte rule over inbuff1 and inbuff2 where it is a contract of its own:
// what a failed read or skip leaves consumed. (Reads across the two views are
// exercised at every split point by the block and fixture tests.)

#include <gtest/gtest.h>

#include <tuple>

#include "core/status.h"
#include "tests/cluster/cluster_harness.h"

namespace {

using cluster_testing::Bytes;
using cluster_testing::View;

TEST(EbmlGetVarUintFromBuffTest, ReadsAcrossTheTwoViews) {
  // inbuff1 holds bytes[0, split), inbuff2 the rest (none when split is the size)
  const struct { Bytes bytes; size_t split; int status; uint64_t value; uint32_t length; size_t consumed; } rows[] = {
      {{0x81}, 1, kStatusOk, 1, 1, 1},
      {{0x40, 0x02}, 1, kStatusOk, 2, 2, 2},
      {{0x10, 0x00, 0x00, 0x01}, 2, kStatusOk, 1, 4, 4},
      {{0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, 3, kStatusOk, 0x00FFFFFFFFFFFFFF, 8, 8},
      {{0x00, 0x81}, 2, kStatusMalformed, 0, 0, 1},
      {{0x20, 0x01}, 1, kStatusReadFailed, 0, 0, 2},  // 3 bytes wanted, the read ones stay consumed
      {{0x20, 0x01}, 2, kStatusReadFailed, 0, 0, 2},
  };
  for (const auto& c : rows) {
    mkvinbuff in1 = View(c.bytes, 0, c.split), in2 = View(c.bytes, c.split, c.bytes.size());
    uint64_t value = 0;
    uint32_t length = 0;
    EXPECT_EQ(ebml_get_var_uint_from_buff(&in1, c.split < c.bytes.size() ? &in2 : nullptr, &value, &length), c.status);
    EXPECT_TRUE(c.status != kStatusOk || (value == c.value && length == c.length)) << value << " " << length;
    EXPECT_EQ(in1.buff_pos + in2.buff_pos, c.consumed);
  }
}

TEST(SkipBuffbytesTest, IsAllOrNothing) {
  Bytes bytes(5);
  const struct { uint32_t count; bool with_inbuff2; int result; uint32_t left1, left2; } rows[] = {
      {2, true, 0, 1, 2}, {5, true, 0, 0, 0}, {6, true, -1, 3, 2}, {4, false, -1, 3, 2}, {3, false, 0, 0, 2}};
  for (const auto& row : rows) {
    mkvinbuff in1 = View(bytes, 0, 3), in2 = View(bytes, 3, 5);
    const int result = skip_buffbytes(&in1, row.with_inbuff2 ? &in2 : nullptr, row.count);
    EXPECT_EQ(std::tie(result, in1.buff_left, in2.buff_left), std::tie(row.result, row.left1, row.left2)) << row.count;
  }
}

}  // namespace
