#pragma once
// The host's memory pools and media-buffer (MRA) pools. Pool buffers are
// reference counted: the acquirer holds one reference, every buffer element of
// a media buffer that points into the buffer holds another, and the buffer
// returns to its pool when the last reference goes. So an output media buffer
// that refers to the bytes of an input buffer keeps them valid after the
// input buffer itself was given back. Every operation is thread-safe.

#include <atomic>
#include <chrono>
#include <cstdint>
#include <type_traits>

#include "platform/media_buffer.h"
#include "platform/memory_pool.h"

namespace host {

// `count` buffers of `size` bytes. Destroying the object closes the pool:
// buffers still referenced stay valid, and the storage goes with the last one.
class MemoryPool {
 public:
  MemoryPool(uint32_t size, uint32_t count);
  ~MemoryPool();
  MemoryPool(const MemoryPool&) = delete;
  MemoryPool& operator=(const MemoryPool&) = delete;

  // The framework's view: the operation table and the pool argument.
  static const MmfMemoryPoolOps* Ops();
  MmfMemoryPool* handle() const { return handle_; }

  // A buffer with one reference for the caller, waiting up to `timeout` for one
  // to come back; null when none did.
  MmfPoolBuffer* AcquireWaiting(std::chrono::milliseconds timeout);
  uint32_t FreeCount() const;

 private:
  MmfMemoryPool* handle_;
};

// A buffer of a host pool. The framework record comes first, so that a
// buffer handle is the record's address. References change without the
// pool's lock, inline (every frame element of every channel takes and drops
// one); the lock guards the free list, so only the drop that frees a buffer
// takes it.
struct PoolBuffer {
  MmfPoolBuffer record;
  std::atomic<uint32_t> references;
  uint32_t mapped;
};
static_assert(std::is_standard_layout_v<PoolBuffer> && std::atomic<uint32_t>::is_always_lock_free);

// With the last reference gone: the buffer goes back to its pool.
void ReturnToPool(PoolBuffer* buffer);

// References held on a buffer (0 once it is back in its pool).
inline uint32_t BufferReferences(const MmfPoolBuffer* buffer) {
  return reinterpret_cast<const PoolBuffer*>(buffer)->references.load(std::memory_order_acquire);
}

// One more reference; the holder gives it back with DropBufferReference.
inline void ReferenceBuffer(MmfPoolBuffer* buffer) {
  reinterpret_cast<PoolBuffer*>(buffer)->references.fetch_add(1, std::memory_order_relaxed);
}

inline void DropBufferReference(MmfPoolBuffer* buffer) {
  auto* pool_buffer = reinterpret_cast<PoolBuffer*>(buffer);
  uint32_t references = pool_buffer->references.load(std::memory_order_relaxed);
  do {
    if (references == 0) return;  // already back in the pool
  } while (!pool_buffer->references.compare_exchange_weak(references, references - 1, std::memory_order_acq_rel,
                                                          std::memory_order_relaxed));
  if (references == 1) ReturnToPool(pool_buffer);
}

// Elements of each output media buffer of a filter: MmfAllocateMraPool grants
// at most this many, whatever the filter asks for, as a decoder takes a few
// frames at a time. A filter that fails while filling one loses only those.
constexpr uint32_t kOutputBufferElements = 26;

// Media buffers taken from any pool by the calling thread so far: a call that
// took none never got as far as filling a buffer.
uint64_t MrasAcquiredOnThisThread();

// A pool of `count` media buffers with `capacity` elements each, for the host's
// own filters; freed with MmfFreeMraPool.
MmfMraPool* MakeMraPool(uint32_t count, uint32_t capacity);
uint32_t MraPoolFreeCount(MmfMraPool* pool);

// A buffer element's `type`: whether it holds its pool buffer's reference.
constexpr uint32_t kOwnReference = 1;
constexpr uint32_t kSharedReference = 0;

// One element of a media buffer as the host stores it.
struct MraElement {
  uint32_t kind;  // kMmfElement...
  // Property type. For a buffer element: kOwnReference when it holds a
  // reference of its own; kSharedReference when an earlier element of the
  // media buffer holds the one on the same pool buffer that it relies on.
  uint32_t type;
  uint32_t low;
  uint16_t high;
  MmfPoolBuffer* handle;  // buffer element: the pool buffer its bytes lie in
  uint8_t* address;
  uint32_t size;
};

// The ElementCount elements of a media buffer of a host pool, read in place:
// the host's own sinks walk every element of every output buffer, and the
// framework's per-element getters would cost them a call and checks each.
const MraElement* MraElements(MmfMra* mra);

}  // namespace host
