#include "tools/progress_bar.h"

#include <unistd.h>

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <string>

namespace {

constexpr auto kRedrawInterval = std::chrono::milliseconds(200);
constexpr int kBarWidth = 24;

std::string Amount(double bytes) {
  const char* units[] = {"B", "KiB", "MiB", "GiB", "TiB"};
  int unit = 0;
  while (bytes >= 1024 && unit < 4) {
    bytes /= 1024;
    ++unit;
  }
  char text[32];
  std::snprintf(text, sizeof text, unit ? "%.1f %s" : "%.0f %s", bytes, units[unit]);
  return text;
}

std::string Duration(double seconds) {
  auto s = static_cast<uint64_t>(seconds + 0.5);
  char text[32];
  if (s >= 3600) {
    std::snprintf(text, sizeof text, "%" PRIu64 ":%02" PRIu64 ":%02" PRIu64, s / 3600, s / 60 % 60, s % 60);
  } else {
    std::snprintf(text, sizeof text, "%" PRIu64 ":%02" PRIu64, s / 60, s % 60);
  }
  return text;
}

}  // namespace

ProgressBar::ProgressBar(const char* label, uint64_t total_bytes, bool enabled)
    : label_(label), total_(total_bytes), enabled_(enabled) {}

ProgressBar::~ProgressBar() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stop_ = true;
  }
  wake_.notify_all();
  if (ticker_.joinable()) ticker_.join();
}

bool ProgressBar::StderrIsTerminal() { return isatty(STDERR_FILENO) == 1; }

void ProgressBar::Start() {
  start_ = std::chrono::steady_clock::now();
  if (!enabled_) return;
  Draw(false);
  ticker_ = std::thread([this] { Tick(); });
}

void ProgressBar::Tick() {
  std::unique_lock<std::mutex> lock(mutex_);
  while (!wake_.wait_for(lock, kRedrawInterval, [this] { return stop_; })) Draw(false);
}

void ProgressBar::Finish() {
  {
    std::lock_guard<std::mutex> lock(mutex_);
    stop_ = true;
  }
  wake_.notify_all();
  if (ticker_.joinable()) ticker_.join();
  if (enabled_) Draw(true);
}

void ProgressBar::Draw(bool done) {
  const uint64_t bytes = bytes_.load(std::memory_order_relaxed);
  const uint64_t frames = frames_.load(std::memory_order_relaxed);
  const double elapsed = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
  // Frame bytes fall short of the file's size by its headers and framing: a
  // finished run is full whatever the count says.
  double fraction = done ? 1.0 : total_ ? std::min(1.0, static_cast<double>(bytes) / static_cast<double>(total_)) : 0;
  const double rate = elapsed > 0 ? static_cast<double>(bytes) / elapsed : 0;
  std::string bar(kBarWidth, '-');
  for (int i = 0; i < static_cast<int>(fraction * kBarWidth + 0.5) && i < kBarWidth; ++i)
    bar[static_cast<size_t>(i)] = '#';
  std::string left = "--:--";
  if (done) {
    left = "0:00";
  } else if (rate > 0 && total_ > bytes) {
    left = Duration(static_cast<double>(total_ - bytes) / rate);
  }
  std::fprintf(stderr, "\r%s [%s] %3d%%  %s  %" PRIu64 " frames  %s/s  %s left\x1b[K%s", label_, bar.c_str(),
               static_cast<int>(fraction * 100), Amount(static_cast<double>(bytes)).c_str(), frames,
               Amount(rate).c_str(), left.c_str(), done ? "\n" : "");
  std::fflush(stderr);
}
