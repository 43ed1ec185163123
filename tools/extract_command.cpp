// `kelvane extract FILE [-t TRACK]... -o DIR`: plays the file through the
// plug-in in the host's graph (streamer, kelvane, one sink per acquired
// channel) and writes each selected channel as a file that players and
// decoders open. Frames go to the files from the references the plug-in
// delivers; the channels' formats come from the plug-in's output formats and
// the track numbers, codec IDs and bit depths from the file's headers.

#include <sys/stat.h>

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "host/graph_runner.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "platform/media_format.h"
#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/damage_report.h"
#include "tools/extract/channel_extractor.h"
#include "tools/extract/header_outputs.h"
#include "tools/extract/timestamp_recorder.h"
#include "tools/extract/writer_choice.h"
#include "tools/progress_bar.h"
#include "tools/reading/header_reading.h"

namespace {

constexpr char kCommand[] = "extract";
constexpr unsigned long kMaxBufferSize = 64ul << 20;

const std::string kExtractHelp =
    std::string(
        "usage: kelvane extract FILE [-t TRACK]... -o DIR [--timestamps]\n"
        "       kelvane extract FILE [--attachments DIR] [--chapters FILE]\n"
        "\n"
        "Plays FILE through the plug-in as the framework does and writes each selected track\n"
        "to DIR/trackN.EXT (N: the Matroska track number, as 'kelvane info' and 'kelvane\n"
        "packets' print it), in a format that common players and decoders open:\n") +
    kWriterFormatsHelp +
    "Header-stripped tracks come out with their stripped bytes put back, zlib-compressed\n"
    "tracks inflated, and laced blocks as their single frames. A raw track's NAME.index has one text line per packet:\n"
    "  config OFFSET SIZE          a decoder-configuration packet\n"
    "  frame OFFSET SIZE TIME_US   a frame and its presentation time in microseconds\n"
    "(OFFSET and SIZE in bytes of NAME.raw; lines starting with # are comments).\n"
    "\n"
    "When standard error is a terminal a progress bar shows the bytes and frames\n"
    "written, the rate and the time left. Standard output gets one line per file.\n"
    "\n"
    "FILE must be a regular file (not standard input or a pipe): the plug-in reads it\n"
    "twice, to rate it and to play it.\n"
    "\n"
    "On damaged input every frame delivered is written all the same, and playback goes on\n"
    "past the damage from the next cue point, as 'kelvane packets' does; standard error\n"
    "says where frames are missing. A track the plug-in sets up no channel for (an\n"
    "encrypted one) is named on standard error and left out.\n"
    "\n"
    "options:\n"
    "  -t, --track TRACK  extract this track (repeatable, or TRACK,TRACK...);\n"
    "                     default: every track the plug-in offers\n"
    "  -o, --output DIR   the directory to write to (made, with its parents, when missing)\n"
    "  --timestamps       also DIR/trackN.timestamps.txt: each frame's time in\n"
    "                     milliseconds, ascending (timestamp format v2)\n"
    "  --attachments DIR  write each attachment to DIR under its own file name\n"
    "  --chapters FILE    write the chapters to FILE in the simple chapter format\n"
    "                     (CHAPTER01=00:00:00.000, CHAPTER01NAME=...)\n"
    "  -q, --quiet        no progress bar\n"
    "  --buffer-size BYTES  bytes per input buffer (default 65536); small ones split\n"
    "                     frames across buffers, which must not change the files\n"
    "  --no-recover       stop where the channels fail, rather than going on past the damage\n"
    "  --plugin PATH      the plug-in to load (default: kelvane.so beside this program)\n"
    "  -h, --help         this text\n"
    "\n"
    "exit codes: 0 every file written; 1 the file cannot be read, the plug-in refused it, it\n"
    "is damaged (what was delivered is written), or a file could not be written; 2 usage,\n"
    "or a track the file does not offer\n"
    "\n"
    "examples:\n"
    "  kelvane extract movie.mkv -o tracks\n"
    "  kelvane extract movie.mkv -t 2 -o audio && ffplay audio/track2.aac\n"
    "  kelvane extract movie.mkv --attachments fonts --chapters chapters.txt\n";

struct Options {
  const char* file = nullptr;
  const char* directory = nullptr;
  std::vector<uint64_t> tracks;
  std::string plugin = host::PluginBesideExecutable();
  bool quiet = false;
  bool recover = true;
  bool timestamps = false;
  const char* attachments = nullptr;  // directory
  const char* chapters = nullptr;     // file
  uint32_t buffer_size = host::RunnerOptions{}.input_buffer_size;
};

constexpr int kRecoveries = 4;  // times a file may be played on past damage, as packets does

bool ParseTracks(const char* text, std::vector<uint64_t>* tracks) {
  std::string list(text);
  size_t start = 0;
  for (;;) {
    size_t comma = list.find(',', start);
    std::string item = list.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
    unsigned long number = 0;
    if (!ParseNumber(item.c_str(), ~0ul, &number) || number == 0) return false;
    tracks->push_back(number);
    if (comma == std::string::npos) return true;
    start = comma + 1;
  }
}

// -1 to go on, else the exit code.
int ParseOptions(int argc, char** argv, Options* options) {
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    auto value = [&](const char* name) -> const char* {
      if (i + 1 < argc) return argv[++i];
      UsageError(kCommand, "%s needs a value", name);
      return nullptr;
    };
    if (IsHelpOption(arg)) return PrintHelp(kExtractHelp.c_str());
    if (!std::strcmp(arg, "-t") || !std::strcmp(arg, "--track")) {
      const char* list = value(arg);
      if (!list) return kExitUsage;
      if (!ParseTracks(list, &options->tracks)) {
        return UsageError(kCommand, "%s: '%s' is not a list of track numbers like 1,3", arg, list);
      }
    } else if (!std::strcmp(arg, "-o") || !std::strcmp(arg, "--output")) {
      if (!(options->directory = value(arg))) return kExitUsage;
    } else if (!std::strcmp(arg, "--plugin")) {
      const char* path = value(arg);
      if (!path) return kExitUsage;
      options->plugin = path;
    } else if (!std::strcmp(arg, "--buffer-size")) {
      const char* text = value(arg);
      unsigned long size = 0;
      if (!text) return kExitUsage;
      if (!ParseNumber(text, kMaxBufferSize, &size) || size == 0) {
        return UsageError(kCommand, "--buffer-size: '%s' is not a number of bytes from 1 to %lu", text, kMaxBufferSize);
      }
      options->buffer_size = static_cast<uint32_t>(size);
    } else if (!std::strcmp(arg, "-q") || !std::strcmp(arg, "--quiet")) {
      options->quiet = true;
    } else if (!std::strcmp(arg, "--no-recover")) {
      options->recover = false;
    } else if (!std::strcmp(arg, "--timestamps")) {
      options->timestamps = true;
    } else if (!std::strcmp(arg, "--attachments")) {
      if (!(options->attachments = value(arg))) return kExitUsage;
    } else if (!std::strcmp(arg, "--chapters")) {
      if (!(options->chapters = value(arg))) return kExitUsage;
    } else if (int code = TakeFile(kCommand, arg, &options->file); code != kExitOk) {
      return code;
    }
  }
  if (!options->file) return UsageError(kCommand, "no FILE given");
  if (!options->directory && !options->attachments && !options->chapters) {
    return UsageError(kCommand, "no output directory given (-o DIR)");
  }
  return -1;
}

