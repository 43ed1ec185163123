#pragma once
// Runs a parser graph as the framework does: the file streamer feeds the
// plug-in's input channel, and each acquired output channel has a sink on its
// own thread that calls the plug-in's NextBuffer until the end of the stream
// and gives every output media buffer back once it has consumed it. Sinks
// put split frames back together and prepend frame prefixes, so what they
// record are whole frames (checksummed piece by piece, never copied). They
// also check that each frame element points into an input buffer.

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "host/playback_control.h"
#include "host/plugin_loader.h"

namespace host {

struct RunFrame {
  uint64_t time_us = 0;  // the last timestamp property before the frame
  uint32_t size = 0;
  uint32_t adler32 = 0;  // 0 when checksums are off
  bool marked = false;   // a time marker (property 3) came since the frame before
};

// Frames a sink gathers before it passes them to RunnerOptions::on_frames:
// one call per output buffer rather than one per frame.
constexpr size_t kFrameBatch = 256;

struct RunnerOptions {
  uint32_t input_buffer_size = 65536;  // the read unit the input format announces
  uint32_t first_input_buffer_size = 0;  // bytes of the streamer's first buffer; 0: input_buffer_size
  // Indexes of the output channels to acquire; empty: all of them.
  std::vector<int32_t> channels;
  // Per acquired channel (in the order of `channels`), microseconds a sink
  // sleeps after each output buffer; missing entries are 0.
  std::vector<uint32_t> sink_delay_us;
  bool checksum = true;  // Adler-32 of every frame
  uint32_t config_buffer_size = 65536;  // bytes of an output pool buffer (decoder configurations)
  // Called on a sink's thread once per output buffer it consumed, before the
  // buffer goes back; the buffer's elements are readable.
  void (*on_buffer)(void* user, int32_t channel, MmfMra* buffer) = nullptr;
  void* user = nullptr;
  // Called on a sink's thread with the whole frames (not decoder-configuration
  // packets) completed in the output buffers it consumed, in order, at most
  // kFrameBatch (or frame_room's room) at a time: when that room is full,
  // when NextBuffer answers anything but a delivery, and, under playback
  // control, after each output buffer (before on_buffer). With keep_frames
  // off, ChannelRun::frames stays empty, so a long file costs no memory per
  // frame.
  void (*on_frames)(void* user, int32_t channel, const RunFrame* frames, size_t count) = nullptr;
  // Where a sink gathers the frames it passes to on_frames next, and in
  // *room how many fit there: the consumer's own storage, so that it need not
  // copy them again. Asked on the sink's thread at its start and after each
  // on_frames. Null (or no room): the sink's own batch of kFrameBatch.
  RunFrame* (*frame_room)(void* user, int32_t channel, size_t* room) = nullptr;
  bool keep_frames = true;
  // Another upstream filter in place of the file streamer: its output channel
  // and operations. It delivers from the first Cluster on.
  const MmfMediaOutputOps* upstream = nullptr;
  MmfChannel* upstream_output = nullptr;
  // Playback control on a controller thread (file streamer only): the actions
  // in order, or, when set, the script in their place.
  std::vector<ControlAction> actions;
  std::function<void(PlaybackControl&)> script;
  // The file streamer reads the next buffers on a thread of its own while
  // the channels parse (see StreamerConfig::read_ahead); off for tests that
  // need a fixed order of reads.
  bool read_ahead = false;
  // The sinks' threads side by side on one core and the reader on another
  // (see host/thread_placement.h): for sinks that do little of their own.
  bool channels_share_core = false;
  bool preroll = false;       // sets "EnablePreroll"
  int32_t trick_time_ms = 0;  // sets "TrickTime" when not 0
  // Damaged input (file streamer only, see host/damage_recovery.h): after a
  // channel fails, the channels that it stopped catch up to where it failed;
  // then playback goes on from the first cue point after the furthest frame
  // delivered, at most `recoveries` times. Off: a failure ends the run.
  bool catch_up = false;
  int recoveries = 0;
};

// Where a channel's frames stopped at damaged input and went on again.
struct Gap {
  size_t at = 0;           // frames delivered before it
  uint64_t from_us = 0;    // time of the last of them
  uint64_t to_us = 0;      // time of the cue point playback went on from
  uint64_t after_byte = 0;  // the furthest any channel had got: the damage lies after it
};

struct ChannelRun {
  int32_t index = -1;  // output channel index
  std::string name;
  uint32_t fourcc = 0;
  std::vector<RunFrame> config;  // decoder-configuration packets (property 30)
  std::vector<RunFrame> frames;  // empty unless RunnerOptions::keep_frames
  uint64_t frame_count = 0;      // frames delivered, kept or not
  uint64_t last_time_us = 0;     // time of the last of them
  std::vector<size_t> seeks;     // frame_count when each control sequence took effect
  int end_result = 0;             // NextBuffer's last answer
  uint64_t buffers = 0;           // output media buffers consumed
  uint64_t skip_marks = 0;        // properties 37
  uint64_t time_markers = 0;      // properties 3
  uint64_t foreign_elements = 0;  // frame elements that point outside every input buffer
  bool incomplete_frame = false;  // the stream ended inside a split frame
  uint64_t frame_end = 0;         // file offset just past the last frame delivered
  // Its last NextBuffer failed of itself, rather than answering a state that
  // another channel's failure or a Stop had set.
  bool failed = false;
  std::vector<Gap> gaps;
};

struct RunResult {
  bool ok = false;  // rated, set up, and every sink ended with end of stream
  std::string error;
  int rating = 0;
  std::vector<ChannelRun> channels;
  uint64_t bytes_read = 0;  // by the streamer
  std::vector<int> control_results;  // the answer of each action
  uint64_t first_cluster = 0;  // where the input stood after the rating
};

// Loads nothing: `plugin` is the loaded kelvane.so.
RunResult RunGraph(const Plugin& plugin, const std::string& path, const RunnerOptions& options);

}  // namespace host
