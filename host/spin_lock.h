#pragma once
// A lock around a few instructions' worth of work that threads seldom want
// at the same moment: taking and giving it back are one atomic operation
// each, with no system call and nothing to wake. A thread that finds it held
// yields until it is free. Not for waiting on a condition (use a mutex).

#include <atomic>
#include <thread>

namespace host {

class SpinLock {
 public:
  void lock() {
    while (held_.exchange(true, std::memory_order_acquire)) {
      while (held_.load(std::memory_order_relaxed)) std::this_thread::yield();
    }
  }
  void unlock() { held_.store(false, std::memory_order_release); }

 private:
  std::atomic<bool> held_{false};
};

}  // namespace host
