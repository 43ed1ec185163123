// The fixture set: the committed expectations must agree with the committed files.

#include "tests/support/fixtures.h"

#include <algorithm>
#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace testing_support {
namespace {

// ---------------------------------------------------------------------------
// Adler-32

struct AdlerCase {
  const char* label;
  std::vector<uint8_t> data;
  uint32_t expected;  // from zlib's adler32()
};

std::vector<uint8_t> Text(const char* s) { return std::vector<uint8_t>(s, s + std::char_traits<char>::length(s)); }

std::vector<uint8_t> Repeated(uint8_t byte, size_t count) { return std::vector<uint8_t>(count, byte); }

std::vector<uint8_t> Ramp(size_t count) {
  std::vector<uint8_t> v(count);
  for (size_t i = 0; i < count; ++i) v[i] = static_cast<uint8_t>(i % 251);
  return v;
}

TEST(Adler32Test, MatchesZlibValues) {
  const AdlerCase cases[] = {
      {"empty", {}, 0x00000001},
      {"a", Text("a"), 0x00620062},
      {"abc", Text("abc"), 0x024D0127},
      {"Wikipedia", Text("Wikipedia"), 0x11E60398},
      // 0xFF runs around the longest run that needs no reduction.
      {"5552 x 0xFF", Repeated(0xFF, 5552), 0xF18F9B8C},
      {"5553 x 0xFF", Repeated(0xFF, 5553), 0x8E299C8B},
      {"1000000 x 0xFF", Repeated(0xFF, 1000000), 0x3843E1BE},
      {"ramp of 100000", Ramp(100000), 0x84CBA994},
  };
  for (const AdlerCase& c : cases) {
    EXPECT_EQ(Adler32(c.data.data(), c.data.size()), c.expected) << c.label;
  }
}

TEST(FixtureSetTest, IndexListsEveryFileOnceAndEveryListedFileExists) {
  std::vector<std::string> names = FixtureNames();
  ASSERT_FALSE(names.empty());
  std::set<std::string> listed(names.begin(), names.end());
  EXPECT_EQ(listed.size(), names.size()) << "a fixture is listed twice in index.txt";

  std::set<std::string> on_disk;
  for (const auto& entry : std::filesystem::directory_iterator(KELVANE_FIXTURE_DIR)) {
    if (entry.path().extension() == ".mkv") on_disk.insert(entry.path().stem().string());
  }
  EXPECT_EQ(listed, on_disk);
}

class FixtureFileTest : public ::testing::TestWithParam<std::string> {
 protected:
  void SetUp() override { fx_ = LoadFixture(GetParam()); }
  std::set<uint64_t> TrackNumbers() const {
    std::set<uint64_t> numbers;
    for (const ExpectedTrack& t : fx_.tracks) numbers.insert(t.number);
    return numbers;
  }
  FixtureExpectation fx_;
};

TEST_P(FixtureFileTest, FileSizeMatchesTheExpectation) {
  std::vector<uint8_t> bytes = ReadFixtureBytes(GetParam());
  EXPECT_GT(fx_.file_size, 0u);
  EXPECT_EQ(bytes.size(), fx_.file_size);
  EXPECT_TRUE(std::filesystem::exists(fx_.path)) << fx_.path;
}

TEST_P(FixtureFileTest, HeaderFactsAndTracksArePresent) {
  EXPECT_FALSE(fx_.doc_type.empty());
  EXPECT_GT(fx_.timecode_scale, 0u);
  EXPECT_FALSE(fx_.muxing_app.empty());
  EXPECT_FALSE(fx_.writing_app.empty());
  ASSERT_FALSE(fx_.tracks.empty());
  EXPECT_EQ(TrackNumbers().size(), fx_.tracks.size()) << "track numbers are not unique";
  EXPECT_EQ(TrackNumbers().count(0), 0u);
  EXPECT_FALSE(fx_.blocks.empty());
}

TEST_P(FixtureFileTest, BlocksBelongToDeclaredTracksAndCarryFrames) {
  std::set<uint64_t> numbers = TrackNumbers();
  uint64_t frame_bytes = 0;
  for (size_t i = 0; i < fx_.blocks.size(); ++i) {
    const ExpectedBlock& b = fx_.blocks[i];
    EXPECT_EQ(numbers.count(b.track), 1u) << "block " << i << " of undeclared track " << b.track;
    EXPECT_FALSE(b.frames.empty()) << "block " << i;
    for (const ExpectedFrame& f : b.frames) frame_bytes += f.size;
  }
  EXPECT_LT(frame_bytes, fx_.file_size);
}

TEST_P(FixtureFileTest, CuesAgreeWithTheCuePointCount) {
  EXPECT_EQ(fx_.cues.empty(), fx_.cue_point_count == 0);
  EXPECT_GE(fx_.cues.size(), fx_.cue_point_count);
  // Cue points are stored in time order; each has at least one position line.
  size_t time_runs = 0;
  for (size_t i = 0; i < fx_.cues.size(); ++i) {
    if (i == 0 || fx_.cues[i].time_ticks != fx_.cues[i - 1].time_ticks) ++time_runs;
    if (i > 0) {
      EXPECT_GE(fx_.cues[i].time_ticks, fx_.cues[i - 1].time_ticks) << "cue " << i;
    }
  }
  EXPECT_LE(time_runs, fx_.cue_point_count);
  std::set<uint64_t> numbers = TrackNumbers();
  for (const ExpectedCue& c : fx_.cues) {
    EXPECT_EQ(numbers.count(c.track), 1u) << "cue of undeclared track " << c.track;
    EXPECT_LT(c.cluster_position, fx_.file_size);
    EXPECT_GE(c.block_number, 1u);
  }
}

INSTANTIATE_TEST_SUITE_P(AllFixtures, FixtureFileTest, ::testing::ValuesIn(FixtureNames()),
                         [](const ::testing::TestParamInfo<std::string>& info) { return info.param; });

}  // namespace
}  // namespace testing_support
