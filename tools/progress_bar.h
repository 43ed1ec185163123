#pragma once
// A one-line progress bar on standard error for long-running commands: bytes
// and frames done, rate and time left, redrawn a few times a second by its
// own thread. It draws only when standard error is a terminal; otherwise it
// stays silent, so piped and logged output carry no control characters.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <thread>

class ProgressBar {
 public:
  // `total_bytes`: what 100% stands for (0: unknown, no bar or time left).
  ProgressBar(const char* label, uint64_t total_bytes, bool enabled);
  ~ProgressBar();
  ProgressBar(const ProgressBar&) = delete;
  ProgressBar& operator=(const ProgressBar&) = delete;

  static bool StderrIsTerminal();

  void Start();
  // From any thread.
  void Add(uint64_t bytes, uint64_t frames) {
    bytes_.fetch_add(bytes, std::memory_order_relaxed);
    frames_.fetch_add(frames, std::memory_order_relaxed);
  }
  // Draws the final state and ends the line.
  void Finish();

 private:
  void Draw(bool done);
  void Tick();

  const char* label_;
  uint64_t total_;
  bool enabled_;
  std::atomic<uint64_t> bytes_{0};
  std::atomic<uint64_t> frames_{0};
  std::chrono::steady_clock::time_point start_;
  std::mutex mutex_;
  std::condition_variable wake_;
  bool stop_ = false;
  std::thread ticker_;
};
