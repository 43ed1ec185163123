#include "tools/frame_lines.h"

#include <cstring>

namespace {

// A block per channel: a few such blocks cost far less than a line per frame of a long file.
constexpr size_t kBlockBytes = 256 * 1024;
constexpr size_t kLongestLine = 80;

constexpr char kPairs[] =
    "00010203040506070809101112131415161718192021222324252627282930313233343536373839"
    "40414243444546474849505152535455565758596061626364656667686970717273747576777879"
    "8081828384858687888990919293949596979899";

int DigitCount(uint64_t value) {
  int n = 1;
  for (; value >= 10000; value /= 10000) n += 4;
  return n + (value >= 10) + (value >= 100) + (value >= 1000);
}

// Two digits at a time, written in place from the end: the lines are most of
// what the tool itself costs per frame.
template <typename Unsigned>
char* DecimalOf(char* out, Unsigned value) {
  char* const end = out + DigitCount(value);
  char* at = end;
  while (value >= 100) {
    const auto pair = static_cast<unsigned>(value % 100);
    value /= 100;
    at -= 2;
    std::memcpy(at, kPairs + 2 * pair, 2);
  }
  if (value >= 10) {
    std::memcpy(at - 2, kPairs + 2 * value, 2);
  } else {
    at[-1] = static_cast<char>('0' + value);
  }
  return end;
}

// 32-bit arithmetic while it holds the value (every time of a file under 71 minutes).
char* Decimal(char* out, uint64_t value) {
  return value <= UINT32_MAX ? DecimalOf(out, static_cast<uint32_t>(value)) : DecimalOf(out, value);
}

char* Hex8(char* out, uint32_t value) {
  static const char kHex[] = "0123456789abcdef";
  for (int shift = 28; shift >= 0; shift -= 4) *out++ = kHex[value >> shift & 0xF];
  return out;
}

}  // namespace

FrameLines::FrameLines(const std::vector<uint64_t>& tracks, bool hash)
    : tracks_(tracks), hash_(hash), channels_(tracks.size()) {
  for (size_t k = 0; k < channels_.size(); ++k) {
    Channel& channel = channels_[k];
    channel.block.reset(new char[kBlockBytes]);
    channel.capacity = kBlockBytes;
    char* out = Decimal(channel.prefix, k);
    *out++ = ' ';
    out = Decimal(out, tracks_[k]);
    *out++ = ' ';
    channel.prefix_length = static_cast<size_t>(out - channel.prefix);
  }
}

FrameLines::~FrameLines() {
  for (Channel& channel : channels_) {
    if (channel.spill) std::fclose(channel.spill);
  }
}

void FrameLines::OnFrame(void* user, int32_t channel, const host::RunFrame& frame) {
  static_cast<FrameLines*>(user)->Add(channel, frame);
}

// "CHANNEL TRACK TIME SIZE[ ADLER32]", as the lines of a kept run print.
void FrameLines::Add(int32_t index, const host::RunFrame& frame) {
  if (index < 0 || static_cast<size_t>(index) >= channels_.size()) return;  // not an offered channel
  Channel& channel = channels_[static_cast<size_t>(index)];
  if (channel.used + kLongestLine > channel.capacity) Spill(channel);
  char* out = channel.block.get() + channel.used;
  std::memcpy(out, channel.prefix, channel.prefix_length);
  out = Decimal(out + channel.prefix_length, frame.time_us);
  *out++ = ' ';
  out = Decimal(out, frame.size);
  if (hash_) {
    *out++ = ' ';
    out = Hex8(out, frame.adler32);
  }
  *out++ = '\n';
  channel.used = static_cast<size_t>(out - channel.block.get());
}

// Without a temporary file the block just grows: the lines are never lost.
void FrameLines::Spill(Channel& channel) {
  if (!channel.in_memory && !channel.spill) channel.spill = std::tmpfile();
  if (!channel.spill) {
    channel.in_memory = true;
    auto larger = std::make_unique<char[]>(channel.capacity * 2);
    std::memcpy(larger.get(), channel.block.get(), channel.used);
    channel.block = std::move(larger);
    channel.capacity *= 2;
    return;
  }
  if (std::fwrite(channel.block.get(), 1, channel.used, channel.spill) != channel.used) channel.failed = true;
  channel.used = 0;
}

bool FrameLines::Write(int32_t index, FILE* out) {
  if (index < 0 || static_cast<size_t>(index) >= channels_.size()) return true;
  Channel& channel = channels_[static_cast<size_t>(index)];
  if (channel.failed) return false;
  if (channel.spill) {
    std::rewind(channel.spill);
    char chunk[65536];
    size_t n;
    while ((n = std::fread(chunk, 1, sizeof chunk, channel.spill)) > 0) std::fwrite(chunk, 1, n, out);
    if (std::ferror(channel.spill)) return false;
  }
  std::fwrite(channel.block.get(), 1, channel.used, out);
  return true;
}
