#pragma once
// A track stored with zlib content compression: the plug-in delivers its
// frames as they are stored, so each is inflated with zlib before the
// track's own writer gets it (and the decoder configuration too, when the
// compression covers the CodecPrivate).

#include <memory>

#include "tools/extract/frame_writer.h"

class InflatingWriter : public FrameWriter {
 public:
  InflatingWriter(OutputFile* out, std::unique_ptr<FrameWriter> inner, bool config_compressed)
      : FrameWriter(out), inner_(std::move(inner)), config_compressed_(config_compressed) {}
  bool Begin(const std::vector<Bytes>& config) override;
  bool Frame(const FrameView& frame) override;
  bool Finish() override { return inner_->Finish() || Fail(inner_->error()); }

 private:
  bool Inflate(const Bytes& stored, Bytes* plain);

  std::unique_ptr<FrameWriter> inner_;
  bool config_compressed_;
  Bytes stored_;
  Bytes plain_;
};
