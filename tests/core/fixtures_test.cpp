// The fixture set and its loader: the committed expectations must agree with
// the committed files, and the loader must refuse what it cannot read.

#include "tests/support/fixtures.h"

#include <algorithm>
#include <filesystem>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest-spi.h>
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

// ---------------------------------------------------------------------------
// Parsing of the three text files

int CountFailures(const std::string& expected, const std::string& cues, const std::string& blocks,
                  std::string* first_message = nullptr) {
  ::testing::TestPartResultArray results;
  {
    ::testing::ScopedFakeTestPartResultReporter reporter(
        ::testing::ScopedFakeTestPartResultReporter::INTERCEPT_ONLY_CURRENT_THREAD, &results);
    ParseFixtureTexts("crafted", expected, cues, blocks);
  }
  if (first_message && results.size() > 0) *first_message = results.GetTestPartResult(0).message();
  return results.size();
}

TEST(FixtureLoaderTest, WellFormedTextsGiveEveryValue) {
  const std::string expected =
      "# comment line\n"
      "doc_type webm\n"
      "timecode_scale 22674\n"
      "duration_ns 1012960950\n"
      "title A title  with two blanks\n"
      "muxing_app libebml v1.4.4 + libmatroska v1.7.1\n"
      "writing_app Lavf\n"
      "file_size 10813\n"
      "\n"
      "track number=2 uid=18446744073709551615 type=audio codec=A_FLAC codec_private_size=42 "
      "default_duration=104489795 language=ger sampling_frequency=44100.5 channels=2 bit_depth=16 "
      "flac_sample_rate=44100 flac_channels=2 flac_bits=24 compression=zlib\n"
      "track number=1 uid=7 type=video codec=V_MPEG4/ISO/AVC width=160 height=120 sar=12:11 display_unit=3\n"
      "cue_points 2\n"
      "tag TITLE Fixture Tag Title\n"
      "tag COMMENT\n"
      "tag title lower case\n";
  const std::string cues = "0 1 8780 1\n14977 2 9000 3\n";
  const std::string blocks = "1 -2 S 1 24:bd5a0c7b,44:85ff10cc\n2 14977 B 0 5:0000000f\n";

  ::testing::TestPartResultArray results;
  FixtureExpectation fx;
  {
    ::testing::ScopedFakeTestPartResultReporter reporter(
        ::testing::ScopedFakeTestPartResultReporter::INTERCEPT_ONLY_CURRENT_THREAD, &results);
    fx = ParseFixtureTexts("crafted", expected, cues, blocks);
  }
  ASSERT_EQ(results.size(), 0) << results.GetTestPartResult(0).message();

  EXPECT_EQ(fx.name, "crafted");
  EXPECT_EQ(fx.doc_type, "webm");
  EXPECT_EQ(fx.timecode_scale, 22674u);
  EXPECT_TRUE(fx.has_duration);
  EXPECT_EQ(fx.duration_ns, 1012960950u);
  EXPECT_EQ(fx.title, "A title  with two blanks");
  EXPECT_EQ(fx.muxing_app, "libebml v1.4.4 + libmatroska v1.7.1");
  EXPECT_EQ(fx.writing_app, "Lavf");
  EXPECT_EQ(fx.file_size, 10813u);
  EXPECT_EQ(fx.cue_point_count, 2u);

  ASSERT_EQ(fx.tracks.size(), 2u);
  const ExpectedTrack& a = fx.tracks[0];
  EXPECT_EQ(a.number, 2u);
  EXPECT_EQ(a.uid, 18446744073709551615u);
  EXPECT_EQ(a.type, "audio");
  EXPECT_EQ(a.codec, "A_FLAC");
  EXPECT_EQ(a.codec_private_size, 42u);
  EXPECT_EQ(a.default_duration, 104489795u);
  EXPECT_EQ(a.language, "ger");
  EXPECT_DOUBLE_EQ(a.sampling_frequency, 44100.5);
  EXPECT_EQ(a.channels, 2u);
  EXPECT_EQ(a.bit_depth, 16u);
  EXPECT_EQ(a.flac_sample_rate, 44100u);
  EXPECT_EQ(a.flac_channels, 2u);
  EXPECT_EQ(a.flac_bits, 24u);
  EXPECT_EQ(a.width, 0u);
  EXPECT_EQ(a.fields.at("compression"), "zlib");
  EXPECT_EQ(a.fields.size(), 14u);
  const ExpectedTrack& v = fx.tracks[1];
  EXPECT_EQ(v.width, 160u);
  EXPECT_EQ(v.height, 120u);
  EXPECT_EQ(v.sar_num, 12u);
  EXPECT_EQ(v.sar_den, 11u);
  EXPECT_EQ(v.fields.at("display_unit"), "3");
  EXPECT_EQ(v.language, "");

  ASSERT_EQ(fx.tags.size(), 3u);
  EXPECT_EQ(fx.tags[0], (std::pair<std::string, std::string>{"TITLE", "Fixture Tag Title"}));
  EXPECT_EQ(fx.tags[1], (std::pair<std::string, std::string>{"COMMENT", ""}));
  EXPECT_EQ(fx.tags[2], (std::pair<std::string, std::string>{"title", "lower case"}));

  ASSERT_EQ(fx.cues.size(), 2u);
  EXPECT_EQ(fx.cues[1].time_ticks, 14977u);
  EXPECT_EQ(fx.cues[1].track, 2u);
  EXPECT_EQ(fx.cues[1].cluster_position, 9000u);
  EXPECT_EQ(fx.cues[1].block_number, 3u);

  ASSERT_EQ(fx.blocks.size(), 2u);
  EXPECT_EQ(fx.blocks[0].track, 1u);
  EXPECT_EQ(fx.blocks[0].ticks, -2);
  EXPECT_TRUE(fx.blocks[0].simple);
  EXPECT_TRUE(fx.blocks[0].key);
  ASSERT_EQ(fx.blocks[0].frames.size(), 2u);
  EXPECT_EQ(fx.blocks[0].frames[1].size, 44u);
  EXPECT_EQ(fx.blocks[0].frames[1].adler32, 0x85FF10CCu);
  EXPECT_FALSE(fx.blocks[1].simple);
  EXPECT_FALSE(fx.blocks[1].key);
  EXPECT_EQ(fx.blocks[1].frames[0].adler32, 0xFu);
}

