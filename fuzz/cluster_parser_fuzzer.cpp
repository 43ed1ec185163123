// The playback parser over arbitrary bytes, fed as the output path feeds it:
// consecutive buffers whose sizes come from the input, skips applied, frames
// consumed by their sizes. Every result must be a declared one, no fixed
// capacity may be exceeded, every block allocated must be freed again, and
// when the same bytes also parse completely in one buffer, the block lists
// must agree.
//
// Input: a flags byte, 1 to 8 buffer-size bytes, one allocation-failure byte,
// then the file. Seeds: tests/fixtures/*.mkv behind a prefix such as
// "\x01\x07\x00" (group tails read, buffers of 7 bytes, no failure).

#include <cstdint>
#include <cstdlib>
#include <vector>

#include "core/cluster/cluster_status.h"
#include "core/cluster/mkv_cluster.h"
#include "host/heap_control.h"
#include "host/log_control.h"
#include "tests/support/cluster_driver.h"

namespace {

void Check(bool condition) {
  if (!condition) std::abort();
}

// 0..127 as they are, above that in steps of 64 up to 8192.
size_t BufferSize(uint8_t code) { return code < 128 ? code : static_cast<size_t>(code - 127) * 64; }

void CheckRecord(int result, const mkvcluster& c, bool group_tail) {
  if (group_tail) {
    Check(result == kClusterBlockReady || result == kClusterChildShort || result == kClusterInvalid ||
          result == kClusterNoMemory || result == kClusterGroupEnded);
  } else {
    Check(result <= kClusterBlockReady && result >= kClusterNoMemory);
  }
  if (result == kClusterBlockReady) {
    Check(c.frame_count >= 1 && c.frame_count <= kMaxLaceFrames && c.frame_sizes != nullptr);
    Check(c.resume.step == mkv_resume_step::none);
  } else {
    Check(c.frame_sizes == nullptr || c.frame_count >= 1);
  }
  Check(c.resume.lace_count <= kMaxLaceFrames && c.resume.lace_index < kMaxLaceFrames);
  Check(c.resume.number.left <= 8 && c.resume.number.length <= 8);
  Check(c.codec_state_size <= kMaxCodecStateSize && (c.codec_state == nullptr) == (c.codec_state_size == 0));
  Check(c.in_blockgroup <= 1);
}

bool SameBlocks(const testing_support::DriveOutcome& a, const testing_support::DriveOutcome& b, bool keys) {
  if (a.blocks.size() != b.blocks.size()) return false;
  for (size_t i = 0; i < a.blocks.size(); ++i) {
    const auto& x = a.blocks[i];
    const auto& y = b.blocks[i];
    if (x.track != y.track || x.ticks != y.ticks || x.flags != y.flags || x.frame_sizes != y.frame_sizes ||
        x.adler32 != y.adler32 || (keys && x.key != y.key)) {
      return false;
    }
  }
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static bool quiet = (host::SetLogThreshold(0), true);
  (void)quiet;
  if (size < 3) return 0;
  uint8_t flags = data[0];
  size_t size_count = 1 + (flags >> 2 & 7);
  if (size < 2 + size_count) return 0;
  testing_support::DriveOptions options;
  options.read_group_tail = flags & 1;
  options.observe = CheckRecord;
  options.buffer_sizes.clear();
  for (size_t i = 0; i < size_count; ++i) options.buffer_sizes.push_back(BufferSize(data[1 + i]));
  uint8_t fail_at = data[1 + size_count];
  const uint8_t* file = data + 2 + size_count;
  size_t file_size = size - 2 - size_count;
  uint64_t start = flags & 2 ? 0 : testing_support::FirstClusterOffset(file, file_size);
  if (start >= file_size) start = 0;

  int64_t live = host::LiveBlockCount();
  host::FailNthAllocation(fail_at);
  auto split = testing_support::DriveClusters(file, file_size, start, options);
  host::FailNthAllocation(0);
  Check(host::LiveBlockCount() == live);

  testing_support::DriveOptions whole_options = options;
  whole_options.buffer_sizes = {file_size};
  auto whole = testing_support::DriveClusters(file, file_size, start, whole_options);
  Check(host::LiveBlockCount() == live);
  if (fail_at == 0 && split.complete && whole.complete) Check(SameBlocks(split, whole, options.read_group_tail));
  return 0;
}
