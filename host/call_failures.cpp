#include "host/call_failures.h"

#include <atomic>

namespace host {
namespace {

std::atomic<int> armed[static_cast<int>(FrameworkCall::kCount)];

}  // namespace

void FailNextCall(FrameworkCall call, int error) { armed[static_cast<int>(call)].store(error); }

int TakeInjectedFailure(FrameworkCall call) {
  std::atomic<int>& slot = armed[static_cast<int>(call)];
  return slot.load(std::memory_order_relaxed) == 0 ? 0 : slot.exchange(0);
}

}  // namespace host
