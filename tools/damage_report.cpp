#include "tools/damage_report.h"

#include <algorithm>
#include <cinttypes>
#include <cstdio>

#include "platform/mmf_status.h"

namespace {

constexpr uint8_t kClusterId[4] = {0x1F, 0x43, 0xB6, 0x75};

// An EBML variable-size number at `bytes`: its length, or 0 when it has none.
int NumberLength(uint8_t first) {
  for (int length = 1; length <= 8; ++length) {
    if (first & (0x80 >> (length - 1))) return length;
  }
  return 0;
}

uint64_t TrackOf(const host::ChannelRun& run, const std::vector<uint64_t>& tracks) {
  return static_cast<size_t>(run.index) < tracks.size() ? tracks[static_cast<size_t>(run.index)] : 0;
}

}  // namespace

bool EndsInsideCluster(const char* path, uint64_t first_cluster, uint64_t* cluster, uint64_t* size) {
  FILE* in = std::fopen(path, "rb");
  if (!in || fseeko(in, 0, SEEK_END) != 0) {
    if (in) std::fclose(in);
    return false;
  }
  *size = static_cast<uint64_t>(ftello(in));
  bool inside = false;
  for (uint64_t at = first_cluster; at < *size;) {
    uint8_t header[12] = {};
    if (fseeko(in, static_cast<off_t>(at), SEEK_SET) != 0) break;
    const size_t got = std::fread(header, 1, sizeof header, in);
    const int id_length = NumberLength(header[0]);
    const int size_length = id_length && id_length <= 4 && got > size_t(id_length) ? NumberLength(header[id_length]) : 0;
    if (!size_length || got < size_t(id_length + size_length)) break;
    uint64_t length = header[id_length] & (0xFFu >> size_length);
    for (int i = 1; i < size_length; ++i) length = length << 8 | header[id_length + i];
    const uint64_t data = at + static_cast<uint64_t>(id_length + size_length);
    if (length > *size - std::min(data, *size)) {
      inside = id_length == 4 && std::equal(header, header + 4, kClusterId);
      *cluster = at;
      break;
    }
    at = data + length;
  }
  std::fclose(in);
  return inside;
}

bool ReportDamage(const char* command, const char* file, const host::RunResult& result,
                  const std::vector<uint64_t>& tracks) {
  bool damaged = false;
  for (const host::ChannelRun& run : result.channels) {
    const uint64_t track = TrackOf(run, tracks);
    for (const host::Gap& gap : run.gaps) {
      std::fprintf(stderr,
                   "kelvane %s: %s: channel %d (track %" PRIu64 ") failed on damaged input after byte %" PRIu64
                   "; no frames from %" PRIu64 " us to %" PRIu64 " us, then on from the next cue point\n",
                   command, file, run.index, track, gap.after_byte, gap.from_us, gap.to_us);
      damaged = true;
    }
    if (run.end_result == kMmfEndOfStream) continue;
    std::fprintf(stderr,
                 "kelvane %s: %s: channel %d (track %" PRIu64 ") stopped after %" PRIu64 " us, after byte %" PRIu64
                 " (answer %d)\n",
                 command, file, run.index, track, run.last_time_us, run.frame_end, run.end_result);
    damaged = true;
  }
  uint64_t cluster = 0, size = 0;
  if (!result.channels.empty() && EndsInsideCluster(file, result.first_cluster, &cluster, &size)) {
    std::fprintf(stderr, "kelvane %s: %s: the file ended prematurely, at byte %" PRIu64 " inside the Cluster at byte %" PRIu64
                 "\n", command, file, size, cluster);
    damaged = true;
  }
  return damaged;
}
