#include <cstdarg>
#include <cstdio>
#include <mutex>

#include "host/log_control.h"
#include "platform/ao_log.h"

namespace {

std::mutex log_mutex;
int log_threshold = kAoLogDegraded;
host::LogCapture log_capture;
[[gnu::tls_model("initial-exec")]] thread_local host::ThreadLog* thread_log = nullptr;

}  // namespace

namespace host {

ThreadLog::ThreadLog() : outer_(thread_log) { thread_log = this; }
ThreadLog::~ThreadLog() { thread_log = outer_; }

void NoteOnThread(const char* text) {
  if (thread_log) thread_log->last_ = text;
}

void SetLogThreshold(int level) {
  std::lock_guard lock(log_mutex);
  log_threshold = level;
}

void SetLogCapture(LogCapture capture) {
  std::lock_guard lock(log_mutex);
  log_capture = std::move(capture);
}

}  // namespace host

extern "C" void AoLog(int level, const char* format, ...) {
  char text[1024];
  va_list args;
  va_start(args, format);
  std::vsnprintf(text, sizeof text, format, args);
  va_end(args);
  host::NoteOnThread(text);

  std::lock_guard lock(log_mutex);
  if (log_capture) log_capture(level, text);
  if (level <= log_threshold) std::fprintf(stderr, "[%d] %s\n", level, text);
}
