#pragma once
// The graph runner's consumer of one output channel: whole frames out of the
// output media buffers the channel delivers, checksummed piece by piece and
// never copied, where each frame ends in the file, and, while the channel
// catches up after damage, the frames it passed on before dropped. Used by
// graph_runner.cpp only; inline, as its per-frame path must be.

#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/graph_runner.h"
#include "host/memory_pools.h"
#include "platform/media_buffer.h"
#include "platform/mra_pool.h"

namespace host {

class FrameAdler32 {
 public:
  void Update(const uint8_t* data, size_t n) {
    constexpr uint32_t kBase = 65521;
    constexpr size_t kBlock = 5552;  // the longest run without overflow of b
    while (n > 0) {
      size_t run = n < kBlock ? n : kBlock;
      n -= run;
      for (size_t i = 0; i < run; ++i) {
        a_ += data[i];
        b_ += a_;
      }
      data += run;
      a_ %= kBase;
      b_ %= kBase;
    }
  }
  uint32_t Value() const { return b_ << 16 | a_; }

 private:
  uint32_t a_ = 1, b_ = 0;
};

// One output channel's consumer: whole frames out of output media buffers.
// It runs for every element of every frame, so the options it needs per frame
// are copied in, the element bounds that the setter checked are not checked
// again, and a frame in one element (nearly all of them) takes a path of its
// own.
class FrameSink {
 public:
  FrameSink(ChannelRun* run, const RunnerOptions& options, MmfMemoryPool* config_pool, MmfMemoryPool* prefix_pool,
       bool pass_each_buffer)
      : run_(run),
        config_pool_(config_pool),
        prefix_pool_(prefix_pool),
        on_frames_(options.on_frames),
        frame_room_(options.frame_room),
        user_(options.user),
        index_(run->index),
        checksum_(options.checksum),
        keep_frames_(options.keep_frames),
        pass_each_buffer_(pass_each_buffer) {
    NextRoom();
  }
  FrameSink(const FrameSink&) = delete;  // it points into itself
  FrameSink& operator=(const FrameSink&) = delete;

  // Takes the buffer's frames; answers the buffer as a consumer of whole
  // buffers is to see it: the same, or while catching up a copy without the
  // frames passed on before (given back with MmfReleaseMra).
  MmfMra* Consume(MmfMra* mra) {
    const MraElement* element = MraElements(mra);
    const MraElement* const end = element + mra->ElementCount;
    consumed_ = element;
    consumed_count_ = mra->ElementCount;
    frame_first_ = element;  // of a frame begun in an earlier buffer, the part in this one
    while (element != end) {
      if (config_left_ == 0 && !in_parts_ && !checksum_ && skip_before_ == 0) {
        element = TakeWholeFrames(element, end);
        if (element == end) break;
      }
      current_ = element;
      if (element->kind == kMmfElementBuffer) {
        Buffer(*element);
      } else if (element->kind == kMmfElementProperty) {
        Property(*element);
      }
      ++element;
    }
    NoteFrameEnd();
    if (pass_each_buffer_) PassFrames();
    return dropped_.empty() ? mra : WithoutDropped(mra);
  }

  // The frames gathered so far go to the consumer, and the counts are up to
  // date: each buffer's when a controller follows them, else when the batch
  // is full and whenever the sink stops.
  void PassFrames() {
    if (batch_end_ == batch_begin_) return;
    const size_t count = static_cast<size_t>(batch_end_ - batch_begin_);
    run_->frame_count += count;
    run_->last_time_us = batch_end_[-1].time_us;
    if (keep_frames_) run_->frames.insert(run_->frames.end(), batch_begin_, batch_end_);
    if (on_frames_) on_frames_(user_, index_, batch_begin_, count);
    NextRoom();
  }

  ~FrameSink() {
    if (copies_) (void)MmfFreeMraPool(copies_);
  }

  void Finish() {
    PassFrames();
    run_->incomplete_frame = in_parts_;
  }

  // After a seek or a scan took effect: a frame being put together is lost to the flush.
  void Restart() {
    in_parts_ = false;
    last_part_ = false;
    marked_ = false;
  }

  // After the runner went back to a point before frames it already passed on
  // (to let a channel catch up): frames that start before `offset` are dropped.
  void SkipBefore(uint64_t offset) { skip_before_ = offset; }

