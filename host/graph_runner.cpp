#include "host/graph_runner.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include "host/damage_recovery.h"
#include "host/file_streamer.h"
#include "host/graph_clock.h"
#include "host/graph_setup.h"
#include "host/input_streams.h"
#include "host/memory_pools.h"
#include "host/thread_placement.h"
#include "platform/media_buffer.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"

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

class Adler32 {
 public:
  void Update(const uint8_t* data, size_t n) {
    constexpr uint32_t kBase = 65521;
    constexpr size_t kBlock = 5552;  // the longest run without overflow of b
    while (n > 0) {
      size_t run = n < kBlock ? n : kBlock;
      n -= run;
      for (size_t i = 0; i < run; ++i) {
        a_ += data[i];
        b_ += a_;
      }
      data += run;
      a_ %= kBase;
      b_ %= kBase;
    }
  }
  uint32_t Value() const { return b_ << 16 | a_; }

 private:
  uint32_t a_ = 1, b_ = 0;
};

// One output channel's consumer: whole frames out of output media buffers.
// It runs for every element of every frame, so the options it needs per frame
// are copied in, the element bounds that the setter checked are not checked
// again, and a frame in one element (nearly all of them) takes a path of its
// own.
class Sink {
 public:
  Sink(ChannelRun* run, const RunnerOptions& options, MmfMemoryPool* config_pool, MmfMemoryPool* prefix_pool,
       bool pass_each_buffer)
      : run_(run),
        config_pool_(config_pool),
        prefix_pool_(prefix_pool),
        on_frames_(options.on_frames),
        frame_room_(options.frame_room),
        user_(options.user),
        index_(run->index),
        checksum_(options.checksum),
        keep_frames_(options.keep_frames),
        pass_each_buffer_(pass_each_buffer) {
    NextRoom();
  }
  Sink(const Sink&) = delete;  // it points into itself
  Sink& operator=(const Sink&) = delete;

  // Takes the buffer's frames; answers the buffer as a consumer of whole
  // buffers is to see it: the same, or while catching up a copy without the
  // frames passed on before (given back with MmfReleaseMra).
  MmfMra* Consume(MmfMra* mra) {
    const MraElement* element = MraElements(mra);
    const MraElement* const end = element + mra->ElementCount;
    consumed_ = element;
    consumed_count_ = mra->ElementCount;
    frame_first_ = element;  // of a frame begun in an earlier buffer, the part in this one
    while (element != end) {
      if (config_left_ == 0 && !in_parts_ && !checksum_ && skip_before_ == 0) {
        element = TakeWholeFrames(element, end);
        if (element == end) break;
      }
      current_ = element;
      if (element->kind == kMmfElementBuffer) {
        Buffer(*element);
      } else if (element->kind == kMmfElementProperty) {
        Property(*element);
      }
      ++element;
    }
    NoteFrameEnd();
    if (pass_each_buffer_) PassFrames();
    return dropped_.empty() ? mra : WithoutDropped(mra);
  }

  // The frames gathered so far go to the consumer, and the counts are up to
  // date: each buffer's when a controller follows them, else when the batch
  // is full and whenever the sink stops.
  void PassFrames() {
    if (batch_end_ == batch_begin_) return;
    const size_t count = static_cast<size_t>(batch_end_ - batch_begin_);
    run_->frame_count += count;
    run_->last_time_us = batch_end_[-1].time_us;
    if (keep_frames_) run_->frames.insert(run_->frames.end(), batch_begin_, batch_end_);
    if (on_frames_) on_frames_(user_, index_, batch_begin_, count);
    NextRoom();
  }

  ~Sink() {
    if (copies_) (void)MmfFreeMraPool(copies_);
  }

  void Finish() {
    PassFrames();
    run_->incomplete_frame = in_parts_;
  }

  // After a seek or a scan took effect: a frame being put together is lost to the flush.
  void Restart() {
    in_parts_ = false;
    last_part_ = false;
    marked_ = false;
  }

  // After the runner went back to a point before frames it already passed on
  // (to let a channel catch up): frames that start before `offset` are dropped.
  void SkipBefore(uint64_t offset) { skip_before_ = offset; }

 private:
  MmfMra* WithoutDropped(MmfMra* mra) {
    MmfMra* copy = nullptr;
    if (!copies_) copies_ = MakeMraPool(1, mra->Capacity);
    if (copies_ && MmfAcquireMra(copies_, &copy, kMmfAcquireNoWait) == 0) {
      uint32_t n = 0;
      for (uint32_t i = 0; i < consumed_count_; ++i) {
        const MraElement& e = consumed_[i];
        if (dropped_[i]) continue;
        (void)(e.kind == kMmfElementBuffer ? MmfSetMraBufferElement(copy, n++, e.handle, e.address, e.size)
                                           : MmfSetMraPropertyElement(copy, n++, e.type, e.low, e.high));
      }
    }
    dropped_.clear();
    return copy ? copy : mra;
  }