// The offered channels as the framework sees them before playback, with the
// facts from the headers that their formats do not carry.
int DescribeChannels(const host::Plugin& plugin, const char* path, std::vector<ChannelFacts>* channels) {
  auto input = host::OpenFileStream(path, true);
  if (!input) return Failure(kCommand, "cannot open %s", path);
  host::SetupOptions setup;
  setup.configure_outputs = false;
  host::FilterGraph graph(plugin, *input, setup);
  if (!graph.rated()) return RefusedFile(kCommand, path, graph.rating());
  std::vector<reading::TrackFacts> tracks;
  uint64_t timecode_scale = 0;
  if (!reading::ReadOfferedTracks(path, &tracks, &timecode_scale)) return Failure(kCommand, "%s: cannot read its track entries", path);
  size_t next_track = 0;
  for (size_t k = 0; k < graph.outputs().size(); ++k) {
    const MmfMediaFormat& format = graph.outputs()[k].offered;
    if (graph.outputs()[k].formats_offered == 0) {
      std::fprintf(stderr, "kelvane %s: %s: channel %zu is not set up, its track is left out: %s\n", kCommand, path, k,
                   graph.outputs()[k].not_set_up.c_str());
      continue;
    }
    if (format.fourcc == 0) continue;  // a channel record the plug-in left unused
    if (next_track >= tracks.size()) return Failure(kCommand, "%s: more channels than tracks", path);
    const reading::TrackFacts& track = tracks[next_track++];
    ChannelFacts facts;
    facts.channel = static_cast<int32_t>(k);
    facts.track = track.number;
    facts.codec_id = track.codec_id;
    facts.fourcc = format.fourcc;
    facts.default_duration_ns = track.default_duration_ns;
    facts.timecode_scale_ns = timecode_scale;
    for (const reading::ContentEncodingFacts& encoding : track.content_encodings) {
      if (!encoding.compression || encoding.comp_algo != reading::kCompressionZlib) continue;
      facts.zlib_frames = facts.zlib_frames || (encoding.scope & 1);
      facts.zlib_private = facts.zlib_private || (encoding.scope & 2);
    }
    facts.video = format.stream_type == static_cast<uint32_t>(kMmfStreamEncodedVideo);
    if (!facts.video) {
      facts.channels = format.media.audio.channels;
      facts.sample_rate = format.media.audio.sample_rate;
      facts.bit_depth = static_cast<uint32_t>(track.bit_depth);
      facts.pcm_byte_order = format.pcm_byte_order;
    }
    channels->push_back(facts);
  }
  return kExitOk;
}