 private:
  MmfMra* WithoutDropped(MmfMra* mra) {
    MmfMra* copy = nullptr;
    if (!copies_) copies_ = MakeMraPool(1, mra->Capacity);
    if (copies_ && MmfAcquireMra(copies_, &copy, kMmfAcquireNoWait) == 0) {
      uint32_t n = 0;
      for (uint32_t i = 0; i < consumed_count_; ++i) {
        const MraElement& e = consumed_[i];
        if (dropped_[i]) continue;
        (void)(e.kind == kMmfElementBuffer ? MmfSetMraBufferElement(copy, n++, e.handle, e.address, e.size)
                                           : MmfSetMraPropertyElement(copy, n++, e.type, e.low, e.high));
      }
    }
    dropped_.clear();
    return copy ? copy : mra;
  }

  // Where the last frame passed on ends in the file: its element's place in
  // the input buffer that the last file-offset property named.
  void NoteFrameEnd() {
    if (!last_frame_) return;
    run_->frame_end = file_offset_ + static_cast<uint64_t>(last_frame_->address + last_frame_->size -
                                                           last_frame_->handle->Data);
    last_frame_ = nullptr;
  }

  // Whether a frame whose first input piece is `element` was passed on before a catch-up.
  bool PassedBefore(const MraElement& element) {
    if (file_offset_ + static_cast<uint64_t>(element.address - element.handle->Data) < skip_before_) return true;
    skip_before_ = 0;  // a channel's frames come in file order: the rest are new
    return false;
  }

  void Property(const MraElement& element) {
    const uint32_t type = element.type;
    // A time comes with every frame: tested before the rest, without a jump table.
    if (type == kMmfPropVideoTime || type == kMmfPropAudioTime || type == kMmfPropSubtitleTime) {
      time_ = MmfPropertyValue(element.low, element.high);
      return;
    }
    switch (type) {
      case kMmfPropFileOffset:
        NoteFrameEnd();
        file_offset_ = MmfPropertyValue(element.low, element.high);
        break;
      case kMmfPropTimeMarker:
        ++run_->time_markers;
        marked_ = true;
        break;
      case kMmfPropSkipMark:
        ++run_->skip_marks;
        break;
      case kMmfPropConfigCount:
        config_left_ = static_cast<uint32_t>(MmfPropertyValue(element.low, element.high));
        break;
      case kMmfPropFramePart:
        if (!in_parts_) StartFrame();
        in_parts_ = true;
        if (dropping_) Drop(current_);
        break;
      case kMmfPropFrameEnd:
        if (!in_parts_) StartFrame();
        in_parts_ = true;
        last_part_ = true;
        if (dropping_) Drop(current_);
        break;
      default:
        break;
    }
  }

  void StartFrame() {
    frame_ = RunFrame{time_, 0, 0, marked_};
    marked_ = false;
    adler_ = FrameAdler32{};
    dropping_ = false;
    placed_ = false;
    frame_first_ = current_;
  }

  // While catching up: the consumer of whole buffers does not see this element.
  void Drop(const MraElement* element) {
    if (dropped_.empty()) dropped_.resize(consumed_count_);
    dropped_[static_cast<size_t>(element - consumed_)] = true;
  }

  // Whether a frame element's bytes are the input's own (zero copy). Its
  // bounds need no test: MmfSetMraBufferElement refused any element outside
  // its pool buffer, and a null handle. What is left is the pool: never an
  // output pool buffer, and the filter's input pool only for the frame
  // prefix, the one piece that is neither a whole frame nor a frame's last.
  bool ZeroCopy(const MmfPoolBuffer* handle) const {
    const MmfMemoryPool* pool = handle->Pool;
    if (pool == config_pool_) return false;
    return pool != prefix_pool_ || (in_parts_ && !last_part_);
  }

  void Buffer(const MraElement& element) {
    if (config_left_ > 0) {
      --config_left_;
      AddConfig(run_, element, checksum_);
      return;
    }
    if (!ZeroCopy(element.handle)) ++run_->foreign_elements;
    const bool from_input = element.handle->Pool != prefix_pool_;
    if (!in_parts_) {
      // A frame of its own: passed on at once, with nothing to put together.
      const RunFrame frame{time_, element.size, checksum_ ? Checksum(element) : 0, marked_};
      marked_ = false;
      if (skip_before_ != 0 && PassedBefore(element)) return Drop(current_);
      last_frame_ = &element;
      Deliver(frame);
      return;
    }
    if (skip_before_ != 0 && from_input && !placed_ && (dropping_ = PassedBefore(element))) {
      for (const MraElement* e = frame_first_; e < current_; ++e) Drop(e);
    }
    placed_ = placed_ || from_input;
    if (dropping_) Drop(current_);
    frame_.size += element.size;
    if (checksum_) adler_.Update(element.address, element.size);
    if (!last_part_) return;
    if (!dropping_) last_frame_ = &element;  // only a whole frame counts as passed on
    frame_.adler32 = checksum_ ? adler_.Value() : 0;
    in_parts_ = false;
    last_part_ = false;
    const RunFrame frame = frame_;
    if (!dropping_) Deliver(frame);
  }

