// Every fixture played end to end through a real graph (streamer → kelvane →
// one sink per acquired channel) against the frames mkvinfo lists for it: at
// several input buffer sizes with every channel and each alone, the tool's way
// (no checksums, the streamer reading ahead, the channels on one core), with
// sinks at different speeds on their own threads (run under ThreadSanitizer),
// and, for the small files, in buffers of every size up to 64 bytes and split
// at every byte. The small files are then damaged: every truncation, flipped
// bit, overwritten block or lace header byte and, for the smallest, every
// failed allocation must end (ctest's timeout fails a hung case) with no frame
// element outside the input and no block left allocated.
//
// KELVANE_FIXTURES names another fixture directory (drawn_remuxes.sh).
// KELVANE_SWEEP=quick (the default of a cross build run under an emulator)
// sweeps only the tiny files, with wider strides.

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "host/heap_control.h"
#include "host/log_control.h"
#include "tests/support/cluster_driver.h"
#include "tests/support/fixtures.h"
#include "tests/support/playback_expectations.h"
#include "tests/support/plugin_under_test.h"

namespace {

using namespace playback_test;

constexpr size_t kTiny = 7500;    // split at every byte; the only files swept in quick mode
constexpr size_t kSmall = 10000;  // every buffer size, truncation, flipped bit and header byte

bool Quick() {
  const char* mode = std::getenv("KELVANE_SWEEP");
  return mode && *mode ? std::string(mode) == "quick" : KELVANE_SWEEP_QUICK != 0;
}

// A consumer's room for the sinks' frames: a few at a time, so that the
// sinks run into its end often. Every frame must come back in place.
struct FrameRooms {
  static constexpr size_t kRoom = 5;
  host::RunFrame room[8][kRoom];
  std::vector<host::RunFrame> passed[8];
  bool elsewhere[8] = {};  // frames came from anywhere but the room (each channel's sink writes its own)

  static host::RunFrame* Room(void* user, int32_t channel, size_t* room) {
    *room = kRoom;
    return static_cast<FrameRooms*>(user)->room[channel];
  }
  static void OnFrames(void* user, int32_t channel, const host::RunFrame* frames, size_t count) {
    auto* rooms = static_cast<FrameRooms*>(user);
    rooms->elsewhere[channel] |= frames != rooms->room[channel] || count > kRoom;
    rooms->passed[channel].insert(rooms->passed[channel].end(), frames, frames + count);
  }
};

// Time, size, time mark and checksum of each frame; checksums as 0 where `checksum` is off.
auto Keys(const std::vector<host::RunFrame>& frames, bool checksum = true) {
  std::vector<std::tuple<uint64_t, uint32_t, bool, uint32_t>> keys;
  for (const host::RunFrame& f : frames) keys.emplace_back(f.time_us, f.size, f.marked, checksum ? f.adler32 : 0);
  return keys;
}

class ConformanceTest : public testing::TestWithParam<std::string> {
 protected:
  void SetUp() override {
    host::SetLogThreshold(0);  // the damaged files' complaints are expected
    name_ = GetParam();
    path_ = testing_support::FixturePath(name_ + ".mkv");
    fixture_ = testing_support::LoadFixture(name_);
    offered_ = OfferedTracks(fixture_);
    bytes_ = testing_support::ReadFixtureBytes(name_);
    refused_ = fixture_.doc_type != "matroska" || offered_.empty();
  }
  // `recover`: past damage, from the next cue point; else a failure ends the run.
  static host::RunnerOptions Options(uint32_t buffer_size, bool recover = true) {
    host::RunnerOptions options;
    options.input_buffer_size = buffer_size;
    options.catch_up = recover;
    options.recoveries = recover ? 4 : 0;
    return options;
  }
  host::RunResult Play(const host::RunnerOptions& options, const std::string& path = "") {
    return host::RunGraph(plugin_test::HostPlugin(), path.empty() ? path_ : path, options);
  }
  // The listed frames, and the same decoder configuration packets in every run.
  void Check(const host::RunResult& run) {
    CheckRun(name_, fixture_, offered_, run);
    for (const host::ChannelRun& channel : run.channels) {
      std::vector<Frame> config = AsFrames(channel.config);
      EXPECT_EQ(config_.emplace(channel.index, config).first->second, config) << "channel " << channel.index;
    }
  }
  bool Swept(size_t limit) const { return !refused_ && bytes_.size() <= (Quick() ? std::min(limit, kTiny) : limit); }
  size_t Stride(size_t smallest, size_t others) const {
    const size_t stride = bytes_.size() <= 4096 ? smallest : others;
    return Quick() ? stride * 4 + 1 : stride;
  }
  host::RunResult FullRun() {
    host::RunResult full = Play(Options(1u << 20, false));
    size_t frames = 0;
    for (const auto& channel : full.channels) frames += channel.frames.size();
    EXPECT_TRUE(full.ok && frames > 0) << name_ << ": " << full.error;
    return full;
  }
  // Every channel delivered a prefix of the full run's frames of that channel.
  static void ExpectPrefixes(const host::RunResult& full, const host::RunResult& part, const std::string& what) {
    ASSERT_LE(part.channels.size(), full.channels.size()) << what;
    for (size_t c = 0; c < part.channels.size(); ++c) {
      const std::vector<Frame> want = AsFrames(full.channels[c].frames), got = AsFrames(part.channels[c].frames);
      ASSERT_LE(got.size(), want.size()) << what << ", channel " << c;
      EXPECT_TRUE(std::equal(got.begin(), got.end(), want.begin())) << what << ", channel " << c;
    }
  }
  // Plays `changed` from a scratch file: it must end with no frame element
  // outside the input, and when `full` is given, deliver a prefix of its frames.
  void PlayDamaged(const std::vector<uint8_t>& changed, const std::string& what, const host::RunResult* full) {
    const std::string scratch = testing::TempDir() + "kelvane_damaged_" + std::to_string(getpid()) + ".mkv";
    std::ofstream(scratch, std::ios::binary | std::ios::trunc)
        .write(reinterpret_cast<const char*>(changed.data()), static_cast<std::streamsize>(changed.size()));
    const host::RunResult run = Play(Options(4096, false), scratch);
    std::remove(scratch.c_str());
    for (const host::ChannelRun& channel : run.channels) EXPECT_EQ(channel.foreign_elements, 0u) << what;
    if (full) ExpectPrefixes(*full, run, what);
  }

