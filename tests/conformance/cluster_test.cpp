// Every fixture driven through the playback parser in buffers of many sizes,
// down to one byte, so that a read stops and resumes at every byte; the block
// list must equal what mkvinfo reported for the file, and no block may be
// left allocated.

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

#include "host/heap_control.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"

namespace {

using testing_support::DriveClusters;
using testing_support::DriveOptions;
using testing_support::FirstClusterOffset;

// "track ticks S|B key frames size:adler,..." per block, then how the drive
// ended. Keys of Blocks are known only when the group tails are read.
std::vector<std::string> Listed(const std::vector<testing_support::ExpectedBlock>& blocks, bool block_keys) {
  std::vector<std::string> out;
  for (const auto& b : blocks) {
    std::string line = std::to_string(b.track) + " " + std::to_string(b.ticks) + (b.simple ? " S " : " B ") +
                       (b.simple || block_keys ? std::to_string(b.key) : "?");
    for (const auto& f : b.frames) line += " " + std::to_string(f.size) + ":" + std::to_string(f.adler32);
    out.push_back(line);
  }
  out.push_back("complete");
  return out;
}

std::vector<std::string> Driven(const std::vector<uint8_t>& file, const DriveOptions& options) {
  auto outcome = DriveClusters(file.data(), file.size(), FirstClusterOffset(file.data(), file.size()), options);
  std::vector<testing_support::ExpectedBlock> blocks;
  for (const auto& b : outcome.blocks) {
    testing_support::ExpectedBlock block{b.track, b.ticks, b.simple, b.key, {}};
    for (size_t f = 0; f < b.frame_sizes.size(); ++f) {
      block.frames.push_back({static_cast<uint32_t>(b.frame_sizes[f]), f < b.adler32.size() ? b.adler32[f] : 0});
    }
    blocks.push_back(block);
  }
  std::vector<std::string> out = Listed(blocks, options.read_group_tail);
  out.back() = outcome.failed ? "failed with " + std::to_string(outcome.failure) : outcome.complete ? "complete" : "ended inside an element";
  return out;
}

class ClusterFixtureTest : public testing::TestWithParam<std::string> {};

// A damaged fixture is read as mkvinfo lists it, whole when the damage reads
// as elements to pass over (a block size that claims too much), else up to
// the damage, ending with the parser's answer there: a cut file inside the
// block it cuts short (waiting for more data), zeroed bytes with an error.
// mkvinfo's next block after those opens the Cluster of a cue point.
TEST_P(ClusterFixtureTest, EveryBufferSizeGivesTheMkvinfoBlockList) {
  const testing_support::FixtureExpectation fx = testing_support::LoadFixture(GetParam());
  auto file = testing_support::ReadFixtureBytes(GetParam());
  ASSERT_FALSE(file.empty());
  const bool cut = fx.damaged_at == file.size();
  int64_t live_before = host::LiveBlockCount();
  for (size_t size : {size_t{1}, size_t{2}, size_t{3}, size_t{7}, size_t{64}, size_t{4096}, size_t{32768}, file.size()}) {
    for (bool group_tail : {true, false}) {
      SCOPED_TRACE(testing::Message() << "in buffers of " << size << (group_tail ? "" : ", group tails left to the parser"));
      DriveOptions options;
      options.buffer_sizes = {size};
      options.read_group_tail = group_tail;
      std::vector<std::string> driven = Driven(file, options), listed = Listed(fx.blocks, group_tail);
      if (fx.damaged_at && driven.back() != "complete") {
        ASSERT_EQ(driven.back(), cut ? "ended inside an element" : "failed with -2");
        driven.erase(driven.end() - (cut ? 2 : 1), driven.end());
        const size_t read = driven.size();
        ASSERT_LE(read + (cut ? 0 : 1), fx.blocks.size());
        if (!cut) {
          const auto& next = fx.blocks[read];
          EXPECT_TRUE(next.key && std::any_of(fx.cues.begin(), fx.cues.end(),
                                              [&](const auto& cue) { return int64_t(cue.time_ticks) == next.ticks; }));
        }
        listed.resize(cut ? fx.blocks.size() : read);
      }
      ASSERT_EQ(driven, listed);
    }
  }
  EXPECT_EQ(host::LiveBlockCount(), live_before);
}

INSTANTIATE_TEST_SUITE_P(Fixtures, ClusterFixtureTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const auto& info) { return info.param; });

}  // namespace
