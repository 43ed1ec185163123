#include <pthread.h>

#include <cstdint>

#include "platform/system.h"

// Free stack of the calling thread: the distance from the current frame down to
// the lowest address of the thread's stack.
extern "C" size_t SysStackAvail(void) {
  pthread_attr_t attr;
  if (pthread_getattr_np(pthread_self(), &attr) != 0) return 0;
  void* low = nullptr;
  size_t size = 0;
  int rc = pthread_attr_getstack(&attr, &low, &size);
  pthread_attr_destroy(&attr);
  if (rc != 0) return 0;
  char here;
  auto current = reinterpret_cast<uintptr_t>(&here);
  auto bottom = reinterpret_cast<uintptr_t>(low);
  return current > bottom ? current - bottom : 0;
}
