#pragma once
// The plug-in's one allocation seam. Every heap block of the plug-in comes
// from here, so a host can fail any chosen allocation and tests can prove that
// each failure is answered cleanly and leaks nothing.

#include <cstddef>
#include <cstring>

#include "platform/system.h"

[[nodiscard]] inline void* mem_alloc(size_t size) { return SysAlloc(size); }

[[nodiscard]] inline void* mem_alloc_zeroed(size_t size) {
  void* block = SysAlloc(size);
  if (block) std::memset(block, 0, size);
  return block;
}

inline void mem_free(void* block) { SysFree(block); }

// A zero-filled record of type T (a plain record: no constructor runs).
template <typename T>
[[nodiscard]] T* mem_new_zeroed() {
  return static_cast<T*>(mem_alloc_zeroed(sizeof(T)));
}
