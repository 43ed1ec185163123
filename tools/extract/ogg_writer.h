#pragma once
// Vorbis or Theora in Ogg (.ogg, .ogv): the three headers of the decoder
// configuration (split by the plug-in, or still Xiph-laced), the
// identification header alone on the first page and each other packet on a
// page of its own (more pages for packets longer than one page carries), with
// the codec's granule positions; an empty last page marks the end of the stream.

#include <memory>

#include "tools/extract/frame_writer.h"
#include "tools/extract/ogg_granules.h"

class OggWriter : public FrameWriter {
 public:
  OggWriter(OutputFile* out, uint32_t serial, std::unique_ptr<OggGranules> granules)
      : FrameWriter(out), serial_(serial), granules_(std::move(granules)) {}
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
  std::unique_ptr<OggGranules> granules_;
  std::vector<iovec> list_;
};
