#include "tests/support/log_recorder.h"

#include <algorithm>

#include "host/log_control.h"

namespace testing_support {

LogRecorder::LogRecorder() {
  host::SetLogCapture([this](int level, const std::string& text) {
    std::lock_guard lock(mutex_);
    messages_.emplace_back(level, text);
  });
}

LogRecorder::~LogRecorder() { host::SetLogCapture({}); }

std::vector<std::pair<int, std::string>> LogRecorder::messages() const {
  std::lock_guard lock(mutex_);
  return messages_;
}

bool LogRecorder::Contains(int level, const std::string& text) const {
  const auto all = messages();
  return std::find(all.begin(), all.end(), std::pair<int, std::string>(level, text)) != all.end();
}

}  // namespace testing_support
