#pragma once
// The named values of an instance that the framework reads and sets.

#include "filter/mkv_filter.h"
#include "platform/resources.h"

constexpr int kResourceRows = 11;

// Allocates the instance's table (the rows and a terminating row) with value
// pointers into `context`. Null when the allocation fails.
[[nodiscard]] AoResource* MakeResourceTable(MkvContext* context);

// The instance's table; null for a handle that is not a filter.
AoResource* GetResources(MkvFilter* filter);

// 0; 22 for a handle that is not a filter, a row below "EnablePreroll" or a
// row that is not a 32-bit integer; 4032 for an unknown name (exact case);
// 1 for a read-only row. `value` points at a signed 32-bit integer, which is
// clamped to the row's range; a null value answers 22 for a settable row.
[[nodiscard]] int SetResource(MkvFilter* filter, const char* name, const void* value);
