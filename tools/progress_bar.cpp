#include "tools/progress_bar.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>

namespace {

constexpr auto kRedrawInterval = std::chrono::milliseconds(200);
constexpr size_t kBarWidth = 24;     // the widest bar
constexpr size_t kNarrowestBar = 8;  // below this the bar is left out
constexpr size_t kDefaultColumns = 80;

// Columns of the terminal on standard error, asked at every redraw so that a
// resized window is followed.
size_t TerminalColumns() {
  winsize size{};
  if (ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0) return size.ws_col;
  return kDefaultColumns;
}

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
  std::string left = "--:--";
  if (done) {
    left = "0:00";
  } else if (rate > 0 && total_ > bytes) {
    left = Duration(static_cast<double>(total_ - bytes) / rate);
  }
  char percent[8];
  std::snprintf(percent, sizeof percent, "%3d%%", static_cast<int>(fraction * 100));
  // The line never reaches the last column, so the terminal does not wrap
  // it and each redraw overwrites the one before. A narrow bar and the parts
  // most wanted come first (percentage, bytes, time left, rate, frames); a
  // bar of up to its full width takes what room is left.
  const std::string parts[] = {std::string(percent), Amount(static_cast<double>(bytes)),
                               std::to_string(frames) + " frames", Amount(rate) + "/s", left + " left"};
  const size_t wanted[] = {0, 1, 4, 3, 2};
  const size_t width = TerminalColumns() - 1;
  const size_t bar_frame = 3;  // " [" and "]"
  size_t used = std::strlen(label_) + bar_frame + kNarrowestBar;
  const bool with_bar = used + 1 + parts[0].size() <= width;
  if (!with_bar) used = std::strlen(label_);
  bool kept[5] = {};
  for (size_t index : wanted) {
    const size_t cost = (index == 0 ? 1 : 2) + parts[index].size();
    if (used + cost > width) break;
    kept[index] = true;
    used += cost;
  }
  std::string line = label_;
  if (with_bar) {
    const size_t bar_width = std::min(kBarWidth, kNarrowestBar + (width - used));
    std::string bar(bar_width, '-');
    const auto filled = static_cast<size_t>(fraction * static_cast<double>(bar_width) + 0.5);
    for (size_t i = 0; i < filled && i < bar_width; ++i) bar[i] = '#';
    line += " [" + bar + "]";
  }
  for (size_t index = 0; index < 5; ++index) {
    if (kept[index]) line += (index == 0 ? " " : "  ") + parts[index];
  }
  std::fprintf(stderr, "\r%s\x1b[K%s", line.c_str(), done ? "\n" : "");
  std::fflush(stderr);
}
