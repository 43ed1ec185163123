// Memory pools: fixed buffers with reference counts behind the framework's
// operation table.

#include <atomic>
#include <condition_variable>
#include <cstring>
#include <memory>
#include <mutex>
#include <new>
#include <type_traits>
#include <vector>

#include "host/memory_pools.h"

namespace {

// Frees the storage of records that need no destruction.
struct StorageDeleter {
  void operator()(host::PoolBuffer* records) const { ::operator delete[](records); }
};
static_assert(std::is_trivially_destructible_v<host::PoolBuffer>);

struct PoolState {
  std::mutex mutex;
  std::condition_variable returned;
  uint32_t size = 0;
  // Records are made as they are first handed out: a generous pool costs
  // nothing for the buffers a run never needs.
  std::unique_ptr<host::PoolBuffer[], StorageDeleter> buffers;
  uint32_t count = 0;
  uint32_t made = 0;  // buffers[0, made) have their records
  // Left unfilled: a page costs memory only once a buffer that uses it is filled.
  std::unique_ptr<uint8_t[]> bytes;
  std::vector<host::PoolBuffer*> free;
  uint32_t in_use = 0;
  bool closed = false;  // the owner has gone; delete with the last buffer
};

PoolState* State(MmfMemoryPool* pool) { return reinterpret_cast<PoolState*>(pool); }
host::PoolBuffer* Host(MmfPoolBuffer* buffer) { return reinterpret_cast<host::PoolBuffer*>(buffer); }

// With the pool's lock held: a free buffer with one reference, or null.
MmfPoolBuffer* TakeLocked(PoolState* state) {
  host::PoolBuffer* buffer = nullptr;
  if (!state->free.empty()) {
    buffer = state->free.back();
    state->free.pop_back();
  } else if (state->made < state->count) {
    const uint32_t i = state->made++;
    const MmfPoolBuffer record{reinterpret_cast<MmfMemoryPool*>(state),
                               state->bytes.get() + static_cast<size_t>(state->size) * i, state->size, 0};
    buffer = new (&state->buffers[i]) host::PoolBuffer{record, {0}, 0};
  } else {
    return nullptr;
  }
  buffer->references.store(1, std::memory_order_relaxed);
  buffer->mapped = 0;
  ++state->in_use;
  return &buffer->record;
}

uint32_t OpBufferSize(MmfMemoryPool* pool) { return pool ? State(pool)->size : 0; }
uint32_t OpBufferCount(MmfMemoryPool* pool) {
  return pool ? State(pool)->count : 0;
}
uint32_t OpFreeCount(MmfMemoryPool* pool) {
  if (!pool) return 0;
  PoolState* state = State(pool);
  std::lock_guard lock(state->mutex);
  return static_cast<uint32_t>(state->free.size()) + (state->count - state->made);
}

int OpAcquireBuffer(MmfMemoryPool* pool, MmfPoolBuffer** buffer, uint32_t) {
  if (!pool || !buffer) return 22;
  PoolState* state = State(pool);
  std::lock_guard lock(state->mutex);
  MmfPoolBuffer* taken = TakeLocked(state);
  if (!taken) return 11;
  *buffer = taken;
  return 0;
}

int OpMapBuffer(MmfPoolBuffer* buffer) {
  if (!buffer) return 22;
  std::lock_guard lock(State(buffer->Pool)->mutex);
  Host(buffer)->mapped = 1;
  return 0;
}

int OpReleaseMappedBuffer(MmfPoolBuffer* buffer) {
  if (!buffer) return 22;
  host::DropBufferReference(buffer);
  return 0;
}

int OpReleaseBuffer(MmfPoolBuffer* buffer) {
  if (!buffer) return 22;
  host::DropBufferReference(buffer);
  return 0;
}

const MmfMemoryPoolOps kPoolOps = {
    .BufferSize = OpBufferSize,
    .BufferCount = OpBufferCount,
    .FreeCount = OpFreeCount,
    .AcquireBuffer = OpAcquireBuffer,
    .MapBuffer = OpMapBuffer,
    .ReleaseMappedBuffer = OpReleaseMappedBuffer,
    .ReleaseBuffer = OpReleaseBuffer,
};

}  // namespace

namespace host {

MemoryPool::MemoryPool(uint32_t size, uint32_t count) {
  auto* state = new PoolState;
  state->size = size;
  state->bytes.reset(new uint8_t[static_cast<size_t>(size) * count]);
  // Storage only: each record is made when its buffer is first taken.
  state->buffers.reset(static_cast<host::PoolBuffer*>(::operator new[](sizeof(host::PoolBuffer) * count)));
  state->count = count;
  state->free.reserve(count);
  handle_ = reinterpret_cast<MmfMemoryPool*>(state);
}

MemoryPool::~MemoryPool() {
  PoolState* state = State(handle_);
  bool last;
  {
    std::lock_guard lock(state->mutex);
    state->closed = true;
    last = state->in_use == 0;
  }
  if (last) delete state;
}

const MmfMemoryPoolOps* MemoryPool::Ops() { return &kPoolOps; }

MmfPoolBuffer* MemoryPool::AcquireWaiting(std::chrono::milliseconds timeout) {
  PoolState* state = State(handle_);
  std::unique_lock lock(state->mutex);
  state->returned.wait_for(lock, timeout, [state] { return !state->free.empty() || state->made < state->count; });
  return TakeLocked(state);
}

uint32_t MemoryPool::FreeCount() const { return OpFreeCount(handle_); }

void ReturnToPool(PoolBuffer* buffer) {
  PoolState* state = State(buffer->record.Pool);
  bool delete_pool = false;
  {
    std::lock_guard lock(state->mutex);
    buffer->mapped = 0;
    state->free.push_back(buffer);
    --state->in_use;
    delete_pool = state->closed && state->in_use == 0;
    state->returned.notify_one();
  }
  if (delete_pool) delete state;
}

}  // namespace host
