#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "host/input_streams.h"

namespace host {
namespace {

// The header parse asks for a few hundred bytes at a time: each read() below
// takes at least this much, and small reads are served from it. Reads at least
// half this size go straight to the file while nothing is held, so playback's
// input buffers are not copied twice.
constexpr uint64_t kReadAhead = 64 * 1024;

class FileInputStream final : public InputStream {
 public:
  FileInputStream(const std::string& path, int fd, bool seekable, bool owns)
      : InputStream(path, seekable), fd_(fd), owns_(owns), offset_known_(owns) {}
  ~FileInputStream() override {
    if (owns_) close(fd_);
  }

 protected:
  int64_t SourceRead(void* buffer, uint64_t count) override {
    if (held_ == end_) {
      if (count >= kReadAhead / 2) return ReadFile(buffer, count);
      if (!ahead_) ahead_.reset(new uint8_t[kReadAhead]);  // not zero-filled: read() fills what is used
      int64_t got = ReadFile(ahead_.get(), kReadAhead);
      if (got <= 0) return got;
      held_ = 0;
      end_ = static_cast<uint64_t>(got);
    }
    const uint64_t taken = std::min(count, end_ - held_);
    std::memcpy(buffer, ahead_.get() + held_, static_cast<size_t>(taken));
    held_ += taken;
    return static_cast<int64_t>(taken);
  }
  bool SourceSeek(uint64_t offset) override {
    // A seek within what is held moves in memory: the header parse jumps about a few KB at a time.
    if (offset_known_ && offset <= file_offset_ && file_offset_ - offset <= end_) {
      held_ = end_ - (file_offset_ - offset);
      return true;
    }
    held_ = end_ = 0;
    if (lseek(fd_, static_cast<off_t>(offset), SEEK_SET) != static_cast<off_t>(offset)) {
      offset_known_ = false;
      return false;
    }
    file_offset_ = offset;
    offset_known_ = true;
    return true;
  }
  // pread() leaves the descriptor's offset alone, so what is held stays valid.
  int64_t SourceReadAlongside(uint64_t offset, void* buffer, uint64_t count) override {
    auto* out = static_cast<uint8_t*>(buffer);
    uint64_t done = 0;
    while (done < count) {
      ssize_t got = pread(fd_, out + done, count - done, static_cast<off_t>(offset + done));
      if (got == 0) break;
      if (got < 0) {
        if (errno == EINTR) continue;
        if (done == 0) return -1;
        break;
      }
      done += static_cast<uint64_t>(got);
    }
    return static_cast<int64_t>(done);
  }
  uint64_t SourceLength() override {
    struct stat st;
    return fstat(fd_, &st) == 0 && S_ISREG(st.st_mode) ? static_cast<uint64_t>(st.st_size) : 0;
  }

 private:
  int64_t ReadFile(void* buffer, uint64_t count) {
    for (;;) {
      ssize_t got = read(fd_, buffer, count);
      if (got >= 0) {
        file_offset_ += static_cast<uint64_t>(got);
        return got;
      }
      if (errno != EINTR) return -1;
    }
  }

  int fd_;
  bool owns_;
  bool offset_known_;          // file_offset_ is the descriptor's offset (not so for an inherited one)
  uint64_t file_offset_ = 0;   // the descriptor's offset: that of ahead_[end_]
  std::unique_ptr<uint8_t[]> ahead_;
  uint64_t held_ = 0;          // next byte of ahead_ to deliver
  uint64_t end_ = 0;           // bytes in ahead_
};

}  // namespace

std::unique_ptr<InputStream> OpenFileStream(const std::string& path, bool seekable) {
  if (path == "-") return std::make_unique<FileInputStream>("stdin", STDIN_FILENO, false, false);
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return nullptr;
  return std::make_unique<FileInputStream>(path, fd, seekable, true);
}

}  // namespace host
