#include "tools/extract/writer_choice.h"

#include "tools/extract/adts_writer.h"
#include "tools/extract/annexb_writer.h"
#include "tools/extract/avi_writer.h"
#include "tools/extract/inflating_writer.h"
#include "tools/extract/elementary_writer.h"
#include "tools/extract/flac_writer.h"
#include "tools/extract/ogg_writer.h"
#include "tools/extract/raw_index_writer.h"
#include "tools/extract/wav_writer.h"

namespace {

constexpr uint32_t Code(const char (&text)[5]) {
  return static_cast<uint32_t>(static_cast<uint8_t>(text[0])) << 24 |
         static_cast<uint32_t>(static_cast<uint8_t>(text[1])) << 16 |
         static_cast<uint32_t>(static_cast<uint8_t>(text[2])) << 8 | static_cast<uint8_t>(text[3]);
}

struct StreamFormat {
  uint32_t fourcc;
  const char* extension;
  bool headers_first;  // elementary video: the decoder configuration goes first
};

// Frames that decoders read as they are, one after the other.
constexpr StreamFormat kElementary[] = {
    {Code("M2A3"), "mp3", false}, {Code("M2A2"), "mp2", false}, {Code("M2A1"), "mp1", false},
    {Code("AC3A"), "ac3", false}, {Code("DTSA"), "dts", false}, {Code("MP1V"), "m1v", true},
    {Code("MP2V"), "m2v", true},
};

bool IsMpeg4Part2(const ChannelFacts& facts) {
  return facts.fourcc == Code("MP4V") && facts.codec_id.rfind("V_MPEG4/ISO/", 0) == 0;
}

constexpr char kVfwCodecId[] = "V_MS/VFW/FOURCC";
constexpr size_t kBitmapInfoHeaderSize = 40;

// Video for Windows compression codes of MPEG-4 Part 2 video (the plug-in
// offers a VfW track under its compression code), in any letter case.
bool IsVfwMpeg4Part2(const ChannelFacts& facts) {
  if (facts.codec_id != kVfwCodecId) return false;
  uint32_t upper = facts.fourcc;
  for (int shift = 0; shift < 32; shift += 8) {
    const uint32_t c = upper >> shift & 0xFF;
    if (c >= 'a' && c <= 'z') upper -= uint32_t{'a' - 'A'} << shift;
  }
  for (uint32_t code : {Code("XVID"), Code("DIVX"), Code("DX50"), Code("FMP4"), Code("MP4V")}) {
    if (upper == code) return true;
  }
  return false;
}

}  // namespace

const char kWriterFormatsHelp[] =
    "  AVC                       .h264  Annex B: start codes, SPS and PPS from the avcC first\n"
    "  AAC                       .aac   ADTS headers from the AudioSpecificConfig\n"
    "  FLAC                      .flac  native FLAC: fLaC, STREAMINFO and the other metadata blocks\n"
    "  Vorbis, Theora            .ogg .ogv  Ogg with the three headers and granule positions\n"
    "  PCM                       .wav   WAV, big-endian samples turned little endian\n"
    "  MPEG audio, AC-3, DTS     .mp3 .mp2 .mp1 .ac3 .dts  elementary streams\n"
    "  MPEG-1/2, MPEG-4 Part 2   .m1v .m2v .m4v  elementary streams, sequence/VOL headers first\n"
    "    (also Video for Windows tracks coded XVID, DIVX, DX50, FMP4 or MP4V)\n"
    "  other Video for Windows   .avi   AVI with the track's BITMAPINFOHEADER\n"
    "  anything else             .raw + .index  raw frames and a per-frame index (below)\n";

ChosenWriter ChooseWriter(const ChannelFacts& facts, const std::string& directory, OutputFile* out) {
  ChosenWriter chosen;
  std::string base = directory + "/track" + std::to_string(facts.track) + ".";
  auto make = [&](const char* extension, std::unique_ptr<FrameWriter> writer) {
    chosen.path = base + extension;
    chosen.writer = std::move(writer);
  };
  const uint32_t code = facts.fourcc;
  if (code == Code("AVC1")) {
    make("h264", std::make_unique<AnnexBWriter>(out));
  } else if (code == Code("M4AC") || code == Code("M2AC")) {
    make("aac", std::make_unique<AdtsWriter>(out, facts));
  } else if (code == Code("FLAC")) {
    make("flac", std::make_unique<FlacWriter>(out));
  } else if (code == Code("VRBS")) {
    make("ogg",
         std::make_unique<OggWriter>(out, static_cast<uint32_t>(facts.track), std::make_unique<VorbisGranules>()));
  } else if (code == Code("THEO")) {
    make("ogv",
         std::make_unique<OggWriter>(out, static_cast<uint32_t>(facts.track), std::make_unique<TheoraGranules>()));
  } else if (code == Code("RAWA")) {
    make("wav", std::make_unique<WavWriter>(out, facts));
  } else if (IsMpeg4Part2(facts)) {
    make("m4v", std::make_unique<ElementaryWriter>(out, true));
  } else if (IsVfwMpeg4Part2(facts)) {
    make("m4v", std::make_unique<ElementaryWriter>(out, true, kBitmapInfoHeaderSize));
  } else if (facts.codec_id == kVfwCodecId) {
    make("avi", std::make_unique<AviWriter>(out, facts));
  } else {
    for (const StreamFormat& format : kElementary) {
      if (format.fourcc == code) make(format.extension, std::make_unique<ElementaryWriter>(out, format.headers_first));
    }
    if (!chosen.writer) {
      chosen.index_path = base + "index";
      make("raw", std::make_unique<RawIndexWriter>(out, chosen.index_path, facts));
    }
  }
  if (facts.zlib_frames) {
    chosen.writer = std::make_unique<InflatingWriter>(out, std::move(chosen.writer), facts.zlib_private);
  }
  return chosen;
}
