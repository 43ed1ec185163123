// `kelvane probe [--json] [--plugin PATH] FILE`: connects the plug-in to a
// file (or, for "-", to standard input, which cannot seek) the way the
// framework does, and prints the sniff and rating answers, the output
// channels with their formats, the "Duration" resource and whether the input
// seeks. The byte-rate estimate and the decoder-configuration packets have no
// operation of their own before playback; they are read from the instance's
// records, whose layout the plug-in's headers give.

#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "filter/mkv_context.h"
#include "filter/mkv_filter.h"
#include "host/file_streamer.h"
#include "host/graph_setup.h"
#include "host/memory_pools.h"
#include "tools/commands.h"

namespace {

constexpr uint32_t kPoolBuffers = 4;

std::string FourCc(uint32_t code) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    char c = static_cast<char>(code >> shift);
    text += (c >= 32 && c < 127) ? c : '?';
  }
  return text;
}

uint64_t DurationResource(const host::Plugin& plugin, MmfFilterHandle* handle) {
  const AoResourceAccessOps* access = plugin.resources();
  const AoResource* rows = access ? access->GetResources(handle) : nullptr;
  for (const AoResource* row = rows; row && row->Name; ++row) {
    if (std::strcmp(row->Name, "Duration") == 0) return *static_cast<const uint64_t*>(row->Value);
  }
  return 0;
}

// One line of output in either form: a key and its value, at a depth.
class Printer {
 public:
  explicit Printer(bool json) : json_(json) {}
  void Open(const char* key, bool array = false) {
    Key(key);
    std::printf(json_ ? (array ? "[" : "{") : "\n");
    first_ = true;
    ++depth_;
  }
  void Close(bool array = false) {
    --depth_;
    if (json_) std::printf(array ? "]" : "}");
    first_ = false;
  }
  void Item(const std::string& label) {  // an object inside an array; the label shows in text only
    Separate();
    if (json_) {
      std::printf("{");
    } else {
      std::printf("%*s%s\n", 2 * depth_, "", label.c_str());
    }
    first_ = true;
    ++depth_;
  }
  void Numbers(const char* key, const std::vector<int64_t>& values) {
    Key(key);
    if (json_) std::printf("[");
    for (size_t i = 0; i < values.size(); ++i) std::printf(json_ && i ? ",%" PRId64 : i ? " %" PRId64 : "%" PRId64, values[i]);
    std::printf(json_ ? "]" : values.empty() ? "none" : "");
    End();
  }
  void Number(const char* key, int64_t value) {
    Key(key);
    std::printf("%" PRId64, value);
    End();
  }
  void Text(const char* key, const std::string& value) {
    Key(key);
    std::printf(json_ ? "\"%s\"" : "%s", value.c_str());
    End();
  }
  void Finish() {
    if (json_) std::printf("}\n");
  }

 private:
  void Separate() {
    if (json_ && !first_) std::printf(",");
    first_ = false;
  }
  void Key(const char* key) {
    Separate();
    if (json_) {
      std::printf("\"%s\":", key);
    } else {
      std::printf("%*s%s: ", 2 * depth_, "", key);
    }
  }
  void End() {
    if (!json_) std::printf("\n");
  }
  bool json_;
  bool first_ = true;
  int depth_ = 0;
};

void PrintChannel(Printer& out, const host::OutputChannelSetup& setup, size_t index) {
  const MkvChannel& channel = *AsMkvChannel(setup.channel);
  const MmfMediaFormat& format = channel.Format;
  out.Item("channel " + std::to_string(index) + ":");
  out.Text("name", channel.Name ? channel.Name : "");
  out.Text("fourcc", FourCc(format.fourcc));
  char type[16];
  std::snprintf(type, sizeof type, "0x%08" PRIX32, format.stream_type);
  out.Text("stream_type", type);
  if (format.stream_type == static_cast<uint32_t>(kMmfStreamEncodedVideo)) {
    const MmfVideoFormat& video = format.media.video;
    out.Number("width", video.width);
    out.Number("height", video.height);
    out.Number("frame_rate", video.frame_rate);
    out.Text("pixel_aspect", std::to_string(video.pixel_aspect_width) + ":" + std::to_string(video.pixel_aspect_height));
    out.Number("duration_us", video.duration);
  } else {
    const MmfAudioFormat& audio = format.media.audio;
    out.Number("channels", audio.channels);
    out.Number("sample_rate", audio.sample_rate);
    out.Number("bits_per_sample", audio.bits_per_sample);
    out.Number("duration", audio.duration);
  }
  out.Number("stream_duration", static_cast<int64_t>(format.duration));
  out.Number("extra_size", format.extra_size);
  out.Number("buffer_count", setup.offered.buffer_count);
  const MkvChannelState* state = channel.State;
  std::vector<int64_t> packets;
  for (uint32_t j = 0; state && j < state->DecoderConfigCount && j < kMaxDecoderConfigPackets; ++j) {
    packets.push_back(state->DecoderConfigSize[j]);
  }
  out.Numbers("decoder_config", packets);
  out.Number("acquire", setup.acquire_result);
  out.Number("set_format", setup.set_format_result);
  out.Number("set_pool", setup.pool_result);
  out.Close();
}

int Usage() {
  std::fprintf(stderr, "usage: kelvane probe [--json] [--plugin PATH] FILE|-\n");
  return 2;
}

}  // namespace

int RunProbe(int argc, char** argv) {
  std::string plugin_path = host::PluginBesideExecutable();
  const char* file = nullptr;
  bool json = false;
  for (int i = 0; i < argc; ++i) {
    if (!std::strcmp(argv[i], "--plugin") && i + 1 < argc) {
      plugin_path = argv[++i];
    } else if (!std::strcmp(argv[i], "--json")) {
      json = true;
    } else if (!file && (argv[i][0] != '-' || !std::strcmp(argv[i], "-"))) {
      file = argv[i];
    } else {
      return Usage();
    }
  }
  if (!file) return Usage();

  std::string error;
  std::unique_ptr<host::Plugin> plugin = host::Plugin::Load(plugin_path, &error);
  if (!plugin) {
    std::fprintf(stderr, "kelvane: cannot load the plug-in %s: %s\n", plugin_path.c_str(), error.c_str());
    return 1;
  }
  const bool from_stdin = std::strcmp(file, "-") == 0;
  auto stream = host::OpenFileStream(file, !from_stdin);
  if (!stream) {
    std::fprintf(stderr, "kelvane: cannot open %s\n", file);
    return 1;
  }

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

  Printer out(json);
  if (json) std::printf("{");
  out.Text("file", from_stdin ? "-" : file);
  out.Number("sniff", graph.sniff());
  out.Number("rating", graph.rating());
  if (graph.rated()) {
    MmfFilterHandle* handle = graph.handle();
    const MmfSeekerOps* seeker = plugin->seeker();
    out.Number("duration_resource", static_cast<int64_t>(DurationResource(*plugin, handle)));
    out.Number("byte_rate", AsMkvFilter(handle)->Context->ByteRate);
    out.Text("seekable", seeker && seeker->SeekQuery(handle) == 2 ? "yes" : "no");
    out.Open("input");
    out.Number("set_format", graph.input_format_result());
    out.Number("set_media_output", graph.media_output_result());
    out.Number("set_pool", graph.input_pool_result());
    out.Close();
    out.Open("channels", true);
    for (size_t k = 0; k < graph.outputs().size(); ++k) PrintChannel(out, graph.outputs()[k], k);
    out.Close(true);
  }
  out.Finish();
  return graph.rated() ? 0 : 1;
}
