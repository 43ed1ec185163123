#include "host/read_ahead.h"

#include "host/thread_placement.h"

#include <chrono>

namespace host {

namespace {

// Reads kept ahead, and how few there are when the thread is woken again:
// woken for every buffer taken, the thread would cost a wake-up per buffer,
// more than the read it saves. 24 buffers of 64 KiB are more than a core's
// own cache holds, so that the bytes have moved on to the cache the cores
// share by the time a channel on another core walks them: fetched from there,
// not from the reader core's cache, they cost the walk less (about 6% on a
// long file of small frames).
constexpr size_t kDepth = 24;
constexpr size_t kRefill = kDepth / 2;

}  // namespace

ReadAhead::ReadAhead(InputStream* source, MemoryPool* pool, int cpu) : source_(source), pool_(pool), cpu_(cpu) {}

ReadAhead::~ReadAhead() {
  std::unique_lock lock(mutex_);
  stopping_ = true;
  wanted_.notify_one();
  lock.unlock();
  if (thread_.joinable()) thread_.join();
  lock.lock();
  DiscardLocked(lock);
}

void ReadAhead::Start(uint64_t offset, uint32_t size) {
  std::unique_lock lock(mutex_);
  if (Continues(offset, size)) return;
  DiscardLocked(lock);
  active_ = true;
  next_ = offset;
  size_ = size;
  if (!thread_.joinable()) {
    thread_ = std::thread([this] { Run(); });
    KeepOnCpu(thread_, cpu_);
  }
  wanted_.notify_one();
}

MmfPoolBuffer* ReadAhead::Take(uint64_t offset, uint32_t size, int64_t* got) {
  std::unique_lock lock(mutex_);
  if (!active_) return nullptr;
  if (!Continues(offset, size)) {
    DiscardLocked(lock);
    return nullptr;
  }
  // The thread may not have got to it yet, but it will unless the pool ran
  // dry: waiting costs less than reading it here and starting over. While it
  // is being read, reading the one after it here costs no more than waiting.
  while (reads_.empty() || !reads_.front().done) {
    if (MayRead() && ReadNext(lock) == Outcome::kRead) continue;
    if (reads_.empty()) {  // none begun, and none can be: the end, or no buffer free
      DiscardLocked(lock);
      return nullptr;
    }
    done_.wait(lock);  // the thread is reading it
  }
  Read read = reads_.front();
  reads_.pop_front();
  *got = read.got;
  if (starved_ || reads_.size() <= kRefill) {
    starved_ = false;
    wanted_.notify_one();
  }
  return read.buffer;
}

void ReadAhead::Discard() {
  std::unique_lock lock(mutex_);
  DiscardLocked(lock);
}

// A read under way cannot be called back: its buffer goes once it is done.
void ReadAhead::DiscardLocked(std::unique_lock<std::mutex>& lock) {
  active_ = false;
  done_.wait(lock, [this] { return under_way_ == 0; });
  for (const Read& read : reads_) MemoryPool::Ops()->ReleaseMappedBuffer(read.buffer);
  reads_.clear();
  starved_ = false;
  ended_ = false;
}

// The read-ahead's next buffer is the one of `size` bytes at `offset`.
bool ReadAhead::Continues(uint64_t offset, uint32_t size) const {
  return active_ && size == size_ && offset == (reads_.empty() ? next_ : reads_.front().offset);
}

// Begins the read at next_ and makes it outside the lock; the reads after it
// may begin meanwhile, on the assumption that it gets every byte. When it
// does not (the end), the read-ahead stops, and the caller's next request,
// which then differs from the next read's, drops the rest.
ReadAhead::Outcome ReadAhead::ReadNext(std::unique_lock<std::mutex>& lock) {
  MmfPoolBuffer* buffer = pool_->AcquireWaiting(std::chrono::milliseconds(0));
  if (!buffer) return Outcome::kNoBuffer;
  MemoryPool::Ops()->MapBuffer(buffer);
  reads_.push_back({buffer, next_, 0, false});
  Read& read = reads_.back();  // stays where it is: only done reads leave, and a discard waits for this one
  const uint64_t offset = next_;
  const uint32_t size = size_;
  next_ += size;
  ++under_way_;
  lock.unlock();
  const int64_t got = source_->ReadAtAlongside(offset, buffer->Data, size);
  lock.lock();
  --under_way_;
  read.got = got;
  read.done = true;
  if (got < static_cast<int64_t>(size)) ended_ = true;
  done_.notify_all();
  return Outcome::kRead;
}

bool ReadAhead::MayRead() const { return active_ && !ended_ && !starved_ && reads_.size() < kDepth; }

void ReadAhead::Run() {
  std::unique_lock lock(mutex_);
  for (;;) {
    wanted_.wait(lock, [this] { return stopping_ || (MayRead() && reads_.size() <= kRefill); });
    while (!stopping_ && MayRead()) {
      if (ReadNext(lock) == Outcome::kNoBuffer) {
        starved_ = true;
        done_.notify_all();
        break;
      }
    }
    if (stopping_) return;
  }
}

}  // namespace host
