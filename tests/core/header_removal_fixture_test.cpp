// The header-removal fixture: a video track whose frames are stored without
// the VOP start code that its ContentCompSettings holds. The header parse must
// report that encoding, and its settings put in front of each stored frame must
// give back the frames the file held before the prefix was removed (mkvinfo's
// sizes and Adler-32 of that file, NAME.frames).

#include <gtest/gtest-spi.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "core/status.h"
#include "tests/support/fixtures.h"
#include "tests/support/header_parse.h"

namespace {

using testing_support::ExpectedFullFrame;
using testing_support::ExpectedTrack;
using testing_support::FixtureExpectation;
using testing_support::HeaderParse;

constexpr char kFixture[] = "header_removal_mpeg4";

std::vector<uint8_t> HexBytes(const std::string& hex) {
  std::vector<uint8_t> out;
  for (size_t i = 0; i + 1 < hex.size(); i += 2) {
    out.push_back(static_cast<uint8_t>(std::stoul(hex.substr(i, 2), nullptr, 16)));
  }
  return out;
}

// The frame of every unlaced SimpleBlock and Block, in file order, found by a
// walk over the Segment's Clusters that is independent of the parser.
struct StoredFrame {
  uint64_t track;
  int64_t ticks;
  std::vector<uint8_t> bytes;
};

class UnlacedFrameWalk {
 public:
  explicit UnlacedFrameWalk(const std::vector<uint8_t>& file) : file_(file) {}

  // False when the file cannot be walked to its end.
  bool Run(std::vector<StoredFrame>* frames) {
    size_t pos = 0;
    uint32_t id;
    size_t end;
    if (!Header(&pos, &id, &end) || id != 0x1A45DFA3) return false;  // EBML header
    pos = end;
    if (!Header(&pos, &id, &end) || id != 0x18538067) return false;  // Segment
    size_t segment_end = end;
    while (pos < segment_end) {
      if (!Header(&pos, &id, &end)) return false;
      if (id == 0x1F43B675 && !Cluster(pos, end, frames)) return false;
      pos = end;
    }
    return pos == segment_end;
  }

 private:
  bool Vint(size_t* pos, uint64_t* value, bool keep_marker) const {
    if (*pos >= file_.size() || file_[*pos] == 0) return false;
    size_t length = 1;
    while (!(file_[*pos] & (0x80 >> (length - 1)))) ++length;
    if (*pos + length > file_.size()) return false;
    *value = keep_marker ? file_[*pos] : file_[*pos] & (0xFFu >> length);
    for (size_t i = 1; i < length; ++i) *value = (*value << 8) | file_[*pos + i];
    *pos += length;
    return true;
  }

  // Reads an element's ID and size; `end` is where its data ends.
  bool Header(size_t* pos, uint32_t* id, size_t* end) const {
    uint64_t raw_id, size;
    if (!Vint(pos, &raw_id, true) || !Vint(pos, &size, false) || size > file_.size() - *pos) return false;
    *id = static_cast<uint32_t>(raw_id);
    *end = *pos + size;
    return true;
  }

  bool Cluster(size_t pos, size_t end, std::vector<StoredFrame>* frames) const {
    uint64_t timecode = 0;
    uint32_t id;
    size_t child_end;
    while (pos < end) {
      if (!Header(&pos, &id, &child_end)) return false;
      if (id == 0xE7) {  // Timecode
        timecode = 0;
        for (size_t i = pos; i < child_end; ++i) timecode = (timecode << 8) | file_[i];
      } else if (id == 0xA3) {
        if (!Block(pos, child_end, timecode, frames)) return false;
      } else if (id == 0xA0) {
        size_t at = pos, block_end;
        while (at < child_end) {
          if (!Header(&at, &id, &block_end)) return false;
          if (id == 0xA1 && !Block(at, block_end, timecode, frames)) return false;
          at = block_end;
        }
      }
      pos = child_end;
    }
    return pos == end;
  }

  bool Block(size_t pos, size_t end, uint64_t cluster_timecode, std::vector<StoredFrame>* frames) const {
    StoredFrame frame;
    if (!Vint(&pos, &frame.track, false) || pos + 3 > end) return false;
    frame.ticks = static_cast<int64_t>(cluster_timecode) + static_cast<int16_t>((file_[pos] << 8) | file_[pos + 1]);
    if ((file_[pos + 2] >> 1) & 3) return true;  // laced: not a track this walk looks at
    frame.bytes.assign(file_.begin() + static_cast<std::ptrdiff_t>(pos + 3),
                       file_.begin() + static_cast<std::ptrdiff_t>(end));
    frames->push_back(std::move(frame));
    return true;
  }

  const std::vector<uint8_t>& file_;
};

class HeaderRemovalFixtureTest : public testing::Test {
 protected:
  void SetUp() override {
    expected_ = testing_support::LoadFixture(kFixture);
    full_frames_ = testing_support::LoadFullFrames(kFixture);
    file_ = testing_support::ReadFixtureBytes(kFixture);
    for (const ExpectedTrack& track : expected_.tracks) {
      if (track.fields.count("comp_settings")) stripped_ = track;
    }
  }

