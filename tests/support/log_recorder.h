#pragma once
// Records every AoLog message while it lives, so tests can assert exact texts.

#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace testing_support {

class LogRecorder {
 public:
  LogRecorder();
  ~LogRecorder();
  LogRecorder(const LogRecorder&) = delete;
  LogRecorder& operator=(const LogRecorder&) = delete;

  std::vector<std::pair<int, std::string>> messages() const;
  bool Contains(int level, const std::string& text) const;

 private:
  mutable std::mutex mutex_;
  std::vector<std::pair<int, std::string>> messages_;
};

}  // namespace testing_support
