// `kelvane packets FILE`: plays the file through the plug-in in a graph of
// streamer, kelvane and one sink per acquired channel, and prints what each
// channel delivered: its decoder-configuration packets, then one line per
// frame with the channel, track number, presentation time (microseconds),
// size and Adler-32 of the frame bytes.

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "host/graph_runner.h"
#include "host/plugin_loader.h"
#include "host/thread_placement.h"
#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/control_options.h"
#include "tools/damage_report.h"
#include "tools/frame_lines.h"
#include "tools/json_writer.h"
#include "tools/playback_limits.h"
#include "tools/reading/header_reading.h"

const char kPacketsHelp[] =
    "usage: kelvane packets [OPTIONS] FILE\n"
    "\n"
    "Plays FILE through the plug-in as a framework does (a file streamer feeding it, one sink\n"
    "thread per output channel) and prints what each channel delivered. First the decoder-\n"
    "configuration packets, one line each:\n"
    "  CHANNEL TRACK config SIZE ADLER32\n"
    "then every frame, channel after channel, in delivery order:\n"
    "  CHANNEL TRACK TIME_US SIZE ADLER32\n"
    "CHANNEL is the output channel's index (as 'kelvane probe' lists them), TRACK the Matroska\n"
    "track number it plays (read with the demuxer's own header parser, since a channel does\n"
    "not carry it), TIME_US the presentation time in microseconds, SIZE the frame's bytes and\n"
    "ADLER32 their Adler-32 checksum in hex. With playback control, a line\n"
    "  CHANNEL TRACK seek\n"
    "marks where each seek or scan jump took effect.\n"
    "\n"
    "On damaged input every frame delivered is printed all the same. When a channel fails\n"
    "and the file has cue points, playback goes on from the first cue point after the\n"
    "furthest frame delivered (at most 4 times), and a line\n"
    "  CHANNEL TRACK gap FROM_US TO_US\n"
    "marks where frames are missing; standard error says where each channel failed or\n"
    "stopped, and whether the file ended inside a Cluster. A track the plug-in sets up no\n"
    "channel for (an encrypted one) is named on standard error and left out.\n"
    "\n"
    "options:\n"
    "  --channels K,K,...  output channels to acquire, by index (default: all)\n"
    "  --buffer-size BYTES\n"
    "                      bytes per input buffer, 1 to 67108864 (default 65536)\n"
    "  --no-hash           no Adler-32 of the frames (the channel threads then share one core)\n"
    "  --json              one JSON document instead of lines (docs/json.md, section packets)\n"
    "  --no-recover        stop where the channels fail, rather than going on past the damage\n"
    "  --plugin PATH       the plug-in to load (default: kelvane.so beside this program)\n"
    "  -h, --help          this text\n"
    "playback control:\n"
    "%s"
    "%s"
    "\n"
    "exit codes: 0 every channel played to its end; 1 the plug-in refused the file, it cannot\n"
    "be read, or it is damaged (a channel failed or stopped, or the file ends inside a Cluster:\n"
    "what was delivered is printed); 2 usage, including a channel the file does not offer. A\n"
    "control action the plug-in refused is reported on standard error (exit code 0).\n"
    "\n"
    "examples:\n"
    "  kelvane packets movie.mkv\n"
    "  kelvane packets --channels 1 --no-hash movie.mkv\n"
    "  kelvane packets --seek 10@2 --preroll movie.mkv       # seek to 10 s once playback reaches 2 s\n"
    "  kelvane packets --ff 400@1 --trick-time 500 movie.mkv # fast forward from 1 s\n"
    "  kelvane packets --seek 600 --frames 3 movie.mkv        # where a seek to 10 min lands\n";

