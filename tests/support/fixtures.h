#pragma once
// The real Matroska files in tests/fixtures and the facts that mkvinfo and
// ffprobe report about them (written by tests/fixtures/make_fixtures.sh):
// NAME.mkv, NAME.expected, NAME.cues and NAME.blocks, listed in index.txt
// (and NAME.frames for a track stored with header removal).

#include <cstddef>
#include <cstdint>
#include <map>
#include <string>
#include <utility>
#include <vector>

#include "tests/support/adler32.h"

namespace testing_support {

// One TrackEntry. Keys absent from the file's line keep their zero defaults;
// `fields` holds every key=value token exactly as written (also the keys that
// have no typed member, such as display_width or compression).
struct ExpectedTrack {
  uint64_t number = 0;
  std::string type, codec;  // type: video, audio, subtitles or other
  uint32_t codec_private_size = 0;
  uint64_t width = 0, height = 0, default_duration = 0;  // default_duration in ns
  uint64_t channels = 0;
  uint32_t sar_num = 0, sar_den = 0, flac_sample_rate = 0, flac_channels = 0, flac_bits = 0;
  std::map<std::string, std::string> fields;
};

// One CueTrackPositions; cluster_position is relative to the Segment's data,
// block_number is 1 when the file has none.
struct ExpectedCue {
  uint64_t time_ticks, track, cluster_position, block_number;
};

struct ExpectedFrame {
  uint32_t size;
  uint32_t adler32;
};

// One SimpleBlock or Block in a BlockGroup. ticks = Cluster timecode + the
// block's relative timecode, in TimecodeScale units. (The list's kind and key
// columns are checked for form only: no test reads them yet.)
struct ExpectedBlock {
  uint64_t track;
  int64_t ticks;
  std::vector<ExpectedFrame> frames;  // in lace order
};

struct FixtureExpectation {
  std::string name, doc_type;
  uint64_t timecode_scale = 0, duration_ns = 0, file_size = 0;
  std::vector<ExpectedTrack> tracks;  // in file order
  uint64_t damaged_at = 0;  // the first byte the recipe zeroed, or the length it cut the file to; 0: none
  std::vector<ExpectedCue> cues;
  std::vector<std::pair<std::string, std::string>> tags;  // every SimpleTag: name, string
  std::vector<ExpectedBlock> blocks;                       // in file order
};

// FILE in the fixture directory: $KELVANE_FIXTURES when set (drawn remuxes
// are played that way), else the committed tests/fixtures.
std::string FixturePath(const std::string& file);

// Fixture names in the order of index.txt.
std::vector<std::string> FixtureNames();

// Reads NAME.expected, NAME.cues and NAME.blocks. A missing file or a
// malformed line is reported with ADD_FAILURE (file and line named).
FixtureExpectation LoadFixture(const std::string& name);

// Reads NAME.frames, written only for a fixture whose track is stored with
// header removal: its frames as a player must see them once the removed
// prefix is put back (size and Adler-32 that mkvinfo reported for the file
// before the prefix was removed), in file order, one block each. Failures are
// reported as LoadFixture reports them.
std::vector<ExpectedBlock> LoadFullFrames(const std::string& name);

// The whole NAME.mkv; empty (with ADD_FAILURE) when it cannot be read.
std::vector<uint8_t> ReadFixtureBytes(const std::string& name);

}  // namespace testing_support
