#pragma once
// Controls of the host's AoLog: where messages go, for the tool and for tests.

#include <functional>
#include <string>

namespace host {

// Messages at this level or below go to stderr (lower numbers are more severe).
// The default shows failures and degraded results (levels up to 3).
void SetLogThreshold(int level);

// Every message, whatever its level, is also handed to the capture function
// while one is set. Pass an empty function to remove it.
using LogCapture = std::function<void(int level, const std::string& text)>;
void SetLogCapture(LogCapture capture);

// While it lives, keeps the messages logged on the thread that made it.
void NoteOnThread(const char* text);

class ThreadLog {
 public:
  ThreadLog();
  ~ThreadLog();
  ThreadLog(const ThreadLog&) = delete;
  ThreadLog& operator=(const ThreadLog&) = delete;
  // The last message, or "" when none came.
  const std::string& last() const { return last_; }

 private:
  ThreadLog* outer_;
  std::string last_;
  friend void NoteOnThread(const char* text);
};

}  // namespace host
