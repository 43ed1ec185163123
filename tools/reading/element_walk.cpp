#include "tools/reading/element_walk.h"

#include <cinttypes>
#include <cstdio>
#include <vector>

#include "core/header/ebml_read.h"
#include "core/status.h"
#include "stream/mkvvstream.h"

namespace reading {

namespace {

constexpr int kMaxDepth = 64;
constexpr uint32_t kAnywhere = 1;

std::string Describe(const Element& element) {
  if (element.kind) return element.kind->name;
  char text[24];
  std::snprintf(text, sizeof text, "element 0x%" PRIX32, element.id);
  return text;
}

std::string At(uint64_t offset) { return " at " + std::to_string(offset); }

class Walker {
 public:
  Walker(mkvvstream* stream, ElementVisitor& visitor, const WalkOptions& options)
      : stream_(stream), visitor_(visitor), options_(options), length_(mkvvstream_length(stream)) {}

  WalkEnd Run() {
    uint64_t next = 0;
    // The top level has no parent: an element that runs past the end of the file is cut short.
    if (Walk(0, UINT64_MAX, 0, nullptr, &next) && next < length_ && end_.complete) {
      Stop(next, "no element");
    }
    return end_;
  }

 private:
  // Walks the elements from `start` to `end` (the parent's end as stored)
  // at `depth`. For a parent of unknown size, the walk ends at the first
  // element that cannot be its child; *next is where the walk ended. False
  // once the walk has stopped for good.
  bool Walk(uint64_t start, uint64_t end, int depth, const Element* unsized_parent, uint64_t* next) {
    uint64_t position = start;
    while (position < end && position < length_) {
      Element element;
      element.depth = depth;
      if (!ReadHeader(position, &element)) return false;
      if (unsized_parent && !MayBeChildOf(element, unsized_parent->id)) break;
      const uint64_t data_end = element.unknown_size ? end : ebml_end_of(element.data_offset(), element.data_size);
      if (data_end > end) {
        return Stop(position, Describe(element) + " runs past the end of its parent (to " + std::to_string(data_end) +
                                  ", the parent ends at " + std::to_string(end) + ")");
      }
      uint64_t element_end = data_end;
      if (element.kind && element.kind->type == ValueType::master) {
        if (!Master(&element, data_end, &element_end)) return false;
      } else {
        ReadValue(&element);
        if (!silent_) visitor_.Leaf(element);
        NoteSeekEntry(element);
      }
      if (element_end > length_) {
        return Stop(element.offset, "the file ends inside " + Describe(element) + At(element.offset) + ": " +
                                        std::to_string(length_ - element.data_offset()) + " of its " +
                                        std::to_string(element.data_size) + " data bytes are there");
      }
      position = element_end;
      if (jump_to_ && depth == 1) {
        position = jump_to_;
        jump_to_ = 0;
      }
    }
    *next = position < end ? position : end;
    if (*next > length_) *next = length_;
    return true;
  }

  // Reads a master's children when the visitor wants them (or when only they
  // tell where an element of unknown size ends). *element_end: its end.
  bool Master(Element* element, uint64_t data_end, uint64_t* element_end) {
    if (element->id == ids::kSegment && element->depth == 0) {
      segment_data_ = element->data_offset();
      segment_end_ = data_end;
    }
    const bool was_silent = silent_;
    const bool wanted = !silent_ && visitor_.Enter(*element);
    if (!wanted && element->id == ids::kCluster && element->depth == 1 && options_.jump_over_clusters &&
        !seeks_.empty()) {
      // Nothing listed behind the Clusters: the walk of the Segment is over.
      const uint64_t target = JumpTarget(element->offset);
      jump_to_ = target ? target : segment_end_;
      *element_end = element->offset;
      return true;
    }
    if (!wanted && !element->unknown_size) return true;
    if (element->depth + 1 >= kMaxDepth) return Stop(element->offset, "elements nested too deep" + At(element->offset));
    silent_ = !wanted;
    uint64_t children_end = data_end;
    const bool walked = Walk(element->data_offset(), data_end, element->depth + 1,
                             element->unknown_size ? element : nullptr, &children_end);
    silent_ = was_silent;
    if (!walked) return false;
    if (element->unknown_size) {
      element->data_size = children_end - element->data_offset();
      *element_end = children_end;
    }
    if (element->id == ids::kSeek) {
      if (seek_id_ && seek_position_set_) seeks_.push_back({seek_id_, seek_position_});
      seek_id_ = 0;
      seek_position_set_ = false;
    }
    if (wanted) visitor_.Leave(*element);
    return true;
  }

