#pragma once
// Vorbis in Ogg (.ogg): the three headers of the decoder configuration, the
// identification header alone on the first page and each other packet on a
// page of its own (more pages for packets longer than one page carries), with
// granule positions counted from the Vorbis block sizes; an empty last page
// marks the end of the stream.

#include "tools/extract/frame_writer.h"
#include "tools/extract/vorbis_blocks.h"

class OggWriter : public FrameWriter {
 public:
  OggWriter(OutputFile* out, uint32_t serial) : FrameWriter(out), serial_(serial) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;
  bool Finish() override;

 private:
  // Writes one packet as pages; the last of them carries `granule`.
  bool Packet(const FrameView& packet, int64_t granule, uint8_t flags);
  bool Page(const FrameView& packet, size_t offset, size_t length, const uint8_t* lacing, size_t segments,
            int64_t granule, uint8_t flags);

  uint32_t serial_;
  uint32_t sequence_ = 0;
  int64_t granule_ = 0;
  VorbisBlocks blocks_;
  std::vector<iovec> list_;
};
