#include "tools/frame_lines.h"

#include <cstring>

namespace {

// A block per channel: a few such blocks cost far less than a line per frame of a long file.
constexpr size_t kBlockBytes = 64 * 1024;
// Room a line may take: its prefix (whose array is copied whole), a time of
// up to 20 digits, a size of up to 10, a checksum and the separators.
constexpr size_t kLongestLine = 96;

// The lines are most of what the tool itself costs per frame, so numbers are
// written two digits at a time from a table, with no loop and no division
// other than the compiler's multiply-shift by constants.
struct PairTable {
  char pairs[256][2];
};

// "00" to "99".
constexpr PairTable kDecimalPairs = [] {
  PairTable table{};
  for (int k = 0; k < 100; ++k) {
    table.pairs[k][0] = static_cast<char>('0' + k / 10);
    table.pairs[k][1] = static_cast<char>('0' + k % 10);
  }
  return table;
}();

// "00" to "ff".
constexpr PairTable kHexPairs = [] {
  constexpr char kHex[] = "0123456789abcdef";
  PairTable table{};
  for (int k = 0; k < 256; ++k) {
    table.pairs[k][0] = kHex[k >> 4];
    table.pairs[k][1] = kHex[k & 0xF];
  }
  return table;
}();

char* Pair(char* out, const PairTable& table, uint32_t value) {
  std::memcpy(out, table.pairs[value], 2);
  return out + 2;
}

// Exactly four digits of a value below 10^4, leading zeros included.
char* FourDigits(char* out, uint32_t value) {
  out = Pair(out, kDecimalPairs, value / 100);
  return Pair(out, kDecimalPairs, value % 100);
}

// Exactly six digits of a value below 10^6.
char* SixDigits(char* out, uint32_t value) { return FourDigits(Pair(out, kDecimalPairs, value / 10000), value % 10000); }

// Exactly eight digits of a value below 10^8.
char* EightDigits(char* out, uint32_t value) { return FourDigits(FourDigits(out, value / 10000), value % 10000); }

// A value below 10^4 without leading zeros (0 is "0"). The longer values
// are tested for first: they are the common ones (frame sizes).
char* UpToFour(char* out, uint32_t value) {
  if (value >= 100) {
    if (value >= 1000) {
      out = Pair(out, kDecimalPairs, value / 100);
    } else {
      *out++ = static_cast<char>('0' + value / 100);
    }
    return Pair(out, kDecimalPairs, value % 100);
  }
  if (value >= 10) return Pair(out, kDecimalPairs, value);
  *out = static_cast<char>('0' + value);
  return out + 1;
}

// A value below 10^8 without leading zeros; eight digits (times from 10 s
// to 100 s in microseconds) take the shortest way.
[[gnu::always_inline]] inline char* UpToEight(char* out, uint32_t value) {
  if (value < 10000) return UpToFour(out, value);
  if (value >= 10000000) return EightDigits(out, value);
  return FourDigits(UpToFour(out, value / 10000), value % 10000);
}

char* Decimal(char* out, uint64_t value) {
  constexpr uint64_t kEight = 100000000;
  if (value < kEight) return UpToEight(out, static_cast<uint32_t>(value));
  const uint64_t low = value % kEight;
  value /= kEight;
  if (value < kEight) {
    out = UpToEight(out, static_cast<uint32_t>(value));
  } else {
    // At most 20 digits: 4 above the next 16.
    out = UpToFour(out, static_cast<uint32_t>(value / kEight));
    out = EightDigits(out, static_cast<uint32_t>(value % kEight));
  }
  return EightDigits(out, static_cast<uint32_t>(low));
}

// Decimal, with the values below 10^8 (nearly every time and size) written in place.
[[gnu::always_inline]] inline char* Number(char* out, uint64_t value) {
  if (value < 10000) return UpToFour(out, static_cast<uint32_t>(value));
  return value < 100000000 ? UpToEight(out, static_cast<uint32_t>(value)) : Decimal(out, value);
}

char* Hex8(char* out, uint32_t value) {
  out = Pair(out, kHexPairs, value >> 24);
  out = Pair(out, kHexPairs, value >> 16 & 0xFF);
  out = Pair(out, kHexPairs, value >> 8 & 0xFF);
  return Pair(out, kHexPairs, value & 0xFF);
}

}  // namespace

FrameLines::FrameLines(const std::vector<uint64_t>& tracks, bool hash)
    : tracks_(tracks), hash_(hash), channels_(tracks.size()), channel_count_(channels_.size()) {
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

// "CHANNEL TRACK TIME SIZE[ ADLER32]", as the lines of a kept run print.
void FrameLines::OnFrames(void* user, int32_t index, const host::RunFrame* frames, size_t count) {
  auto* lines = static_cast<FrameLines*>(user);
  if (static_cast<uint32_t>(index) >= lines->channel_count_) return;  // not an offered channel (negative ones wrap)
  Channel& channel = lines->channels_[static_cast<size_t>(index)];
  // The prefix array, copied in fixed sizes the compiler does inline (its
  // first 16 bytes, which hold nearly every prefix, then the rest): each line
  // goes on over what was copied past the prefix. Held here, apart from the
  // block's bytes, so that writing a line does not make the compiler read it
  // again.
  char prefix[sizeof channel.prefix];
  static_assert(sizeof prefix <= kLongestLine);
  std::memcpy(prefix, channel.prefix, sizeof prefix);
  const size_t prefix_length = channel.prefix_length;
  // Times run on within a channel, so their whole seconds change about once a
  // second of them: they are written out then and copied for the lines in
  // between. The microseconds that follow are always six digits.
  uint64_t seconds = channel.seconds;
  char seconds_text[sizeof channel.seconds_text];
  std::memcpy(seconds_text, channel.seconds_text, sizeof seconds_text);
  size_t seconds_length = channel.seconds_length;
  const bool hash = lines->hash_;
  char* out = channel.block.get() + channel.used;
  const char* last_start = channel.block.get() + (channel.capacity - kLongestLine);  // where a line still fits
  for (const host::RunFrame* frame = frames; frame != frames + count; ++frame) {
    if (out > last_start) {
      channel.used = static_cast<size_t>(out - channel.block.get());
      lines->Spill(channel);
      out = channel.block.get() + channel.used;
      last_start = channel.block.get() + (channel.capacity - kLongestLine);
    }
    std::memcpy(out, prefix, 16);
    if (prefix_length > 16) std::memcpy(out + 16, prefix + 16, sizeof prefix - 16);
    out += prefix_length;
    constexpr uint64_t kMillion = 1000000;
    const uint64_t time = frame->time_us;
    if (time < kMillion) {
      out = Number(out, time);
    } else {
      const uint64_t whole = time / kMillion;
      if (whole != seconds) {
        seconds = whole;  // at most 14 digits
        seconds_length = static_cast<size_t>(Decimal(seconds_text, whole) - seconds_text);
      }
      std::memcpy(out, seconds_text, sizeof seconds_text);
      out = SixDigits(out + seconds_length, static_cast<uint32_t>(time - whole * kMillion));
    }
    *out++ = ' ';
    out = Number(out, frame->size);
    if (hash) {
      *out++ = ' ';
      out = Hex8(out, frame->adler32);
    }
    *out++ = '\n';
  }
  channel.used = static_cast<size_t>(out - channel.block.get());
  channel.seconds = seconds;
  std::memcpy(channel.seconds_text, seconds_text, sizeof seconds_text);
  channel.seconds_length = seconds_length;
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
