#pragma once
// The event interface: the one event the filter posts (id 4, once per
// metadata block) and the two operations that only answer 0.

#include <cstdint>

#include "filter/mkv_filter.h"
#include "platform/interfaces.h"

constexpr uint32_t kMetadataEvent = 4;

// 0 and event 4 for iterator 0 (which becomes 1); -1 for any other iterator,
// leaving the event id untouched.
[[nodiscard]] int EventList(MkvFilter* filter, uint32_t* event, uint32_t* iterator);
// Stores the post function; a later call replaces it, null clears it.
void EventSetPostFunction(MkvFilter* filter, MmfEventPost post);
int EventRegister();
int SetInputPosition();