  std::string name_, path_;
  FixtureExpectation fixture_;
  std::vector<uint64_t> offered_;
  std::vector<uint8_t> bytes_;
  bool refused_ = false;
  std::map<int32_t, std::vector<Frame>> config_;  // per channel index, from its first run
};

// With several tracks, also each channel acquired alone; the tool plays
// without checksums another way (sinks take whole frames on a short path and
// gather them in the tool's own room), and each channel gets the same frames.
TEST_P(ConformanceTest, DeliversTheListedFramesAtEveryBufferSize) {
  if (refused_) {
    const host::RunResult refused = Play({});
    EXPECT_EQ(refused.rating, 0);
    EXPECT_TRUE(refused.channels.empty());
    return;
  }
  std::vector<uint32_t> sizes = {1000, 4096, 32768, 65536, 1u << 20};
  const size_t standard = sizes.size();
  if (Swept(kSmall) && Quick()) sizes.insert(sizes.end(), {1, 2, 3, 5, 7, 13, 16, 31, 64, 100, 333});
  for (uint32_t k = 1; Swept(kSmall) && !Quick() && k < bytes_.size(); k = k < 64 ? k + 1 : k * 9 / 8 + 7) {
    sizes.push_back(k);
  }
  for (size_t s = 0; s < sizes.size(); ++s) {
    SCOPED_TRACE("input buffers of " + std::to_string(sizes[s]) + " bytes");
    host::RunnerOptions options = Options(sizes[s]);
    const host::RunResult all = Play(options);
    Check(all);
    for (int32_t only = 0; s < standard && offered_.size() > 1 && only < int32_t(offered_.size()); ++only) {
      SCOPED_TRACE("only channel " + std::to_string(only) + " acquired");
      options.channels = {only};
      Check(Play(options));
    }
    if (sizes[s] != 1000 && sizes[s] != 65536) continue;
    SCOPED_TRACE("the tool's way");
    host::RunnerOptions tool = Options(sizes[s]);
    tool.checksum = false;
    tool.read_ahead = tool.channels_share_core = true;
    auto rooms = std::make_unique<FrameRooms>();
    tool.user = rooms.get();
    tool.frame_room = FrameRooms::Room;
    tool.on_frames = FrameRooms::OnFrames;
    const host::RunResult got = Play(tool);
    EXPECT_EQ(std::count(std::begin(rooms->elsewhere), std::end(rooms->elsewhere), true), 0);
    ASSERT_EQ(got.ok, all.ok) << got.error;
    ASSERT_EQ(got.channels.size(), all.channels.size());
    for (size_t k = 0; k < got.channels.size(); ++k) {
      SCOPED_TRACE("channel " + std::to_string(k));
      const host::ChannelRun &a = got.channels[k], &b = all.channels[k];
      // Which frames a failing channel loses with its output buffer depends on where it stood.
      if (!a.gaps.empty() || !b.gaps.empty()) continue;
      ASSERT_LT(k, std::size(rooms->passed));
      EXPECT_EQ(Keys(a.frames), Keys(b.frames, false));
      EXPECT_EQ(Keys(rooms->passed[k]), Keys(a.frames));
      EXPECT_EQ(std::make_tuple(a.frame_count, a.last_time_us, a.config.size(), a.foreign_elements, a.incomplete_frame,
                                a.time_markers),
                std::make_tuple(b.frame_count, b.last_time_us, b.config.size(), b.foreign_elements, b.incomplete_frame,
                                b.time_markers));
    }
  }
}

// Two buffers, the first ending at every byte: each split point on its own,
// including those inside element IDs, sizes, block headers and lace tables.
TEST_P(ConformanceTest, DeliversTheListedFramesSplitAtEveryByte) {
  if (!Swept(kTiny)) GTEST_SKIP() << "split at every byte: the tiny files only";
  const auto whole = static_cast<uint32_t>(bytes_.size());
  for (uint32_t first = 1; first < whole; first += static_cast<uint32_t>(Stride(1, 1))) {
    SCOPED_TRACE("a first buffer of " + std::to_string(first) + " bytes");
    host::RunnerOptions options = Options(whole);
    options.first_input_buffer_size = first;
    Check(Play(options));
    if (HasFatalFailure()) return;
  }
}

// A slow sink sleeps after each buffer while the fast channels fill the ring
// and wait for room until it moves past the tail (files larger than 39 input
// buffers of 1000 bytes fill it); with the streamer reading ahead and the
// channels on one core too.
TEST_P(ConformanceTest, ChannelsAtDifferentSpeedsEachGetTheirWholeTrack) {
  if (refused_ || offered_.size() < 2 || bytes_.size() < 39000) GTEST_SKIP() << "one channel, or too short to fill the ring";
  for (int slow : {0, 1, 2}) {
    SCOPED_TRACE(slow == 0 ? "the first channel slow" : slow == 1 ? "the last channel slow" : "the tool's way");
    host::RunnerOptions options = Options(1000);
    options.sink_delay_us.assign(offered_.size(), 0);
    options.sink_delay_us[slow == 1 ? offered_.size() - 1 : 0] = 3000;
    options.read_ahead = options.channels_share_core = slow == 2;
    Check(Play(options));
  }
}

// Byte ranges [start, end) of every SimpleBlock's and Block's element header,
// block header and lace header (cut at 24 bytes of the block's data).
std::vector<std::pair<size_t, size_t>> BlockHeaders(const std::vector<uint8_t>& b) {
  using testing_support::cluster_driver_detail::read_vint;
  std::vector<std::pair<size_t, size_t>> out;
  std::vector<std::pair<uint64_t, uint64_t>> ranges = {{0, b.size()}};
  while (!ranges.empty()) {
    auto [pos, end] = ranges.back();
    ranges.pop_back();
    while (pos < end) {
      uint64_t start = pos, id = 0, size = 0;
      if (!read_vint(b.data(), b.size(), &pos, &id, true) || !read_vint(b.data(), b.size(), &pos, &size, false)) break;
      const uint64_t data_end = size > end - std::min(end, pos) ? end : pos + size;
      if (id == 0x18538067 || id == 0x1F43B675 || id == 0xA0) {  // Segment, Cluster, BlockGroup
        ranges.push_back({pos, data_end});
      } else if (id == 0xA3 || id == 0xA1) {  // SimpleBlock, Block
        out.push_back({start, std::min(data_end, pos + 24)});
      }
      pos = data_end;
    }
  }
  return out;
}

// Every truncation delivers a prefix of the full run's frames; every flipped bit and every
// overwritten byte of a block or lace header ends.
TEST_P(ConformanceTest, EveryTruncationFlippedBitAndOverwrittenHeaderByteEnds) {
  if (!Swept(kSmall)) GTEST_SKIP() << "the small files only";
  const host::RunResult full = FullRun();
  for (size_t length = 0; length < bytes_.size() && !HasFatalFailure(); length += Stride(1, 7)) {
    PlayDamaged({bytes_.begin(), bytes_.begin() + ptrdiff_t(length)}, "first " + std::to_string(length) + " bytes", &full);
  }
  const size_t bits = std::min<size_t>(bytes_.size(), 4096) * 8;
  for (size_t bit = 0; bit < bits; bit += Stride(3, 29)) {  // 3 and 29 visit every bit position of a byte
    std::vector<uint8_t> flipped = bytes_;
    flipped[bit / 8] ^= static_cast<uint8_t>(0x80 >> (bit % 8));
    PlayDamaged(flipped, "bit " + std::to_string(bit) + " flipped", nullptr);
  }
  // Values that single flipped bits never give a size or lace count: zero, one, the largest.
  const auto headers = BlockHeaders(bytes_);
  ASSERT_EQ(headers.size(), fixture_.blocks.size());  // the walker found the blocks, not noise
  for (size_t h = 0; h < headers.size(); h += Quick() ? 3 : 1) {
    for (size_t pos = headers[h].first; pos < headers[h].second; ++pos) {
      for (uint8_t value : {0x00, 0x01, 0x7F, 0x80, 0xFE, 0xFF}) {
        if (bytes_[pos] == value) continue;
        std::vector<uint8_t> changed = bytes_;
        changed[pos] = value;
        PlayDamaged(changed, "byte " + std::to_string(pos) + " set to " + std::to_string(value), nullptr);
      }
    }
  }
}

// Rating and playback with the 1st, 2nd, ... host allocation failing in
// turn, until a run makes fewer allocations than the failing one: each run
// ends with a refusal, a channel's error or the whole run, delivers only
// frames of the full run, and frees every block it took.
TEST_P(ConformanceTest, EveryFailedAllocationEndsWithoutLeaking) {
  if (refused_ || bytes_.size() > 4096) GTEST_SKIP() << "the smallest files only";
  const host::RunResult full = FullRun();
  bool completed = false;
  uint64_t n = 1;
  for (; !completed && n < 20000; ++n) {
    const std::string what = "allocation " + std::to_string(n) + " failing";
    const int64_t live = host::LiveBlockCount();
    const uint64_t before = host::AllocationCount();
    host::FailNthAllocation(n);
    host::RunResult run = Play(Options(1000, false));
    host::FailNthAllocation(0);
    completed = host::AllocationCount() - before < n;
    EXPECT_EQ(host::LiveBlockCount(), live) << what;
    if (completed) {
      Check(run);
      break;
    }
    EXPECT_TRUE(run.rating == 0 ? run.channels.empty() : run.rating == 80) << what;
    for (const host::ChannelRun& channel : run.channels) {
      EXPECT_TRUE(channel.end_result == 2 || channel.end_result == 1) << what << ": " << channel.end_result;
    }
    ExpectPrefixes(full, run, what);
    if (HasFatalFailure()) return;
  }
  EXPECT_TRUE(completed) << "still failing after " << n << " allocations";
  EXPECT_GT(n, 20u) << "rating and playback take more than a few allocations";
}

INSTANTIATE_TEST_SUITE_P(Fixtures, ConformanceTest, testing::ValuesIn(testing_support::FixtureNames()),
                         [](const testing::TestParamInfo<std::string>& info) { return info.param; });

// Every fixture on disk is listed in index.txt once, so every one is played here.
TEST(FixtureIndexTest, ListsEveryFileOnce) {
  std::vector<std::string> names = testing_support::FixtureNames();
  std::set<std::string> listed(names.begin(), names.end()), on_disk;
  EXPECT_EQ(listed.size(), names.size());
  for (const auto& entry : std::filesystem::directory_iterator(testing_support::FixturePath("."))) {
    if (entry.path().extension() == ".mkv") on_disk.insert(entry.path().stem().string());
  }
  EXPECT_EQ(listed, on_disk);
}

}  // namespace