int SelectTracks(const Options& options, std::vector<ChannelFacts>* channels) {
  if (options.tracks.empty()) return kExitOk;
  std::vector<ChannelFacts> chosen;
  for (uint64_t track : options.tracks) {
    bool found = false;
    for (const ChannelFacts& facts : *channels) {
      if (facts.track != track) continue;
      found = true;
      bool twice = false;
      for (const ChannelFacts& taken : chosen) twice = twice || taken.track == track;
      if (!twice) chosen.push_back(facts);
    }
    if (!found) {
      std::string offered;
      for (const ChannelFacts& facts : *channels) offered += (offered.empty() ? "" : " ") + std::to_string(facts.track);
      return UsageError(kCommand, "%s offers no track %" PRIu64 " (offered: %s)", options.file, track,
                        offered.empty() ? "none" : offered.c_str());
    }
  }
  *channels = std::move(chosen);
  return kExitOk;
}

struct Extraction {
  ChannelFacts facts;
  OutputFile file;
  ChosenWriter chosen;
  std::unique_ptr<ChannelExtractor> extractor;
};

struct RunState {
  std::vector<std::unique_ptr<Extraction>> extractions;

  ChannelExtractor* For(int32_t channel) {
    for (auto& extraction : extractions) {
      if (extraction->facts.channel == channel) return extraction->extractor.get();
    }
    return nullptr;
  }
};

void OnBuffer(void* user, int32_t channel, MmfMra* buffer) {
  if (ChannelExtractor* extractor = static_cast<RunState*>(user)->For(channel)) extractor->Consume(buffer);
}

