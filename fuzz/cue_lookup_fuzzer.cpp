// Cue lookup and time/position conversion over cue tables made from the
// input: arbitrary times and cluster positions, unsorted, repeated, next to
// the 64-bit limits, or none at all; output channels with track numbers that
// may or may not match, acquired or not. The input then names queries
// (GetCueingPosition both ways, ConvertToPosition, ConvertToTime, Seek, the
// byte-rate estimate, a channel's acquisition toggled) with fuzzed times and
// positions. A small model of the search rules gives the one answer each
// query may have, and the messages it logs; the filter's must be exactly those.
//
// Input: flags (bit 0: the file has Cues, bit 1: EnablePreroll), timecode
// scale, Segment data position, first Cluster position, channel count (0-4)
// with each channel's track and acquired bit, cue count (0-63) with each
// cue's ticks and up to 4 positions (track, cluster, codec state), then
// queries of one op byte and one number each until the input ends.

#include <memory>
#include <string>
#include <vector>

#include "core/memory.h"
#include "core/queue.h"
#include "filter/cue_search.h"
#include "filter/mkv_context.h"
#include "filter/rating.h"
#include "filter/time_converter.h"
#include "fuzz/fuzz_input.h"
#include "tests/support/cue_rules.h"

namespace {

constexpr uint32_t kMaxCues = 63;
constexpr uint32_t kMaxPositionsPerCue = 4;
constexpr int32_t kMaxChannels = 4;
constexpr int kMaxQueries = 256;
constexpr int kNoConversion = 4002;
constexpr int kNoCueingData = 48;

using fuzz_input::Check;

// What the filter logged during the current query, as "level text".
std::vector<std::string> logged;

struct ModelPosition { uint64_t track, cluster; };
struct ModelCue { uint64_t ticks; std::vector<ModelPosition> positions; };
struct ModelChannel { uint64_t track; bool acquired; };

// The search and conversion rules over plain vectors, in list order, and the
// messages each logs.
struct Model {
  explicit Model(fuzz_input::Reader& in) {
    const uint8_t flags = in.Byte();
    has_cues = flags & 1;
    preroll = flags & 2;
    scale = in.Number();
    segment = in.Number();
    first_cluster = in.Number();
    for (int32_t k = in.Byte() % (kMaxChannels + 1); k > 0; --k) {
      const uint8_t b = in.Byte();
      channels.push_back({static_cast<uint64_t>(b & 7), (b & 8) != 0});
    }
    const uint32_t cue_count = in.Byte() % (kMaxCues + 1);
    for (uint32_t i = 0; i < cue_count && !in.empty(); ++i) {
      cues.push_back({in.Number(), {}});
      for (uint32_t j = in.Byte() % (kMaxPositionsPerCue + 1); j > 0; --j) {
        cues.back().positions.push_back({uint64_t{in.Byte()} & 7, in.Number()});  // read in this order
      }
    }
  }

  bool has_cues = false, preroll = false;
  uint64_t scale = 0, segment = 0, first_cluster = 0;
  std::vector<ModelCue> cues;
  std::vector<ModelChannel> channels;
  bool validated = false, all_tracks = false;
  uint64_t last_position_time = 0;
  std::vector<std::string> log;

  uint64_t Time(const ModelCue& cue) const { return cue.ticks * (scale / 1000); }

  // Once per table: when no position names an acquired channel's track, every channel's counts.
  void Validate() {
    if (validated) return;
    validated = all_tracks = true;
    for (const ModelCue& cue : cues) {
      for (const ModelPosition& p : cue.positions) {
        for (const ModelChannel& c : channels) all_tracks = all_tracks && !(c.acquired && c.track == p.track);
      }
    }
  }

  bool Counts(const ModelPosition& p) const {
    for (const ModelChannel& c : channels) {
      if (c.track == p.track) return c.acquired || all_tracks;
    }
    return false;
  }

