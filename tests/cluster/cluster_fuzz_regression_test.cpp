// Inputs the cluster parser fuzz target found, replayed with the target's own
// checks (tests/support/cluster_fuzz_input.h).

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/cluster_fuzz_input.h"

namespace {

TEST(ClusterFuzzRegressionTest, FoundInputsPassEveryCheckOfTheFuzzTarget) {
  const struct {
    const char* name;
    std::vector<uint8_t> input;
  } found[] = {
      // A CodecState copied, then freed by destroy_mkvcluster: the size stays
      // behind with a null copy, which the first checks took for a broken record.
      {"CodecState size stays after destroy",
       {0x60, 0x00, 0x80, 0x01, 0x1F, 0x43, 0xB6, 0x75, 0x77, 0xC0, 0x00, 0x00, 0xA0, 0x01, 0x00,
        0x60, 0x20, 0x00, 0x16, 0x6A, 0x18, 0xA4, 0x81, 0x81, 0x81, 0x81, 0x1F}},
  };
  for (const auto& f : found) EXPECT_EQ(testing_support::RunClusterFuzzInput(f.input.data(), f.input.size()), "") << f.name;
}

}  // namespace