  // Nearly every element is a frame's time or a whole frame: without
  // checksums those go straight into the batch, the sink's state held in
  // locals, up to the first element of another kind (or the end), which is
  // returned for the general steps.
  const MraElement* TakeWholeFrames(const MraElement* element, const MraElement* end) {
    uint64_t time = time_;
    bool marked = marked_;
    RunFrame* out = batch_end_;
    RunFrame* limit = batch_limit_;
    uint64_t foreign = 0;
    const MraElement* last = nullptr;
    for (; element != end; ++element) {
      if (element->kind == kMmfElementProperty) {
        const uint32_t type = element->type;
        if (type != kMmfPropVideoTime && type != kMmfPropAudioTime && type != kMmfPropSubtitleTime) break;
        time = MmfPropertyValue(element->low, element->high);
        continue;
      }
      if (element->kind != kMmfElementBuffer) break;
      foreign += ZeroCopy(element->handle) ? 0 : 1;
      last = element;
      *out++ = RunFrame{time, element->size, 0, marked};
      marked = false;
      if (out == limit) {
        batch_end_ = out;
        PassFrames();
        out = batch_end_;
        limit = batch_limit_;
      }
    }
    time_ = time;
    marked_ = marked;
    batch_end_ = out;
    run_->foreign_elements += foreign;
    if (last) last_frame_ = last;
    return element;
  }

  static uint32_t Checksum(const MraElement& element) {
    FrameAdler32 adler;
    adler.Update(element.address, element.size);
    return adler.Value();
  }

  // Out of line: a channel's decoder configurations come once per run. A
  // static function, so that the sink itself never escapes to a call.
  [[gnu::noinline]] static void AddConfig(ChannelRun* run, const MraElement& element, bool checksum) {
    run->config.push_back(RunFrame{0, element.size, checksum ? Checksum(element) : 0, false});
  }

  // Frames are gathered and counted a batch at a time.
  void Deliver(const RunFrame& frame) {
    *batch_end_++ = frame;
    if (batch_end_ == batch_limit_) PassFrames();
  }

  // The consumer's room for the next frames, else the sink's own batch.
  void NextRoom() {
    size_t room = 0;
    RunFrame* at = frame_room_ ? frame_room_(user_, index_, &room) : nullptr;
    if (!at || room == 0) {
      at = batch_;
      room = kFrameBatch;
    }
    batch_begin_ = batch_end_ = at;
    batch_limit_ = at + room;
  }

  ChannelRun* run_;
  MmfMemoryPool* config_pool_;
  MmfMemoryPool* prefix_pool_;
  void (*on_frames_)(void* user, int32_t channel, const RunFrame* frames, size_t count);
  RunFrame* (*frame_room_)(void* user, int32_t channel, size_t* room);
  void* user_;
  int32_t index_;
  bool checksum_;
  bool keep_frames_;
  bool pass_each_buffer_;
  uint64_t time_ = 0;
  uint32_t config_left_ = 0;
  bool in_parts_ = false;   // a frame announced by property 7 is being put together
  bool last_part_ = false;  // property 8 came: the next buffer element ends the frame
  bool marked_ = false;     // a time marker came since the last frame started
  const MraElement* consumed_ = nullptr;  // the elements of the buffer being consumed
  uint32_t consumed_count_ = 0;
  const MraElement* current_ = nullptr;      // the element being taken
  const MraElement* frame_first_ = nullptr;  // the first element of the frame being put together
  std::vector<bool> dropped_;  // while catching up: elements of frames passed on before
  MmfMraPool* copies_ = nullptr;
  bool placed_ = false;     // the frame being put together has had a piece from the input
  bool dropping_ = false;   // that piece showed it was passed on before a catch-up
  uint64_t file_offset_ = 0;               // of the input buffer that the last file-offset property named
  const MraElement* last_frame_ = nullptr;  // last input piece of a frame in the buffer being consumed
  uint64_t skip_before_ = 0;               // frames that start before this offset are dropped; 0: none
  RunFrame frame_;
  FrameAdler32 adler_;
  RunFrame batch_[kFrameBatch];
  RunFrame* batch_begin_ = batch_;  // where the frames passed next are gathered
  RunFrame* batch_end_ = batch_;
  RunFrame* batch_limit_ = batch_ + kFrameBatch;
};

}  // namespace host
