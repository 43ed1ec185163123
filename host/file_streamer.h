#pragma once
// The host's file streamer: the filter upstream of a parser. Its output
// channel delivers input media buffers through the framework's NextBuffer:
// a type-9 file-offset property and one buffer element of up to the
// configured buffer size, read straight from the source into the pool buffer
// that is delivered (no second copy). After a seek the next buffer starts
// with a type-3 time marker. In list mode it reads only the byte ranges of
// read-list requests, asking the downstream list maker for each next entry;
// a request length of -1 ends the stream. At the end NextBuffer answers
// kMmfEndOfStream, and keeps answering it. With read-ahead on, while it
// streams on normally from a seekable source, the next buffers are read on a
// thread of its own.

#include <cstdint>
#include <memory>
#include <mutex>

#include "host/input_streams.h"
#include "host/memory_pools.h"
#include "host/read_ahead.h"
#include "platform/interfaces.h"

namespace host {

struct StreamerConfig {
  uint32_t buffer_size = 32768;  // bytes per input buffer; also the output format's buffer size
  uint32_t buffer_count = 64;    // pool buffers and media buffers
  // Bytes of the first buffer only (at most buffer_size; 0: buffer_size), so
  // that tests can split the input at any byte.
  uint32_t first_buffer_size = 0;
  // Read the next buffers in the background while streaming on. The source is
  // then read between NextBuffer calls too, so it must outlive the streamer
  // strictly; and the order of reads and of pool use is no longer fixed.
  bool read_ahead = false;
  int reader_cpu = -1;  // where the read-ahead thread runs; -1: anywhere
};

class FileStreamer {
 public:
  // `source` is not owned and must outlive the streamer.
  FileStreamer(InputStream* source, StreamerConfig config);
  ~FileStreamer();
  FileStreamer(const FileStreamer&) = delete;
  FileStreamer& operator=(const FileStreamer&) = delete;

  // The output channel record that a downstream input channel names as its Peer.
  MmfChannel* output() { return &output_; }
  static const MmfMediaOutputOps* Ops();
  // The streamer behind an output channel record, or null.
  static FileStreamer* OfOutput(MmfChannel* output);

  // The next buffer starts at `offset`, headed by a time marker of `time_us`.
  int Seek(uint64_t offset, uint64_t time_us);

  // Where list mode asks for entries: the list maker of the downstream filter
  // and its input channel.
  void ConnectListMaker(const MmfListMakerOps* list_maker, MmfChannel* downstream_input);
  // 1: read only the ranges of the list maker's requests, starting with its
  // current entry; 0: stream normally, from the current entry's position when
  // it holds a ready request. 0, or 4044 when no list maker is connected.
  int SetListMode(uint32_t mode);

  // Bytes read from the source so far.
  uint64_t bytes_read() const;

 private:
  int NextBuffer(MmfMra** buffer);
  int NextRequest();
  int TakeCurrentEntry();
  int Deliver(uint64_t offset, uint32_t wanted, MmfMra** buffer);
  MmfPoolBuffer* ReadBytes(uint64_t offset, uint32_t wanted, int64_t* got, int* failure);
  static int OpNextBuffer(MmfChannel* output, MmfMra** buffer);

  InputStream* source_;
  StreamerConfig config_;
  MmfChannel output_{};
  std::unique_ptr<MemoryPool> bytes_;
  MmfMraPool* mras_ = nullptr;
  ReadAhead read_ahead_;  // after bytes_: its buffers go back before the pool goes

  mutable std::mutex mutex_;
  uint64_t position_ = 0;        // next file offset to read
  bool marker_pending_ = false;  // the next buffer starts with a time marker
  uint64_t marker_time_ = 0;
  bool ended_ = false;
  bool delivered_ = false;  // a buffer of file bytes has gone out
  uint64_t bytes_read_ = 0;

  const MmfListMakerOps* list_maker_ = nullptr;
  MmfChannel* downstream_input_ = nullptr;
  uint32_t list_mode_ = 0;
  bool switch_pending_ = false;        // SetListMode was called; the next buffer takes the current entry
  MmfReadListEntry* entry_ = nullptr;  // list mode: the entry being read
  uint64_t request_left_ = 0;          // list mode: bytes of entry_'s request still to read
};

}  // namespace host
