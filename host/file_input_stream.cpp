#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "host/input_streams.h"

namespace host {
namespace {

class FileInputStream final : public InputStream {
 public:
  FileInputStream(const std::string& path, int fd, bool seekable, bool owns)
      : InputStream(path, seekable), fd_(fd), owns_(owns) {}
  ~FileInputStream() override {
    if (owns_) close(fd_);
  }

 protected:
  int64_t SourceRead(void* buffer, uint64_t count) override {
    for (;;) {
      ssize_t got = read(fd_, buffer, count);
      if (got >= 0) return got;
      if (errno != EINTR) return -1;
    }
  }
  bool SourceSeek(uint64_t offset) override {
    return lseek(fd_, static_cast<off_t>(offset), SEEK_SET) == static_cast<off_t>(offset);
  }
  uint64_t SourceLength() override {
    struct stat st;
    return fstat(fd_, &st) == 0 && S_ISREG(st.st_mode) ? static_cast<uint64_t>(st.st_size) : 0;
  }

 private:
  int fd_;
  bool owns_;
};

}  // namespace

std::unique_ptr<InputStream> OpenFileStream(const std::string& path, bool seekable) {
  if (path == "-") return std::make_unique<FileInputStream>("stdin", STDIN_FILENO, false, false);
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return nullptr;
  return std::make_unique<FileInputStream>(path, fd, seekable, true);
}

}  // namespace host
