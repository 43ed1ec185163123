// The whole plug-in as a framework drives it: loaded by path, the input rated,
// output channels acquired, and playback through a real graph (the host's
// file streamer upstream, sinks downstream) while a controller seeks,
// flushes, pauses, resumes, scans forward and backward, ends a scan and
// stops, as the input commands.
//
// Input: a control header, then the file. The file starts at the first EBML
// magic (1A 45 DF A3) within the first 64 bytes; the bytes before it are the
// header, so a fixture on its own is a seed that plays all its channels with
// no commands. Without a magic the first 8 bytes are the header. Header:
//   byte 0: bits 0-1 channel threads (0: one channel pulled on this thread,
//           deterministic; 1-3: that many channels, each on a sink thread),
//           bit 2 EnablePreroll, bits 3-7 which channel the deterministic
//           mode plays;
//   byte 1: input buffer size code; byte 2: TrickTime code (0: default);
//   then commands of an op byte and an argument (see Command).
// KELVANE_FUZZ_SINGLE=1 forces the deterministic mode, to reproduce a crash.
//
// Every answer must be a specified one, every frame element must lie inside
// the buffer it names (threaded runs: inside an input buffer), and after
// teardown no block the plug-in allocated may remain.

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "fuzz/fuzz_input.h"
#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/graph_runner.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "host/memory_pools.h"
#include "host/playback_control.h"
#include "host/plugin_loader.h"
#include "platform/media_buffer.h"
#include "platform/mmf_status.h"

