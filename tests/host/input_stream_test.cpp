// The host's input streams (file and memory, seekable or pipe-like): what a
// pipe refuses that a file allows. The file streamer on top of them, its
// markers, list mode and read-ahead, is played through in the conformance,
// control and tool tests.

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "host/input_streams.h"
#include "platform/mmf_status.h"

namespace {

using Bytes = std::vector<uint8_t>;

Bytes Pattern(size_t size) {
  Bytes bytes(size);
  for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<uint8_t>(i * 7 + i / 251);
  return bytes;
}

Bytes Slice(const Bytes& bytes, size_t from, size_t size) { return Bytes(bytes.begin() + from, bytes.begin() + from + size); }

std::string TempFile(const Bytes& bytes) {
  char path[] = "/tmp/kelvane-stream-XXXXXX";
  const int fd = mkstemp(path);
  EXPECT_EQ(write(fd, bytes.data(), bytes.size()), ssize_t(bytes.size()));
  close(fd);
  return path;
}

TEST(HostInputStreamTest, PeekReadSeekAndLengthFollowTheKind) {
  const Bytes bytes = Pattern(10000);
  const std::string path = TempFile(bytes);
  for (bool file : {true, false}) {
    for (bool seekable : {true, false}) {
      SCOPED_TRACE(std::string(file ? "file" : "memory") + (seekable ? ", seekable" : ", pipe-like"));
      auto stream = file ? host::OpenFileStream(path.c_str(), seekable) : host::MakeMemoryStream(bytes.data(), bytes.size(), seekable);
      ASSERT_NE(stream, nullptr);
      void* handle = stream->record()->Handle;
      const MmfInputStreamOps* ops = stream->record()->Ops;
      Bytes peeked(600), read(20000);
      ASSERT_EQ(ops->Peek(handle, peeked.data(), 600), 600);
      ASSERT_EQ(ops->Read(handle, read.data(), 1000), 1000);
      EXPECT_EQ(peeked, Slice(bytes, 0, 600));  // the peek consumed nothing
      EXPECT_EQ(Slice(read, 0, 1000), Slice(bytes, 0, 1000));
      EXPECT_EQ(ops->Tell(handle), 1000);
      EXPECT_EQ(ops->Length(handle), seekable ? bytes.size() : 0u);
      EXPECT_EQ(ops->Seek(handle, 1000, 0), 1000);  // where it stands: always fine
      EXPECT_EQ(ops->Seek(handle, 5000, 0), seekable ? 5000 : -1);
      ASSERT_EQ(ops->Read(handle, read.data(), 1), 1);
      EXPECT_EQ(read[0], bytes[seekable ? 5000 : 1000]);
      EXPECT_EQ(ops->Read(handle, read.data(), read.size()), seekable ? 4999 : 8999);
      EXPECT_EQ(ops->Read(handle, read.data(), read.size()), 0);
      EXPECT_EQ(ops->Peek(handle, read.data(), 10), 0);
      if (seekable) {  // back into bytes already read
        EXPECT_EQ(ops->Seek(handle, 3, 0), 3);
        ASSERT_EQ(ops->Read(handle, read.data(), 2), 2);
        EXPECT_EQ(Slice(read, 0, 2), Slice(bytes, 3, 2));
        // A read alongside others leaves the stream where it stands.
        EXPECT_EQ(stream->ReadAtAlongside(9950, read.data(), 100), 50);
        EXPECT_EQ(Slice(read, 0, 50), Slice(bytes, 9950, 50));
        EXPECT_EQ(stream->ReadAtAlongside(10000, read.data(), 100), 0);
        ASSERT_EQ(ops->Read(handle, read.data(), 2), 2);
        EXPECT_EQ(Slice(read, 0, 2), Slice(bytes, 5, 2));
      } else {
        EXPECT_EQ(stream->ReadAtAlongside(0, read.data(), 100), -1);
      }
    }
  }
  std::remove(path.c_str());
  EXPECT_EQ(host::OpenFileStream("/nonexistent/kelvane.mkv", true), nullptr);
}

}  // namespace