TEST(FixtureLoaderTest, AbsentDurationIsNotReported) {
  FixtureExpectation fx = ParseFixtureTexts("crafted", "doc_type matroska\ntimecode_scale 1000000\n", "", "");
  EXPECT_FALSE(fx.has_duration);
  EXPECT_EQ(fx.duration_ns, 0u);
}

struct MalformedCase {
  const char* label;
  const char* expected;
  const char* cues;
  const char* blocks;
  const char* file_and_line;  // as the failure names it
};

TEST(FixtureLoaderTest, MalformedLineIsReportedWithItsFileAndLine) {
  const MalformedCase cases[] = {
      {"unknown key", "doc_type matroska\nwidth 160\n", "", "", "crafted.expected:2"},
      {"number with text after it", "timecode_scale 1000000ns\n", "", "", "crafted.expected:1"},
      {"negative size", "file_size -1\n", "", "", "crafted.expected:1"},
      {"key without value", "doc_type\n", "", "", "crafted.expected:1"},
      {"duration not a number", "duration_ns 2.5\n", "", "", "crafted.expected:1"},
      {"tag without name", "tag \n", "", "", "crafted.expected:1"},
      {"track token without =", "track number=1 type=video video\n", "", "", "crafted.expected:1"},
      {"track without number", "track type=video codec=V_MPEG1\n", "", "", "crafted.expected:1"},
      {"track key twice", "track number=1 type=video number=2\n", "", "", "crafted.expected:1"},
      {"track number too large", "track number=18446744073709551616 type=video\n", "", "",
       "crafted.expected:1"},
      {"sar without denominator", "track number=1 type=video sar=4\n", "", "", "crafted.expected:1"},
      {"channels not a number", "track number=1 type=audio channels=two\n", "", "", "crafted.expected:1"},
      {"cue with three fields", "", "0 1 5364\n", "", "crafted.cues:1"},
      {"cue with five fields", "", "0 1 5364 1\n0 1 5364 1 1\n", "", "crafted.cues:2"},
      {"block kind X", "", "", "1 0 X 1 10:00000001\n", "crafted.blocks:1"},
      {"block key 2", "", "", "1 0 S 2 10:00000001\n", "crafted.blocks:1"},
      {"block without frames", "", "", "1 0 S 1\n", "crafted.blocks:1"},
      {"frame without checksum", "", "", "1 0 S 1 10\n", "crafted.blocks:1"},
      {"checksum of nine digits", "", "", "1 0 S 1 10:000000001\n", "crafted.blocks:1"},
      {"checksum not hex", "", "", "1 0 S 1 10:0000000g\n", "crafted.blocks:1"},
      {"empty lace entry", "", "", "1 0 S 1 10:00000001,\n", "crafted.blocks:1"},
      {"two blanks between fields", "", "", "1  0 S 1 10:00000001\n", "crafted.blocks:1"},
  };
  for (const MalformedCase& c : cases) {
    std::string message;
    EXPECT_EQ(CountFailures(c.expected, c.cues, c.blocks, &message), 1) << c.label;
    EXPECT_NE(message.find(std::string(c.file_and_line) + ": malformed line"), std::string::npos)
        << c.label << ": " << message;
  }
}

