#include "host/file_streamer.h"

#include <chrono>

#include "host/call_failures.h"
#include "host/read_lists.h"
#include "platform/mmf_status.h"
#include "platform/mra_pool.h"

namespace host {

namespace {

constexpr uint32_t kElementsPerBuffer = 4;  // time marker, file offset, bytes
constexpr auto kPoolWait = std::chrono::seconds(10);
constexpr int kNoBuffer = 11;

}  // namespace

FileStreamer::FileStreamer(InputStream* source, StreamerConfig config)
    : source_(source),
      config_(config),
      bytes_(std::make_unique<MemoryPool>(config.buffer_size, config.buffer_count)),
      read_ahead_(source, bytes_.get(), config.reader_cpu) {
  output_.Kind = kMmfChannelKind;
  output_.Direction = kMmfDirectionOutput;
  output_.Format.buffer_size = config.buffer_size;
  output_.Format.buffer_count = config.buffer_count;
  output_.State = this;
  mras_ = MakeMraPool(config.buffer_count, kElementsPerBuffer);
}

FileStreamer::~FileStreamer() { MmfFreeMraPool(mras_); }

const MmfMediaOutputOps* FileStreamer::Ops() {
  // The streamer's output needs no negotiation in our framework: only NextBuffer is offered.
  static const MmfMediaOutputOps ops = {
      .IterateOutputChannels = nullptr,
      .AcquireOutputChannel = nullptr,
      .ReleaseOutputChannel = nullptr,
      .IterateOutputFormats = nullptr,
      .VerifyOutputFormat = nullptr,
      .SetOutputFormat = nullptr,
      .NextBuffer = OpNextBuffer,
      .SetOutputChannelMemoryPool = nullptr,
  };
  return &ops;
}

FileStreamer* FileStreamer::OfOutput(MmfChannel* output) {
  if (!output || output->Kind != kMmfChannelKind || output->Direction != kMmfDirectionOutput) return nullptr;
  auto* streamer = static_cast<FileStreamer*>(output->State);
  return streamer && streamer->output() == output ? streamer : nullptr;
}

int FileStreamer::OpNextBuffer(MmfChannel* output, MmfMra** buffer) {
  FileStreamer* streamer = OfOutput(output);
  if (!streamer || !buffer) return kMmfInvalidArgument;
  return streamer->NextBuffer(buffer);
}

int FileStreamer::Seek(uint64_t offset, uint64_t time_us) {
  std::lock_guard lock(mutex_);
  position_ = offset;
  marker_pending_ = true;
  marker_time_ = time_us;
  ended_ = false;
  read_ahead_.Discard();
  return kMmfOk;
}

void FileStreamer::ConnectListMaker(const MmfListMakerOps* list_maker, MmfChannel* downstream_input) {
  std::lock_guard lock(mutex_);
  list_maker_ = list_maker;
  downstream_input_ = downstream_input;
}

int FileStreamer::SetListMode(uint32_t mode) {
  std::lock_guard lock(mutex_);
  if (!list_maker_ || !list_maker_->GetNextReadList) return kMmfNotAvailable;
  list_mode_ = mode ? 1 : 0;
  switch_pending_ = true;
  ended_ = false;
  read_ahead_.Discard();
  return kMmfOk;
}

uint64_t FileStreamer::bytes_read() const {
  std::lock_guard lock(mutex_);
  return bytes_read_;
}

// The list maker's current entry (asked with no previous entry, so nothing is
// consumed): in list mode it becomes the request being read; in normal mode
// its ready request says where streaming goes on.
int FileStreamer::TakeCurrentEntry() {
  MmfReadListEntry* entry = nullptr;
  int result = list_maker_->GetNextReadList(downstream_input_, &entry, nullptr);
  if (result != kMmfOk) return result;
  if (list_mode_) {
    entry_ = entry;
    request_left_ = 0;
    if (!entry || !entry->Ready || !entry->Request) return kMmfNotAvailable;
    if (entry->Request->Length < 0) return kMmfEndOfStream;
    request_left_ = static_cast<uint32_t>(entry->Request->Length);
    position_ = entry->Request->Position;
    marker_pending_ = true;
    marker_time_ = entry->Request->Time;
    return kMmfOk;
  }
  entry_ = nullptr;
  if (entry && entry->Ready && entry->Request && entry->Request->Length >= 0) {
    position_ = entry->Request->Position;
    marker_pending_ = true;
    marker_time_ = entry->Request->Time;
  }
  return kMmfOk;
}

// List mode: the request after the one just read, from the list maker.
int FileStreamer::NextRequest() {
  MmfReadListEntry* next = nullptr;
  int result = list_maker_->GetNextReadList(downstream_input_, &next, entry_);
  if (result != kMmfOk) return result;
  if (!next || !next->Ready || !next->Request) return kMmfNotAvailable;
  entry_ = next;
  if (next->Request->Length < 0) return kMmfEndOfStream;
  request_left_ = static_cast<uint32_t>(next->Request->Length);
  position_ = next->Request->Position;
  marker_pending_ = true;
  marker_time_ = next->Request->Time;
  return kMmfOk;
}

int FileStreamer::NextBuffer(MmfMra** buffer) {
  std::lock_guard lock(mutex_);
  *buffer = nullptr;
  if (ended_) return kMmfEndOfStream;
  if (switch_pending_) {
    switch_pending_ = false;
    int result = TakeCurrentEntry();
    if (result == kMmfEndOfStream) ended_ = true;
    if (result != kMmfOk) return result;
  }
  uint32_t wanted = config_.buffer_size;
  if (!delivered_ && config_.first_buffer_size != 0 && config_.first_buffer_size < wanted) {
    wanted = config_.first_buffer_size;
  }
  if (list_mode_) {
    while (request_left_ == 0) {
      int result = NextRequest();
      if (result == kMmfEndOfStream) ended_ = true;
      if (result != kMmfOk) return result;
    }
    if (request_left_ < wanted) wanted = static_cast<uint32_t>(request_left_);
  }
  // Read ahead only once the reader streams on: the buffer after a seek is
  // often followed by another seek (a cue lookup, a trick-play step), and
  // reading ahead then only costs reads.
  const bool continues = delivered_ && !marker_pending_ && !list_mode_;
  int result = Deliver(position_, wanted, buffer);
  if (result == kMmfEndOfStream) ended_ = true;
  if (result == kMmfBufferDelivered) delivered_ = true;
  if (result == kMmfBufferDelivered && continues && config_.read_ahead && source_->seekable()) {
    read_ahead_.Start(position_, config_.buffer_size);
  }
  return result;
}

// The bytes at `offset`: those read ahead when they are these, else read now
// into a pool buffer. Null with the answer in `failure` when there are none.
MmfPoolBuffer* FileStreamer::ReadBytes(uint64_t offset, uint32_t wanted, int64_t* got, int* failure) {
  if (MmfPoolBuffer* bytes = read_ahead_.Take(offset, wanted, got)) return bytes;
  MmfPoolBuffer* bytes = bytes_->AcquireWaiting(kPoolWait);
  if (!bytes) {
    // An offset the source cannot reach ends the stream, whatever the pool holds.
    *failure = source_->Seek(offset) < 0 ? kMmfEndOfStream : kNoBuffer;
    return nullptr;
  }
  MemoryPool::Ops()->MapBuffer(bytes);
  *got = source_->ReadAt(offset, bytes->Data, wanted);
  return bytes;
}

int FileStreamer::Deliver(uint64_t offset, uint32_t wanted, MmfMra** buffer) {
  int64_t got = 0;
  int failure = kMmfEndOfStream;
  MmfPoolBuffer* bytes = ReadBytes(offset, wanted, &got, &failure);
  if (!bytes) return failure;
  if (got <= 0) {
    MemoryPool::Ops()->ReleaseMappedBuffer(bytes);
    return kMmfEndOfStream;
  }
  MmfMra* mra = nullptr;
  int result = MmfAcquireMra(mras_, &mra, 0);
  if (result != kMmfOk) {
    MemoryPool::Ops()->ReleaseMappedBuffer(bytes);
    return result;
  }
  uint32_t index = 0;
  if (marker_pending_) {
    result = MmfSetMraPropertyElement(mra, index++, kMmfPropTimeMarker, static_cast<uint32_t>(marker_time_),
                                      static_cast<uint16_t>(marker_time_ >> 32));
  }
  if (result == kMmfOk) {
    result = MmfSetMraPropertyElement(mra, index++, kMmfPropFileOffset, static_cast<uint32_t>(offset),
                                      static_cast<uint16_t>(offset >> 32));
  }
  if (result == kMmfOk) result = MmfSetMraBufferElement(mra, index, bytes, bytes->Data, static_cast<uint32_t>(got));
  // The media buffer's element now holds the bytes; the streamer keeps no reference.
  MemoryPool::Ops()->ReleaseMappedBuffer(bytes);
  if (result != kMmfOk) {
    MmfReleaseMra(mra);
    return result;
  }
  marker_pending_ = false;
  position_ = offset + static_cast<uint64_t>(got);
  bytes_read_ += static_cast<uint64_t>(got);
  if (list_mode_) request_left_ -= static_cast<uint64_t>(got) < request_left_ ? static_cast<uint64_t>(got) : request_left_;
  *buffer = mra;
  return kMmfBufferDelivered;
}

}  // namespace host

// The streamer that a read list steers is the one its list maker's input
// channel is connected to.
extern "C" int MmfStreamerSetListMode(MmfReadList* list, uint32_t mode) {
  if (!list) return kMmfInvalidArgument;
  if (int error = host::TakeInjectedFailure(host::FrameworkCall::kStreamerSetListMode)) return error;
  host::FileStreamer* streamer = host::FileStreamer::OfOutput(list->Channel ? list->Channel->Peer : nullptr);
  if (!streamer) return kMmfNotAvailable;
  return streamer->SetListMode(mode);
}
