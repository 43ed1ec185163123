// `kelvane packets FILE`: plays the file through the plug-in in a graph of
// streamer, kelvane and one sink per acquired channel, and prints what each
// channel delivered: its decoder-configuration packets, then one line per
// frame with the channel, track number, presentation time (microseconds),
// size and Adler-32 of the frame bytes.

#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "core/codec_table.h"
#include "core/file_model.h"
#include "core/header/element_walker.h"
#include "core/memory.h"
#include "core/metadata_list.h"
#include "core/status.h"
#include "host/graph_runner.h"
#include "host/input_streams.h"
#include "host/plugin_loader.h"
#include "stream/mkvvstream.h"
#include "tools/commands.h"
#include "tools/control_options.h"

namespace {

constexpr int64_t kHeaderBufferSize = 480;

struct Options {
  host::RunnerOptions run;
  bool json = false;
  const char* file = nullptr;
};

int Usage(FILE* out, int code) {
  std::fprintf(out,
               "usage: kelvane packets [--buffer-size BYTES] [--channels K,K,...] [--json] [--no-hash] FILE\n"
               "  --buffer-size  bytes per input buffer (default 32768)\n"
               "  --channels     output channels to acquire, by index (default: all)\n"
               "  --json         one JSON document instead of lines\n"
               "  --no-hash      no Adler-32 of the frames\n");
  std::fprintf(out, "playback control (lines mode prints \"CHANNEL TRACK seek\" where each took effect):\n%s",
               kControlUsage);
  return code;
}

bool ParseChannels(const char* text, std::vector<int32_t>* channels) {
  while (*text) {
    char* end = nullptr;
    long k = std::strtol(text, &end, 10);
    if (end == text || k < 0) return false;
    channels->push_back(static_cast<int32_t>(k));
    text = *end == ',' ? end + 1 : end;
    if (*end && *end != ',') return false;
  }
  return !channels->empty();
}

int ParseOptions(int argc, char** argv, Options* options) {
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (!std::strcmp(arg, "--help")) return Usage(stdout, 0);
    if (int taken = ParseControlOption(argc, argv, &i, &options->run); taken != 0) {
      if (taken < 0) return Usage(stderr, 2);
      continue;
    }
    if (!std::strcmp(arg, "--json")) {
      options->json = true;
    } else if (!std::strcmp(arg, "--no-hash")) {
      options->run.checksum = false;
    } else if (!std::strcmp(arg, "--buffer-size") && i + 1 < argc) {
      char* end = nullptr;
      unsigned long size = std::strtoul(argv[++i], &end, 10);
      if (*end || size == 0 || size > (64ul << 20)) return Usage(stderr, 2);
      options->run.input_buffer_size = static_cast<uint32_t>(size);
    } else if (!std::strcmp(arg, "--channels") && i + 1 < argc) {
      if (!ParseChannels(argv[++i], &options->run.channels)) return Usage(stderr, 2);
    } else if ((arg[0] == '-' && arg[1]) || options->file) {
      return Usage(stderr, 2);
    } else {
      options->file = arg;
    }
  }
  return options->file ? -1 : Usage(stderr, 2);
}

// Track numbers of the offered tracks: the plug-in offers one channel per
// track with a supported codec, in file order.
std::vector<uint64_t> OfferedTracks(const char* path) {
  std::vector<uint64_t> tracks;
  auto input = host::OpenFileStream(path, true);
  mkvvstream stream;
  if (!input || mkvvstream_init(&stream, input->record(), kHeaderBufferSize, 1, kFillWithRead, 1) != 0) return tracks;
  static mkv_file_info info;  // large: keep it off the stack
  std::memset(&info, 0, sizeof info);
  mkv_parse_limits limits{kDefaultMaxStringSize, 1};
  info.parse_limits = &limits;
  info.metadata = mem_new_zeroed<mkv_metadata_list>();
  if (info.metadata && parse_mkvfile(&info, &stream) == kParseSucceeded) {
    for (uint32_t i = 0; i < info.track_count && i < kMaxTracks; ++i) {
      if (lookup_codec_fourcc(info.tracks[i].codec_id) != 0) tracks.push_back(info.tracks[i].track_number);
    }
  }
  if (info.metadata) FreeMetadata(info.metadata);
  destroy_mkv_file_info(&info);
  mkvvstream_destroy(&stream);
  return tracks;
}

