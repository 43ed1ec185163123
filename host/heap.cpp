#include <atomic>
#include <cstdlib>

#include "host/heap_control.h"
#include "platform/system.h"

namespace {

std::atomic<uint64_t> allocation_count{0};
std::atomic<uint64_t> fail_at{0};  // allocation number that fails; 0 = none
std::atomic<int64_t> live_blocks{0};

}  // namespace

namespace host {

void FailNthAllocation(uint64_t n) {
  fail_at.store(n == 0 ? 0 : allocation_count.load() + n);
}

uint64_t AllocationCount() { return allocation_count.load(); }
int64_t LiveBlockCount() { return live_blocks.load(); }

}  // namespace host

extern "C" void* SysAlloc(size_t size) {
  uint64_t number = allocation_count.fetch_add(1) + 1;
  uint64_t failing = number;
  if (fail_at.compare_exchange_strong(failing, 0)) return nullptr;
  void* block = std::malloc(size == 0 ? 1 : size);
  if (block) live_blocks.fetch_add(1);
  return block;
}

extern "C" void SysFree(void* block) {
  if (!block) return;
  live_blocks.fetch_sub(1);
  std::free(block);
}