  // Where the last frame passed on ends in the file: its element's place in
  // the input buffer that the last file-offset property named.
  void NoteFrameEnd() {
    if (!last_frame_) return;
    run_->frame_end = file_offset_ + static_cast<uint64_t>(last_frame_->address + last_frame_->size -
                                                           last_frame_->handle->Data);
    last_frame_ = nullptr;
  }

  // Whether a frame whose first input piece is `element` was passed on before a catch-up.
  bool PassedBefore(const MraElement& element) {
    if (file_offset_ + static_cast<uint64_t>(element.address - element.handle->Data) < skip_before_) return true;
    skip_before_ = 0;  // a channel's frames come in file order: the rest are new
    return false;
  }

  void Property(const MraElement& element) {
    const uint32_t type = element.type;
    // A time comes with every frame: tested before the rest, without a jump table.
    if (type == kMmfPropVideoTime || type == kMmfPropAudioTime || type == kMmfPropSubtitleTime) {
      time_ = MmfPropertyValue(element.low, element.high);
      return;
    }
    switch (type) {
      case kMmfPropFileOffset:
        NoteFrameEnd();
        file_offset_ = MmfPropertyValue(element.low, element.high);
        break;
      case kMmfPropTimeMarker:
        ++run_->time_markers;
        marked_ = true;
        break;
      case kMmfPropSkipMark:
        ++run_->skip_marks;
        break;
      case kMmfPropConfigCount:
        config_left_ = static_cast<uint32_t>(MmfPropertyValue(element.low, element.high));
        break;
      case kMmfPropFramePart:
        if (!in_parts_) StartFrame();
        in_parts_ = true;
        if (dropping_) Drop(current_);
        break;
      case kMmfPropFrameEnd:
        if (!in_parts_) StartFrame();
        in_parts_ = true;
        last_part_ = true;
        if (dropping_) Drop(current_);
        break;
      default:
        break;
    }
  }

  void StartFrame() {
    frame_ = RunFrame{time_, 0, 0, marked_};
    marked_ = false;
    adler_ = Adler32{};
    dropping_ = false;
    placed_ = false;
    frame_first_ = current_;
  }

  // While catching up: the consumer of whole buffers does not see this element.
  void Drop(const MraElement* element) {
    if (dropped_.empty()) dropped_.resize(consumed_count_);
    dropped_[static_cast<size_t>(element - consumed_)] = true;
  }

  // Whether a frame element's bytes are the input's own (zero copy). Its
  // bounds need no test: MmfSetMraBufferElement refused any element outside
  // its pool buffer, and a null handle. What is left is the pool: never an
  // output pool buffer, and the filter's input pool only for the frame
  // prefix, the one piece that is neither a whole frame nor a frame's last.
  bool ZeroCopy(const MmfPoolBuffer* handle) const {
    const MmfMemoryPool* pool = handle->Pool;
    if (pool == config_pool_) return false;
    return pool != prefix_pool_ || (in_parts_ && !last_part_);
  }

  void Buffer(const MraElement& element) {
    if (config_left_ > 0) {
      --config_left_;
      AddConfig(run_, element, checksum_);
      return;
    }
    if (!ZeroCopy(element.handle)) ++run_->foreign_elements;
    const bool from_input = element.handle->Pool != prefix_pool_;
    if (!in_parts_) {
      // A frame of its own: passed on at once, with nothing to put together.
      const RunFrame frame{time_, element.size, checksum_ ? Checksum(element) : 0, marked_};
      marked_ = false;
      if (skip_before_ != 0 && PassedBefore(element)) return Drop(current_);
      last_frame_ = &element;
      Deliver(frame);
      return;
    }
    if (skip_before_ != 0 && from_input && !placed_ && (dropping_ = PassedBefore(element))) {
      for (const MraElement* e = frame_first_; e < current_; ++e) Drop(e);
    }
    placed_ = placed_ || from_input;
    if (dropping_) Drop(current_);
    frame_.size += element.size;
    if (checksum_) adler_.Update(element.address, element.size);
    if (!last_part_) return;
    if (!dropping_) last_frame_ = &element;  // only a whole frame counts as passed on
    frame_.adler32 = checksum_ ? adler_.Value() : 0;
    in_parts_ = false;
    last_part_ = false;
    const RunFrame frame = frame_;
    if (!dropping_) Deliver(frame);
  }

