// Inputs the cluster parser fuzz target found, replayed with the target's own
// checks (tests/support/cluster_fuzz_input.h). The corpus and the fixtures
// walk the unlaced-block shortcut beside the parser.

#include <gtest/gtest.h>

#include "tests/support/cluster_fuzz_input.h"
#include "tests/support/ebml_builder.h"

namespace {

// A CodecState copied, then freed by destroy_mkvcluster: the size stays behind
// with a null copy, which the first checks took for a broken record.
TEST(ClusterFuzzRegressionTest, CodecStateSizeLeftByDestroyPassesTheChecks) {
  const ebml::Bytes input = {0x60, 0x00, 0x80, 0x01, 0x1F, 0x43, 0xB6, 0x75, 0x77, 0xC0, 0x00, 0x00, 0xA0, 0x01,
                             0x00, 0x60, 0x20, 0x00, 0x16, 0x6A, 0x18, 0xA4, 0x81, 0x81, 0x81, 0x81, 0x1F};
  EXPECT_EQ(testing_support::RunClusterFuzzInput(input.data(), input.size()), "");
}

}  // namespace