namespace {

constexpr int kSchemaVersion = 1;
constexpr int kRecoveries = 4;  // times a file may be played on past damage
constexpr unsigned long kMaxBufferSize = 64ul << 20;

struct Options {
  host::RunnerOptions run;
  LimitOptions limits;
  bool json = false;
  const char* file = nullptr;
  std::string plugin_path = host::PluginBesideExecutable();
};

// A comma-separated list of distinct channel indexes.
bool ParseChannels(const char* text, std::vector<int32_t>* channels) {
  std::string list = text;
  size_t start = 0;
  while (true) {
    size_t comma = list.find(',', start);
    std::string item = list.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
    unsigned long k = 0;
    if (!ParseNumber(item.c_str(), 0x7FFFFFFF, &k)) return false;
    if (std::find(channels->begin(), channels->end(), static_cast<int32_t>(k)) != channels->end()) return false;
    channels->push_back(static_cast<int32_t>(k));
    if (comma == std::string::npos) return true;
    start = comma + 1;
  }
}

// -1 when the options are good, else the exit code.
int ParseOptions(int argc, char** argv, Options* options) {
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (IsHelpOption(arg)) {
      std::printf(kPacketsHelp, kControlUsage, kLimitUsage);
      return kExitOk;
    }
    std::string error;
    int taken = ParseControlOption(argc, argv, &i, &options->run, &error);
    if (taken == 0) taken = ParseLimitOption(argc, argv, &i, &options->limits, &error);
    if (taken != 0) {
      if (taken < 0) return UsageError("packets", "%s", error.c_str());
      continue;
    }
    const bool takes_value =
        !std::strcmp(arg, "--buffer-size") || !std::strcmp(arg, "--channels") || !std::strcmp(arg, "--plugin");
    if (takes_value && i + 1 >= argc) return UsageError("packets", "%s needs a value", arg);
    if (!std::strcmp(arg, "--json")) {
      options->json = true;
    } else if (!std::strcmp(arg, "--no-recover")) {
      options->run.recoveries = 0;
    } else if (!std::strcmp(arg, "--no-hash")) {
      options->run.checksum = false;
    } else if (!std::strcmp(arg, "--buffer-size")) {
      unsigned long size = 0;
      const char* value = argv[++i];
      if (!ParseNumber(value, kMaxBufferSize, &size) || size == 0) {
        return UsageError("packets", "--buffer-size: '%s' is not a number of bytes from 1 to %lu", value,
                          kMaxBufferSize);
      }
      options->run.input_buffer_size = static_cast<uint32_t>(size);
    } else if (!std::strcmp(arg, "--channels")) {
      const char* value = argv[++i];
      if (!ParseChannels(value, &options->run.channels)) {
        return UsageError("packets", "--channels: '%s' is not a list of distinct channel indexes like 0,2", value);
      }
    } else if (!std::strcmp(arg, "--plugin")) {
      options->plugin_path = argv[++i];
    } else if (!std::strcmp(arg, "-")) {
      return UsageError("packets", "FILE cannot be standard input: playback reads the file twice");
    } else if (int code = TakeFile("packets", arg, &options->file); code != kExitOk) {
      return code;
    }
  }
  if (!options->file) return UsageError("packets", "no FILE given");
  return -1;
}

// Track numbers of the offered tracks: the plug-in offers one channel per
// track with a supported codec that is not encrypted, in file order. The
// encrypted ones are said on standard error.
std::vector<uint64_t> OfferedTracks(const char* path) {
  std::vector<uint64_t> tracks;
  reading::HeaderReading reading = reading::ReadHeaders(path, {true, false});
  if (reading.ok) {
    for (const reading::TrackFacts& track : reading.facts.tracks) {
      if (track.offered_fourcc) {
        tracks.push_back(track.number);
      } else if (track.encrypted) {
        std::fprintf(stderr, "kelvane packets: %s: track %" PRIu64 " (%s) is left out: it is encrypted\n", path,
                     track.number, track.codec_id.c_str());
      }
    }
  }
  return tracks;
}

uint64_t TrackOf(const host::ChannelRun& run, const std::vector<uint64_t>& tracks) {
  return static_cast<size_t>(run.index) < tracks.size() ? tracks[static_cast<size_t>(run.index)] : 0;
}

std::string FourCC(uint32_t code) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    char c = static_cast<char>(code >> shift & 0xFF);
    text += c >= 32 && c < 127 ? c : '?';
  }
  return text;
}

