#include "host/graph_runner.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include "host/damage_recovery.h"
#include "host/file_streamer.h"
#include "host/frame_sink.h"
#include "host/graph_clock.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "host/memory_pools.h"
#include "host/thread_placement.h"
#include "platform/media_buffer.h"
#include "platform/mmf_status.h"

namespace host {
namespace {

constexpr uint32_t kPrefixBufferSize = 4096;
constexpr uint32_t kPrefixBuffers = 16;
constexpr uint32_t kConfigBuffers = 8;
// Input buffers referenced at once: the ring's 39 plus what output media
// buffers still point into; small buffers need many, and an output media
// buffer still being filled with large frames from large input buffers points
// into hundreds. Too few would leave the streamer waiting for a buffer under
// the plug-in's ring lock while the channel holding them waits for that lock.
// A pool buffer costs memory only once it is filled, so the pool is generous.
constexpr uint32_t kInputPoolBytes = 256u << 20;
constexpr uint32_t kMinInputBuffers = 48;
constexpr uint32_t kMaxInputBuffers = 2048;
constexpr int kMaxShortInputRetries = 1000;


constexpr int kControlStopped = 16;  // the control state a channel answers once the graph is stopped
constexpr int kFailed = 1;           // NextBuffer's error, and the control state it leaves

// What a sink thread works with.
struct SinkLinks {
  const MmfMediaOutputOps* output;
  MmfChannel* channel;
  ChannelRun* run;
  size_t index;  // among the sinks
  uint32_t delay_us;
  MmfMemoryPool* config_pool;
  MmfMemoryPool* prefix_pool;
  PlaybackControl* playback;  // null: none
  bool controlled;            // actions or a script: checkpoints, and the clock follows the frames
  const MmfMediaControlOps* control;
  MmfFilterHandle* handle;
};

void SinkThread(const SinkLinks links, const RunnerOptions& options) {
  ChannelRun* run = links.run;
  PlaybackControl* playback = links.playback;
  FrameSink sink(run, options, links.config_pool, links.prefix_pool, links.controlled);
  auto restart = [&] {
    if (playback->Flushed()) sink.Restart();
    if (playback->Marked()) {
      run->seeks.push_back(static_cast<size_t>(run->frame_count));
    } else {
      sink.SkipBefore(run->frame_end);
    }
  };
  int short_inputs = 0;
  for (;;) {
    if (links.controlled && playback->Checkpoint()) restart();
    MmfMra* mra = nullptr;
    const uint64_t taken = MrasAcquiredOnThisThread();
    int result = links.output->NextBuffer(links.channel, &mra);
    run->end_result = result;
    if (result == 4 && ++short_inputs < kMaxShortInputRetries) continue;  // delivery goes on
    if (result != kMmfBufferDelivered || !mra) {
      // A call that took no output buffer and failed only answered the state
      // another channel's failure had left. A channel that fails stops the
      // graph, as a player does when one of its decoders' inputs breaks: the
      // others may wait for ring room that only its reads would free.
      const bool stopped = result == kControlStopped || (result == kFailed && MrasAcquiredOnThisThread() == taken);
      run->failed = !stopped && result != kMmfEndOfStream;
      if (run->failed) (void)links.control->Stop(links.handle);
      sink.PassFrames();  // the recovery reads the counts while the sink waits
      if (playback && playback->AfterEnd(links.index)) {
        restart();
        continue;
      }
      break;
    }
    short_inputs = 0;
    ++run->buffers;
    const uint64_t frames_before = run->frame_count;
    MmfMra* shown = sink.Consume(mra);
    // Only a frame completed here moves the clock. A buffer cut short by a
    // control sequence's Stop may hold none, and the last frame before it may
    // be from before a seek: reported now, it would set the clock back.
    if (links.controlled && run->frame_count != frames_before && playback->Consumed(run->last_time_us)) restart();
    if (options.on_buffer) options.on_buffer(options.user, run->index, shown);
    if (shown != mra) (void)MmfReleaseMra(shown);
    (void)MmfReleaseMra(mra);
    if (links.delay_us) std::this_thread::sleep_for(std::chrono::microseconds(links.delay_us));
  }
  sink.Finish();
}

// The streamer's upstream as the plug-in sees it. Playback from the first
// Cluster is not a seek, yet the streamer heads the first buffer after its
// Seek with a time marker; that marker becomes a copy of the file-offset
// property that follows it. The streamer's output record's framework word
// holds the flag.
struct StartOfPlay {
  std::atomic<bool> marker_pending{true};
};

int StreamFromStart(MmfChannel* output, MmfMra** buffer) {
  int result = FileStreamer::Ops()->NextBuffer(output, buffer);
  auto* start = static_cast<StartOfPlay*>(output->Reserved);
  if (result != kMmfBufferDelivered || !start || !start->marker_pending.exchange(false)) return result;
  uint32_t type = 0, low = 0, next_type = 0, next_low = 0;
  uint16_t high = 0, next_high = 0;
  if (MmfGetMraPropertyElement(*buffer, 0, &type, &low, &high) == 0 && type == kMmfPropTimeMarker &&
      MmfGetMraPropertyElement(*buffer, 1, &next_type, &next_low, &next_high) == 0 &&
      next_type == kMmfPropFileOffset) {
    (void)MmfSetMraPropertyElement(*buffer, 0, next_type, next_low, next_high);
  }
  return result;
}

const MmfMediaOutputOps* StreamerFromStartOps() {
  static const MmfMediaOutputOps ops = [] {
    MmfMediaOutputOps copy = *FileStreamer::Ops();
    copy.NextBuffer = StreamFromStart;
    return copy;
  }();
  return &ops;
}

ControlTables ControlTablesOf(const Plugin& plugin) {
  return ControlTables{plugin.Get<MmfMediaControlOps>("MediaControl"), plugin.Get<MmfMediaFlushOps>("MediaFlush"),
                       plugin.converter(), plugin.seeker(), plugin.Get<MmfTrickPlayOps>("MediaTrickPlay")};
}

void SetControlResources(const Plugin& plugin, MmfFilterHandle* handle, const RunnerOptions& options) {
  const AoResourceAccessOps* resources = plugin.resources();
  if (!resources) return;
  int32_t on = 1;
  if (options.preroll) (void)resources->SetResource(handle, "EnablePreroll", &on);
  if (options.trick_time_ms) (void)resources->SetResource(handle, "TrickTime", &options.trick_time_ms);
}

uint32_t InputBufferCount(uint32_t size) {
  uint32_t count = size ? kInputPoolBytes / size : kMaxInputBuffers;
  return std::clamp(count, kMinInputBuffers, kMaxInputBuffers);
}

}  // namespace

RunResult RunGraph(const Plugin& plugin, const std::string& path, const RunnerOptions& options) {
  RunResult out;
  auto rating_stream = OpenFileStream(path, true);
  auto source = OpenFileStream(path, true);
  if (!rating_stream || !source) {
    out.error = "cannot open " + path;
    return out;
  }
  const MmfMediaOutputOps* output = plugin.output();
  const auto* control = plugin.Get<MmfMediaControlOps>("MediaControl");
  const auto* flush = plugin.Get<MmfMediaFlushOps>("MediaFlush");
  if (!output || !control || !flush) {
    out.error = "the plug-in lacks an interface the runner needs";
    return out;
  }

  MemoryPool prefix_pool(kPrefixBufferSize, kPrefixBuffers);
  MemoryPool config_pool(options.config_buffer_size, kConfigBuffers);
  const ThreadPlacement placement = options.channels_share_core ? PlaceChannelsTogether() : ThreadPlacement{};
  FileStreamer streamer(source.get(), StreamerConfig{options.input_buffer_size,
                                                     InputBufferCount(options.input_buffer_size),
                                                     options.first_input_buffer_size, options.read_ahead,
                                                     placement.reader_cpu});
  SetupOptions setup;
  setup.buffer_size = options.input_buffer_size;
  setup.configure_outputs = false;
  const bool own_upstream = options.upstream && options.upstream_output;
  setup.upstream = own_upstream ? options.upstream : StreamerFromStartOps();
  setup.input_pool = MemoryPool::Ops();
  setup.input_pool_param = prefix_pool.handle();
  FilterGraph graph(plugin, *rating_stream, setup);
  out.rating = graph.rating();
  if (!graph.rated()) {
    out.error = "the plug-in refused the file";
    return out;
  }
  MmfFilterHandle* handle = graph.handle();
  StartOfPlay start_of_play;
  streamer.output()->Reserved = &start_of_play;
  handle->InputChannel->Peer = own_upstream ? options.upstream_output : streamer.output();
  if (const auto* list_maker = plugin.Get<MmfListMakerOps>("MediaListMaker")) {
    streamer.ConnectListMaker(list_maker, handle->InputChannel);
  }
  const int64_t first_cluster = rating_stream->Tell();
  out.first_cluster = first_cluster > 0 ? static_cast<uint64_t>(first_cluster) : 0;

  // A framework connects only the channels that offer a format.
  std::vector<int32_t> wanted = options.channels;
  if (wanted.empty()) {
    for (size_t k = 0; k < graph.outputs().size(); ++k) {
      if (graph.outputs()[k].formats_offered > 0) wanted.push_back(static_cast<int32_t>(k));
    }
  }
  std::vector<MmfChannel*> acquired;
  for (int32_t k : wanted) {
    if (k < 0 || static_cast<size_t>(k) >= graph.outputs().size() ||
        graph.outputs()[static_cast<size_t>(k)].formats_offered == 0) {
      out.error = "no output channel " + std::to_string(k);
      break;
    }
    const OutputChannelSetup& channel = graph.outputs()[static_cast<size_t>(k)];
    if (output->AcquireOutputChannel(channel.channel) != kMmfOk) {
      out.error = "cannot acquire output channel " + std::to_string(k);
      break;
    }
    acquired.push_back(channel.channel);
    if (output->SetOutputFormat(channel.channel, &channel.offered) != kMmfOk ||
        output->SetOutputChannelMemoryPool(channel.channel, MemoryPool::Ops(), config_pool.handle()) != kMmfOk) {
      out.error = "cannot configure output channel " + std::to_string(k);
      break;
    }
    ChannelRun run;
    run.index = k;
    run.name = channel.channel->Name ? channel.channel->Name : "";
    run.fourcc = channel.offered.fourcc;
    out.channels.push_back(std::move(run));
  }

  GraphClock clock;
  AttachGraphClock(handle->Graph, &clock);
  if (out.error.empty() && first_cluster >= 0) {
    SetControlResources(plugin, handle, options);
    (void)control->Start(handle);
    if (!own_upstream) (void)streamer.Seek(static_cast<uint64_t>(first_cluster), 0);
    std::unique_ptr<PlaybackControl> playback;
    const bool controlled = !options.actions.empty() || options.script;
    if (!own_upstream && (controlled || options.catch_up)) {
      playback = std::make_unique<PlaybackControl>(ControlTablesOf(plugin), handle, &streamer, &clock, acquired.size());
    }
    std::vector<std::thread> sinks;
    for (size_t i = 0; i < acquired.size(); ++i) {
      const uint32_t delay = i < options.sink_delay_us.size() ? options.sink_delay_us[i] : 0;
      const SinkLinks links{output,         acquired[i],  &out.channels[i],         i,       delay,  config_pool.handle(),
                            prefix_pool.handle(), playback.get(), playback && controlled, control, handle};
      // By pointer: a Thumb function's address is odd, and a reference bound to it reads as misaligned.
      sinks.emplace_back(&SinkThread, links, std::cref(options));
      if (placement.channels_cpu >= 0) {
        KeepOnCpu(sinks.back(), placement.channels_cpu);
        WaitForTurnOnCore(sinks.back());
      }
    }
    std::thread controller;
    if (playback) {
      controller = std::thread([&] {
        if (options.script) {
          options.script(*playback);
        } else {
          out.control_results = playback->Run(options.actions);
        }
        if (options.catch_up) {
          const RecoveryLinks links{output, plugin.converter(), handle, config_pool.handle(), playback.get()};
          RecoverFromDamage(links, acquired, &out.channels, options.recoveries);
        }
        playback->Finish();
      });
    }
    for (std::thread& sink : sinks) sink.join();
    if (controller.joinable()) controller.join();
    (void)control->Stop(handle);
    out.ok = std::all_of(out.channels.begin(), out.channels.end(),
                         [](const ChannelRun& run) { return run.end_result == kMmfEndOfStream; });
    if (!out.ok) out.error = "a channel ended with an error";
  } else if (out.error.empty()) {
    out.error = "the input has no position after rating";
  }
  (void)flush->Flush(handle);
  for (MmfChannel* channel : acquired) (void)output->ReleaseOutputChannel(channel);
  AttachGraphClock(handle->Graph, nullptr);
  out.bytes_read = streamer.bytes_read();
  return out;
}

}  // namespace host
