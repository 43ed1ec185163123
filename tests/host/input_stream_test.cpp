#include "host/input_streams.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

namespace {

std::vector<uint8_t> Bytes(size_t n) {
  std::vector<uint8_t> out(n);
  for (size_t i = 0; i < n; ++i) out[i] = static_cast<uint8_t>(i * 13 + 1);
  return out;
}

class TempFile {
 public:
  explicit TempFile(const std::vector<uint8_t>& bytes) {
    char name[] = "/tmp/kelvane-stream-XXXXXX";
    int fd = mkstemp(name);
    path_ = name;
    EXPECT_EQ(write(fd, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    close(fd);
  }
  ~TempFile() { std::remove(path_.c_str()); }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

struct StreamKind {
  const char* name;
  bool file;
  bool seekable;
};

class HostInputStreamTest : public ::testing::TestWithParam<StreamKind> {
 protected:
  void SetUp() override {
    if (GetParam().file) {
      file_ = std::make_unique<TempFile>(bytes_);
      stream_ = host::OpenFileStream(file_->path(), GetParam().seekable);
    } else {
      stream_ = host::MakeMemoryStream(bytes_.data(), bytes_.size(), GetParam().seekable);
    }
    ASSERT_NE(stream_, nullptr);
  }
  int64_t Call(int64_t (*op)(void*, void*, uint64_t), void* out, uint64_t n) {
    return op(stream_->record()->Handle, out, n);
  }

  std::vector<uint8_t> bytes_ = Bytes(10000);
  std::unique_ptr<TempFile> file_;
  std::unique_ptr<host::InputStream> stream_;
};

TEST_P(HostInputStreamTest, PeekDoesNotConsume) {
  const MmfInputStreamOps* ops = stream_->record()->Ops;
  std::vector<uint8_t> peeked(600), read(1000);
  ASSERT_EQ(Call(ops->Peek, peeked.data(), 600), 600);
  ASSERT_EQ(Call(ops->Read, read.data(), 1000), 1000);
  EXPECT_TRUE(std::equal(peeked.begin(), peeked.end(), bytes_.begin()));
  EXPECT_TRUE(std::equal(read.begin(), read.end(), bytes_.begin()));
  EXPECT_EQ(ops->Tell(stream_->record()->Handle), 1000);
}

TEST_P(HostInputStreamTest, SeekAndLengthFollowSeekability) {
  void* handle = stream_->record()->Handle;
  const MmfInputStreamOps* ops = stream_->record()->Ops;
  EXPECT_EQ(ops->Length(handle), GetParam().seekable ? bytes_.size() : 0u);
  EXPECT_EQ(ops->Seek(handle, 0, 0), 0);  // where it stands: always fine
  int64_t expected = GetParam().seekable ? 5000 : -1;
  EXPECT_EQ(ops->Seek(handle, 5000, 0), expected);
  uint8_t byte = 0;
  ASSERT_EQ(Call(ops->Read, &byte, 1), 1);
  EXPECT_EQ(byte, bytes_[GetParam().seekable ? 5000 : 0]);
}

TEST_P(HostInputStreamTest, ReadsToTheEndAndThenDeliverNothing) {
  const MmfInputStreamOps* ops = stream_->record()->Ops;
  std::vector<uint8_t> out(20000);
  std::vector<uint8_t> peek(3);
  ASSERT_EQ(Call(ops->Peek, peek.data(), 3), 3);
  EXPECT_EQ(Call(ops->Read, out.data(), out.size()), 10000);
  EXPECT_EQ(Call(ops->Read, out.data(), out.size()), 0);
  EXPECT_EQ(Call(ops->Peek, out.data(), 10), 0);
  EXPECT_EQ(stream_->counters().bytes_read, 10000u);
}

INSTANTIATE_TEST_SUITE_P(Kinds, HostInputStreamTest,
                         ::testing::Values(StreamKind{"FileSeekable", true, true}, StreamKind{"FilePipeLike", true, false},
                                           StreamKind{"MemorySeekable", false, true},
                                           StreamKind{"MemoryPipeLike", false, false}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST(HostFileStreamTest, MissingFileIsNull) { EXPECT_EQ(host::OpenFileStream("/nonexistent/kelvane.mkv", true), nullptr); }

}  // namespace
