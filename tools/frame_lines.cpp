#include "tools/frame_lines.h"

#include <bit>
#include <cstring>

namespace {

// A block per channel: a few such blocks cost far less than a line per frame of a long file.
constexpr size_t kBlockBytes = 256 * 1024;
// The longest line, and the bytes a digit group may write past its end.
constexpr size_t kLongestLine = 96;

// Eight decimal digits of `value` (below 10^8) as ASCII, the first digit in
// the lowest byte: split into 4-digit halves, then pairs, then digits, all
// lanes at once, with multiply-shift division by 100 and by 10 (exact in
// these ranges).
static_assert(std::endian::native == std::endian::little, "digit lanes are stored lowest byte first");

uint64_t EightDigits(uint32_t value) {
  uint64_t lanes = (value / 10000) | (static_cast<uint64_t>(value % 10000) << 32);
  uint64_t tens = ((lanes * 10486) >> 20) & 0x0000007F0000007Full;
  lanes = tens | ((lanes - tens * 100) << 16);
  tens = ((lanes * 103) >> 10) & 0x000F000F000F000Full;
  lanes = tens | ((lanes - tens * 10) << 8);
  return lanes + 0x3030303030303030ull;
}

// Writes the 8 bytes of `digits` at `out` and keeps `count` of them (the
// last ones): the lines have room after them for what is written past.
char* Keep(char* out, uint64_t digits, int count) {
  digits >>= 8 * (8 - count);
  std::memcpy(out, &digits, sizeof digits);
  return out + count;
}

// A value below 10^8 without leading zeros.
char* Small(char* out, uint32_t value) {
  const uint64_t digits = EightDigits(value);
  const uint64_t numeric = digits - 0x3030303030303030ull;
  // Leading zero digits are the low zero bytes; 0 itself keeps one digit.
  const int zeros = numeric == 0 ? 7 : std::countr_zero(numeric) / 8;
  return Keep(out, digits, 8 - zeros);
}

// Eight digits at a time: the lines are most of what the tool itself costs per frame.
char* Decimal(char* out, uint64_t value) {
  constexpr uint64_t kEight = 100000000;
  if (value < kEight) return Small(out, static_cast<uint32_t>(value));
  out = Decimal(out, value / kEight);
  return Keep(out, EightDigits(static_cast<uint32_t>(value % kEight)), 8);
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
  // The whole prefix array, a fixed size the compiler copies inline; the line
  // goes on over its unused end.
  static_assert(sizeof channel.prefix <= kLongestLine);
  std::memcpy(out, channel.prefix, sizeof channel.prefix);
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