namespace {

// Bounds of one execution: the file is cut, input buffers are never so small
// that a file takes more than kMaxInputBuffers of them, and the deterministic
// mode pulls at most kMaxPulls output buffers.
constexpr size_t kMaxFileBytes = 160 * 1024;  // the largest fixture, Cues at its end
constexpr size_t kMaxInputBuffers = 2048;
constexpr int kMaxCommands = 24;
constexpr int kMaxPulls = 4000;
constexpr int kMaxShortInputs = 64;
constexpr size_t kHeaderSearch = 64;
constexpr size_t kHeaderWithoutMagic = 8;

using fuzz_input::Check;
using fuzz_input::OneOf;

const host::Plugin* plugin = nullptr;
std::string scratch_path;

// What NextBuffer may end with: an error, the end of the stream, a short
// input, or the stopped state.
bool SpecifiedEnd(int result) { return OneOf(result, {1, kMmfEndOfStream, 4, 16}); }
bool SpecifiedControl(int result) { return OneOf(result, {0, kMmfStoppedAfterError}); }
bool SpecifiedScan(int result) { return OneOf(result, {0, 48, kMmfInvalidArgument, kMmfNotAvailable, 12}); }

struct Command {
  enum Kind { kSeek, kPause, kResume, kScanForward, kScanBackward, kScanEnd, kFlush, kWait, kStop };
  Kind kind;
  uint64_t time_us;
  uint32_t speed;
  uint32_t amount;  // kWait: pulls (deterministic) or quarter milliseconds (threads)
};

struct Header {
  int threads;
  bool preroll;
  uint32_t channel, buffer_size;
  int32_t trick_time_ms;
  std::vector<Command> commands;
};

Header ReadHeader(const uint8_t* data, size_t size) {
  fuzz_input::Reader in(data, size);
  const uint8_t flags = in.Byte(), code = in.Byte(), trick = in.Byte();
  Header header{flags & 3, (flags & 4) != 0, static_cast<uint32_t>(flags >> 3),
                code < 128 ? code + 1u : (code - 127u) * 512u, trick ? 500 + trick * 2 : 0, {}};
  while (!in.empty() && header.commands.size() < kMaxCommands) {
    const uint8_t op = in.Byte();
    Command command{static_cast<Command::Kind>(op % 9), 0, 0, 0};
    // A seek mostly within the first ten seconds, sometimes anywhere.
    command.time_us = op & 0x80 ? in.Number() : uint64_t{in.Byte()} * 40000;
    command.speed = op & 0x40 ? static_cast<uint32_t>(in.Number()) : 100u * (1 + in.Byte() % 16);
    command.amount = in.Byte();
    header.commands.push_back(command);
  }
  const char* single = std::getenv("KELVANE_FUZZ_SINGLE");  // reproduces a crash on one thread
  if (single && *single && *single != '0') header.threads = 0;
  return header;
}

// Where the file starts: at the EBML magic near the front, else after a fixed header.
size_t FileStart(const uint8_t* data, size_t size) {
  static const uint8_t kMagic[] = {0x1A, 0x45, 0xDF, 0xA3};
  const uint8_t* end = data + std::min(size, kHeaderSearch + sizeof kMagic);
  const uint8_t* magic = std::search(data, end, std::begin(kMagic), std::end(kMagic));
  return magic != end ? static_cast<size_t>(magic - data) : std::min(size, kHeaderWithoutMagic);
}

// A delivered media buffer: each buffer element inside the buffer it names;
// the time of its last timestamp property (0: none).
uint64_t CheckedLastTime(MmfMra* mra) {
  uint64_t time = 0;
  uint32_t kind = 0, type = 0, low = 0, size = 0;
  uint16_t high = 0;
  MmfPoolBuffer* handle = nullptr;
  uint8_t* address = nullptr;
  for (uint32_t i = 0; MmfGetMraElementType(mra, i, &kind) == 0; ++i) {
    if (kind == kMmfElementBuffer && MmfGetMraBufferElement(mra, i, &handle, &address, &size) == 0) {
      Check(handle && address >= handle->Data && size <= handle->Size &&
                static_cast<size_t>(address - handle->Data) <= handle->Size - size,
            "a buffer element outside its buffer", static_cast<long>(size));
    } else if (kind == kMmfElementProperty && MmfGetMraPropertyElement(mra, i, &type, &low, &high) == 0 &&
               OneOf(static_cast<int>(type), {kMmfPropVideoTime, kMmfPropAudioTime, kMmfPropSubtitleTime})) {
      time = MmfPropertyValue(low, high);
    }
  }
  return time;
}

// The commands both modes send the same way, through the playback controller,
// each answer checked. False for the ones each mode does its own way.
bool ApplyControlCommand(host::PlaybackControl& playback, const Command& command) {
  switch (command.kind) {
    case Command::kSeek:
      Check(OneOf(playback.Seek(command.time_us), {0, kMmfNoConversion}), "seek");
      return true;
    case Command::kPause:
    case Command::kResume:
      Check(SpecifiedControl(command.kind == Command::kPause ? playback.Pause() : playback.Resume()), "pause");
      return true;
    case Command::kScanForward:
    case Command::kScanBackward:
      Check(SpecifiedScan(command.kind == Command::kScanForward ? playback.ScanForward(command.speed)
                                                                : playback.ScanBackward(command.speed)),
            "scan");
      return true;
    case Command::kScanEnd:
      Check(SpecifiedScan(playback.ScanEnd()), "scan end");
      return true;
    default:
      return false;
  }
}

// One channel pulled on the calling thread, the commands done between pulls:
// the same input always takes the same path.
void PlayDeterministic(const uint8_t* file, size_t size, const Header& header) {
  auto rating_stream = host::MakeMemoryStream(file, size, true, "fuzz");
  auto source = host::MakeMemoryStream(file, size, true, "fuzz");
  host::MemoryPool prefix_pool(4096, 16);
  host::MemoryPool config_pool(65536, 8);
  // As many input buffers as the runner gives a graph: the ring's plus what frames still point into.
  const uint32_t buffers = std::clamp<uint32_t>((16u << 20) / header.buffer_size, 48, 2048);
  host::FileStreamer streamer(source.get(), host::StreamerConfig{header.buffer_size, buffers});
  const host::SetupOptions setup{.buffer_size = header.buffer_size, .configure_outputs = false,
                                 .upstream = host::FileStreamer::Ops(), .input_pool = host::MemoryPool::Ops(),
                                 .input_pool_param = prefix_pool.handle()};
  host::FilterGraph graph(*plugin, *rating_stream, setup);
  Check(OneOf(graph.rating(), {0, kMmfRatingAccepted}), "rating", graph.rating());
  if (!graph.rated() || graph.outputs().empty()) return;
  MmfFilterHandle* handle = graph.handle();
  handle->InputChannel->Peer = streamer.output();
  if (const auto* list_maker = plugin->Get<MmfListMakerOps>("MediaListMaker")) {
    streamer.ConnectListMaker(list_maker, handle->InputChannel);
  }
  const int64_t first_cluster = rating_stream->Tell();
  const MmfMediaOutputOps* output = plugin->output();
  const auto* control = plugin->Get<MmfMediaControlOps>("MediaControl");
  const auto* flush = plugin->Get<MmfMediaFlushOps>("MediaFlush");
  const host::OutputChannelSetup& chosen = graph.outputs()[header.channel % graph.outputs().size()];
  MmfChannel* channel = chosen.channel;
  MmfMra* mra = nullptr;
  if (chosen.formats_offered == 0) return;  // a record counted for a track that was left out: it cannot play
  Check(output->AcquireOutputChannel(channel) == kMmfOk, "acquire");
  const bool configured = output->SetOutputFormat(channel, &chosen.offered) == kMmfOk &&
                          output->SetOutputChannelMemoryPool(channel, host::MemoryPool::Ops(),
                                                             config_pool.handle()) == kMmfOk;
  host::GraphClock clock;
  host::AttachGraphClock(handle->Graph, &clock);
  if (configured && first_cluster >= 0) {
    if (const AoResourceAccessOps* resources = plugin->resources()) {
      int32_t on = 1;
      if (header.preroll) (void)resources->SetResource(handle, "EnablePreroll", &on);
      if (header.trick_time_ms) (void)resources->SetResource(handle, "TrickTime", &header.trick_time_ms);
    }
    (void)control->Start(handle);
    (void)streamer.Seek(static_cast<uint64_t>(first_cluster), 0);
    host::ControlTables tables{control, flush, plugin->converter(), plugin->seeker(),
                               plugin->Get<MmfTrickPlayOps>("MediaTrickPlay")};
    host::PlaybackControl playback(tables, handle, &streamer, &clock, 0);
    int pulls = 0;
    auto pull = [&](int count) {
      for (int short_inputs = 0; count > 0 && pulls < kMaxPulls; --count, ++pulls) {
        const int result = output->NextBuffer(channel, &mra);
        if (result == kMmfBufferDelivered && mra) {
          clock.Consumed(CheckedLastTime(mra));
          (void)MmfReleaseMra(mra);
          continue;
        }
        Check(SpecifiedEnd(result), "NextBuffer", result);
        if (result != 4 || ++short_inputs > kMaxShortInputs) return;
      }
    };
    for (const Command& command : header.commands) {
      if (ApplyControlCommand(playback, command)) continue;
      if (command.kind == Command::kFlush) Check(flush->Flush(handle) == kMmfOk, "flush");
      if (command.kind == Command::kStop) Check(SpecifiedControl(control->Stop(handle)), "stop");
      if (command.kind == Command::kWait) pull(static_cast<int>(command.amount));
    }
    pull(kMaxPulls);
    (void)control->Stop(handle);
  }
  (void)flush->Flush(handle);
  (void)output->ReleaseOutputChannel(channel);
  host::AttachGraphClock(handle->Graph, nullptr);
}

// Threads: RunGraph's sinks, and this controller's commands as its script.
void PlayThreaded(const uint8_t* file, size_t size, const Header& header) {
  size_t outputs = 0;
  {
    auto stream = host::MakeMemoryStream(file, size, true, "fuzz");
    host::FilterGraph graph(*plugin, *stream, {.configure_outputs = false});
    if (!graph.rated()) return;
    for (const host::OutputChannelSetup& output : graph.outputs()) outputs += output.formats_offered > 0;
  }
  FILE* out = std::fopen(scratch_path.c_str(), "wb");
  Check(out != nullptr && std::fwrite(file, 1, size, out) == size, "scratch file");
  std::fclose(out);

  host::RunnerOptions options;
  options.input_buffer_size = header.buffer_size;
  options.checksum = false;
  options.preroll = header.preroll;
  options.trick_time_ms = header.trick_time_ms;
  for (size_t k = 0; k < std::min<size_t>(outputs, static_cast<size_t>(header.threads)); ++k) {
    options.channels.push_back(static_cast<int32_t>(k));
    options.sink_delay_us.push_back(static_cast<uint32_t>(k) * 50);
  }
  if (!header.commands.empty()) {
    options.script = [&](host::PlaybackControl& playback) {
      for (const Command& command : header.commands) {
        if (ApplyControlCommand(playback, command)) continue;
        if (command.kind == Command::kFlush) {  // a flush happens only inside a sequence on a running graph
          Check(SpecifiedScan(playback.ScanEnd()), "scan end");
        } else if (command.kind == Command::kWait) {
          std::this_thread::sleep_for(std::chrono::microseconds(250 * (command.amount % 8)));
        } else if (command.kind == Command::kStop) {
          Check(SpecifiedControl(playback.Stop()), "stop");
          return;  // stopped sinks end; no sequence may follow
        }
      }
    };
  }
  host::RunResult run = host::RunGraph(*plugin, scratch_path, options);
  Check(OneOf(run.rating, {0, kMmfRatingAccepted}), "rating", run.rating);
  for (const host::ChannelRun& channel : run.channels) {
    Check(channel.foreign_elements == 0, "a frame element outside every input buffer",
          static_cast<long>(channel.foreign_elements));
    if (channel.buffers > 0 || run.error.empty()) Check(SpecifiedEnd(channel.end_result), "end", channel.end_result);
  }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  host::SetLogThreshold(0);
  std::string error;
  static std::unique_ptr<host::Plugin> loaded = host::Plugin::Load(KELVANE_PLUGIN_PATH, &error);
  Check(loaded != nullptr, error.c_str());
  plugin = loaded.get();
  const char* dir = access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp";
  scratch_path = std::string(dir) + "/kelvane_plugin_fuzz_" + std::to_string(getpid()) + ".mkv";
  std::atexit([] { std::remove(scratch_path.c_str()); });
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const size_t start = FileStart(data, size);
  Header header = ReadHeader(data, start);
  const size_t file_size = std::min(size - start, kMaxFileBytes);
  const size_t least = (file_size + kMaxInputBuffers - 1) / kMaxInputBuffers;
  header.buffer_size = static_cast<uint32_t>(std::max<size_t>(header.buffer_size, least));
  fuzz_input::ExpectNoBlockLeft(
      [&] { (header.threads == 0 ? PlayDeterministic : PlayThreaded)(data + start, file_size, header); });
  return 0;
}