  // Nearly every element is a frame's time or a whole frame: without
  // checksums those go straight into the batch, the sink's state held in
  // locals, up to the first element of another kind (or the end), which is
  // returned for the general steps.
  const MraElement* TakeWholeFrames(const MraElement* element, const MraElement* end) {
    uint64_t time = time_;
    bool marked = marked_;
    RunFrame* out = batch_end_;
    RunFrame* limit = batch_limit_;
    uint64_t foreign = 0;
    const MraElement* last = nullptr;
    for (; element != end; ++element) {
      if (element->kind == kMmfElementProperty) {
        const uint32_t type = element->type;
        if (type != kMmfPropVideoTime && type != kMmfPropAudioTime && type != kMmfPropSubtitleTime) break;
        time = MmfPropertyValue(element->low, element->high);
        continue;
      }
      if (element->kind != kMmfElementBuffer) break;
      foreign += ZeroCopy(element->handle) ? 0 : 1;
      last = element;
      *out++ = RunFrame{time, element->size, 0, marked};
      marked = false;
      if (out == limit) {
        batch_end_ = out;
        PassFrames();
        out = batch_end_;
        limit = batch_limit_;
      }
    }
    time_ = time;
    marked_ = marked;
    batch_end_ = out;
    run_->foreign_elements += foreign;
    if (last) last_frame_ = last;
    return element;
  }

  static uint32_t Checksum(const MraElement& element) {
    Adler32 adler;
    adler.Update(element.address, element.size);
    return adler.Value();
  }

  // Out of line: a channel's decoder configurations come once per run. A
  // static function, so that the sink itself never escapes to a call.
  [[gnu::noinline]] static void AddConfig(ChannelRun* run, const MraElement& element, bool checksum) {
    run->config.push_back(RunFrame{0, element.size, checksum ? Checksum(element) : 0, false});
  }

  // Frames are gathered and counted a batch at a time.
  void Deliver(const RunFrame& frame) {
    *batch_end_++ = frame;
    if (batch_end_ == batch_limit_) PassFrames();
  }

  // The consumer's room for the next frames, else the sink's own batch.
  void NextRoom() {
    size_t room = 0;
    RunFrame* at = frame_room_ ? frame_room_(user_, index_, &room) : nullptr;
    if (!at || room == 0) {
      at = batch_;
      room = kFrameBatch;
    }
    batch_begin_ = batch_end_ = at;
    batch_limit_ = at + room;
  }

  ChannelRun* run_;
  MmfMemoryPool* config_pool_;
  MmfMemoryPool* prefix_pool_;
  void (*on_frames_)(void* user, int32_t channel, const RunFrame* frames, size_t count);
  RunFrame* (*frame_room_)(void* user, int32_t channel, size_t* room);
  void* user_;
  int32_t index_;
  bool checksum_;
  bool keep_frames_;
  bool pass_each_buffer_;
  uint64_t time_ = 0;
  uint32_t config_left_ = 0;
  bool in_parts_ = false;   // a frame announced by property 7 is being put together
  bool last_part_ = false;  // property 8 came: the next buffer element ends the frame
  bool marked_ = false;     // a time marker came since the last frame started
  const MraElement* consumed_ = nullptr;  // the elements of the buffer being consumed
  uint32_t consumed_count_ = 0;
  const MraElement* current_ = nullptr;      // the element being taken
  const MraElement* frame_first_ = nullptr;  // the first element of the frame being put together
  std::vector<bool> dropped_;  // while catching up: elements of frames passed on before
  MmfMraPool* copies_ = nullptr;
  bool placed_ = false;     // the frame being put together has had a piece from the input
  bool dropping_ = false;   // that piece showed it was passed on before a catch-up
  uint64_t file_offset_ = 0;               // of the input buffer that the last file-offset property named
  const MraElement* last_frame_ = nullptr;  // last input piece of a frame in the buffer being consumed
  uint64_t skip_before_ = 0;               // frames that start before this offset are dropped; 0: none
  RunFrame frame_;
  Adler32 adler_;
  RunFrame batch_[kFrameBatch];
  RunFrame* batch_begin_ = batch_;  // where the frames passed next are gathered
  RunFrame* batch_end_ = batch_;
  RunFrame* batch_limit_ = batch_ + kFrameBatch;
};

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
  Sink sink(run, options, links.config_pool, links.prefix_pool, links.controlled);
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
