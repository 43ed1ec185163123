// `kelvane probe [--json] [--plugin PATH] FILE`: connects the plug-in to a
// file (or, for "-", to standard input, which cannot seek) the way the
// framework does, and prints the sniff and rating answers, the output
// channels with their formats, the "Duration" resource and whether the input
// seeks. Everything shown comes through the plug-in's interfaces and the
// framework's records (channel name and format): what a framework sees.

#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "host/file_streamer.h"
#include "host/graph_setup.h"
#include "host/memory_pools.h"
#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/json_writer.h"
#include "tools/probe_notes.h"

const char kProbeHelp[] =
    "usage: kelvane probe [--json] [--plugin PATH] FILE\n"
    "\n"
    "Connects the plug-in to FILE as the framework does before playback, and prints what it\n"
    "answers: the sniff and the rating (80: a Matroska file it plays), the \"Duration\"\n"
    "resource, whether the input can seek, the answers of the input channel's set-up, then\n"
    "each output channel (one per track with a codec it supports) with its format: the\n"
    "four-character code, the picture size and frame rate or the channels and sample rate,\n"
    "the size of the codec's extra data, and the answers of acquiring and configuring it.\n"
    "A channel counted for a track that the plug-in then left out (an encrypted one) offers\n"
    "no format: it is shown as not set up, with the reason the plug-in logged.\n"
    "The decoder-configuration packets are delivered at playback: see 'kelvane packets'.\n"
    "\n"
    "FILE may be - for standard input, or a pipe or FIFO: an input that cannot seek.\n"
    "\n"
    "options:\n"
    "  --json           one JSON document instead of text (docs/json.md, section probe)\n"
    "%s"
    "  -h, --help       this text\n"
    "\n"
    "exit codes: 0 the plug-in accepted the file; 1 it refused it (the answers are still\n"
    "printed) or the file cannot be read; 2 usage\n"
    "\n"
    "examples:\n"
    "  kelvane probe movie.mkv\n"
    "  cat movie.mkv | kelvane probe -\n"
    "  kelvane probe --json movie.mkv | jq '.channels[] | {fourcc, width, height}'\n";

namespace {

constexpr uint32_t kPoolBuffers = 4;
constexpr int kSchemaVersion = 1;
constexpr int kSeekable = 2;  // SeekQuery's answer for an input the plug-in can seek in

std::string FourCc(uint32_t code) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    char c = static_cast<char>(code >> shift);
    text += (c >= 32 && c < 127) ? c : '?';
  }
  return text;
}

const AoResource* FindResource(const host::Plugin& plugin, MmfFilterHandle* handle, const char* name) {
  const AoResourceAccessOps* access = plugin.resources();
  const AoResource* rows = access ? access->GetResources(handle) : nullptr;
  for (const AoResource* row = rows; row && row->Name; ++row) {
    if (!std::strcmp(row->Name, name)) return row;
  }
  return nullptr;
}

int64_t DurationResource(const host::Plugin& plugin, MmfFilterHandle* handle) {
  const AoResource* row = FindResource(plugin, handle, "Duration");
  if (!row || !row->Value || (row->Type & kAoResourceKindMask) != kAoResourceInt64) return 0;
  return *static_cast<const int64_t*>(row->Value);
}

bool IsVideo(const MmfMediaFormat& format) {
  return format.stream_type == static_cast<uint32_t>(kMmfStreamEncodedVideo);
}

struct ProbeReport {
  std::string file;
  int sniff = 0;
  int rating = 0;
  bool rated = false;
  int64_t duration = 0;
  bool seekable = false;
  int input_set_format = -1;
  int input_set_media_output = -1;
  int input_set_pool = -1;
  std::vector<host::OutputChannelSetup> channels;
};

// ---- text ----

void PrintChannelText(const host::OutputChannelSetup& setup, size_t index) {
  const MmfChannel& channel = *setup.channel;
  const MmfMediaFormat& format = channel.Format;
  std::printf("  channel %zu:\n", index);
  std::printf("    name: %s\n", channel.Name ? channel.Name : "");
  if (setup.formats_offered == 0) {
    std::printf("    set_up: no\n    reason: %s\n", setup.not_set_up.c_str());
    return;
  }
  std::printf("    fourcc: %s\n", FourCc(format.fourcc).c_str());
  std::printf("    stream_type: 0x%08" PRIX32 "\n", format.stream_type);
  if (IsVideo(format)) {
    const MmfVideoFormat& video = format.media.video;
    std::printf("    width: %u\n    height: %u\n    frame_rate: %u\n", video.width, video.height, video.frame_rate);
    std::printf("    pixel_aspect: %u:%u\n", video.pixel_aspect_width, video.pixel_aspect_height);
    std::printf("    duration_us: %d\n", video.duration);
  } else {
    const MmfAudioFormat& audio = format.media.audio;
    std::printf("    channels: %u\n    sample_rate: %u\n    bits_per_sample: %u\n", audio.channels,
                audio.sample_rate, audio.bits_per_sample);
    std::printf("    duration: %d\n", audio.duration);
  }
  std::printf("    stream_duration: %" PRIu64 "\n", format.duration);
  std::printf("    extra_size: %u\n", format.extra_size);
  std::printf("    buffer_count: %u\n", setup.offered.buffer_count);
  std::printf("    acquire: %d\n    set_format: %d\n    set_pool: %d\n", setup.acquire_result,
              setup.set_format_result, setup.pool_result);
}

