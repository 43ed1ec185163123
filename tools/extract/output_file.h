#pragma once
// A file that a writer fills: gathered writes straight from the caller's
// memory (no staging copy), and patching of earlier bytes for headers whose
// sizes are known only at the end. The first failure sticks and is reported.

#include <sys/uio.h>

#include <cstddef>
#include <cstdint>
#include <string>

class OutputFile {
 public:
  OutputFile() = default;
  ~OutputFile();
  OutputFile(const OutputFile&) = delete;
  OutputFile& operator=(const OutputFile&) = delete;

  bool Open(const std::string& path);
  bool Write(const iovec* pieces, size_t count);
  bool Write(const void* data, size_t size);
  bool WriteAt(uint64_t offset, const void* data, size_t size);
  bool Close();

  uint64_t size() const { return size_; }
  bool failed() const { return !error_.empty(); }
  const std::string& error() const { return error_; }
  const std::string& path() const { return path_; }

 private:
  bool Fail(const char* what);

  int fd_ = -1;
  uint64_t size_ = 0;
  std::string path_;
  std::string error_;
};
