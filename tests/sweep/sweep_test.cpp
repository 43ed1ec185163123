// Sweeps of small fixtures through a real graph (streamer → kelvane → sinks):
// every input buffer size, every split point of the smallest, truncations,
// flipped bits, overwritten block and lace header bytes, and failed
// allocations. Each case must end (a watchdog aborts a hung run), and the
// sanitizers of the asan build watch for the rest.
//
// KELVANE_SWEEP=quick (the default of a cross build run under an emulator)
// limits the sweeps to the two smallest fixtures and wider strides.

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <ostream>
#include <fstream>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "host/graph_runner.h"
#include "host/heap_control.h"
#include "host/log_control.h"
#include "tests/support/fixtures.h"
#include "tests/support/plugin_under_test.h"

namespace {

const host::Plugin& HostPlugin() {
  host::SetLogThreshold(0);  // the damaged files' complaints are expected
  return plugin_test::HostPlugin();
}

bool Quick() {
  const char* mode = std::getenv("KELVANE_SWEEP");
  if (mode && *mode) return std::string(mode) == "quick";
  return KELVANE_SWEEP_QUICK != 0;
}

// Aborts the process when one case runs longer than the bound: a hang is a fault.
class Watchdog {
 public:
  explicit Watchdog(int seconds) : thread_([this, seconds] { Watch(seconds); }) {}
  ~Watchdog() {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      done_ = true;
    }
    wake_.notify_all();
    thread_.join();
  }
  void Arm(const std::string& what) {
    std::lock_guard<std::mutex> lock(mutex_);
    what_ = what;
    ++generation_;
  }

 private:
  void Watch(int seconds) {
    std::unique_lock<std::mutex> lock(mutex_);
    uint64_t seen = generation_;
    while (!done_) {
      if (!wake_.wait_for(lock, std::chrono::seconds(seconds), [&] { return done_ || generation_ != seen; })) {
        std::fprintf(stderr, "sweep case did not end within %d s: %s\n", seconds, what_.c_str());
        std::abort();
      }
      seen = generation_;
    }
  }

  std::mutex mutex_;
  std::condition_variable wake_;
  std::string what_;
  uint64_t generation_ = 0;
  bool done_ = false;
  std::thread thread_;
};

std::string WriteTemp(const std::vector<uint8_t>& bytes) {
  static int counter = 0;
  std::string path = testing::TempDir() + "kelvane_sweep_" + std::to_string(getpid()) + "_" +
                     std::to_string(counter++) + ".mkv";
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
  return path;
}

