#pragma once
// The one reader of bytes over the pair of buffer views. Every bounds check of
// the playback parser lives here; the parser itself never indexes a buffer.

#include <cstdint>
#include <cstring>

#include "core/cluster/mkv_inbuff.h"

struct buff_cursor {
  mkvinbuff* first;   // inbuff1, never null
  mkvinbuff* second;  // inbuff2, or null when absent

  [[nodiscard]] bool next(uint8_t* byte) {
    mkvinbuff* view = first->buff_left ? first : second;
    if (!view || !view->buff_left) return false;
    *byte = view->buff[view->buff_pos];
    ++view->buff_pos;
    --view->buff_left;
    return true;
  }

  [[nodiscard]] uint64_t position() const { return mkvinbuff_position(first, second); }

  [[nodiscard]] uint64_t available() const {
    return uint64_t{first->buff_left} + (second ? second->buff_left : 0);
  }

  // The unread bytes of `first` when at least `count` of them are there, else
  // null: lets a caller decode a short field in place.
  [[nodiscard]] const uint8_t* contiguous(uint32_t count) const {
    return first->buff_left >= count ? first->buff + first->buff_pos : nullptr;
  }

  // Consumes min(count, available()) bytes; returns how many.
  uint64_t skip_up_to(uint64_t count) {
    uint64_t done = take(first, count);
    if (second) done += take(second, count - done);
    return done;
  }

  // Copies and consumes `count` bytes, inbuff1's first. The caller has made
  // sure that available() holds them; never more than is there is read.
  void copy_out(uint8_t* destination, uint32_t count) {
    uint32_t head = count < first->buff_left ? count : first->buff_left;
    uint32_t tail = second ? (count - head < second->buff_left ? count - head : second->buff_left) : 0;
    if (head) std::memcpy(destination, first->buff + first->buff_pos, head);
    if (tail) std::memcpy(destination + head, second->buff + second->buff_pos, tail);
    skip_up_to(uint64_t{head} + tail);
  }

 private:
  static uint64_t take(mkvinbuff* view, uint64_t count) {
    uint32_t n = count < view->buff_left ? static_cast<uint32_t>(count) : view->buff_left;
    view->buff_pos += n;
    view->buff_left -= n;
    return n;
  }
};