// ---------------------------------------------------------------------------
// The committed fixture set

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

// What a minimal EBML walk finds at the first SimpleBlock or Block of a file.
struct FirstBlock {
  bool simple = false;
  uint64_t track = 0;
  int64_t ticks = 0;  // Cluster timecode + relative timecode
  uint8_t flags = 0;
  size_t frame_count = 0;
  size_t first_frame = 0;  // offset of the first frame's bytes in the file
};

class ByteWalk {
 public:
  explicit ByteWalk(const std::vector<uint8_t>& bytes) : bytes_(bytes) {}

  std::optional<FirstBlock> FindFirstBlock() {
    size_t pos = 0;
    uint32_t id;
    uint64_t size;
    if (!Header(&pos, &id, &size) || id != 0x1A45DFA3) return std::nullopt;  // EBML header
    pos = End(pos, size);
    if (!Header(&pos, &id, &size) || id != 0x18538067) return std::nullopt;  // Segment
    size_t segment_end = End(pos, size);
    while (pos < segment_end) {
      if (!Header(&pos, &id, &size)) return std::nullopt;
      if (id == 0x1F43B675) return FirstBlockOfCluster(pos, End(pos, size));
      pos = End(pos, size);
    }
    return std::nullopt;
  }

 private:
  static constexpr uint64_t kUnknown = ~uint64_t{0};

  size_t End(size_t pos, uint64_t size) const {
    return size == kUnknown || size > bytes_.size() - pos ? bytes_.size() : pos + size;
  }

  // An EBML variable-size integer; `keep_marker` for element IDs.
  bool Vint(size_t* pos, uint64_t* value, int max_length, bool keep_marker, int* length_out = nullptr) const {
    if (*pos >= bytes_.size() || bytes_[*pos] == 0) return false;
    int length = 1;
    while (!(bytes_[*pos] & (0x80 >> (length - 1)))) ++length;
    if (length > max_length || *pos + length > bytes_.size()) return false;
    uint64_t v = keep_marker ? bytes_[*pos] : bytes_[*pos] & (0xFF >> length);
    bool all_ones = v == (0xFFu >> length);
    for (int i = 1; i < length; ++i) {
      all_ones = all_ones && bytes_[*pos + i] == 0xFF;
      v = (v << 8) | bytes_[*pos + i];
    }
    *pos += length;
    *value = (!keep_marker && all_ones) ? kUnknown : v;
    if (length_out) *length_out = length;
    return true;
  }

  bool Header(size_t* pos, uint32_t* id, uint64_t* size) const {
    uint64_t raw_id;
    if (!Vint(pos, &raw_id, 4, true) || !Vint(pos, size, 8, false)) return false;
    *id = static_cast<uint32_t>(raw_id);
    return true;
  }