// The frame lines and their marks come from the kept frames, unless `lines` wrote them.
void PrintLines(const host::RunResult& result, const std::vector<uint64_t>& tracks, bool hash, bool kept) {
  for (const host::ChannelRun& run : result.channels) {
    for (const host::RunFrame& packet : run.config) {
      std::printf("%d %" PRIu64 " config %u", run.index, TrackOf(run, tracks), packet.size);
      if (hash) std::printf(" %08x", packet.adler32);
      std::printf("\n");
    }
  }
  for (const host::ChannelRun& run : result.channels) {
    if (!kept) break;
    const uint64_t track = TrackOf(run, tracks);
    size_t next_seek = 0, next_gap = 0;
    auto marks_before = [&](size_t i) {
      for (; next_seek < run.seeks.size() && run.seeks[next_seek] <= i; ++next_seek) {
        std::printf("%d %" PRIu64 " seek\n", run.index, track);
      }
      for (; next_gap < run.gaps.size() && run.gaps[next_gap].at <= i; ++next_gap) {
        const host::Gap& gap = run.gaps[next_gap];
        std::printf("%d %" PRIu64 " gap %" PRIu64 " %" PRIu64 "\n", run.index, track, gap.from_us, gap.to_us);
      }
    };
    for (size_t i = 0; i < run.frames.size(); ++i) {
      const host::RunFrame& frame = run.frames[i];
      marks_before(i);
      std::printf("%d %" PRIu64 " %" PRIu64 " %u", run.index, track, frame.time_us, frame.size);
      if (hash) std::printf(" %08x", frame.adler32);
      std::printf("\n");
    }
    marks_before(SIZE_MAX);
  }
}

void WriteFrame(JsonWriter& out, const host::RunFrame& frame, bool hash, bool config) {
  out.BeginObject(true);
  if (!config) out.Field("time_us", frame.time_us);
  out.Field("size", frame.size);
  if (hash) {
    char adler[9];
    std::snprintf(adler, sizeof adler, "%08x", frame.adler32);
    out.Field("adler32", adler);
  }
  if (!config) out.Field("marked", frame.marked);
  out.EndObject();
}

void WriteJson(const char* file, const host::RunResult& result, const std::vector<uint64_t>& tracks, bool hash) {
  JsonWriter out(stdout);
  out.BeginObject();
  out.Field("schema_version", kSchemaVersion);
  out.Field("command", "packets");
  out.Field("file", file);
  out.FieldOrNull("error", result.ok ? nullptr : result.error.c_str());
  uint64_t cluster = 0, size = 0;
  out.Key("ended_inside_cluster");
  if (EndsInsideCluster(file, result.first_cluster, &cluster, &size)) {
    out.Uint(cluster);
  } else {
    out.Null();
  }
  out.Key("control_results");
  out.BeginArray(true);
  for (int answer : result.control_results) out.Int(answer);
  out.EndArray();
  out.Key("channels");
  out.BeginArray();
  for (const host::ChannelRun& run : result.channels) {
    out.BeginObject();
    out.Field("channel", run.index);
    out.Field("track", TrackOf(run, tracks));
    out.Field("name", run.name);
    out.Field("fourcc", FourCC(run.fourcc));
    out.Key("config");
    out.BeginArray();
    for (const host::RunFrame& packet : run.config) WriteFrame(out, packet, hash, true);
    out.EndArray();
    out.Key("seeks");
    out.BeginArray(true);
    for (size_t at : run.seeks) out.Uint(at);
    out.EndArray();
    out.Key("gaps");
    out.BeginArray();
    for (const host::Gap& gap : run.gaps) {
      out.BeginObject(true);
      out.Field("at", gap.at);
      out.Field("from_us", gap.from_us);
      out.Field("to_us", gap.to_us);
      out.Field("after_byte", gap.after_byte);
      out.EndObject();
    }
    out.EndArray();
    out.Field("end_result", run.end_result);
    out.Field("last_byte", run.frame_end);
    out.Key("frames");
    out.BeginArray();
    for (const host::RunFrame& frame : run.frames) WriteFrame(out, frame, hash, false);
    out.EndArray();
    out.EndObject();
  }
  out.EndArray();
  out.EndObject();
  out.Finish();
}

