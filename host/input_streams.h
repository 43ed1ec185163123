#pragma once
// The host's input streams: file-backed or memory-backed byte sources behind
// the framework's MmfInputStream record, each seekable or not. Peek never
// consumes: bytes peeked from a pipe are kept and handed out by later reads.

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/input_stream.h"

namespace host {

class InputStream {
 public:
  virtual ~InputStream() = default;
  InputStream(const InputStream&) = delete;
  InputStream& operator=(const InputStream&) = delete;

  // The framework record; valid while this object lives.
  MmfInputStream* record() { return &record_; }
  bool seekable() const { return seekable_; }

  // What the stream was asked to do, for tests that bound the bytes a parse reads.
  struct Counters {
    uint64_t bytes_read = 0;  // bytes delivered by Read
    uint64_t reads = 0;
    uint64_t seeks = 0;
    uint64_t peeks = 0;
  };
  Counters counters() const;

  int64_t Peek(void* buffer, uint64_t count);
  int64_t Read(void* buffer, uint64_t count);
  int64_t Seek(uint64_t offset);
  // Seek and Read as one step, so that no other caller's seek or read comes
  // between them: -1 when the offset cannot be reached.
  int64_t ReadAt(uint64_t offset, void* buffer, uint64_t count);
  // ReadAt that other reads may overlap, and that leaves the stream where it
  // is: the file streamer's reader and the caller it serves then both copy
  // at once. Sources that cannot read at an offset do it as ReadAt.
  int64_t ReadAtAlongside(uint64_t offset, void* buffer, uint64_t count);
  int64_t Tell();
  uint64_t Length();

 protected:
  InputStream(std::string name, bool seekable);

  // The source below the look-ahead: read from its own position, seek it, size it.
  virtual int64_t SourceRead(void* buffer, uint64_t count) = 0;
  virtual bool SourceSeek(uint64_t offset) = 0;
  virtual uint64_t SourceLength() = 0;
  // Reads at `offset` without the stream's position or lock, safe alongside
  // any other call: kCannotReadAlongside when the source cannot.
  static constexpr int64_t kCannotReadAlongside = -2;
  virtual int64_t SourceReadAlongside(uint64_t /*offset*/, void* /*buffer*/, uint64_t /*count*/) {
    return kCannotReadAlongside;
  }

 private:
  int64_t FillLookahead(uint64_t count);
  int64_t ReadLocked(void* buffer, uint64_t count);
  bool SeekLocked(uint64_t offset);

  std::string name_;
  MmfInputStream record_{};
  bool seekable_;
  mutable std::mutex mutex_;
  uint64_t position_ = 0;            // offset of the next byte a read delivers
  std::vector<uint8_t> lookahead_;   // bytes peeked but not yet read, starting at position_
  Counters counters_;
};

// A file on disk; "-" is standard input (never seekable). Null when it cannot be opened.
std::unique_ptr<InputStream> OpenFileStream(const std::string& path, bool seekable);

// A stream over bytes the caller keeps alive for the stream's lifetime.
std::unique_ptr<InputStream> MakeMemoryStream(const uint8_t* data, size_t size, bool seekable,
                                              std::string name = "memory");

}  // namespace host
