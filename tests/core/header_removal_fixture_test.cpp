// The header-removal fixture: a video track whose frames are stored without the
// VOP start code that its ContentCompSettings holds. The header parse must
// report that encoding, and its settings put in front of each stored frame must
// give back the frames the file held before the prefix was removed (mkvinfo's
// sizes and Adler-32 of that file, NAME.frames).

#include <gtest/gtest.h>

#include <vector>

#include "core/status.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

constexpr char kFixture[] = "header_removal_mpeg4";

TEST(HeaderRemovalFixtureTest, ParsedPrefixAndStoredFramesGiveTheFramesBeforeRemoval) {
  std::vector<uint8_t> file = testing_support::ReadFixtureBytes(kFixture);
  std::vector<testing_support::ExpectedFullFrame> want = testing_support::LoadFullFrames(kFixture);
  testing_support::HeaderParse parse(file);
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  ASSERT_EQ(parse.info().track_count, 2u);
  const mkv_track_info& stripped = parse.info().tracks[0];
  EXPECT_EQ(parse.info().tracks[1].content_encoding_count, 0u);
  EXPECT_EQ(stripped.compressed, 1u);
  ASSERT_EQ(stripped.content_encoding_count, 1u);
  const mkv_content_encoding& encoding = stripped.content_encodings[0];
  EXPECT_EQ(encoding.order, 0u);
  EXPECT_EQ(encoding.scope, 1u);
  EXPECT_EQ(encoding.type, 0u);
  EXPECT_EQ(encoding.comp_algo, 3u);
  std::vector<uint8_t> prefix(encoding.comp_settings, encoding.comp_settings + encoding.comp_settings_size);
  ASSERT_EQ(prefix, (std::vector<uint8_t>{0x00, 0x00, 0x01, 0xB6}));  // mkvinfo's comp_settings

  // Each stored frame of the track, prefixed, as the playback parser finds it.
  std::vector<testing_support::ExpectedFullFrame> got;
  testing_support::DriveOptions options;
  options.buffer_sizes = {file.size()};
  options.observe = [&](int result, const mkvcluster& c, bool) {
    if (result != kClusterBlockReady || c.track_number != stripped.track_number) return;
    std::vector<uint8_t> full = prefix;
    full.insert(full.end(), file.begin() + static_cast<std::ptrdiff_t>(c.block_end - c.block_data_left),
                file.begin() + static_cast<std::ptrdiff_t>(c.block_end));
    got.push_back({c.track_number, static_cast<int64_t>(c.cluster_timecode) + c.block_timecode,
                   static_cast<uint32_t>(full.size()), testing_support::Adler32(full.data(), full.size())});
  };
  uint64_t start = testing_support::FirstClusterOffset(file.data(), file.size());
  ASSERT_TRUE(testing_support::DriveClusters(file.data(), file.size(), start, options).complete);
  ASSERT_EQ(got.size(), want.size());
  ASSERT_GE(got.size(), 10u);
  for (size_t i = 0; i < got.size(); ++i) {
    EXPECT_EQ(got[i].track, want[i].track) << "frame " << i;
    EXPECT_EQ(got[i].ticks, want[i].ticks) << "frame " << i;
    EXPECT_EQ(got[i].size, want[i].size) << "frame " << i;
    EXPECT_EQ(got[i].adler32, want[i].adler32) << "frame " << i;
  }
}

}  // namespace