// "0 (track 1), 1 (track 3)": the offered channels and the tracks they play.
std::string ChannelList(const std::vector<uint64_t>& tracks) {
  std::string text;
  for (size_t k = 0; k < tracks.size(); ++k) {
    text += (k ? ", " : "") + std::to_string(k) + " (track " + std::to_string(tracks[k]) + ")";
  }
  return text;
}

}  // namespace

int RunPackets(int argc, char** argv) {
  Options options;
  options.run.read_ahead = true;  // the streamer reads on while the channels parse
  options.run.catch_up = true;
  options.run.recoveries = kRecoveries;
  if (int code = ParseOptions(argc, argv, &options); code >= 0) return code;
  // Without checksums a sink does next to nothing of its own: its thread is
  // one of the channel threads that take turns under the plug-in's lock, and
  // those run best side by side on one core.
  options.run.channels_share_core = !options.run.checksum;
  const char* file = options.file;
  // With --json a failure still gives one document: the error, and what was delivered.
  host::RunResult result;
  auto failed = [&](int code, std::string error) {
    if (options.json) {
      result.error = error;
      WriteJson(file, result, {}, options.run.checksum);
    }
    return code;
  };
  if (int code = CheckInputFile("packets", file); code != kExitOk) return failed(code, "the file cannot be read");
  auto plugin = LoadPlugin("packets", options.plugin_path);
  if (!plugin) return failed(kExitFailed, "the plug-in cannot be loaded");

  std::vector<uint64_t> tracks = OfferedTracks(file);
  for (int32_t k : options.run.channels) {
    if (!tracks.empty() && static_cast<size_t>(k) >= tracks.size()) {
      return UsageError("packets", "--channels: %s offers no channel %d; its channels: %s", file, k,
                        ChannelList(tracks).c_str());
    }
  }
  // Plain playback in lines streams the frame lines instead of keeping every frame.
  std::unique_ptr<FrameLines> lines;
  if (!options.json && options.run.actions.empty() && !tracks.empty()) {
    // The channels' core is kept for the channels; the lines are formatted beside the streamer's reader.
    const int cpu = options.run.channels_share_core ? host::PlaceChannelsTogether().reader_cpu : -1;
    lines = std::make_unique<FrameLines>(tracks, options.run.checksum, cpu);
    options.run.on_frames = FrameLines::OnFrames;
    options.run.frame_room = FrameLines::Room;
    options.run.user = lines.get();
    options.run.keep_frames = false;
  }
  std::vector<int32_t> playing = options.run.channels;
  if (playing.empty()) {
    for (size_t k = 0; k < tracks.size(); ++k) playing.push_back(static_cast<int32_t>(k));
  }
  PlaybackLimits limits(options.limits, playing);
  limits.Apply(&options.run);
  result = host::RunGraph(*plugin, file, options.run);
  limits.Settle(&result);
  if (result.rating != kAcceptedRating) {
    return failed(RefusedFile("packets", file, result.rating), "the plug-in refused the file");
  }
  if (result.error.rfind("no output channel ", 0) == 0) {
    return UsageError("packets", "--channels: %s has %s", file, result.error.c_str());
  }
  // Once playback began, what was delivered is printed, damage or not.
  if (result.channels.empty()) {
    return failed(Failure("packets", "%s: %s", file, result.error.c_str()), result.error.c_str());
  }
  ReportControlResults("packets", file, options.run.actions, result.control_results);
  options.json ? WriteJson(file, result, tracks, options.run.checksum)
               : PrintLines(result, tracks, options.run.checksum, !lines);
  for (const host::ChannelRun& run : result.channels) {
    if (lines && !lines->Write(run.index, stdout, run.gaps)) return Failure("packets", "cannot write the frame lines");
  }
  std::fflush(stdout);
  return ReportDamage("packets", file, result, tracks) ? kExitFailed : kExitOk;
}
