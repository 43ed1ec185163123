#pragma once
// A walk over a file's EBML elements as they stand in its bytes: each
// element's position, header and data size, and the value of the leaves the
// element table knows, handed to a visitor in file order. Elements of an
// unknown size end where an element that cannot be their child starts. The
// walk stops at the first byte it cannot read as an element, and says where.

#include <cstdint>
#include <string>

#include "tools/reading/element_kinds.h"

struct mkvvstream;

namespace reading {

struct Element {
  uint64_t offset = 0;       // of its ID
  uint32_t header_size = 0;  // ID and size bytes
  uint64_t data_size = 0;    // as stored; an unknown size: the bytes found up to its end (known at Leave)
  bool unknown_size = false;
  uint32_t id = 0;
  int depth = 0;
  const ElementKind* kind = nullptr;  // null: not in the table
  // A leaf's value, when its kind says how to read it.
  bool has_value = false;
  uint64_t uint_value = 0;
  int64_t int_value = 0;  // sint and date
  double float_value = 0;
  std::string bytes;  // ascii and utf8 text (cut at a NUL); binary: its first bytes only
  bool bytes_cut = false;  // a long binary or text value was not read whole

  uint64_t data_offset() const { return offset + header_size; }
};

class ElementVisitor {
 public:
  virtual ~ElementVisitor() = default;
  // A master element: true to walk its children, false to pass over them.
  virtual bool Enter(const Element& element) = 0;
  virtual void Leaf(const Element& /*element*/) {}
  virtual void Leave(const Element& /*element*/) {}
};

struct WalkOptions {
  // When the visitor passes over the first Cluster, go on at the next element
  // the SeekHead lists behind it rather than past every Cluster in turn.
  bool jump_over_clusters = false;
  uint32_t max_binary_bytes = 16;     // of a binary leaf, read for its value
  uint32_t max_text_bytes = 1 << 16;  // of a text leaf
};

struct WalkEnd {
  bool complete = true;  // every byte up to the end of the file was read as elements
  uint64_t stopped_at = 0;
  std::string reason;  // why the walk stopped early
};

// Walks from the stream's start to its end (the stream must seek).
WalkEnd WalkElements(mkvvstream* stream, ElementVisitor& visitor, const WalkOptions& options);

}  // namespace reading
