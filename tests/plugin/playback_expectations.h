#pragma once
// What a played fixture must deliver: for each offered track, the frames that
// mkvinfo listed (NAME.blocks, or NAME.frames for a track stored with header
// removal), with times of ticks × (TimecodeScale / 1000) microseconds.

#include <cstring>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/codec_table.h"
#include "host/graph_runner.h"
#include "tests/support/fixtures.h"

namespace playback_test {

using testing_support::ExpectedFrame;
using testing_support::FixtureExpectation;


using testing_support::ExpectedFrame;
using testing_support::FixtureExpectation;

struct Frame {
  uint64_t time_us;
  uint32_t size;
  uint32_t adler32;
  bool operator==(const Frame&) const = default;
};

inline std::ostream& operator<<(std::ostream& out, const Frame& f) {
  return out << "{" << f.time_us << " us, " << f.size << " bytes, " << std::hex << f.adler32 << std::dec << "}";
}

inline bool Supported(const std::string& codec) {
  for (const mkv_codec_row& row : supported_codec_id) {
    if (codec == row.codec_id) return true;
  }
  return false;
}

// Output channels follow the supported tracks in file order.
inline std::vector<uint64_t> OfferedTracks(const FixtureExpectation& fixture) {
  std::vector<uint64_t> tracks;
  for (const auto& track : fixture.tracks) {
    if (Supported(track.codec)) tracks.push_back(track.number);
  }
  return tracks;
}

inline std::vector<Frame> ExpectedFrames(const std::string& name, const FixtureExpectation& fixture, uint64_t track) {
  const uint64_t scale = fixture.timecode_scale / 1000;
  std::vector<Frame> frames;
  std::vector<testing_support::ExpectedFullFrame> full;
  for (const auto& t : fixture.tracks) {
    if (t.number == track && t.fields.count("compression")) full = testing_support::LoadFullFrames(name);
  }
  if (!full.empty()) {
    for (const auto& f : full) {
      if (f.track == track) frames.push_back({static_cast<uint64_t>(f.ticks) * scale, f.size, f.adler32});
    }
    return frames;
  }
  for (const auto& block : fixture.blocks) {
    if (block.track != track) continue;
    for (const ExpectedFrame& f : block.frames) frames.push_back({static_cast<uint64_t>(block.ticks) * scale, f.size, f.adler32});
  }
  return frames;
}

inline std::vector<Frame> Delivered(const host::ChannelRun& run) {
  std::vector<Frame> frames;
  for (const host::RunFrame& f : run.frames) frames.push_back({f.time_us, f.size, f.adler32});
  return frames;
}

// "" when equal, else where the lists part.
inline std::string FirstDifference(const std::vector<Frame>& got, const std::vector<Frame>& want) {
  size_t i = 0;
  while (i < got.size() && i < want.size() && got[i] == want[i]) ++i;
  if (i == got.size() && i == want.size()) return "";
  std::ostringstream text;
  text << got.size() << " frames delivered, " << want.size() << " expected; first difference at " << i << ": ";
  if (i < got.size()) text << "got " << got[i] << " ";
  if (i < want.size()) text << "expected " << want[i];
  return text.str();
}

inline void CheckRun(const std::string& name, const FixtureExpectation& fixture, const std::vector<uint64_t>& offered,
              const host::RunResult& result) {
  ASSERT_TRUE(result.ok) << result.error;
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE("channel " + std::to_string(run.index));
    const uint64_t track = offered[static_cast<size_t>(run.index)];
    EXPECT_EQ(FirstDifference(Delivered(run), ExpectedFrames(name, fixture, track)), "") << "track " << track;
    EXPECT_EQ(run.foreign_elements, 0u) << "a frame element points outside the input buffers";
    // The first buffer: the whole CodecPrivate, or the three Vorbis headers without their lacing.
    for (const auto& t : fixture.tracks) {
      if (t.number != track) continue;
      uint64_t total = 0;
      for (const host::RunFrame& packet : run.config) total += packet.size;
      if (t.codec_private_size == 0) {
        EXPECT_TRUE(run.config.empty());
      } else if (t.codec == "A_VORBIS") {
        EXPECT_EQ(run.config.size(), 3u);
        EXPECT_LT(total, t.codec_private_size);
      } else {
        EXPECT_EQ(run.config.size(), 1u);
        EXPECT_EQ(total, t.codec_private_size);
      }
    }
    EXPECT_FALSE(run.incomplete_frame);
  }
}

}  // namespace playback_test
