#include <algorithm>
#include <cstring>

#include "host/input_streams.h"

namespace host {
namespace {

InputStream* Self(void* handle) { return static_cast<InputStream*>(handle); }

int64_t OpPeek(void* handle, void* buffer, uint64_t count) { return Self(handle)->Peek(buffer, count); }
int64_t OpRead(void* handle, void* buffer, uint64_t count) { return Self(handle)->Read(buffer, count); }
int64_t OpSeek(void* handle, uint64_t offset, int whence) {
  return whence == 0 ? Self(handle)->Seek(offset) : -1;
}
int64_t OpTell(void* handle) { return Self(handle)->Tell(); }
uint64_t OpLength(void* handle) { return Self(handle)->Length(); }

const MmfInputStreamOps kInputStreamOps = {
    .Reserved0 = nullptr,
    .Reserved1 = nullptr,
    .Peek = OpPeek,
    .Read = OpRead,
    .Reserved4 = nullptr,
    .Seek = OpSeek,
    .Tell = OpTell,
    .Length = OpLength,
};

}  // namespace

InputStream::InputStream(std::string name, bool seekable) : name_(std::move(name)), seekable_(seekable) {
  record_.Name = name_.c_str();
  record_.Ops = &kInputStreamOps;
  record_.Handle = this;
}

InputStream::Counters InputStream::counters() const {
  std::lock_guard lock(mutex_);
  return counters_;
}

int64_t InputStream::FillLookahead(uint64_t count) {
  while (lookahead_.size() < count) {
    uint8_t chunk[4096];
    uint64_t want = std::min<uint64_t>(sizeof chunk, count - lookahead_.size());
    int64_t got = SourceRead(chunk, want);
    if (got < 0) return got;
    if (got == 0) break;
    lookahead_.insert(lookahead_.end(), chunk, chunk + got);
  }
  return static_cast<int64_t>(std::min<uint64_t>(count, lookahead_.size()));
}

int64_t InputStream::Peek(void* buffer, uint64_t count) {
  std::lock_guard lock(mutex_);
  ++counters_.peeks;
  int64_t available = FillLookahead(count);
  if (available > 0) std::memcpy(buffer, lookahead_.data(), static_cast<size_t>(available));
  return available;
}

int64_t InputStream::Read(void* buffer, uint64_t count) {
  std::lock_guard lock(mutex_);
  return ReadLocked(buffer, count);
}

int64_t InputStream::Seek(uint64_t offset) {
  std::lock_guard lock(mutex_);
  return SeekLocked(offset) ? static_cast<int64_t>(offset) : -1;
}

int64_t InputStream::ReadAt(uint64_t offset, void* buffer, uint64_t count) {
  std::lock_guard lock(mutex_);
  return SeekLocked(offset) ? ReadLocked(buffer, count) : -1;
}

int64_t InputStream::ReadAtAlongside(uint64_t offset, void* buffer, uint64_t count) {
  if (!seekable_) return ReadAt(offset, buffer, count);
  const int64_t got = SourceReadAlongside(offset, buffer, count);
  if (got == kCannotReadAlongside) return ReadAt(offset, buffer, count);
  std::lock_guard lock(mutex_);
  ++counters_.reads;
  if (got > 0) counters_.bytes_read += static_cast<uint64_t>(got);
  return got;
}

int64_t InputStream::ReadLocked(void* buffer, uint64_t count) {
  ++counters_.reads;
  auto* out = static_cast<uint8_t*>(buffer);
  uint64_t from_lookahead = std::min<uint64_t>(count, lookahead_.size());
  if (from_lookahead) {
    std::memcpy(out, lookahead_.data(), static_cast<size_t>(from_lookahead));
    lookahead_.erase(lookahead_.begin(), lookahead_.begin() + static_cast<ptrdiff_t>(from_lookahead));
  }
  uint64_t done = from_lookahead;
  while (done < count) {
    int64_t got = SourceRead(out + done, count - done);
    if (got < 0) {
      if (done == 0) return got;
      break;
    }
    if (got == 0) break;
    done += static_cast<uint64_t>(got);
  }
  position_ += done;
  counters_.bytes_read += done;
  return static_cast<int64_t>(done);
}

bool InputStream::SeekLocked(uint64_t offset) {
  ++counters_.seeks;
  if (offset == position_) return true;
  if (!seekable_ || !SourceSeek(offset)) return false;
  lookahead_.clear();
  position_ = offset;
  return true;
}

int64_t InputStream::Tell() {
  std::lock_guard lock(mutex_);
  return static_cast<int64_t>(position_);
}

uint64_t InputStream::Length() {
  std::lock_guard lock(mutex_);
  return seekable_ ? SourceLength() : 0;
}

}  // namespace host