  int Search(uint64_t* time, bool forward, uint64_t* position) {
    if (!has_cues) {
      log.push_back("5 kelvane: GetCueingPosition no cueing data.");
      return kNoCueingData;
    }
    *position = kNoCuePosition;
    Validate();
    if (cues.empty()) return 0;
    std::vector<uint64_t> times;
    for (const ModelCue& cue : cues) times.push_back(Time(cue));
    const ModelCue& chosen = cues[testing_support::ChosenCue(times, *time, forward)];
    *time = Time(chosen);
    for (const ModelPosition& p : chosen.positions) {
      const uint64_t bytes = segment + p.cluster;
      if (Counts(p) && static_cast<int64_t>(bytes) < static_cast<int64_t>(*position)) *position = bytes;
    }
    return 0;
  }

  int ToPosition(uint64_t time, uint64_t* position) {
    last_position_time = time;
    uint64_t copy = time;
    if (Search(&copy, false, position) == 0) return 0;
    if (time == 0) *position = first_cluster;
    return time == 0 ? 0 : kNoConversion;
  }

  // The first counting position at or after `position`: its cue's time and
  // position, and the time of the cue before (0 before the first); null: none.
  const ModelPosition* AtOrAfter(uint64_t position, uint64_t* time, uint64_t* previous) {
    *previous = 0;
    for (const ModelCue& cue : cues) {
      for (const ModelPosition& p : cue.positions) {
        if (Counts(p) && static_cast<int64_t>(segment + p.cluster) >= static_cast<int64_t>(position)) {
          *time = Time(cue);
          return &p;
        }
      }
      *previous = Time(cue);
    }
    return nullptr;
  }

  int ToTime(uint64_t position, uint64_t* time) {
    if (last_position_time != 0 && preroll) {
      *time = last_position_time;
      last_position_time = 0;
      return 0;
    }
    *time = 0;
    if (!has_cues) {
      log.push_back("5 kelvane: ConvertToTime() no cueing data.");
      return position == first_cluster ? 0 : kNoConversion;
    }
    Validate();
    uint64_t cue_time = 0, previous = 0;
    if (const ModelPosition* p = AtOrAfter(position, &cue_time, &previous)) {
      *time = segment + p->cluster == position ? cue_time : previous;
    }
    return 0;
  }

  void Seek(uint64_t position) {
    uint64_t time = 0, previous = 0;
    const ModelPosition* p = has_cues ? AtOrAfter(position, &time, &previous) : nullptr;
    if (p && p->track & 1) log.push_back("5 kelvane: Non-zero codec state on cue = 1");  // the filter's table gets track & 1
  }

  int32_t ByteRate() {
    uint64_t first_time = 0, last_time = INT64_MAX, first_position = 0, last_position = 0;
    int32_t rate = 0;
    if (Search(&first_time, false, &first_position) == 0 && Search(&last_time, false, &last_position) == 0 &&
        first_position != kNoCuePosition && last_position != kNoCuePosition) {
      const auto dt = static_cast<int64_t>(last_time - first_time);
      const auto dpos = static_cast<int64_t>(last_position - first_position);
      if (dt > 0 && dpos > 0 && dt / 1000000 > 0) rate = static_cast<int32_t>(dpos / (dt / 1000000));
    }
    if (rate == 0) log.push_back("3 kelvane: CalcOverallByteRate cueing points weren't enough to estimate the bytes per second.");
    return rate;
  }
};

// The filter's records around the same table.
struct FilterUnderTest {
  explicit FilterUnderTest(const Model& model)
      : channels(model.channels.size()), states(model.channels.size()), tracks(model.channels.size()) {
    filter.Context = context.get();
    filter.OutputChannels = channels.data();
    context->OutputChannelCount = static_cast<int32_t>(model.channels.size());
    context->EnablePreroll = model.preroll ? 1 : 0;
    for (size_t k = 0; k < model.channels.size(); ++k) {
      tracks[k].track_number = model.channels[k].track;
      states[k].Track = &tracks[k];
      channels[k].State = &states[k];
      Acquire(k, model.channels[k].acquired);
    }
    mkv_file_info& info = context->FileInfo;
    info.timecode_scale = model.scale;
    info.segment_data_position = model.segment;
    info.first_cluster_position = model.first_cluster;
    info.parse_flags = model.has_cues ? kMetCues : 0;
    for (const ModelCue& row : model.cues) {
      auto* cue = mem_new_zeroed<mkv_cue_point>();
      Check(cue != nullptr, "cue point");
      cue->cue_time = row.ticks;
      for (const ModelPosition& p : row.positions) {
        auto* position = mem_new_zeroed<mkv_cue_track_position>();
        Check(position != nullptr, "cue position");
        *position = {p.track, p.cluster, 0, p.track & 1, {}};
        Check(mkv_queue_append(&cue->track_positions, position), "cue position");
      }
      Check(mkv_queue_append(&info.cue_points, cue), "cue point");
    }
  }
  ~FilterUnderTest() { free_cue_points(&context->FileInfo.cue_points); }
  void Acquire(size_t k, bool acquired) {
    states[k].Acquired = acquired ? 1 : 0;
    channels[k].Flags = acquired ? kChannelAcquired : 0;
  }

