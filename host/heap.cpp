#include <pthread.h>

#include <atomic>
#include <cstdlib>

#include "host/heap_control.h"
#include "platform/system.h"

// The plug-in allocates and frees a small block for nearly every block it
// delivers, so small blocks are kept on per-thread free lists by size class,
// as a real-time framework's pool allocator would, instead of going through
// malloc each time. Under AddressSanitizer every block goes to malloc with
// its exact size, so overruns and uses after free are still caught.

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

std::atomic<uint64_t> allocation_count{0};
std::atomic<uint64_t> fail_at{0};  // allocation number that fails; 0 = none
std::atomic<int64_t> live_blocks{0};

#if KELVANE_HOST_HEAP_CACHE

constexpr size_t kGranule = 16;
constexpr uint32_t kClasses = 8;           // blocks up to 128 bytes are cached
constexpr uint32_t kLargeBlock = kClasses;  // the class of a block that malloc takes back
constexpr uint32_t kMostCachedPerClass = 256;

// Precedes every block; 16 bytes keep the block as aligned as malloc's.
struct alignas(16) BlockHeader {
  uint32_t size_class;
};
static_assert(sizeof(BlockHeader) == kGranule);

struct FreeBlock {
  FreeBlock* next;
};

// Plain, so that reaching it costs no initialisation check; the first block
// a thread caches registers a key whose destructor gives the cache back to
// malloc when the thread ends.
struct ThreadCache {
  FreeBlock* lists[kClasses];
  uint32_t counts[kClasses];
  bool registered;
};

// Initial-exec: this library is loaded with the program, so its thread data
// sits at a fixed offset and is reached without a call.
[[gnu::tls_model("initial-exec")]] thread_local ThreadCache cache;

pthread_key_t cache_key;
pthread_once_t cache_key_once = PTHREAD_ONCE_INIT;

void EmptyCache(void* data) {
  auto* thread_cache = static_cast<ThreadCache*>(data);
  for (FreeBlock*& list : thread_cache->lists) {
    while (list) {
      FreeBlock* next = list->next;
      std::free(reinterpret_cast<BlockHeader*>(list) - 1);
      list = next;
    }
  }
  for (uint32_t& count : thread_cache->counts) count = 0;
}

void MakeCacheKey() {
  if (pthread_key_create(&cache_key, EmptyCache) != 0) std::abort();
}

// False when the thread's cache cannot be emptied at its end: the block then goes back to malloc.
bool CacheRegistered() {
  if (cache.registered) return true;
  if (pthread_once(&cache_key_once, MakeCacheKey) != 0 || pthread_setspecific(cache_key, &cache) != 0) return false;
  cache.registered = true;
  return true;
}

void* NewBlock(size_t size) {
  const uint32_t size_class = size <= kClasses * kGranule ? static_cast<uint32_t>((size + kGranule - 1) / kGranule) - 1
                                                          : kLargeBlock;
  if (size_class < kClasses) {
    if (FreeBlock* block = cache.lists[size_class]) {
      cache.lists[size_class] = block->next;
      --cache.counts[size_class];
      return block;
    }
    size = (size_class + 1) * kGranule;
  }
  auto* header = static_cast<BlockHeader*>(std::malloc(sizeof(BlockHeader) + size));
  if (!header) return nullptr;
  header->size_class = size_class;
  return header + 1;
}

void DeleteBlock(void* block) {
  BlockHeader* header = static_cast<BlockHeader*>(block) - 1;
  const uint32_t size_class = header->size_class;
  if (size_class < kClasses && cache.counts[size_class] < kMostCachedPerClass && CacheRegistered()) {
    auto* free_block = static_cast<FreeBlock*>(block);
    free_block->next = cache.lists[size_class];
    cache.lists[size_class] = free_block;
    ++cache.counts[size_class];
    return;
  }
  std::free(header);
}

#else

void* NewBlock(size_t size) { return std::malloc(size); }
void DeleteBlock(void* block) { std::free(block); }

#endif

}  // namespace

namespace host {

void FailNthAllocation(uint64_t n) {
  fail_at.store(n == 0 ? 0 : allocation_count.load() + n);
}

uint64_t AllocationCount() { return allocation_count.load(); }
int64_t LiveBlockCount() { return live_blocks.load(); }

}  // namespace host

extern "C" void* SysAlloc(size_t size) {
  const uint64_t number = allocation_count.fetch_add(1, std::memory_order_relaxed) + 1;
  uint64_t failing = number;
  if (fail_at.load(std::memory_order_relaxed) == number && fail_at.compare_exchange_strong(failing, 0)) return nullptr;
  void* block = NewBlock(size == 0 ? 1 : size);
  if (block) live_blocks.fetch_add(1, std::memory_order_relaxed);
  return block;
}

extern "C" void SysFree(void* block) {
  if (!block) return;
  live_blocks.fetch_sub(1, std::memory_order_relaxed);
  DeleteBlock(block);
}
