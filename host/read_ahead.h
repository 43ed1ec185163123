#pragma once
// The file streamer's read-ahead: the next few buffers of a sequential read,
// read on a thread of its own, so that the streamer's caller, which serves
// it under the parser's lock, usually finds the bytes already there instead
// of waiting for read(). The bytes are read straight into pool buffers, which
// the streamer then delivers as they are. A buffer is only taken when one is
// free at once: the downstream filter may hold every buffer while it waits
// for the next one, and a read-ahead waiting for one of them would never end.
// A caller that finds its buffer still being read reads the next one itself
// meanwhile: when the downstream filter walks faster than one core copies
// (large frames), both cores then copy instead of one copying and one waiting.

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <mutex>
#include <thread>

#include "host/input_streams.h"
#include "host/memory_pools.h"

namespace host {

class ReadAhead {
 public:
  // `source` and `pool` are not owned and must outlive the read-ahead. The
  // thread runs on `cpu` (-1: anywhere).
  ReadAhead(InputStream* source, MemoryPool* pool, int cpu = -1);
  // Stops the thread, and gives the buffers read ahead back to their pool.
  ~ReadAhead();
  ReadAhead(const ReadAhead&) = delete;
  ReadAhead& operator=(const ReadAhead&) = delete;

  // Reads on from `offset` in steps of `size` bytes in the background, unless
  // that is already what it does; whatever it read from elsewhere is dropped.
  void Start(uint64_t offset, uint32_t size);
  // The buffer of the read of exactly `size` bytes at `offset`, waiting for
  // it when it is under way or due: mapped, with one reference for the
  // caller, and in `got` what the source's read answered. Null when it was
  // not read ahead; then everything read ahead is dropped.
  MmfPoolBuffer* Take(uint64_t offset, uint32_t size, int64_t* got);
  // Stops reading ahead and drops what was read, the buffers back to the pool.
  void Discard();

 private:
  struct Read {
    MmfPoolBuffer* buffer;
    uint64_t offset;
    int64_t got;
    bool done;  // else under way
  };
  enum class Outcome { kRead, kNoBuffer };

  void Run();
  Outcome ReadNext(std::unique_lock<std::mutex>& lock);
  bool Continues(uint64_t offset, uint32_t size) const;
  bool MayRead() const;
  void DiscardLocked(std::unique_lock<std::mutex>& lock);

  InputStream* source_;
  MemoryPool* pool_;
  int cpu_;
  std::mutex mutex_;
  std::condition_variable wanted_;  // the thread may read more, or stop
  std::condition_variable done_;    // a read finished
  bool stopping_ = false;
  bool active_ = false;
  int under_way_ = 0;      // reads made outside the lock now
  bool starved_ = false;   // no pool buffer was free: wait for one to be taken
  bool ended_ = false;     // a read found the end or failed
  uint64_t next_ = 0;      // offset of the read after those begun
  uint32_t size_ = 0;
  std::deque<Read> reads_;  // begun, in file order
  std::thread thread_;      // started with the first Start
};

}  // namespace host
