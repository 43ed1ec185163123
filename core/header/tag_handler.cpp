#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/memory.h"
#include "core/status.h"
#include "platform/ao_log.h"

namespace {

constexpr uint32_t kTagId = 0x7373;
constexpr uint32_t kSimpleTagId = 0x67C8;
constexpr uint32_t kTagNameId = 0x45A3;
constexpr uint32_t kTagStringId = 0x4487;
constexpr uint32_t kTagBinaryId = 0x4485;
constexpr uint64_t kMaxTagBinarySize = 32768;

// A tag value in a new block: text gets a zero-filled block one byte longer,
// so it always ends in a NUL; binary gets exactly `size` bytes. A size above
// `limit` (or of 2^32 or more) or a failed allocation logs `message` and is 12
// with *block null. A short read is 5 (on an input of unknown length the block
// is kept and *read counts the bytes that arrived).
int read_tag_value(mkvvstream* stream, uint64_t size, uint64_t limit, bool text, const char* message,
                   void** block, uint32_t* read) {
  *block = nullptr;
  *read = 0;
  bool within_limit = size <= limit && size < (uint64_t{1} << 32) - (text ? 1 : 0);
  // A value longer than the rest of the input can only end in a short read.
  if (within_limit && !ebml_payload_fits(stream, size)) return kStatusReadFailed;
  void* data = nullptr;
  if (within_limit) {
    auto bytes = static_cast<size_t>(size) + (text ? 1 : 0);
    data = text ? mem_alloc_zeroed(bytes) : mem_alloc(bytes == 0 ? 1 : bytes);
  }
  if (!data) {
    AoLog(kAoLogNotice, message, static_cast<long long>(size));
    return kStatusNoMemory;
  }
  *block = data;
  if (size > INT32_MAX) return kStatusReadFailed;  // a block this large never exists on the target
  uint64_t got = mkvvstream_read(stream, data, static_cast<int32_t>(size));
  if (got > size) got = 0;
  *read = static_cast<uint32_t>(got);
  return got == size ? kStatusOk : kStatusReadFailed;
}

void log_too_many_tags() { AoLog(kAoLogNotice, "kelvane:  Too many tags.  Some metadata may be missing."); }

// One child of the Tags element whose header has been read. Tag and SimpleTag
// are masters whose children arrive next in the same loop.
int read_tag_child(mkv_file_info* info, mkvvstream* stream, mkv_tag_entry** current, uint32_t id, uint64_t size) {
  mkv_tag_entry* tag = *current;
  void* block = nullptr;
  int status;
  switch (id) {
    case kTagId:
      return kStatusOk;
    case kSimpleTagId:
      *current = &info->tags[info->tag_count++];
      return kStatusOk;
    case kTagNameId: {
      if (!tag || tag->name) break;
      uint32_t name_length = 0;  // `length` belongs to the string or binary
      status = read_tag_value(stream, size, string_limit(info), true, "Error allocating tag name of size %lld", &block,
                              &name_length);
      tag->name = static_cast<char*>(block);
      return status;
    }
    case kTagStringId:
      if (!tag || tag->string) break;
      status = read_tag_value(stream, size, string_limit(info), true, "Error allocating tag string of size %lld",
                              &block, &tag->length);
      tag->string = static_cast<char*>(block);
      return status;
    case kTagBinaryId:
      if (!tag || tag->binary) break;
      status = read_tag_value(stream, size, kMaxTagBinarySize, false, "Error allocating tag binary of size %lld",
                              &block, &tag->length);
      tag->binary = static_cast<uint8_t*>(block);
      return status;
    default:
      break;
  }
  return ebml_skip(stream, size);
}

}  // namespace

int mkv_tag_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  mkv_tag_entry* current = nullptr;
  while (mkvvstream_tell(stream) < end) {
    uint32_t child = 0;
    uint64_t child_size = 0;
    int status = ebml_read_id(stream, &child);
    if (status == kStatusOk) status = ebml_read_size(stream, &child_size);
    if (status != kStatusOk) return status;
    if (child == kSimpleTagId && info->tag_count >= kMaxTags) {
      // Every entry is taken: the rest of the element is not read.
      log_too_many_tags();
      (void)mkvvstream_seek(stream, end);
      return kStatusOk;
    }
    status = read_tag_child(info, stream, &current, child, child_size);
    if (status != kStatusOk) return status;
  }
  return kStatusOk;
}
