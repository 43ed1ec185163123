// The packets tool's frame lines: each sink thread hands its frames over in
// chunks (gathered in place or copied in), a thread of their own formats them and spills full blocks to a
// temporary file, and each channel's lines come out whole and in order at
// the end. Long runs of frames on several threads at once go through every
// hand-over and spill, and each line is checked against printf's.

#include <algorithm>
#include <cinttypes>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tools/frame_lines.h"

namespace {

// Frames whose times cross whole seconds at odd places and reach 20 digits,
// with sizes of every length: channel k's frame i.
host::RunFrame FrameOf(size_t k, size_t i) {
  host::RunFrame frame;
  frame.time_us = i % 997 == 3 ? UINT64_MAX - i : i * 33'367 + k * 1'000'001;
  frame.size = static_cast<uint32_t>(i % 11 == 0 ? 4'000'000'000u - i : (i * 7919) % 100'000);
  frame.adler32 = static_cast<uint32_t>(i * 2'654'435'761u);
  return frame;
}

std::string Expected(size_t k, uint64_t track, size_t count, bool hash) {
  std::string text;
  char line[128];
  for (size_t i = 0; i < count; ++i) {
    const host::RunFrame frame = FrameOf(k, i);
    int n = std::snprintf(line, sizeof line, "%zu %" PRIu64 " %" PRIu64 " %" PRIu32, k, track, frame.time_us, frame.size);
    if (hash) n += std::snprintf(line + n, sizeof line - static_cast<size_t>(n), " %08" PRIx32, frame.adler32);
    text.append(line, static_cast<size_t>(n)).push_back('\n');
  }
  return text;
}

// What Write leaves in a stream after a line already buffered there: a
// temporary file, which the kernel fills from the spill directly, or a memory
// stream, which has no descriptor and takes the lines through a buffer.
std::string Written(FrameLines& lines, int32_t channel, bool in_memory) {
  char* memory = nullptr;
  size_t memory_size = 0;
  std::FILE* out = in_memory ? open_memstream(&memory, &memory_size) : std::tmpfile();
  EXPECT_NE(out, nullptr);
  std::fputs("config line\n", out);
  EXPECT_TRUE(lines.Write(channel, out));
  std::string text(in_memory ? 0 : static_cast<size_t>(std::ftell(out)), '\0');
  if (!in_memory) std::rewind(out);
  EXPECT_EQ(std::fread(text.data(), 1, text.size(), out), text.size());
  std::fclose(out);
  if (in_memory) text.assign(memory, memory_size);
  std::free(memory);
  return text;
}

TEST(FrameLinesTest, EveryChannelsLinesComeOutWholeAndInOrder) {
  // frames per channel; batch: frames per call, as a sink hands over one output buffer's; in_place:
  // gathered in the room FrameLines gives, as the runner's sinks do.
  struct Case { const char* name; bool hash; std::vector<size_t> frames; size_t batch; bool in_place; };
  const Case cases[] = {
      {"one short channel", false, {5}, 256, false},
      {"four channels through many chunks and blocks", false, {40'000, 9'000, 2'048, 0}, 256, false},
      {"with checksums, one frame at a time", true, {7'000, 6'001}, 1, false},
      {"batches larger than a chunk", true, {30'000}, 5'000, false},
      {"in place, four channels", false, {40'000, 9'000, 2'049, 1}, 256, true},
      {"in place, with checksums, as much as the room takes", true, {12'345, 3}, SIZE_MAX, true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::vector<uint64_t> tracks;
    for (size_t k = 0; k < c.frames.size(); ++k) tracks.push_back(10 + k * 300);
    FrameLines lines(tracks, c.hash);
    std::vector<std::thread> sinks;
    for (size_t k = 0; k < c.frames.size(); ++k) {
      sinks.emplace_back([&, k] {
        const auto channel = static_cast<int32_t>(k);
        std::vector<host::RunFrame> copied(c.in_place ? 0 : c.batch);  // the sink's own batch
        for (size_t i = 0; i < c.frames[k];) {
          size_t room = copied.size();
          host::RunFrame* at = c.in_place ? FrameLines::Room(&lines, channel, &room) : copied.data();
          const size_t n = std::min({room, c.batch, c.frames[k] - i});
          for (size_t j = 0; j < n; ++j) at[j] = FrameOf(k, i + j);
          FrameLines::OnFrames(&lines, channel, at, n);
          i += n;
        }
      });
    }
    for (std::thread& sink : sinks) sink.join();
    for (size_t k = 0; k < c.frames.size(); ++k) {
      EXPECT_EQ(Written(lines, static_cast<int32_t>(k), k % 2 == 1),
                "config line\n" + Expected(k, tracks[k], c.frames[k], c.hash))
          << "channel " << k;
    }
  }
}

}  // namespace
