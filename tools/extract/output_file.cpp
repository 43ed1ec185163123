#include "tools/extract/output_file.h"

#include <fcntl.h>
#include <limits.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <vector>

OutputFile::~OutputFile() {
  if (fd_ >= 0) ::close(fd_);
}

bool OutputFile::Open(const std::string& path) {
  path_ = path;
  fd_ = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  return fd_ >= 0 || Fail("cannot create");
}

bool OutputFile::Fail(const char* what) {
  if (error_.empty()) error_ = std::string(what) + " " + path_ + ": " + std::strerror(errno);
  return false;
}

bool OutputFile::Write(const iovec* pieces, size_t count) {
  if (failed()) return false;
  // writev may stop early and takes at most IOV_MAX pieces; the list of
  // pieces (not their bytes) is copied so that it can be advanced.
  std::vector<iovec> rest(pieces, pieces + count);
  size_t first = 0;
  while (first < rest.size()) {
    int batch = static_cast<int>(std::min<size_t>(rest.size() - first, IOV_MAX));
    ssize_t written = ::writev(fd_, rest.data() + first, batch);
    if (written < 0) {
      if (errno == EINTR) continue;
      return Fail("cannot write");
    }
    size_ += static_cast<uint64_t>(written);
    size_t left = static_cast<size_t>(written);
    while (first < rest.size() && left >= rest[first].iov_len) left -= rest[first++].iov_len;
    if (left > 0) {
      rest[first].iov_base = static_cast<uint8_t*>(rest[first].iov_base) + left;
      rest[first].iov_len -= left;
    }
  }
  return true;
}

bool OutputFile::Write(const void* data, size_t size) {
  iovec piece{const_cast<void*>(data), size};
  return Write(&piece, 1);
}

bool OutputFile::WriteAt(uint64_t offset, const void* data, size_t size) {
  if (failed()) return false;
  const auto* bytes = static_cast<const uint8_t*>(data);
  while (size > 0) {
    ssize_t written = ::pwrite(fd_, bytes, size, static_cast<off_t>(offset));
    if (written < 0) {
      if (errno == EINTR) continue;
      return Fail("cannot write");
    }
    bytes += written;
    offset += static_cast<uint64_t>(written);
    size -= static_cast<size_t>(written);
  }
  return true;
}

bool OutputFile::Close() {
  if (fd_ >= 0 && ::close(fd_) != 0) Fail("cannot close");
  fd_ = -1;
  return !failed();
}
