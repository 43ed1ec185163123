#pragma once
// `kelvane packets` lines of one channel's frames, written as the frames come
// in rather than kept: each sink thread formats into its own channel's block,
// and a full block goes to an unnamed temporary file. So a long file costs no
// memory per frame, and the lines still come out channel by channel at the end.

#include <cstdint>
#include <cstdio>
#include <memory>
#include <vector>

#include "host/graph_runner.h"

class FrameLines {
 public:
  // One writer per channel index in [0, channels); `tracks` gives each
  // channel's track number for the lines.
  FrameLines(const std::vector<uint64_t>& tracks, bool hash);
  ~FrameLines();
  FrameLines(const FrameLines&) = delete;
  FrameLines& operator=(const FrameLines&) = delete;

  // host::RunnerOptions::on_frames, with `user` this object.
  static void OnFrames(void* user, int32_t channel, const host::RunFrame* frames, size_t count);

  // Writes channel `channel`'s lines to `out`; false when a temporary file failed.
  bool Write(int32_t channel, FILE* out);

 private:
  struct Channel {
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
  void Spill(Channel& channel);

  std::vector<uint64_t> tracks_;
  bool hash_;
  std::vector<Channel> channels_;
  size_t channel_count_;  // channels_.size(), without a division per frame
};
