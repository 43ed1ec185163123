#pragma once
// The header parse: a table-driven walk over the file's element headers that
// hands known elements to their handlers, descends into containers and skips
// the rest by seeking. While inside the Segment it uses the first SeekHead to
// jump over the clusters to the index elements behind them.

#include <cstdint>

#include "core/file_model.h"
#include "stream/mkvvstream.h"

constexpr int kMaxNestingLevels = 50;

// Called with the stream at the element's data. May read up to the element's
// end or stop anywhere inside it; 0 means the element was taken.
using mkv_element_handler = int (*)(mkv_file_info* info, mkvvstream* stream, uint32_t* id, uint64_t* size);

struct mkv_element_row {
  uint32_t id;
  const char* name;
  mkv_element_handler handler;
};

// Reads one element (and, for a container, all its children) at the stream's
// position; leaves the stream at or after the element's end. `parent_start`
// and `parent_size` are 0 at the top level. Returns a core status.
[[nodiscard]] int parse_element(mkv_file_info* info, mkvvstream* stream, uint64_t parent_start,
                                uint64_t parent_size, int32_t depth);

// 0 when the stream starts with an EBML header whose DocType is exactly
// "matroska"; otherwise a non-zero status. `info` must be zeroed.
[[nodiscard]] int valid_mkv(mkvvstream* stream, mkv_file_info* info);

// Walks the whole file. 1 when an EBML header, an Info element and a
// TrackEntry were met (the metadata list is then built); -4 when the walk
// ended on a limit or the heap; -1 when it ended on malformed data; else -2.
[[nodiscard]] int parse_mkvfile(mkv_file_info* info, mkvvstream* stream);