  std::optional<FirstBlock> FirstBlockOfCluster(size_t pos, size_t end) const {
    uint64_t cluster_timecode = 0;
    uint32_t id;
    uint64_t size;
    while (pos < end) {
      if (!Header(&pos, &id, &size)) return std::nullopt;
      if (id == 0xE7) {  // Timecode
        if (size > 8 || End(pos, size) != pos + size) return std::nullopt;
        cluster_timecode = 0;
        for (uint64_t i = 0; i < size; ++i) cluster_timecode = (cluster_timecode << 8) | bytes_[pos + i];
      } else if (id == 0xA3) {
        return ReadBlock(pos, End(pos, size), true, cluster_timecode);
      } else if (id == 0xA0) {
        size_t group_end = End(pos, size);
        while (pos < group_end) {
          if (!Header(&pos, &id, &size)) return std::nullopt;
          if (id == 0xA1) return ReadBlock(pos, End(pos, size), false, cluster_timecode);
          pos = End(pos, size);
        }
        return std::nullopt;
      }
      pos = End(pos, size);
    }
    return std::nullopt;
  }

  std::optional<FirstBlock> ReadBlock(size_t pos, size_t end, bool simple, uint64_t cluster_timecode) const {
    FirstBlock b;
    b.simple = simple;
    if (!Vint(&pos, &b.track, 8, false) || pos + 3 > end) return std::nullopt;
    int16_t relative = static_cast<int16_t>((bytes_[pos] << 8) | bytes_[pos + 1]);
    b.ticks = static_cast<int64_t>(cluster_timecode) + relative;
    b.flags = bytes_[pos + 2];
    pos += 3;
    int lacing = (b.flags >> 1) & 3;  // 0 none, 1 Xiph, 2 fixed-size, 3 EBML
    if (lacing == 0) {
      b.frame_count = 1;
      b.first_frame = pos;
      return b;
    }
    if (pos >= end) return std::nullopt;
    b.frame_count = bytes_[pos++] + 1u;
    if (lacing == 1) {
      for (size_t i = 0; i + 1 < b.frame_count; ++i) {
        while (pos < end && bytes_[pos] == 0xFF) ++pos;
        if (pos++ >= end) return std::nullopt;
      }
    } else if (lacing == 3) {
      uint64_t ignored;
      for (size_t i = 0; i + 1 < b.frame_count; ++i) {  // first size, then signed differences
        if (!Vint(&pos, &ignored, 8, false)) return std::nullopt;
      }
    }
    b.first_frame = pos;
    return b;
  }

  const std::vector<uint8_t>& bytes_;
};

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

TEST_P(FixtureFileTest, FirstBlockMatchesTheBytes) {
  std::vector<uint8_t> bytes = ReadFixtureBytes(GetParam());
  ASSERT_FALSE(fx_.blocks.empty());
  const ExpectedBlock& want = fx_.blocks[0];
  std::optional<FirstBlock> got = ByteWalk(bytes).FindFirstBlock();
  ASSERT_TRUE(got.has_value()) << "no block found in " << fx_.path;
  EXPECT_EQ(got->simple, want.simple);
  EXPECT_EQ(got->track, want.track);
  EXPECT_EQ(got->ticks, want.ticks);
  EXPECT_EQ(got->frame_count, want.frames.size());
  if (want.simple) {
    EXPECT_EQ((got->flags & 0x80) != 0, want.key);
  }
  ASSERT_FALSE(want.frames.empty());
  ASSERT_LE(got->first_frame + want.frames[0].size, bytes.size());
  EXPECT_EQ(Adler32(bytes.data() + got->first_frame, want.frames[0].size), want.frames[0].adler32);
}

INSTANTIATE_TEST_SUITE_P(AllFixtures, FixtureFileTest, ::testing::ValuesIn(FixtureNames()),
                         [](const ::testing::TestParamInfo<std::string>& info) { return info.param; });

}  // namespace
}  // namespace testing_support
