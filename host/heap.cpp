#include <pthread.h>
#include <sys/mman.h>

#include <atomic>
#include <cstdlib>
#include <type_traits>

#include "host/heap_control.h"
#include "platform/system.h"

// The plug-in allocates and frees a small block for nearly every block it
// delivers, so small blocks do not go through malloc. They come from one
// range of address space reserved at the first allocation and cut into
// chunks, each chunk holding blocks of one size class, as a real-time
// framework's pool allocator would: a block's class follows from its
// address, so a block carries no header, and freeing it needs no lookup in
// malloc. Freed blocks wait on per-thread free lists for the next request of
// their class. Under AddressSanitizer every block goes to malloc with its
// exact size, so overruns and uses after free are still caught.

#if defined(__SANITIZE_ADDRESS__)
#define KELVANE_HOST_HEAP_CACHE 0
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define KELVANE_HOST_HEAP_CACHE 0
#endif
#endif
#ifndef KELVANE_HOST_HEAP_CACHE
#define KELVANE_HOST_HEAP_CACHE 1
#endif

namespace {

// Allocations and live blocks are counted per thread, by the thread alone,
// so that counting costs no locked instruction and no cache line moving
// between cores; the totals are summed when asked for. A thread that ends
// adds its counts to the totals of ended threads.
// Plain fields (a thread_local with atomics would need an initialisation
// check at every use), written by their thread and read by others through
// atomic_ref.
struct ThreadCounts {
  uint64_t allocations;
  int64_t live;
  ThreadCounts* next;  // in the list of running threads' counts
};

pthread_mutex_t counts_lock = PTHREAD_MUTEX_INITIALIZER;
ThreadCounts* running_counts = nullptr;  // guarded by counts_lock
uint64_t ended_allocations = 0;          // guarded by counts_lock
int64_t ended_live = 0;                  // guarded by counts_lock

// Armed by FailNthAllocation: the allocation that takes the count from 1 to 0 fails.
std::atomic<bool> failure_armed{false};
std::atomic<int64_t> failure_countdown{0};

template <typename T>
inline T Read(T& counter) {
  return std::atomic_ref<T>(counter).load(std::memory_order_relaxed);
}

template <typename T>
inline void AddOwn(T& counter, T amount) {
  std::atomic_ref<T>(counter).store(counter + amount, std::memory_order_relaxed);
}

#if KELVANE_HOST_HEAP_CACHE

// Class c holds blocks of c * kGranule bytes, the alignment malloc gives.
constexpr size_t kGranule = 16;
constexpr size_t kLargestSmall = 256;
constexpr uint32_t kClasses = kLargestSmall / kGranule + 1;  // class 0 unused
constexpr size_t kChunkShift = 16;
constexpr size_t kChunkBytes = size_t{1} << kChunkShift;
// Address space only: pages cost memory once a block in them is used.
constexpr size_t kRangeBytes = sizeof(void*) == 8 ? size_t{1} << 30 : size_t{64} << 20;
constexpr size_t kChunks = kRangeBytes / kChunkBytes;

inline uint32_t ClassOf(size_t size) { return size == 0 ? 1 : static_cast<uint32_t>((size + kGranule - 1) / kGranule); }

// The reserved range and the class of each chunk handed out from it. A chunk
// belongs to one thread until that thread ends; the blocks in it go wherever
// they are freed.
struct SmallBlockRange {
  uint8_t* base = nullptr;  // null when the range could not be reserved: all to malloc
  std::atomic<size_t> chunks_taken{0};
  // No initialiser: zero as the object's static storage is before it is
  // constructed, and clearing it again would touch every page of it.
  uint8_t class_of_chunk[kChunks];

  SmallBlockRange() {
    void* range = mmap(nullptr, kRangeBytes, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
    if (range != MAP_FAILED) base = static_cast<uint8_t*>(range);
  }
  // The class of a block of the range, or 0 for a block of malloc's.
  uint32_t ClassOfBlock(const void* block) const {
    const uintptr_t offset = reinterpret_cast<uintptr_t>(block) - reinterpret_cast<uintptr_t>(base);
    return offset < kRangeBytes && base ? class_of_chunk[offset >> kChunkShift] : 0;
  }
};
SmallBlockRange small_blocks;

struct FreeBlock {
  FreeBlock* next;
};

// The unused rest of a chunk. No member initialisers: it is part of the
// plain thread data (zero at a thread's start).
struct ChunkRest {
  uint8_t* next;
  uint8_t* end;
};

// Blocks and chunk rests left by threads that ended, for any thread to take.
pthread_mutex_t orphans_lock = PTHREAD_MUTEX_INITIALIZER;
FreeBlock* orphan_blocks[kClasses] = {};    // guarded by orphans_lock
ChunkRest orphan_rests[kClasses][4] = {};   // guarded by orphans_lock
std::atomic<uint32_t> orphan_classes{0};    // bit c: orphans of class c may wait

// Blocks freed on this thread and the chunk it cuts new blocks from, by class.
struct ThreadCache {
  FreeBlock* lists[kClasses];
  ChunkRest rests[kClasses];
  bool registered;

