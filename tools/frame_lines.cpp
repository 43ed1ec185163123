#include "tools/frame_lines.h"

#include <sys/sendfile.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cinttypes>
#include <cstring>
#include <string>
#include <utility>

#include "host/thread_placement.h"

namespace {

// A block per channel: a few such blocks cost far less than a line per frame of a long file.
constexpr size_t kBlockBytes = 64 * 1024;
// Frames a sink gathers before the formatter takes them over: few hand-overs,
// and two chunks per channel of 48 KiB.
constexpr size_t kChunkFrames = 2048;
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

FrameLines::FrameLines(const std::vector<uint64_t>& tracks, bool hash, int cpu)
    : tracks_(tracks), hash_(hash), cpu_(cpu), channels_(tracks.size()), channel_count_(channels_.size()) {
  for (size_t k = 0; k < channels_.size(); ++k) {
    Channel& channel = channels_[k];
    channel.chunk = MakeChunk();
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
  {
    std::lock_guard lock(mutex_);
    stopping_ = true;
  }
  handed_.notify_one();
  if (formatter_.joinable()) formatter_.join();
  for (Channel& channel : channels_) {
    if (channel.spill) std::fclose(channel.spill);
  }
}

FrameLines::FrameChunk FrameLines::MakeChunk() {
  return FrameChunk(static_cast<host::RunFrame*>(::operator new(kChunkFrames * sizeof(host::RunFrame))));
}

host::RunFrame* FrameLines::Room(void* user, int32_t index, size_t* room) {
  auto* lines = static_cast<FrameLines*>(user);
  if (static_cast<uint32_t>(index) >= lines->channel_count_) return nullptr;
  Channel& channel = lines->channels_[static_cast<size_t>(index)];
  *room = kChunkFrames - channel.filled;
  return channel.chunk.get() + channel.filled;
}

// On the sink's thread: the frames go into the channel's chunk (where the
// sink gathered them, as a rule), and a full chunk to the formatter.
void FrameLines::OnFrames(void* user, int32_t index, const host::RunFrame* frames, size_t count) {
  auto* lines = static_cast<FrameLines*>(user);
  if (static_cast<uint32_t>(index) >= lines->channel_count_) return;  // not an offered channel (negative ones wrap)
  Channel& channel = lines->channels_[static_cast<size_t>(index)];
  if (frames == channel.chunk.get() + channel.filled && count <= kChunkFrames - channel.filled) {
    channel.filled += count;
    if (channel.filled == kChunkFrames) lines->Hand(channel);
    return;
  }
  while (count > 0) {
    const size_t taken = std::min(count, kChunkFrames - channel.filled);
    std::memcpy(channel.chunk.get() + channel.filled, frames, taken * sizeof *frames);
    channel.filled += taken;
    frames += taken;
    count -= taken;
    if (channel.filled == kChunkFrames) lines->Hand(channel);
  }
}

// Waits until the chunk the channel handed over before is formatted (it is,
// unless the formatter has fallen a whole chunk behind), then hands this one
// over and gives the sink the other.
void FrameLines::Hand(Channel& channel) {
  std::unique_lock lock(mutex_);
  formatted_.wait(lock, [&channel] { return !channel.formatting; });
  if (!channel.handed) channel.handed = MakeChunk();
  std::swap(channel.chunk, channel.handed);
  channel.handed_count = channel.filled;
  channel.filled = 0;
  channel.formatting = true;
  queue_.push_back(&channel);
  if (!formatter_.joinable()) {
    formatter_ = std::thread([this] { RunFormatter(); });
    host::KeepOnCpu(formatter_, cpu_);
  }
  lock.unlock();
  handed_.notify_one();
}

void FrameLines::RunFormatter() {
  std::unique_lock lock(mutex_);
  for (;;) {
    handed_.wait(lock, [this] { return stopping_ || !queue_.empty(); });
    if (queue_.empty()) return;  // stopping, with every chunk formatted
    Channel& channel = *queue_.front();
    queue_.pop_front();
    lock.unlock();
    Format(channel, channel.handed.get(), channel.handed_count);
    lock.lock();
    channel.formatting = false;
    formatted_.notify_all();
  }
}

void FrameLines::Format(Channel& channel, const host::RunFrame* frames, size_t count) {
  hash_ ? FormatLines<true>(channel, frames, count) : FormatLines<false>(channel, frames, count);
}

// "CHANNEL TRACK TIME SIZE[ ADLER32]", as the lines of a kept run print.
template <bool kHash>
void FrameLines::FormatLines(Channel& channel, const host::RunFrame* frames, size_t count) {
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
  char* out = channel.block.get() + channel.used;
  const char* last_start = channel.block.get() + (channel.capacity - kLongestLine);  // where a line still fits
  for (const host::RunFrame* frame = frames; frame != frames + count; ++frame) {
    if (out > last_start) {
      channel.used = static_cast<size_t>(out - channel.block.get());
      Spill(channel);
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
    if constexpr (kHash) {
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

namespace {

// The temporary file's lines, after what `out` already holds. The kernel
// moves them from the page cache straight to the output where it can (a
// file, a pipe, /dev/null); elsewhere they go through a buffer.
bool CopyOut(FILE* spill, FILE* out) {
  if (std::fflush(spill) != 0 || std::fflush(out) != 0) return false;
  struct stat spilled;
  if (fstat(fileno(spill), &spilled) != 0) return false;
  off_t offset = 0;
  const int out_fd = fileno(out);
  while (out_fd >= 0 && offset < spilled.st_size) {
    const ssize_t sent = sendfile(out_fd, fileno(spill), &offset, static_cast<size_t>(spilled.st_size - offset));
    if (sent < 0 && errno == EINTR) continue;
    if (sent <= 0) break;  // this output takes no sendfile: copy the rest
  }
  if (offset == spilled.st_size) return true;
  if (fseeko(spill, offset, SEEK_SET) != 0) return false;
  char chunk[65536];
  size_t n;
  while ((n = std::fread(chunk, 1, sizeof chunk, spill)) > 0) std::fwrite(chunk, 1, n, out);
  return !std::ferror(spill);
}

// Copies lines, putting each gap's line before the line of the frame it came before.
class GapsBetweenLines {
 public:
  GapsBetweenLines(FILE* out, const char* prefix, const std::vector<host::Gap>& gaps)
      : out_(out), prefix_(prefix), gaps_(gaps) {}
  void Put(const char* data, size_t n) {
    const char* end = data + n;
    while (data != end) {
      PutGaps();
      const char* newline = static_cast<const char*>(std::memchr(data, '\n', static_cast<size_t>(end - data)));
      const char* stop = newline ? newline + 1 : end;
      std::fwrite(data, 1, static_cast<size_t>(stop - data), out_);
      lines_ += newline ? 1 : 0;
      data = stop;
    }
  }
  void PutGaps() {
    for (; next_ < gaps_.size() && gaps_[next_].at <= lines_; ++next_) {
      std::fprintf(out_, "%sgap %" PRIu64 " %" PRIu64 "\n", prefix_, gaps_[next_].from_us, gaps_[next_].to_us);
    }
  }

 private:
  FILE* out_;
  const char* prefix_;
  const std::vector<host::Gap>& gaps_;
  size_t next_ = 0;
  uint64_t lines_ = 0;
};

}  // namespace

bool FrameLines::Write(int32_t index, FILE* out, const std::vector<host::Gap>& gaps) {
  if (index < 0 || static_cast<size_t>(index) >= channels_.size()) return true;
  Channel& channel = channels_[static_cast<size_t>(index)];
  {
    std::unique_lock lock(mutex_);
    formatted_.wait(lock, [&channel] { return !channel.formatting; });
  }
  Format(channel, channel.chunk.get(), channel.filled);  // what the sink gathered last
  channel.filled = 0;
  if (channel.failed) return false;
  if (gaps.empty()) {
    if (channel.spill && !CopyOut(channel.spill, out)) return false;
    std::fwrite(channel.block.get(), 1, channel.used, out);
    return true;
  }
  const std::string prefix(channel.prefix, channel.prefix_length);
  GapsBetweenLines lines(out, prefix.c_str(), gaps);
  if (channel.spill) {
    if (std::fflush(channel.spill) != 0 || fseeko(channel.spill, 0, SEEK_SET) != 0) return false;
    char chunk[65536];
    for (size_t n; (n = std::fread(chunk, 1, sizeof chunk, channel.spill)) > 0;) lines.Put(chunk, n);
    if (std::ferror(channel.spill)) return false;
  }
  lines.Put(channel.block.get(), channel.used);
  lines.PutGaps();
  return true;
}