// A scratch file that the sweeps rewrite for every case.
class Scratch {
 public:
  Scratch() : path_(WriteTemp({})) {}
  ~Scratch() { std::remove(path_.c_str()); }
  const std::string& Write(const std::vector<uint8_t>& bytes) {
    std::ofstream out(path_, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
    return path_;
  }

 private:
  std::string path_;
};

host::RunResult Play(const std::string& path, uint32_t buffer_size) {
  host::RunnerOptions options;
  options.input_buffer_size = buffer_size;
  return host::RunGraph(HostPlugin(), path, options);
}

bool SameFrame(const host::RunFrame& a, const host::RunFrame& b) {
  return a.time_us == b.time_us && a.size == b.size && a.adler32 == b.adler32;
}

// Every channel delivered a prefix of the full run's frames of that channel.
void ExpectPrefixes(const host::RunResult& full, const host::RunResult& part, const std::string& what) {
  if (part.channels.empty()) return;  // refused, or set-up failed before any channel
  ASSERT_LE(part.channels.size(), full.channels.size()) << what;
  for (size_t c = 0; c < part.channels.size(); ++c) {
    const auto& want = full.channels[c].frames;
    const auto& got = part.channels[c].frames;
    ASSERT_LE(got.size(), want.size()) << what << ", channel " << c;
    for (size_t i = 0; i < got.size(); ++i) {
      ASSERT_TRUE(SameFrame(got[i], want[i])) << what << ", channel " << c << ", frame " << i;
    }
  }
}

void ExpectSameRun(const host::RunResult& full, const host::RunResult& run, const std::string& what) {
  ASSERT_TRUE(run.ok) << what << ": " << run.error;
  ASSERT_EQ(run.channels.size(), full.channels.size()) << what;
  for (size_t c = 0; c < run.channels.size(); ++c) {
    const host::ChannelRun& want = full.channels[c];
    const host::ChannelRun& got = run.channels[c];
    ASSERT_EQ(got.config.size(), want.config.size()) << what << ", channel " << c;
    for (size_t i = 0; i < got.config.size(); ++i) {
      ASSERT_TRUE(SameFrame(got.config[i], want.config[i])) << what << ", channel " << c << ", config " << i;
    }
    ASSERT_EQ(got.frames.size(), want.frames.size()) << what << ", channel " << c;
    for (size_t i = 0; i < got.frames.size(); ++i) {
      ASSERT_TRUE(SameFrame(got.frames[i], want.frames[i])) << what << ", channel " << c << ", frame " << i;
    }
    EXPECT_FALSE(got.incomplete_frame) << what << ", channel " << c;
  }
}

host::RunResult FullRun(const std::string& name) {
  host::RunResult full = Play(std::string(KELVANE_FIXTURE_DIR) + "/" + name + ".mkv", 1u << 20);
  EXPECT_TRUE(full.ok) << name << ": " << full.error;
  size_t frames = 0;
  for (const auto& channel : full.channels) frames += channel.frames.size();
  EXPECT_GT(frames, 0u) << name;
  return full;
}

// EBML reading for locating blocks: a variable-size integer at `pos`.
bool ReadVint(const std::vector<uint8_t>& b, size_t pos, bool keep_marker, uint64_t* value, size_t* length) {
  if (pos >= b.size() || b[pos] == 0) return false;
  size_t len = 1;
  while (!(b[pos] & (0x80 >> (len - 1)))) ++len;
  if (pos + len > b.size()) return false;
  uint64_t v = keep_marker ? b[pos] : (b[pos] & (0xFF >> len));
  for (size_t i = 1; i < len; ++i) v = (v << 8) | b[pos + i];
  *value = v;
  *length = len;
  return true;
}

// Byte ranges [start, end) of every SimpleBlock's and Block's element header,
// block header and lace header (cut at 24 bytes of the block's data).
std::vector<std::pair<size_t, size_t>> BlockHeaders(const std::vector<uint8_t>& b) {
  std::vector<std::pair<size_t, size_t>> out;
  std::vector<std::pair<size_t, size_t>> ranges = {{0, b.size()}};
  while (!ranges.empty()) {
    auto [pos, end] = ranges.back();
    ranges.pop_back();
    while (pos < end) {
      uint64_t id = 0, size = 0;
      size_t id_len = 0, size_len = 0;
      if (!ReadVint(b, pos, true, &id, &id_len) || !ReadVint(b, pos + id_len, false, &size, &size_len)) break;
      size_t data = pos + id_len + size_len;
      size_t data_end = size > end - std::min(end, data) ? end : data + static_cast<size_t>(size);
      if (id == 0x18538067 || id == 0x1F43B675 || id == 0xA0) {  // Segment, Cluster, BlockGroup
        ranges.push_back({data, data_end});
      } else if (id == 0xA3 || id == 0xA1) {  // SimpleBlock, Block
        out.push_back({pos, std::min(data_end, data + 24)});
      }
      pos = data_end;
    }
  }
  return out;
}

struct SweepFixture {
  const char* name;
  bool quick;  // one of the two smallest, swept also in quick mode
};

void PrintTo(const SweepFixture& fixture, std::ostream* out) { *out << fixture.name; }

constexpr SweepFixture kFixtures[] = {
    {"tiny_avc", true},
    {"tiny_lace_ebml", true},
    {"lace_fixed", false},
    {"subtitles_srt", false},
};

class SweepTest : public testing::TestWithParam<SweepFixture> {
 protected:
  void SetUp() override {
    if (Quick() && !GetParam().quick) GTEST_SKIP() << "quick sweep: the two smallest fixtures only";
    bytes_ = testing_support::ReadFixtureBytes(GetParam().name);
    ASSERT_FALSE(bytes_.empty());
    full_ = FullRun(GetParam().name);
    ASSERT_TRUE(full_.ok);
  }
  bool Smallest() const { return std::string(GetParam().name) == "tiny_avc"; }
  size_t Stride(size_t smallest, size_t others) const {
    size_t stride = Smallest() ? smallest : others;
    return Quick() ? stride * 4 + 1 : stride;
  }