  MkvFilter filter{};
  std::unique_ptr<MkvContext> context = std::make_unique<MkvContext>();
  std::vector<MkvChannel> channels;
  std::vector<MkvChannelState> states;
  std::vector<mkv_track_info> tracks;
};

void RunQueries(fuzz_input::Reader& in, Model& model, FilterUnderTest& under_test) {
  MkvFilter* filter = &under_test.filter;
  MkvContext* context = under_test.context.get();
  for (int q = 0; q < kMaxQueries && !in.empty(); ++q) {
    logged.clear();
    model.log.clear();
    const uint8_t op = in.Byte();
    const uint64_t value = in.Number();
    uint64_t want_out = 0x5A5A, got_out = 0x5A5A, want_time = value, got_time = value;
    switch (op % 7) {
      case 0:
      case 1: {
        const bool forward = op % 7 == 1;
        const int want = model.Search(&want_time, forward, &want_out);
        const int got = GetCueingPosition(filter, &got_time, forward ? 1 : 0, &got_out);
        Check(got == want && got_time == want_time && got_out == want_out, "GetCueingPosition", got);
        break;
      }
      case 2: {
        const int want = model.ToPosition(value, &want_out);
        const int got = ConvertToPosition(filter, value, &got_out);
        Check(got == want && got_out == want_out && context->LastPositionTime == value, "ConvertToPosition", got);
        break;
      }
      case 3: {
        const int want = model.ToTime(value, &want_out);
        const int got = ConvertToTime(filter, value, &got_out);
        Check(got == want && got_out == want_out && context->LastPositionTime == model.last_position_time,
              "ConvertToTime", got);
        break;
      }
      case 4:
        Check(Seek(filter, value, value ^ 0x55) == 0, "Seek");
        model.Seek(value ^ 0x55);
        for (size_t k = 0; k < model.channels.size(); ++k) {
          Check(!model.preroll || !model.channels[k].acquired ||
                    (under_test.states[k].PrerollTime == value && under_test.states[k].PrerollPending == 1),
                "preroll after Seek");
        }
        break;
      case 5:
        CalcOverallByteRate(filter);
        Check(context->ByteRate == model.ByteRate(), "CalcOverallByteRate", context->ByteRate);
        break;
      default:
        // Acquisition may change after the table was validated; the flags stay.
        if (model.channels.empty()) break;
        const size_t k = value % model.channels.size();
        model.channels[k].acquired = !model.channels[k].acquired;
        under_test.Acquire(k, model.channels[k].acquired);
    }
    Check(logged == model.log, "logged messages");
    const uint32_t flags = context->CueTableFlags;
    Check(((flags & kCueTableValidated) != 0) == model.validated, "validated flag");
    Check(!model.validated || ((flags & kCueTableAllTracksCount) != 0) == model.all_tracks, "all-tracks flag");
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  host::SetLogThreshold(0);
  host::SetLogCapture([](int level, const std::string& text) { logged.push_back(std::to_string(level) + " " + text); });
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  fuzz_input::ExpectNoBlockLeft([&] {
    fuzz_input::Reader in(data, size);
    Model model(in);
    FilterUnderTest under_test(model);
    RunQueries(in, model, under_test);
  });
  return 0;
}