uint64_t FileSize(const char* path) {
  struct stat status;
  return stat(path, &status) == 0 ? static_cast<uint64_t>(status.st_size) : 0;
}

}  // namespace

int RunExtract(int argc, char** argv) {
  Options options;
  if (int code = ParseOptions(argc, argv, &options); code >= 0) return code;
  if (int code = CheckInputFile(kCommand, options.file); code != kExitOk) return code;
  if (options.attachments || options.chapters) {
    if (int code = ExtractFromHeaders(kCommand, options.file, options.attachments, options.chapters); code != kExitOk) {
      return code;
    }
    if (!options.directory) return kExitOk;
  }
  std::unique_ptr<host::Plugin> plugin = LoadPlugin(kCommand, options.plugin);
  if (!plugin) return kExitFailed;
  std::vector<ChannelFacts> channels;
  if (int code = DescribeChannels(*plugin, options.file, &channels); code != kExitOk) return code;
  if (int code = SelectTracks(options, &channels); code != kExitOk) return code;
  if (channels.empty()) return Failure(kCommand, "%s: the plug-in offers no track", options.file);
  if (!MakeDirectories(options.directory)) {
    return Failure(kCommand, "cannot make the directory %s: %s", options.directory, std::strerror(errno));
  }

  ProgressBar progress(kCommand, FileSize(options.file), !options.quiet && ProgressBar::StderrIsTerminal());
  RunState state;
  host::RunnerOptions run;
  run.checksum = false;
  run.read_ahead = true;
  run.catch_up = true;
  run.recoveries = options.recover ? kRecoveries : 0;
  run.input_buffer_size = options.buffer_size;
  for (const ChannelFacts& facts : channels) {
    auto extraction = std::make_unique<Extraction>();
    extraction->facts = facts;
    extraction->chosen = ChooseWriter(facts, options.directory, &extraction->file);
    if (options.timestamps) {
      extraction->chosen.writer = std::make_unique<TimestampRecorder>(
          &extraction->file, std::move(extraction->chosen.writer),
          std::string(options.directory) + "/track" + std::to_string(facts.track) + ".timestamps.txt",
          facts.default_duration_ns, facts.timecode_scale_ns);
    }
    if (!extraction->file.Open(extraction->chosen.path)) {
      return Failure(kCommand, "%s", extraction->file.error().c_str());
    }
    extraction->extractor = std::make_unique<ChannelExtractor>(std::move(extraction->chosen.writer), &progress);
    run.channels.push_back(facts.channel);
    state.extractions.push_back(std::move(extraction));
  }
  run.on_buffer = OnBuffer;
  run.user = &state;

  progress.Start();
  host::RunResult result = host::RunGraph(*plugin, options.file, run);
  progress.Finish();
  int code = kExitOk;
  for (auto& extraction : state.extractions) {
    const ChannelFacts& facts = extraction->facts;
    const std::string& path = extraction->chosen.path;
    if (!extraction->extractor->Finish()) {
      code = Failure(kCommand, "track %" PRIu64 ": %s: %s", facts.track, path.c_str(),
                     extraction->extractor->error().c_str());
      continue;
    }
    std::printf("track %" PRIu64 " %s: %s%s%s, %" PRIu64 " frames, %" PRIu64 " bytes\n", facts.track,
                facts.codec_id.c_str(), path.c_str(), extraction->chosen.index_path.empty() ? "" : " + ",
                extraction->chosen.index_path.c_str(), extraction->extractor->frames(), extraction->file.size());
  }
  if (result.channels.empty()) return Failure(kCommand, "%s: %s", options.file, result.error.c_str());
  std::vector<uint64_t> tracks;
  for (const ChannelFacts& facts : channels) {
    if (tracks.size() <= size_t(facts.channel)) tracks.resize(size_t(facts.channel) + 1);
    tracks[size_t(facts.channel)] = facts.track;
  }
  return ReportDamage(kCommand, options.file, result, tracks) ? kExitFailed : code;
}
