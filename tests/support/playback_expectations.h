#pragma once
// What a played fixture must deliver: for each offered track, the frames that
// mkvinfo listed (NAME.blocks, or NAME.frames for a track stored with header
// removal), with times of ticks × (TimecodeScale / 1000) microseconds; and the
// fixture's cue table with the searches a seek or a scan chooses cue points by.

#include <map>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "core/codec_table.h"
#include "host/graph_runner.h"
#include "host/memory_pools.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/cue_rules.h"
#include "tests/support/fixtures.h"

namespace playback_test {

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

// Output channels follow the supported tracks in file order; an encrypted
// one is counted, but left without a channel that plays.
inline std::vector<uint64_t> OfferedTracks(const FixtureExpectation& fixture) {
  std::vector<uint64_t> tracks;
  for (const auto& track : fixture.tracks) {
    const auto same_codec = [&track](const mkv_codec_row& row) { return track.codec == row.codec_id; };
    const bool supported = std::any_of(std::begin(supported_codec_id), std::end(supported_codec_id), same_codec);
    if (supported && !track.fields.count("encryption")) tracks.push_back(track.number);
  }
  return tracks;
}

inline std::vector<Frame> ExpectedFrames(const std::string& name, const FixtureExpectation& fixture,
                                         const testing_support::ExpectedTrack& track) {
  // Header removal is undone by the plug-in; zlib frames come as stored, as the blocks list them.
  const bool restored = track.fields.count("compression") && track.fields.at("compression") == "header_removal";
  std::vector<Frame> frames;
  const uint64_t scale = fixture.timecode_scale / 1000;
  for (const auto& block : restored ? testing_support::LoadFullFrames(name) : fixture.blocks) {
    if (block.track != track.number) continue;
    for (const ExpectedFrame& f : block.frames) frames.push_back({uint64_t(block.ticks) * scale, f.size, f.adler32});
  }
  return frames;
}

template <typename Got>
std::vector<Frame> AsFrames(const std::vector<Got>& got) {
  std::vector<Frame> frames;
  for (const Got& f : got) frames.push_back({f.time_us, f.size, f.adler32});
  return frames;
}

// "" when equal, else where the lists part. Right before each of `gaps`
// (indexes into `got`: damage the runner went past) up to `lost` frames of
// `want` may be missing, those of the output buffer that was being filled.
inline std::string FirstDifference(const std::vector<Frame>& got, const std::vector<Frame>& want,
                                   const std::vector<size_t>& gaps = {}, size_t lost = 0) {
  size_t i = 0, j = 0;
  for (size_t g = 0; g <= gaps.size(); ++g) {
    const size_t stop = g < gaps.size() ? gaps[g] : got.size();
    while (j < stop && i < want.size() && got[j] == want[i]) ++i, ++j;
    if (j < stop) break;
    const size_t skip_end = g < gaps.size() ? std::min(want.size(), i + lost) : i;
    while (i < skip_end && j < got.size() && !(got[j] == want[i])) ++i;
  }
  if (j == got.size() && i == want.size()) return "";
  std::ostringstream text;
  text << got.size() << " frames delivered, " << want.size() << " expected; first difference at " << j << ": ";
  if (j < got.size()) text << "got " << got[j] << " ";
  if (i < want.size()) text << "expected " << want[i] << " (" << i << ")";
  return text.str();
}

// A damaged fixture's listed frames are what mkvinfo reads of it: up to the
// damage, then from the Cluster where it finds its way again, which is where a
// cue point is: the run goes on from there.
inline void CheckRun(const std::string& name, const FixtureExpectation& fixture, const std::vector<uint64_t>& offered,
                     const host::RunResult& result) {
  ASSERT_TRUE(result.ok) << result.error;
  for (const host::ChannelRun& run : result.channels) {
    SCOPED_TRACE("channel " + std::to_string(run.index));
    const uint64_t track = offered[static_cast<size_t>(run.index)];
    const auto& t = *std::find_if(fixture.tracks.begin(), fixture.tracks.end(),
                                  [track](const testing_support::ExpectedTrack& e) { return e.number == track; });
    std::vector<size_t> gaps;
    for (const host::Gap& gap : run.gaps) gaps.push_back(gap.at);
    const std::vector<Frame> want = ExpectedFrames(name, fixture, t);
    EXPECT_EQ(FirstDifference(AsFrames(run.frames), want, gaps, host::kOutputBufferElements), "") << "track " << track;
    EXPECT_EQ(run.foreign_elements, 0u) << "a frame element points outside the input buffers";
    EXPECT_EQ(run.incomplete_frame && fixture.damaged_at != fixture.file_size, false) << "a frame cut short";
    // The first buffer: the whole CodecPrivate, or the three Vorbis headers without their lacing.
    uint64_t total = 0;
    for (const host::RunFrame& packet : run.config) total += packet.size;
    const bool vorbis = t.codec == "A_VORBIS";
    EXPECT_EQ(run.config.size(), t.codec_private_size == 0 ? 0u : vorbis ? 3u : 1u);
    EXPECT_TRUE(vorbis ? total < t.codec_private_size : total == t.codec_private_size)
        << total << " bytes of decoder configuration, CodecPrivate " << t.codec_private_size;
  }
}

// One frame of a track as the fixture lists it, and the block it is in.
struct Listed : Frame {
  size_t block;      // index in the file's block list
  bool block_start;  // the block's first frame
};

// A fixture's frames per track and its cue points (one per distinct time, at
// the earliest Cluster), with file offsets from the file's own bytes.
struct CueModel {
  explicit CueModel(const std::string& name) : expect(testing_support::LoadFixture(name)) {
    scale = expect.timecode_scale / 1000;
    for (size_t b = 0; b < expect.blocks.size(); ++b) {
      const auto& block = expect.blocks[b];
      for (size_t f = 0; f < block.frames.size(); ++f) {
        tracks[block.track].push_back(
            {{uint64_t(block.ticks) * scale, block.frames[f].size, block.frames[f].adler32}, b, f == 0});
      }
    }
    const std::vector<uint8_t> bytes = testing_support::ReadFixtureBytes(name);
    first_cluster = testing_support::FirstClusterOffset(bytes.data(), bytes.size());
    if (expect.cues.empty()) return;
    segment_data = first_cluster - expect.cues[0].cluster_position;
    for (const auto& cue : expect.cues) {
      const uint64_t position = cue.cluster_position + segment_data;
      if (!times.empty() && times.back() == cue.time_ticks * scale) {
        positions.back() = std::min(positions.back(), position);
        continue;
      }
      times.push_back(cue.time_ticks * scale);
      positions.push_back(position);
      cue_tracks.push_back(cue.track);
    }
  }

