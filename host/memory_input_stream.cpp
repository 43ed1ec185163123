#include <algorithm>
#include <cstring>

#include "host/input_streams.h"

namespace host {
namespace {

class MemoryInputStream final : public InputStream {
 public:
  MemoryInputStream(const uint8_t* data, size_t size, bool seekable, std::string name)
      : InputStream(std::move(name), seekable), data_(data), size_(size) {}

 protected:
  int64_t SourceRead(void* buffer, uint64_t count) override {
    uint64_t n = offset_ < size_ ? std::min<uint64_t>(count, size_ - offset_) : 0;
    if (n) std::memcpy(buffer, data_ + offset_, static_cast<size_t>(n));
    offset_ += n;
    return static_cast<int64_t>(n);
  }
  bool SourceSeek(uint64_t offset) override {
    offset_ = offset;  // past the end is allowed: reads there deliver nothing
    return true;
  }
  uint64_t SourceLength() override { return size_; }
  int64_t SourceReadAlongside(uint64_t offset, void* buffer, uint64_t count) override {
    uint64_t n = offset < size_ ? std::min<uint64_t>(count, size_ - offset) : 0;
    if (n) std::memcpy(buffer, data_ + offset, static_cast<size_t>(n));
    return static_cast<int64_t>(n);
  }

 private:
  const uint8_t* data_;
  uint64_t size_;
  uint64_t offset_ = 0;
};

}  // namespace

std::unique_ptr<InputStream> MakeMemoryStream(const uint8_t* data, size_t size, bool seekable,
                                              std::string name) {
  return std::make_unique<MemoryInputStream>(data, size, seekable, std::move(name));
}

}  // namespace host