  // The first block of class c's list, taken off it, or null.
  FreeBlock* Pop(uint32_t c) {
    FreeBlock* block = lists[c];
    if (block) lists[c] = block->next;
    return block;
  }
  void Push(uint32_t c, void* block) {
    auto* free_block = static_cast<FreeBlock*>(block);
    free_block->next = lists[c];
    lists[c] = free_block;
  }
};

#else

struct ThreadCache {
  bool registered;
};

#endif

// Plain thread data (no initialisation check on each use), registered at the
// thread's first allocation or free (cache.registered); the key's destructor
// hands the cache to the other threads and folds the counts into the ended
// totals when the thread ends.
struct ThreadHeap {
  ThreadCounts counts;
  ThreadCache cache;
};

// Initial-exec: this library is loaded with the program, so its thread data
// sits at a fixed offset and is reached without a call.
[[gnu::tls_model("initial-exec")]] thread_local ThreadHeap thread_heap;
static_assert(std::is_trivially_default_constructible_v<ThreadHeap>, "thread data needs no initialisation check");

#if KELVANE_HOST_HEAP_CACHE

// A thread that ends leaves its free blocks and the rests of its chunks to
// the others.
void OrphanCache(ThreadCache* cache) {
  pthread_mutex_lock(&orphans_lock);
  uint32_t classes = 0;
  for (uint32_t c = 1; c < kClasses; ++c) {
    if (FreeBlock* list = cache->lists[c]) {
      FreeBlock* last = list;
      while (last->next) last = last->next;
      last->next = orphan_blocks[c];
      orphan_blocks[c] = list;
      cache->lists[c] = nullptr;
      classes |= 1u << c;
    }
    ChunkRest& rest = cache->rests[c];
    if (rest.next != rest.end) {
      for (ChunkRest& slot : orphan_rests[c]) {
        if (slot.next == slot.end) {
          slot = rest;
          classes |= 1u << c;
          break;
        }
      }
    }
    rest = {};
  }
  orphan_classes.fetch_or(classes, std::memory_order_relaxed);
  pthread_mutex_unlock(&orphans_lock);
}

// Takes what ended threads left of class c: all their free blocks, or one
// chunk rest. False when there was nothing.
bool AdoptOrphans(ThreadCache& cache, uint32_t c) {
  if (!(orphan_classes.load(std::memory_order_relaxed) & (1u << c))) return false;
  bool adopted = false;
  pthread_mutex_lock(&orphans_lock);
  if (orphan_blocks[c]) {
    cache.lists[c] = orphan_blocks[c];
    orphan_blocks[c] = nullptr;
    adopted = true;
  } else {
    for (ChunkRest& slot : orphan_rests[c]) {
      if (slot.next != slot.end) {
        cache.rests[c] = slot;
        slot = {};
        adopted = true;
        break;
      }
    }
  }
  bool left = orphan_blocks[c] != nullptr;
  for (const ChunkRest& slot : orphan_rests[c]) left |= slot.next != slot.end;
  if (!left) orphan_classes.fetch_and(~(1u << c), std::memory_order_relaxed);
  pthread_mutex_unlock(&orphans_lock);
  return adopted;
}

// A block of class c: from the thread's list, cut from its chunk, from what
// ended threads left, or from a new chunk; null when the range is used up.
void* TakeBlock(ThreadCache& cache, uint32_t c) {
  const size_t block_bytes = size_t{c} * kGranule;
  for (;;) {
    if (FreeBlock* block = cache.Pop(c)) return block;
    ChunkRest& rest = cache.rests[c];
    if (rest.next != rest.end) {
      void* block = rest.next;
      rest.next += block_bytes;
      return block;
    }
    if (AdoptOrphans(cache, c)) continue;
    if (!small_blocks.base) return nullptr;
    const size_t chunk = small_blocks.chunks_taken.fetch_add(1, std::memory_order_relaxed);
    if (chunk >= kChunks) return nullptr;
    small_blocks.class_of_chunk[chunk] = static_cast<uint8_t>(c);
    uint8_t* start = small_blocks.base + chunk * kChunkBytes;
    rest.next = start;
    rest.end = start + kChunkBytes / block_bytes * block_bytes;
  }
}

// Small blocks only for a thread with heap data of its own: only its lists
// and chunk rests are handed on when it ends.
void* NewBlock(size_t size) {
  ThreadCache& cache = thread_heap.cache;
  if (size <= kLargestSmall && cache.registered) {
    if (void* block = TakeBlock(cache, ClassOf(size))) return block;
  }
  return std::malloc(size);
}

void DeleteBlock(void* block) {
  ThreadCache& cache = thread_heap.cache;
  const uint32_t c = small_blocks.ClassOfBlock(block);
  if (c == 0) {
    std::free(block);
    return;
  }
  auto* free_block = static_cast<FreeBlock*>(block);
  if (!cache.registered) [[unlikely]] {
    // A thread without heap data of its own keeps nothing: nobody would
    // hand its list on when it ends.
    pthread_mutex_lock(&orphans_lock);
    free_block->next = orphan_blocks[c];
    orphan_blocks[c] = free_block;
    orphan_classes.fetch_or(1u << c, std::memory_order_relaxed);
    pthread_mutex_unlock(&orphans_lock);
    return;
  }
  cache.Push(c, block);
}

#else

void* NewBlock(size_t size) { return std::malloc(size); }
void DeleteBlock(void* block) { std::free(block); }
void OrphanCache(ThreadCache*) {}

#endif

pthread_key_t heap_key;
pthread_once_t heap_key_once = PTHREAD_ONCE_INIT;

void ThreadEnded(void* data) {
  auto* heap = static_cast<ThreadHeap*>(data);
  OrphanCache(&heap->cache);
  pthread_mutex_lock(&counts_lock);
  ended_allocations += Read(heap->counts.allocations);
  ended_live += Read(heap->counts.live);
  for (ThreadCounts** link = &running_counts; *link; link = &(*link)->next) {
    if (*link == &heap->counts) {
      *link = heap->counts.next;
      break;
    }
  }
  pthread_mutex_unlock(&counts_lock);
  std::atomic_ref<uint64_t>(heap->counts.allocations).store(0, std::memory_order_relaxed);
  std::atomic_ref<int64_t>(heap->counts.live).store(0, std::memory_order_relaxed);
  heap->cache.registered = false;
}

void MakeHeapKey() {
  if (pthread_key_create(&heap_key, ThreadEnded) != 0) std::abort();
}

// The calling thread's heap data, registered on first use. Should the
// registration fail, the counts still go to the thread's record, and the
// thread keeps no blocks (its requests go to malloc, the small blocks it
// frees to the other threads), so nothing is left behind when it ends.
ThreadHeap& OwnHeap() {
  ThreadHeap& heap = thread_heap;
  if (!heap.cache.registered) [[unlikely]] {
    if (pthread_once(&heap_key_once, MakeHeapKey) == 0 && pthread_setspecific(heap_key, &heap) == 0) {
      pthread_mutex_lock(&counts_lock);
      heap.counts.next = running_counts;
      running_counts = &heap.counts;
      pthread_mutex_unlock(&counts_lock);
      heap.cache.registered = true;
    }
  }
  return heap;
}

// The counts of running threads and of those that ended, summed.
template <typename Counter>
int64_t Total(Counter ThreadCounts::*counter, const Counter* ended) {
  pthread_mutex_lock(&counts_lock);
  auto total = static_cast<int64_t>(*ended);
  for (ThreadCounts* counts = running_counts; counts; counts = counts->next) {
    total += static_cast<int64_t>(Read(counts->*counter));
  }
  pthread_mutex_unlock(&counts_lock);
  return total;
}

}  // namespace

namespace host {

void FailNthAllocation(uint64_t n) {
  failure_armed.store(false);
  failure_countdown.store(static_cast<int64_t>(n));
  if (n != 0) failure_armed.store(true);
}

uint64_t AllocationCount() { return static_cast<uint64_t>(Total(&ThreadCounts::allocations, &ended_allocations)); }
int64_t LiveBlockCount() { return Total(&ThreadCounts::live, &ended_live); }

}  // namespace host

namespace {

[[gnu::noinline]] void* AllocateBlock(size_t size) {
  ThreadHeap& heap = OwnHeap();
  AddOwn(heap.counts.allocations, uint64_t{1});
  if (failure_armed.load(std::memory_order_relaxed) && failure_countdown.fetch_sub(1) == 1) {
    failure_armed.store(false);
    return nullptr;
  }
  void* block = NewBlock(size == 0 ? 1 : size);
  if (block) AddOwn(heap.counts.live, int64_t{1});
  return block;
}

[[gnu::noinline]] void FreeBlockOf(void* block) {
  if (!block) return;
  AddOwn(OwnHeap().counts.live, int64_t{-1});
  DeleteBlock(block);
}

}  // namespace

// The commonest requests, a small block while its class's list holds one and
// a small block given back on a thread that has its heap data, are served
// here without a call; everything else takes the general path.
extern "C" void* SysAlloc(size_t size) {
#if KELVANE_HOST_HEAP_CACHE
  ThreadHeap& heap = thread_heap;
  if (size <= kLargestSmall && heap.cache.registered && !failure_armed.load(std::memory_order_relaxed)) [[likely]] {
    const uint32_t c = ClassOf(size);
    if (FreeBlock* block = heap.cache.Pop(c)) [[likely]] {
      AddOwn(heap.counts.allocations, uint64_t{1});
      AddOwn(heap.counts.live, int64_t{1});
      return block;
    }
  }
#endif
  return AllocateBlock(size);
}

extern "C" void SysFree(void* block) {
#if KELVANE_HOST_HEAP_CACHE
  ThreadHeap& heap = thread_heap;
  const uint32_t c = small_blocks.ClassOfBlock(block);
  if (c != 0 && heap.cache.registered) [[likely]] {
    heap.cache.Push(c, block);
    AddOwn(heap.counts.live, int64_t{-1});
    return;
  }
#endif
  FreeBlockOf(block);
}
