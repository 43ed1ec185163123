#pragma once
// Records every AoLog message while it lives, so tests can assert exact texts.

#include <algorithm>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "host/log_control.h"

namespace testing_support {

class LogRecorder {
 public:
  LogRecorder() {
    host::SetLogCapture([this](int level, const std::string& text) {
      std::lock_guard lock(mutex_);
      messages_.emplace_back(level, text);
    });
  }
  ~LogRecorder() { host::SetLogCapture({}); }
  LogRecorder(const LogRecorder&) = delete;
  LogRecorder& operator=(const LogRecorder&) = delete;

  std::vector<std::pair<int, std::string>> messages() const {
    std::lock_guard lock(mutex_);
    return messages_;
  }
  bool Contains(int level, const std::string& text) const {
    const auto all = messages();
    return std::find(all.begin(), all.end(), std::pair<int, std::string>(level, text)) != all.end();
  }

 private:
  mutable std::mutex mutex_;
  std::vector<std::pair<int, std::string>> messages_;
};

}  // namespace testing_support
