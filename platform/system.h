#pragma once
// The system library as the plug-in uses it: the heap and the free-stack query.
// Every heap allocation of the plug-in goes through SysAlloc/SysFree, which
// makes them the one place where allocation failures can be provoked.

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

// Like malloc: null when the heap is exhausted. SysFree(null) does nothing.
void* SysAlloc(size_t size);
void SysFree(void* block);

// Bytes of stack still free below the caller's frame.
size_t SysStackAvail(void);

#ifdef __cplusplus
}
#endif
