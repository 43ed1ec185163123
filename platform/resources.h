#pragma once
// Resources of the add-on interface library: named values of a filter
// instance that the framework reads and sets through a table of rows.

#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

// Bits of a row's type word.
enum {
  kAoResourceSettable = 0x20000000,  // SetResource may change the value
  kAoResourceListed = 0x10000000,    // set on every row
  kAoResourceKindMask = 0xFF,
  // Value kinds (the low byte of the type word).
  kAoResourceInt32 = 1,
  kAoResourceInt64 = 2,
  kAoResourceString = 7,  // the value is a char*
};

typedef struct AoResourceRange32 {
  int32_t Minimum, Maximum, Step;
} AoResourceRange32;

typedef struct AoResourceRange64 {
  int64_t Minimum, Maximum, Step;
} AoResourceRange64;

// One row; a table ends with a row whose Name is null. In an instance's table
// Value points at the live value.
typedef struct AoResource {
  const char* Name;
  const char* Description;
  void* Value;
  const void* Range;  // AoResourceRange32 or AoResourceRange64 by kind, or null
  uint32_t Type;
} AoResource;

#ifdef __cplusplus
}  // extern "C"
#include <type_traits>
static_assert(std::is_standard_layout_v<AoResource> && std::is_trivially_copyable_v<AoResource>);
static_assert(__builtin_offsetof(AoResource, Type) == 4 * sizeof(void*));
static_assert(sizeof(AoResourceRange32) == 12 && sizeof(AoResourceRange64) == 24);
#endif