  bool ReadHeader(uint64_t position, Element* element) {
    element->offset = position;
    uint32_t id = 0;
    uint64_t size = 0;
    if (mkvvstream_seek(stream_, position) != 0) return Stop(position, "cannot seek to" + At(position));
    int status = ebml_read_id(stream_, &id);
    const uint64_t after_id = mkvvstream_tell(stream_);
    if (status == kStatusOk) status = ebml_read_size(stream_, &size);
    if (status != kStatusOk) {
      return Stop(position, std::string(status == kStatusMalformed ? "no valid element header" : "the file ends") +
                                At(position));
    }
    const uint64_t after_size = mkvvstream_tell(stream_);
    const uint64_t size_length = after_size - after_id;
    element->id = id;
    element->header_size = static_cast<uint32_t>(after_size - position);
    element->data_size = size;
    element->unknown_size = size == (uint64_t{1} << (7 * size_length)) - 1;
    element->kind = FindElementKind(id);
    if (element->unknown_size && !(element->kind && element->kind->type == ValueType::master)) {
      return Stop(position, Describe(*element) + At(position) + " has an unknown size, which only a container may have");
    }
    return true;
  }

  static bool MayBeChildOf(const Element& element, uint32_t parent) {
    if (!element.kind) return true;
    const uint32_t own = element.kind->parent;
    // A SimpleTag may nest in a SimpleTag.
    return own == parent || own == kAnywhere || (element.id == ids::kSimpleTag && parent == ids::kSimpleTag);
  }

  void ReadValue(Element* element) {
    if (!element->kind) return;
    const uint64_t size = element->data_size;
    switch (element->kind->type) {
      case ValueType::uint:
        element->has_value = ebml_read_uint(stream_, size, &element->uint_value) == kStatusOk;
        break;
      case ValueType::sint:
      case ValueType::date:
        element->has_value = size <= 8 && ebml_read_signed(stream_, size, &element->int_value) == kStatusOk;
        break;
      case ValueType::floating:
        element->has_value = size == 0 || ((size == 4 || size == 8) &&
                                           ebml_read_float(stream_, size, &element->float_value) == kStatusOk);
        break;
      case ValueType::ascii:
      case ValueType::utf8:
      case ValueType::binary: {
        const uint64_t limit = element->kind->type == ValueType::binary ? options_.max_binary_bytes
                                                                          : options_.max_text_bytes;
        const uint64_t count = size < limit ? size : limit;
        element->bytes.resize(count);
        element->has_value =
            ebml_read_exact(stream_, element->bytes.data(), static_cast<uint32_t>(count)) == kStatusOk;
        element->bytes_cut = count < size;
        if (element->kind->type != ValueType::binary) element->bytes.resize(element->bytes.find('\0') == std::string::npos
                                                                               ? count
                                                                               : element->bytes.find('\0'));
        break;
      }
      case ValueType::master: break;
    }
  }

  void NoteSeekEntry(const Element& element) {
    if (!element.has_value) return;
    if (element.id == ids::kSeekId && element.bytes.size() <= 4) {
      seek_id_ = 0;
      for (unsigned char byte : element.bytes) seek_id_ = seek_id_ << 8 | byte;
    } else if (element.id == ids::kSeekPosition) {
      seek_position_ = element.uint_value;
      seek_position_set_ = true;
    }
  }

  // The nearest element the SeekHeads list behind `cluster`, other than a Cluster; 0: none.
  uint64_t JumpTarget(uint64_t cluster) const {
    uint64_t best = 0;
    for (const auto& [id, relative] : seeks_) {
      const uint64_t position = segment_data_ + relative;
      if (id != ids::kCluster && position > cluster && position < length_ && (!best || position < best)) {
        best = position;
      }
    }
    return best;
  }

  bool Stop(uint64_t offset, std::string reason) {
    if (end_.complete) {
      end_.complete = false;
      end_.stopped_at = offset;
      end_.reason = std::move(reason);
    }
    return false;
  }

  mkvvstream* stream_;
  ElementVisitor& visitor_;
  const WalkOptions& options_;
  const uint64_t length_;
  WalkEnd end_;
  bool silent_ = false;  // walking only to find where an element of unknown size ends
  uint64_t segment_data_ = 0;
  uint64_t segment_end_ = 0;
  std::vector<std::pair<uint32_t, uint64_t>> seeks_;  // ID and Segment-relative position of each Seek
  uint32_t seek_id_ = 0;
  uint64_t seek_position_ = 0;
  bool seek_position_set_ = false;
  uint64_t jump_to_ = 0;  // where the Segment's walk goes on after the first Cluster
};

}  // namespace

WalkEnd WalkElements(mkvvstream* stream, ElementVisitor& visitor, const WalkOptions& options) {
  return Walker(stream, visitor, options).Run();
}

}  // namespace reading