std::string FourCC(uint32_t code) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    char c = static_cast<char>(code >> shift & 0xFF);
    text += c >= 32 && c < 127 && c != '"' && c != '\\' ? c : '?';
  }
  return text;
}

void PrintLines(const host::RunResult& result, const std::vector<uint64_t>& tracks, bool hash) {
  auto track_of = [&](const host::ChannelRun& run) {
    return static_cast<size_t>(run.index) < tracks.size() ? tracks[static_cast<size_t>(run.index)] : 0;
  };
  for (const host::ChannelRun& run : result.channels) {
    for (const host::RunFrame& packet : run.config) {
      std::printf("%d %" PRIu64 " config %u", run.index, track_of(run), packet.size);
      if (hash) std::printf(" %08x", packet.adler32);
      std::printf("\n");
    }
  }
  for (const host::ChannelRun& run : result.channels) {
    size_t next_seek = 0;
    for (size_t i = 0; i < run.frames.size(); ++i) {
      const host::RunFrame& frame = run.frames[i];
      for (; next_seek < run.seeks.size() && run.seeks[next_seek] == i; ++next_seek) {
        std::printf("%d %" PRIu64 " seek\n", run.index, track_of(run));
      }
      std::printf("%d %" PRIu64 " %" PRIu64 " %u", run.index, track_of(run), frame.time_us, frame.size);
      if (hash) std::printf(" %08x", frame.adler32);
      std::printf("\n");
    }
    for (; next_seek < run.seeks.size(); ++next_seek) std::printf("%d %" PRIu64 " seek\n", run.index, track_of(run));
  }
}

void PrintJson(const host::RunResult& result, const std::vector<uint64_t>& tracks, bool hash) {
  std::printf("{\"channels\": [");
  const char* channel_sep = "";
  for (const host::ChannelRun& run : result.channels) {
    uint64_t track = static_cast<size_t>(run.index) < tracks.size() ? tracks[static_cast<size_t>(run.index)] : 0;
    std::printf("%s\n {\"channel\": %d, \"track\": %" PRIu64 ", \"name\": \"%s\", \"fourcc\": \"%s\", \"config\": [",
                channel_sep, run.index, track, run.name.c_str(), FourCC(run.fourcc).c_str());
    channel_sep = ",";
    const char* sep = "";
    for (const host::RunFrame& packet : run.config) {
      std::printf("%s{\"size\": %u", sep, packet.size);
      if (hash) std::printf(", \"adler32\": \"%08x\"", packet.adler32);
      std::printf("}");
      sep = ", ";
    }
    std::printf("],\n  \"frames\": [");
    sep = "";
    for (const host::RunFrame& frame : run.frames) {
      std::printf("%s\n   {\"time_us\": %" PRIu64 ", \"size\": %u", sep, frame.time_us, frame.size);
      if (hash) std::printf(", \"adler32\": \"%08x\"", frame.adler32);
      std::printf("}");
      sep = ",";
    }
    std::printf("]}");
  }
  std::printf("\n]}\n");
}

}  // namespace

int RunPackets(int argc, char** argv) {
  Options options;
  if (int code = ParseOptions(argc, argv, &options); code >= 0) return code;
  std::string error;
  auto plugin = host::Plugin::Load(host::PluginBesideExecutable(), &error);
  if (!plugin) {
    std::fprintf(stderr, "kelvane: %s\n", error.c_str());
    return 1;
  }
  host::RunResult result = host::RunGraph(*plugin, options.file, options.run);
  if (!result.ok) {
    std::fprintf(stderr, "kelvane: '%s': %s\n", options.file, result.error.c_str());
    return 1;
  }
  for (size_t k = 0; k < result.control_results.size(); ++k) {
    if (result.control_results[k] != 0) {
      std::fprintf(stderr, "kelvane: control action %zu answered %d\n", k + 1, result.control_results[k]);
    }
  }
  std::vector<uint64_t> tracks = OfferedTracks(options.file);
  if (options.json) {
    PrintJson(result, tracks, options.run.checksum);
  } else {
    PrintLines(result, tracks, options.run.checksum);
  }
  return 0;
}