  // The cue point that a forward (backward) seek or scan to t chooses.
  size_t Forward(uint64_t t) const { return testing_support::ChosenCue(times, t, true); }
  size_t Backward(uint64_t t) const { return testing_support::ChosenCue(times, t, false); }
  // Index in `track`'s frames of its first frame in the Cluster of cue point
  // `cue`: a Cluster opens with its cue track's block at the cue time.
  size_t FirstFrameInCluster(uint64_t track, size_t cue) const {
    size_t start = 0;
    while (start < expect.blocks.size() &&
           !(expect.blocks[start].track == cue_tracks[cue] && uint64_t(expect.blocks[start].ticks) * scale == times[cue])) {
      ++start;
    }
    const auto& frames = tracks.at(track);
    size_t i = 0;
    while (i < frames.size() && frames[i].block < start) ++i;
    return i;
  }

  FixtureExpectation expect;
  uint64_t scale = 0, first_cluster = 0, segment_data = 0;
  std::map<uint64_t, std::vector<Listed>> tracks;
  std::vector<uint64_t> times, positions, cue_tracks;
};

// "" when `got` is listed[from...] in order (all of it to the end when
// `to_end`), else the first difference.
inline std::string Follows(const std::vector<host::RunFrame>& got, const std::vector<Listed>& listed, size_t from,
                           bool to_end) {
  const size_t end = to_end ? listed.size() : std::min(listed.size(), from + got.size());
  return FirstDifference(AsFrames(got), std::vector<Frame>(listed.begin() + ptrdiff_t(std::min(from, end)),
                                                           listed.begin() + ptrdiff_t(end)));
}

}  // namespace playback_test