  FixtureExpectation expected_;
  std::vector<ExpectedFullFrame> full_frames_;
  std::vector<uint8_t> file_;
  ExpectedTrack stripped_;  // the track mkvinfo shows with ContentCompSettings
};

TEST_F(HeaderRemovalFixtureTest, HeaderParseReportsTheRemovedPrefix) {
  ASSERT_EQ(stripped_.fields.count("compression"), 1u);
  ASSERT_EQ(stripped_.fields.at("compression"), "header_removal");
  std::vector<uint8_t> prefix = HexBytes(stripped_.fields.at("comp_settings"));
  ASSERT_EQ(prefix, (std::vector<uint8_t>{0x00, 0x00, 0x01, 0xB6}));

  HeaderParse parse(file_);
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  ASSERT_EQ(parse.info().track_count, expected_.tracks.size());
  for (uint32_t i = 0; i < parse.info().track_count; ++i) {
    const mkv_track_info& track = parse.info().tracks[i];
    if (track.track_number != stripped_.number) {
      EXPECT_EQ(track.content_encoding_count, 0u) << "track " << track.track_number;
      EXPECT_EQ(track.compressed, 0u) << "track " << track.track_number;
      continue;
    }
    EXPECT_EQ(track.compressed, 1u);
    ASSERT_EQ(track.content_encoding_count, 1u);
    const mkv_content_encoding& encoding = track.content_encodings[0];
    EXPECT_EQ(encoding.order, 0u);
    EXPECT_EQ(encoding.scope, 1u);
    EXPECT_EQ(encoding.type, 0u);
    EXPECT_EQ(encoding.comp_algo, 3u);
    ASSERT_NE(encoding.comp_settings, nullptr);
    EXPECT_EQ(std::vector<uint8_t>(encoding.comp_settings, encoding.comp_settings + encoding.comp_settings_size), prefix);
  }
}

TEST_F(HeaderRemovalFixtureTest, ParsedPrefixAndStoredFrameGiveTheFrameBeforeRemoval) {
  HeaderParse parse(file_);
  ASSERT_EQ(parse.Parse(), kParseSucceeded);
  std::vector<uint8_t> prefix;
  for (uint32_t i = 0; i < parse.info().track_count; ++i) {
    const mkv_track_info& track = parse.info().tracks[i];
    if (track.track_number != stripped_.number || track.content_encoding_count == 0) continue;
    const mkv_content_encoding& encoding = track.content_encodings[0];
    ASSERT_NE(encoding.comp_settings, nullptr);
    prefix.assign(encoding.comp_settings, encoding.comp_settings + encoding.comp_settings_size);
  }
  ASSERT_FALSE(prefix.empty()) << "no header removal settings parsed for track " << stripped_.number;

  std::vector<StoredFrame> walked;
  ASSERT_TRUE(UnlacedFrameWalk(file_).Run(&walked));
  std::vector<StoredFrame> stored;
  for (StoredFrame& frame : walked) {
    if (frame.track == stripped_.number) stored.push_back(std::move(frame));
  }
  ASSERT_EQ(stored.size(), full_frames_.size());
  ASSERT_GE(stored.size(), 10u);
  for (size_t i = 0; i < stored.size(); ++i) {
    std::vector<uint8_t> full = prefix;
    full.insert(full.end(), stored[i].bytes.begin(), stored[i].bytes.end());
    EXPECT_EQ(full_frames_[i].track, stripped_.number) << "frame " << i;
    EXPECT_EQ(stored[i].ticks, full_frames_[i].ticks) << "frame " << i;
    EXPECT_EQ(full.size(), full_frames_[i].size) << "frame " << i;
    EXPECT_EQ(testing_support::Adler32(full.data(), full.size()), full_frames_[i].adler32) << "frame " << i;
  }
}

TEST(FullFramesLoaderTest, LinesGiveTrackTicksSizeAndChecksum) {
  std::vector<ExpectedFullFrame> frames =
      testing_support::ParseFullFramesText("crafted", "# comment\n1 -3 1150 0c0f1f65\n\n2 900 44 8633140a\n");
  ASSERT_EQ(frames.size(), 2u);
  EXPECT_EQ(frames[0].track, 1u);
  EXPECT_EQ(frames[0].ticks, -3);
  EXPECT_EQ(frames[0].size, 1150u);
  EXPECT_EQ(frames[0].adler32, 0x0C0F1F65u);
  EXPECT_EQ(frames[1].track, 2u);
  EXPECT_EQ(frames[1].ticks, 900);
  EXPECT_EQ(frames[1].adler32, 0x8633140Au);
}

TEST(FullFramesLoaderTest, MalformedLineIsReportedWithItsLine) {
  const char* const lines[] = {
      "1 0 1150",              // no checksum
      "1 0 1150 0c0f1f65 7",   // a fifth field
      "1 0 -1 0c0f1f65",       // negative size
      "1 0 1150 00c0f1f65",    // nine hex digits
      "1 0 1150 0c0f1f6g",     // not hex
      "x 0 1150 0c0f1f65",     // track not a number
  };
  for (const char* line : lines) {
    testing::TestPartResultArray results;
    std::vector<ExpectedFullFrame> frames;
    {
      testing::ScopedFakeTestPartResultReporter reporter(
          testing::ScopedFakeTestPartResultReporter::INTERCEPT_ONLY_CURRENT_THREAD, &results);
      frames = testing_support::ParseFullFramesText("crafted", std::string("1 0 4 00000001\n") + line + "\n");
    }
    ASSERT_EQ(results.size(), 1) << line;
    EXPECT_NE(std::string(results.GetTestPartResult(0).message()).find("crafted.frames:2: malformed line"),
              std::string::npos)
        << line;
    EXPECT_EQ(frames.size(), 1u) << line;
  }
}

}  // namespace