void PrintText(const ProbeReport& report) {
  std::printf("file: %s\nsniff: %d\nrating: %d\n", report.file.c_str(), report.sniff, report.rating);
  if (!report.rated) return;
  std::printf("duration_resource: %" PRId64 "\n", report.duration);
  std::printf("seekable: %s\n", report.seekable ? "yes" : "no");
  std::printf("input:\n  set_format: %d\n  set_media_output: %d\n  set_pool: %d\n", report.input_set_format,
              report.input_set_media_output, report.input_set_pool);
  std::printf("channels:\n");
  for (size_t k = 0; k < report.channels.size(); ++k) PrintChannelText(report.channels[k], k);
}

// ---- JSON ----

void WriteChannelJson(JsonWriter& out, const host::OutputChannelSetup& setup, size_t index) {
  const MmfChannel& channel = *setup.channel;
  const MmfMediaFormat& format = channel.Format;
  out.BeginObject();
  out.Field("index", index);
  out.Field("name", channel.Name ? channel.Name : "");
  out.Field("set_up", setup.formats_offered > 0);
  if (setup.formats_offered == 0) {
    out.Field("reason", setup.not_set_up);
    out.EndObject();
    return;
  }
  out.Field("fourcc", FourCc(format.fourcc));
  out.Field("stream_type", format.stream_type);
  out.Field("media", IsVideo(format) ? "video" : "audio");
  if (IsVideo(format)) {
    const MmfVideoFormat& video = format.media.video;
    out.Field("width", video.width);
    out.Field("height", video.height);
    out.Field("frame_rate", video.frame_rate);
    out.Field("pixel_aspect_width", video.pixel_aspect_width);
    out.Field("pixel_aspect_height", video.pixel_aspect_height);
    out.Field("duration_us", video.duration);
  } else {
    const MmfAudioFormat& audio = format.media.audio;
    out.Field("channels", audio.channels);
    out.Field("sample_rate", audio.sample_rate);
    out.Field("bits_per_sample", audio.bits_per_sample);
    out.Field("duration", audio.duration);
  }
  out.Field("stream_duration", format.duration);
  out.Field("extra_size", format.extra_size);
  out.Field("buffer_count", setup.offered.buffer_count);
  out.Field("acquire", setup.acquire_result);
  out.Field("set_format", setup.set_format_result);
  out.Field("set_pool", setup.pool_result);
  out.EndObject();
}

void WriteJson(const ProbeReport& report) {
  JsonWriter out(stdout);
  out.BeginObject();
  out.Field("schema_version", kSchemaVersion);
  out.Field("command", "probe");
  out.Field("file", report.file);
  out.Field("sniff", report.sniff);
  out.Field("rating", report.rating);
  out.Field("accepted", report.rated);
  if (report.rated) {
    out.Field("duration_resource", report.duration);
    out.Field("seekable", report.seekable);
    out.Key("input");
    out.BeginObject();
    out.Field("set_format", report.input_set_format);
    out.Field("set_media_output", report.input_set_media_output);
    out.Field("set_pool", report.input_set_pool);
    out.EndObject();
  }
  out.Key("channels");
  out.BeginArray();
  for (size_t k = 0; k < report.channels.size(); ++k) WriteChannelJson(out, report.channels[k], k);
  out.EndArray();
  out.EndObject();
  out.Finish();
}

}  // namespace

int RunProbe(int argc, char** argv) {
  std::string plugin_path = host::PluginBesideExecutable();
  const char* file = nullptr;
  bool json = false;
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (IsHelpOption(arg)) {
      std::printf(kProbeHelp, kPluginOptionHelp);
      return kExitOk;
    }
    if (!std::strcmp(arg, "--plugin")) {
      if (i + 1 >= argc) return UsageError("probe", "--plugin needs a PATH");
      plugin_path = argv[++i];
    } else if (!std::strcmp(arg, "--json")) {
      json = true;
    } else if (int code = TakeFile("probe", arg, &file); code != kExitOk) {
      return code;
    }
  }
  if (!file) return UsageError("probe", "no FILE given");
  bool from_stream = false;  // standard input, a FIFO or a pipe: read once, never seeks
  if (int code = CheckInput("probe", file, InputUse::kOnce, &from_stream); code != kExitOk) return code;
  std::unique_ptr<host::Plugin> plugin = LoadPlugin("probe", plugin_path);
  if (!plugin) return kExitFailed;
  auto stream = host::OpenFileStream(file, !from_stream);
  if (!stream) return Failure("probe", "cannot open %s", file);

  // The input channel is connected to a file streamer over the same input,
  // as in playback; probing only sets the connection up.
  host::SetupOptions options;
  host::FileStreamer streamer(stream.get(), {options.buffer_size, kPoolBuffers});
  host::MemoryPool input_pool(options.buffer_size, kPoolBuffers);
  host::MemoryPool output_pool(options.buffer_size, kPoolBuffers);
  options.upstream = host::FileStreamer::Ops();
  options.upstream_output = streamer.output();
  options.input_pool = host::MemoryPool::Ops();
  options.input_pool_param = input_pool.handle();
  options.output_pool = host::MemoryPool::Ops();
  options.output_pool_param = output_pool.handle();
  host::FilterGraph graph(*plugin, *stream, options);

  ProbeReport report;
  report.file = file;
  report.sniff = graph.sniff();
  report.rating = graph.rating();
  report.rated = graph.rated();
  if (report.rated) {
    MmfFilterHandle* handle = graph.handle();
    const MmfSeekerOps* seeker = plugin->seeker();
    report.duration = DurationResource(*plugin, handle);
    report.seekable = seeker && seeker->SeekQuery(handle) == kSeekable;
    report.input_set_format = graph.input_format_result();
    report.input_set_media_output = graph.media_output_result();
    report.input_set_pool = graph.input_pool_result();
    report.channels = graph.outputs();
  }
  json ? WriteJson(report) : PrintText(report);
  if (!json && report.rated && !from_stream) PrintCompressionNotes(file);
  return report.rated ? kExitOk : RefusedFile("probe", file, report.rating);
}
