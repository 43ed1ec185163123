#pragma once
// The framework's input stream: a named byte source with a table of operations.
// The plug-in uses peek, read, seek and length; the other entries belong to the
// framework.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct MmfInputStreamOps {
  void* Reserved0;
  void* Reserved1;
  // Copies up to count bytes from the current position without consuming them.
  // Returns the bytes delivered, negative on error.
  int64_t (*Peek)(void* handle, void* buffer, uint64_t count);
  // Returns the bytes read, 0 at the end, negative on error.
  int64_t (*Read)(void* handle, void* buffer, uint64_t count);
  void* Reserved4;
  // whence 0 = from the start. Returns the new offset, or -1 (all ones) on failure.
  int64_t (*Seek)(void* handle, uint64_t offset, int whence);
  // Returns the current offset, or -1 on failure.
  int64_t (*Tell)(void* handle);
  // The stream's length in bytes; 0 when it is not known.
  uint64_t (*Length)(void* handle);
} MmfInputStreamOps;

typedef struct MmfInputStream {
  const char* Name;              // the source's name, e.g. the file's path
  const MmfInputStreamOps* Ops;
  void* Reserved;
  void* Handle;                  // first argument of every operation
} MmfInputStream;

#ifdef __cplusplus
}  // extern "C"
static_assert(sizeof(MmfInputStream) == 4 * sizeof(void*), "input stream record is four words");
static_assert(__builtin_offsetof(MmfInputStreamOps, Peek) == 2 * sizeof(void*));
static_assert(__builtin_offsetof(MmfInputStreamOps, Read) == 3 * sizeof(void*));
static_assert(__builtin_offsetof(MmfInputStreamOps, Seek) == 5 * sizeof(void*));
static_assert(__builtin_offsetof(MmfInputStreamOps, Length) == 7 * sizeof(void*));
#endif
