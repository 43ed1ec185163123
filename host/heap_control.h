#pragma once
// Controls of the host's heap (SysAlloc/SysFree), for tests that prove the
// plug-in survives every failed allocation and leaks nothing.

#include <cstddef>
#include <cstdint>

namespace host {

// Makes the nth SysAlloc from now fail (1 = the next one); 0 turns it off.
// Only that one allocation fails; later ones succeed again.
void FailNthAllocation(uint64_t n);

// Allocations made since the process started, and blocks not yet freed.
uint64_t AllocationCount();
int64_t LiveBlockCount();

}  // namespace host
