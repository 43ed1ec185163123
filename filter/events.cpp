#include "filter/events.h"

#include "filter/mkv_context.h"

int EventList(MkvFilter*, uint32_t* event, uint32_t* iterator) {
  if (*iterator != 0) return -1;
  *event = kMetadataEvent;
  *iterator = 1;
  return 0;
}

void EventSetPostFunction(MkvFilter* filter, MmfEventPost post) { filter->Context->EventPost = post; }

int EventRegister() { return 0; }

int SetInputPosition() { return 0; }