  std::vector<uint8_t> bytes_;
  host::RunResult full_;
  Scratch scratch_;
  Watchdog watchdog_{120};
};

TEST_P(SweepTest, EveryInputBufferSizeDeliversTheSameFrames) {
  const std::string path = std::string(KELVANE_FIXTURE_DIR) + "/" + GetParam().name + ".mkv";
  std::vector<uint32_t> sizes;
  for (uint32_t k = 1; k <= 64; ++k) sizes.push_back(k);
  for (uint32_t k = 65; k < bytes_.size(); k = k * 9 / 8 + 7) sizes.push_back(k);
  if (Quick()) sizes = {1, 2, 3, 5, 7, 13, 16, 31, 64, 100, 333, 1000, 4096};
  for (uint32_t k : sizes) {
    const std::string what = "input buffers of " + std::to_string(k) + " bytes";
    watchdog_.Arm(std::string(GetParam().name) + ", " + what);
    ExpectSameRun(full_, Play(path, k), what);
    if (HasFatalFailure()) return;
  }
}

// Two buffers, the first ending at every byte after the first Cluster's
// start: each split point on its own, including those inside element IDs,
// sizes, block headers and lace tables. The smallest fixtures only.
TEST_P(SweepTest, EverySplitPointDeliversTheSameFrames) {
  if (!GetParam().quick) GTEST_SKIP() << "every split point: the two smallest fixtures only";
  const std::string path = std::string(KELVANE_FIXTURE_DIR) + "/" + GetParam().name + ".mkv";
  const auto whole = static_cast<uint32_t>(bytes_.size());
  for (uint32_t first = 1; first < whole; first += static_cast<uint32_t>(Stride(1, 1))) {
    const std::string what = "a first buffer of " + std::to_string(first) + " bytes";
    watchdog_.Arm(std::string(GetParam().name) + ", " + what);
    host::RunnerOptions options;
    options.input_buffer_size = whole;
    options.first_input_buffer_size = first;
    ExpectSameRun(full_, host::RunGraph(HostPlugin(), path, options), what);
    if (HasFatalFailure()) return;
  }
}

TEST_P(SweepTest, EveryTruncationDeliversAPrefixOfTheFrames) {
  const size_t stride = Stride(1, 7);
  for (size_t length = 0; length < bytes_.size(); length += stride) {
    const std::string what = "first " + std::to_string(length) + " bytes";
    watchdog_.Arm(std::string(GetParam().name) + ", " + what);
    std::vector<uint8_t> cut(bytes_.begin(), bytes_.begin() + static_cast<ptrdiff_t>(length));
    host::RunResult run = Play(scratch_.Write(cut), 4096);
    ExpectPrefixes(full_, run, what);
    if (HasFatalFailure()) return;
  }
}

TEST_P(SweepTest, EveryFlippedBitEnds) {
  const size_t stride = Stride(3, 29);  // 3 and 29 visit every bit position of a byte
  const size_t bits = std::min<size_t>(bytes_.size(), 4096) * 8;
  for (size_t bit = 0; bit < bits; bit += stride) {
    const std::string what = "bit " + std::to_string(bit) + " flipped";
    watchdog_.Arm(std::string(GetParam().name) + ", " + what);
    std::vector<uint8_t> flipped = bytes_;
    flipped[bit / 8] ^= static_cast<uint8_t>(0x80 >> (bit % 8));
    host::RunResult run = Play(scratch_.Write(flipped), 4096);
    for (const host::ChannelRun& channel : run.channels) {
      EXPECT_EQ(channel.foreign_elements, 0u) << what;
    }
  }
}

TEST_P(SweepTest, EveryBlockHeaderByteOverwrittenEnds) {
  const auto headers = BlockHeaders(bytes_);
  ASSERT_FALSE(headers.empty());
  size_t block_count = 0;
  for (const auto& channel : full_.channels) block_count += channel.frames.size();
  EXPECT_GE(block_count, headers.size() / 2);  // the walker found the blocks, not noise
  const size_t block_stride = Quick() ? 3 : 1;
  for (size_t h = 0; h < headers.size(); h += block_stride) {
    for (size_t pos = headers[h].first; pos < headers[h].second; ++pos) {
      for (uint8_t value : {0x00, 0x01, 0x7F, 0x80, 0xFE, 0xFF}) {
        if (bytes_[pos] == value) continue;
        const std::string what = "byte " + std::to_string(pos) + " set to " + std::to_string(value);
        watchdog_.Arm(std::string(GetParam().name) + ", " + what);
        std::vector<uint8_t> changed = bytes_;
        changed[pos] = value;
        host::RunResult run = Play(scratch_.Write(changed), 4096);
        for (const host::ChannelRun& channel : run.channels) {
          EXPECT_EQ(channel.foreign_elements, 0u) << what;
        }
      }
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Fixtures, SweepTest, testing::ValuesIn(kFixtures),
                         [](const testing::TestParamInfo<SweepFixture>& info) { return info.param.name; });

// Rating and a short playback of tiny_avc with the 1st, 2nd, ... host
// allocation failing in turn, until a run makes fewer allocations than the
// failing one: each run ends with a refusal, a channel's error or the whole
// run, delivers only frames of the full run, and frees every block it took.
TEST(SweepAllocationTest, EveryFailedAllocationEndsWithoutLeaking) {
  const std::string path = std::string(KELVANE_FIXTURE_DIR) + "/tiny_avc.mkv";
  const host::RunResult full = FullRun("tiny_avc");
  ASSERT_TRUE(full.ok);
  Watchdog watchdog(120);
  bool completed = false;
  uint64_t n = 1;
  for (; !completed && n < 20000; ++n) {
    const std::string what = "allocation " + std::to_string(n) + " failing";
    watchdog.Arm(what);
    const int64_t live = host::LiveBlockCount();
    const uint64_t before = host::AllocationCount();
    host::FailNthAllocation(n);
    host::RunResult run = Play(path, 1000);
    host::FailNthAllocation(0);
    completed = host::AllocationCount() - before < n;
    EXPECT_EQ(host::LiveBlockCount(), live) << what;
    if (completed) {
      ExpectSameRun(full, run, what);
      break;
    }
    if (run.rating == 0) {
      EXPECT_TRUE(run.channels.empty()) << what;
    } else {
      EXPECT_EQ(run.rating, 80) << what;
      for (const host::ChannelRun& channel : run.channels) {
        EXPECT_TRUE(channel.end_result == 2 || channel.end_result == 1) << what << ": " << channel.end_result;
      }
    }
    ExpectPrefixes(full, run, what);
    if (HasFatalFailure()) return;
  }
  EXPECT_TRUE(completed) << "still failing after " << n << " allocations";
  EXPECT_GT(n, 20u) << "rating and playback take more than a few allocations";
}

}  // namespace
