// Every fixture driven through the playback parser in buffers of many sizes;
// the block list must equal what mkvinfo reported for the file.

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "host/heap_control.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"

namespace {

using testing_support::DriveClusters;
using testing_support::DriveOptions;
using testing_support::DriveOutcome;
using testing_support::ExpectedBlock;
using testing_support::FirstClusterOffset;

// The first difference between the driven and the expected block lists, or "".
std::string FirstDifference(const DriveOutcome& got, const std::vector<ExpectedBlock>& want, bool compare_block_keys) {
  for (size_t i = 0; i < want.size() && i < got.blocks.size(); ++i) {
    const auto& g = got.blocks[i];
    const auto& w = want[i];
    bool same = g.track == w.track && g.ticks == w.ticks && g.simple == w.simple &&
                (g.key == w.key || (!w.simple && !compare_block_keys)) && g.frame_sizes.size() == w.frames.size() &&
                g.adler32.size() == w.frames.size();
    for (size_t f = 0; same && f < w.frames.size(); ++f) {
      same = g.frame_sizes[f] == w.frames[f].size && g.adler32[f] == w.frames[f].adler32;
    }
    if (!same) {
      return "block " + std::to_string(i) + ": track " + std::to_string(g.track) + " ticks " +
             std::to_string(g.ticks) + " frames " + std::to_string(g.frame_sizes.size()) + ", want track " +
             std::to_string(w.track) + " ticks " + std::to_string(w.ticks) + " frames " +
             std::to_string(w.frames.size());
    }
  }
  if (got.blocks.size() != want.size()) {
    return std::to_string(got.blocks.size()) + " blocks, want " + std::to_string(want.size());
  }
  if (got.failed) return "failed with " + std::to_string(got.failure);
  if (!got.complete) return "ended inside an element";
  return "";
}

class ClusterFixtureTest : public testing::TestWithParam<std::string> {};

TEST_P(ClusterFixtureTest, EveryBufferSizeGivesTheMkvinfoBlockList) {
  auto expectation = testing_support::LoadFixture(GetParam());
  auto file = testing_support::ReadFixtureBytes(GetParam());
  ASSERT_FALSE(file.empty());
  uint64_t start = FirstClusterOffset(file.data(), file.size());
  int64_t live_before = host::LiveBlockCount();
  const size_t sizes[] = {1, 2, 3, 7, 64, 4096, 32768, file.size()};
  for (size_t size : sizes) {
    for (bool group_tail : {true, false}) {
      DriveOptions options;
      options.buffer_sizes = {size};
      options.read_group_tail = group_tail;
      auto outcome = DriveClusters(file.data(), file.size(), start, options);
      EXPECT_EQ(FirstDifference(outcome, expectation.blocks, group_tail), "")
          << GetParam() << " in buffers of " << size << (group_tail ? "" : ", group tails left to the parser");
    }
  }
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

INSTANTIATE_TEST_SUITE_P(Fixtures, ClusterFixtureTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const auto& info) { return info.param; });

}  // namespace

namespace {

// The incremental path breaks where a header meets a buffer's end: every
// split point of the two smallest files into two buffers.
TEST(ClusterFixtureSplitTest, EverySplitOfTheSmallestFilesGivesTheMkvinfoBlockList) {
  std::vector<std::pair<size_t, std::string>> by_size;
  for (const auto& name : testing_support::FixtureNames()) {
    by_size.emplace_back(testing_support::ReadFixtureBytes(name).size(), name);
  }
  std::sort(by_size.begin(), by_size.end());
  ASSERT_GE(by_size.size(), 2u);
  for (size_t n = 0; n < 2; ++n) {
    const std::string& name = by_size[n].second;
    auto expectation = testing_support::LoadFixture(name);
    auto file = testing_support::ReadFixtureBytes(name);
    uint64_t start = FirstClusterOffset(file.data(), file.size());
    size_t failures = 0;
    for (size_t split = 1; split < file.size() - start && failures < 3; ++split) {
      DriveOptions options;
      options.buffer_sizes = {split, file.size()};
      auto outcome = DriveClusters(file.data(), file.size(), start, options);
      std::string difference = FirstDifference(outcome, expectation.blocks, true);
      EXPECT_EQ(difference, "") << name << " split after " << split << " bytes";
      failures += !difference.empty();
    }
  }
}

}  // namespace
