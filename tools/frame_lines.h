#pragma once
// `kelvane packets` lines of one channel's frames, written as the frames come
// in rather than kept. Each sink thread only gathers its frames' times and
// sizes in its channel's chunk; a full chunk goes to a thread of its own,
// which formats the lines into the channel's block and writes a full block
// to an unnamed temporary file. So a long file costs no memory per frame, the
// sink threads (which take turns with the demuxer) spend next to nothing on
// lines, and the lines still come out channel by channel at the end.

#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <deque>
#include <memory>
#include <mutex>
#include <new>
#include <thread>
#include <vector>

#include "host/graph_runner.h"

class FrameLines {
 public:
  // One writer per channel index in [0, channels); `tracks` gives each
  // channel's track number for the lines. The formatting thread runs on
  // `cpu` (-1: anywhere).
  FrameLines(const std::vector<uint64_t>& tracks, bool hash, int cpu = -1);
  ~FrameLines();
  FrameLines(const FrameLines&) = delete;
  FrameLines& operator=(const FrameLines&) = delete;

  // host::RunnerOptions::frame_room, with `user` this object: the rest of
  // the channel's chunk, where its sink then gathers its frames in place.
  static host::RunFrame* Room(void* user, int32_t channel, size_t* room);
  // host::RunnerOptions::on_frames, with `user` this object. Frames gathered
  // in the room given are taken as they lie; any others are copied in.
  static void OnFrames(void* user, int32_t channel, const host::RunFrame* frames, size_t count);

  // Writes channel `channel`'s lines to `out`, once its sink has stopped,
  // with a line "CHANNEL TRACK gap FROM_US TO_US" before the frame each gap
  // came before; false when a temporary file failed.
  bool Write(int32_t channel, FILE* out, const std::vector<host::Gap>& gaps = {});

 private:
  // Storage for frames that are only ever copied in whole: not initialised first.
  struct RawDelete {
    void operator()(host::RunFrame* frames) const { ::operator delete(frames); }
  };
  using FrameChunk = std::unique_ptr<host::RunFrame[], RawDelete>;
  static FrameChunk MakeChunk();

  struct Channel {
    // The sink's side: frames gathered, and the chunk being formatted.
    FrameChunk chunk;
    size_t filled = 0;
    FrameChunk handed;  // made at the first hand-over
    size_t handed_count = 0;
    bool formatting = false;  // `handed` is queued or being formatted (guarded by mutex_)
    // The formatting side.
    std::unique_ptr<char[]> block;
    size_t used = 0;
    size_t capacity = 0;
    char prefix[48];  // "CHANNEL TRACK "
    size_t prefix_length = 0;
    // The whole seconds of the last time of 1 s or more, and their digits.
    uint64_t seconds = 0;
    char seconds_text[16];
    size_t seconds_length = 0;
    FILE* spill = nullptr;
    bool in_memory = false;  // no temporary file could be made
    bool failed = false;     // writing the temporary file failed: lines were lost
  };
  void Hand(Channel& channel);
  void Format(Channel& channel, const host::RunFrame* frames, size_t count);
  template <bool kHash>
  void FormatLines(Channel& channel, const host::RunFrame* frames, size_t count);
  void Spill(Channel& channel);
  void RunFormatter();

  std::vector<uint64_t> tracks_;
  bool hash_;
  int cpu_;
  std::vector<Channel> channels_;
  size_t channel_count_;  // channels_.size(), without a division per frame
  std::mutex mutex_;
  std::condition_variable handed_;     // a chunk was handed over, or the formatter should stop
  std::condition_variable formatted_;  // a chunk was formatted
  std::deque<Channel*> queue_;
  bool stopping_ = false;
  std::thread formatter_;  // started with the first hand-over
};
