// Video configurations through MmParseDecoderConfig: records written by real
// encoders (ffprobe's size and aspect ratio), headers written bit by bit for
// what encoders rarely write, and damaged records; and FLAC's STREAMINFO
// unpacked into the decoder's record. Every fixture's tracks are compared with
// ffprobe in the fixture header test.

#include "platform/decoder_config.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "core/flac_config.h"
#include "core/status.h"
#include "host/bit_reader.h"

namespace {

using Bytes = std::vector<uint8_t>;

// Codec headers written bit by bit, most significant first; the last byte padded with zeros.
struct BitWriter {
  Bytes bytes;
  uint64_t bit_count = 0;
  BitWriter& Bits(unsigned count, uint64_t value) {
    for (unsigned i = count; i-- > 0; ++bit_count) {
      if (bit_count % 8 == 0) bytes.push_back(0);
      if ((value >> i) & 1) bytes.back() |= static_cast<uint8_t>(0x80 >> (bit_count % 8));
    }
    return *this;
  }
  BitWriter& Golomb(uint64_t value) {  // ue(v)
    unsigned length = 0;
    while (((value + 1) >> length) > 1) ++length;
    return Bits(length, 0).Bits(length + 1, value + 1);
  }
  BitWriter& SignedGolomb(int64_t value) {  // se(v)
    return Golomb(value > 0 ? 2 * static_cast<uint64_t>(value) - 1 : 2 * static_cast<uint64_t>(-value));
  }
};

// An H.264 RBSP as a NAL unit payload: 03 after every 00 00 that precedes 00..03.
Bytes EscapeRbsp(const Bytes& rbsp) {
  Bytes out;
  for (uint8_t byte : rbsp) {
    if (out.size() >= 2 && out.end()[-1] == 0 && out.end()[-2] == 0 && byte <= 3) out.push_back(3);
    out.push_back(byte);
  }
  return out;
}

// kFlac rows go to setup_flac_codec_config instead.
constexpr uint32_t kAvc1 = 0x41564331, kMp4v = 0x4D503456, kFlac = 0x664C6143;

// An H.264 SPS; 320x240 unless cropped. aspect_idc -1: no aspect_ratio_info, -2: no VUI.
struct Sps {
  uint32_t chroma_format_idc = 1, scaling_lists = 0, bit_depth_minus8 = 0, poc_type = 0, poc_cycle = 3, crop_right = 0;
  uint32_t width_in_mbs = 20, level = 40, id = 0;
  int aspect_idc = 14;
  uint32_t sar_width = 0, sar_height = 0;
};

Bytes avc_record(const Bytes& sps) {
  Bytes r = {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, static_cast<uint8_t>(sps.size())};
  r.insert(r.end(), sps.begin(), sps.end());
  return r;
}

Bytes sps_nal(const Sps& s, uint8_t header = 0x67) {
  BitWriter w;
  w.Bits(8, header).Bits(8, 100).Bits(8, 0).Bits(8, s.level).Golomb(s.id).Golomb(s.chroma_format_idc);
  if (s.chroma_format_idc == 3) w.Bits(1, 0);
  w.Golomb(s.bit_depth_minus8).Golomb(s.bit_depth_minus8).Bits(1, 0).Bits(1, s.scaling_lists);
  for (int i = 0; s.scaling_lists && i < (s.chroma_format_idc == 3 ? 12 : 8); ++i) {
    w.Bits(1, i != 2);  // list 2 absent, odd lists ended early by a scale of 8 - 4 - 4
    for (int j = 0; i != 2 && j < (i % 2 ? 2 : i < 6 ? 16 : 64); ++j) w.SignedGolomb(i % 2 ? -4 : j % 3 - 1);
  }
  w.Golomb(0).Golomb(s.poc_type);
  if (s.poc_type == 0) w.Golomb(2);
  if (s.poc_type == 1) {
    w.Bits(1, 0).SignedGolomb(-1).SignedGolomb(2).Golomb(s.poc_cycle);
    for (uint32_t i = 0; i < s.poc_cycle; ++i) w.SignedGolomb(static_cast<int64_t>(i) - 2);
  }
  w.Golomb(4).Bits(1, 0).Golomb(s.width_in_mbs - 1).Golomb(14).Bits(1, 1).Bits(1, 1).Bits(1, s.crop_right != 0);
  if (s.crop_right) w.Golomb(0).Golomb(s.crop_right).Golomb(0).Golomb(0);
  w.Bits(1, s.aspect_idc != -2);
  if (s.aspect_idc != -2) w.Bits(1, s.aspect_idc >= 0);
  if (s.aspect_idc >= 0) w.Bits(8, static_cast<uint64_t>(s.aspect_idc));
  if (s.aspect_idc == 255) w.Bits(16, s.sar_width).Bits(16, s.sar_height);
  w.Bits(9, 1);  // the rest of the VUI absent, stop bit
  return EscapeRbsp(w.bytes);
}

Bytes avc(const Sps& s) { return avc_record(sps_nal(s)); }

// An MPEG-4 VideoObjectLayer with its start code; 352x288 when rectangular.
struct Vol {
  uint32_t object_type = 1, verid = 0, aspect = 3, par = 0, vbv = 0;  // verid 0: no layer identifier
  uint32_t shape = 0, time_resolution = 25, increment_bits = 0, code = 0x20;  // increment_bits 0: no fixed rate
};

Bytes vol(const Vol& v) {
  BitWriter w;
  w.Bits(24, 1).Bits(8, v.code).Bits(1, 0).Bits(8, v.object_type).Bits(1, v.verid != 0);
  if (v.verid) w.Bits(4, v.verid).Bits(3, 1);
  w.Bits(4, v.aspect);
  if (v.aspect == 15) w.Bits(16, v.par);
  w.Bits(1, v.vbv);
  if (v.vbv) w.Bits(4, 0x7).Bits(51, 0).Bits(28, 0xFFFFFFF);
  w.Bits(2, v.shape);
  if (v.shape == 3 && v.verid > 1) w.Bits(4, 0);
  w.Bits(1, 1).Bits(16, v.time_resolution).Bits(1, 1).Bits(1, v.increment_bits != 0).Bits(v.increment_bits, 1);
  if (v.shape == 0) w.Bits(1, 1).Bits(13, 352).Bits(1, 1).Bits(13, 288).Bits(1, 1);
  return w.bytes;
}

Bytes patched(Bytes bytes, size_t at, uint8_t value) { return bytes[at] = value, bytes; }
Bytes cut(const Bytes& bytes, size_t drop) { return Bytes(bytes.begin(), bytes.end() - static_cast<ptrdiff_t>(drop)); }
Bytes from(const Bytes& bytes, size_t at) { return Bytes(bytes.begin() + static_cast<ptrdiff_t>(at), bytes.end()); }
Bytes behind(Bytes prefix, const Bytes& bytes) { return prefix.insert(prefix.end(), bytes.begin(), bytes.end()), prefix; }

// libx264 (testsrc, setsar; several with emulation-prevention bytes) and ffmpeg's mpeg4 and libxvid.
const Bytes kAvc420 = {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1E, 0x67, 0x64, 0x00, 0x0B, 0xAC, 0xD9, 0x43, 0x4D, 0xE5, 0x93, 0xFF, 0x00, 0x61, 0x00, 0x3C, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00};
const Bytes kAvc422 = {0x01, 0x7A, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x1A, 0x67, 0x7A, 0x00, 0x0B, 0xBC, 0xD9, 0x43, 0x4D, 0xE5, 0x9F, 0x0F, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x42, 0x99, 0x60, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFE, 0xF8, 0xF8, 0x00};
const Bytes kAvc444 = {0x01, 0xF4, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0xF4, 0x00, 0x0B, 0x91, 0x9B, 0x28, 0x69, 0xBC, 0x4C, 0xF8, 0x80, 0x80, 0x00, 0x00, 0x03, 0x00, 0x80, 0x00, 0x00, 0x19, 0x07, 0x8A, 0x14, 0xCB, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xC4, 0x48, 0x44, 0xFF, 0xF8, 0xF8, 0x00};
const Bytes kAvcMono = {0x01, 0x64, 0x00, 0x0B, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x64, 0x00, 0x0B, 0xF3, 0x65, 0x0D, 0x37, 0x89, 0x9F, 0x06, 0x6C, 0x80, 0x00, 0x00, 0x03, 0x00, 0x80, 0x00, 0x00, 0x19, 0x07, 0x8A, 0x14, 0xCB, 0x01, 0x00, 0x06, 0x68, 0xEB, 0xE3, 0xCB, 0x22, 0xC0, 0xFC, 0xF8, 0xF8, 0x00};
const Bytes kAvc420Fields = {0x01, 0x64, 0x00, 0x1E, 0xFF, 0xE1, 0x00, 0x1A, 0x67, 0x64, 0x00, 0x1E, 0xAC, 0xD9, 0x40, 0xB0, 0x7B, 0xF7, 0x83, 0x88, 0x00, 0x00, 0x03, 0x00, 0x08, 0x00, 0x00, 0x03, 0x01, 0x90, 0xF8, 0xA1, 0x4C, 0xB0, 0x01, 0x00, 0x06, 0x68, 0xFB, 0xA3, 0xCB, 0x22, 0xC0, 0xFD, 0xF8, 0xF8, 0x00};
const Bytes kAvc422Fields = {0x01, 0x7A, 0x00, 0x1E, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x7A, 0x00, 0x1E, 0xBC, 0xD9, 0x40, 0xB4, 0x7B, 0x61, 0x42, 0x00, 0x00, 0x03, 0x00, 0x02, 0x00, 0x00, 0x03, 0x00, 0x64, 0x3E, 0x28, 0x53, 0x2C, 0x01, 0x00, 0x07, 0x68, 0xFB, 0xA3, 0xCB, 0x30, 0x02, 0xC0, 0xFE, 0xF8, 0xF8, 0x00};
const Bytes kAvcBaseline = {0x01, 0x42, 0xC0, 0x28, 0xFF, 0xE1, 0x00, 0x19, 0x67, 0x42, 0xC0, 0x28, 0xDA, 0x01, 0xE0, 0x08, 0x9F, 0x97, 0x01, 0x10, 0x00, 0x00, 0x03, 0x00, 0x10, 0x00, 0x00, 0x03, 0x03, 0x20, 0xF1, 0x83, 0x2A, 0x01, 0x00, 0x04, 0x68, 0xCE, 0x0F, 0xC8};
const Bytes kMpeg4ExtendedPar = {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xC4, 0xF8, 0x28, 0x3D, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00, 0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63};
const Bytes kMpeg4TablePar = {0x00, 0x00, 0x01, 0xB0, 0x01, 0x00, 0x00, 0x01, 0xB5, 0x89, 0x13, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xC4, 0xA5, 0x88, 0x00, 0xCD, 0x05, 0x84, 0x12, 0x14, 0x43, 0x00, 0x00, 0x01, 0xB2, 0x4C, 0x61, 0x76, 0x63};
const Bytes kXvid = {0x00, 0x00, 0x01, 0xB0, 0x03, 0x00, 0x00, 0x01, 0xB5, 0x09, 0x00, 0x00, 0x01, 0x00, 0x00, 0x00, 0x01, 0x20, 0x00, 0xBC, 0x24, 0x1E, 0xC4, 0x00, 0x67, 0x0C, 0x16, 0x10, 0x48, 0x51, 0x8F, 0x00, 0x00, 0x01, 0xB2, 0x58, 0x76, 0x69, 0x44};

// "fLaC" and a STREAMINFO flagged last: blocks 4096..4096, frames 14..5000 bytes,
// 44100 Hz, 2 channels, 16 bits, 0x123456789 samples; then patched and resized.
Bytes stream_header(std::initializer_list<std::pair<size_t, uint8_t>> patches = {}, size_t size = 42) {
  Bytes bytes = {'f',  'L',  'a',  'C',  0x80, 0x00, 0x00, 0x22, 0x10, 0x00, 0x10, 0x00, 0x00,
                 0x00, 0x0E, 0x00, 0x13, 0x88, 0x0A, 0xC4, 0x42, 0xF1, 0x23, 0x45, 0x67, 0x89};
  bytes.resize(42, 0xEE);  // MD5
  for (const auto& [offset, value] : patches) bytes[offset] = value;
  bytes.resize(size, 0x00);
  return bytes;
}

// A BITMAPINFOHEADER whose width bytes imitate a layer start code (00 00 01 20).
Bytes bitmap_info() { return patched(patched(patched(patched(Bytes(40, 0), 0, 0x28), 6, 0x01), 7, 0x20), 8, 0x90); }

// The record starts as 11x22 with pixels 33:44: a configuration not understood
// leaves it so, and one without a pixel shape keeps those pixels. A FLAC row
// expects words 0..6 of the decoder's record and the total samples.
TEST(DecoderConfigTest, ConfigurationsGiveTheirPictureShape) {
  const struct {
    const char* name;
    Bytes config;
    uint32_t fourcc;
    bool understood;
    std::vector<uint64_t> want;
  } cases[] = {
      {"x264 4:2:0 200x90 of 208x96, Extended_SAR", kAvc420, kAvc1, true, {200, 90, 97, 60}},
      {"x264 4:2:2", kAvc422, kAvc1, true, {200, 90, 3, 2}},
      {"x264 4:4:4", kAvc444, kAvc1, true, {200, 90, 2, 1}},
      {"x264 monochrome", kAvcMono, kAvc1, true, {200, 90, 24, 11}},
      {"x264 4:2:0 fields", kAvc420Fields, kAvc1, true, {704, 472, 20, 11}},
      {"x264 4:2:2 fields", kAvc422Fields, kAvc1, true, {720, 480, 18, 11}},
      {"x264 Constrained Baseline", kAvcBaseline, kAvc1, true, {1920, 1080, 1, 1}},
      {"mpeg4 extended PAR", kMpeg4ExtendedPar, kMp4v, true, {176, 144, 5, 7}},
      {"mpeg4 table PAR", kMpeg4TablePar, kMp4v, true, {176, 144, 16, 11}},
      {"mpeg4 reserved aspect 7", patched(kMpeg4TablePar, 21, 0xBD), kMp4v, true, {176, 144, 33, 44}},
      {"xvid with control parameters", kXvid, kMp4v, true, {176, 144, 9, 7}},
      {"lower-case avc1", kAvcBaseline, 0x61766331 /* "avc1" */, false, {11, 22, 33, 44}},
      {"AVC record under MP4V", kAvcBaseline, kMp4v, false, {11, 22, 33, 44}},
      {"MPEG-4 configuration under AVC1", kMpeg4TablePar, kAvc1, false, {11, 22, 33, 44}},
      // SPS fields x264 does not write.
      {"eight scaling lists", avc({.scaling_lists = true}), kAvc1, true, {320, 240, 4, 3}},
      {"twelve scaling lists, 10 bits", avc({.chroma_format_idc = 3, .scaling_lists = true, .bit_depth_minus8 = 2}), kAvc1, true, {320, 240, 4, 3}},
      {"picture order type 1 with a cycle", avc({.poc_type = 1}), kAvc1, true, {320, 240, 4, 3}},
      {"picture order type 2", avc({.poc_type = 2}), kAvc1, true, {320, 240, 4, 3}},
      {"level 3: a 03 byte after a single zero stays", avc({.level = 3}), kAvc1, true, {320, 240, 4, 3}},
      {"4:2:0 crop counts chroma samples", avc({.crop_right = 3}), kAvc1, true, {314, 240, 4, 3}},
      {"aspect idc 13", avc({.aspect_idc = 13}), kAvc1, true, {320, 240, 160, 99}},
      {"reserved aspect idc 17", avc({.aspect_idc = 17}), kAvc1, true, {320, 240, 33, 44}},
      {"Extended_SAR 65535:65534", avc({.aspect_idc = 255, .sar_width = 65535, .sar_height = 65534}), kAvc1, true, {320, 240, 65535, 65534}},
      {"Extended_SAR with an escaped zero run", avc({.aspect_idc = 255, .sar_width = 0x8000, .sar_height = 1}), kAvc1, true, {320, 240, 0x8000, 1}},
      {"Extended_SAR of zero width", avc({.aspect_idc = 255, .sar_width = 0, .sar_height = 45}), kAvc1, true, {320, 240, 33, 44}},
      {"no aspect_ratio_info", avc({.aspect_idc = -1}), kAvc1, true, {320, 240, 33, 44}},
      {"no VUI", avc({.aspect_idc = -2}), kAvc1, true, {320, 240, 33, 44}},
      {"chroma_format_idc 4", avc({.chroma_format_idc = 4}), kAvc1, false, {11, 22, 33, 44}},
      {"parameter set 31, the last", avc({.id = 31}), kAvc1, true, {320, 240, 4, 3}},
      {"parameter set 32", avc({.id = 32}), kAvc1, false, {11, 22, 33, 44}},
      {"bit depth 14", avc({.bit_depth_minus8 = 6}), kAvc1, true, {320, 240, 4, 3}},
      {"bit depth 15", avc({.bit_depth_minus8 = 7}), kAvc1, false, {11, 22, 33, 44}},
      {"picture order type 3", avc({.poc_type = 3}), kAvc1, false, {11, 22, 33, 44}},
      {"picture order cycle of 256", avc({.poc_type = 1, .poc_cycle = 256}), kAvc1, false, {11, 22, 33, 44}},
      {"cropping the whole width", avc({.crop_right = 160}), kAvc1, false, {11, 22, 33, 44}},
      {"picture 65536 wide", avc({.width_in_mbs = 4096}), kAvc1, false, {11, 22, 33, 44}},
      {"a PPS where the SPS belongs", avc_record(sps_nal({}, 0x68)), kAvc1, false, {11, 22, 33, 44}},
      {"SPS header byte only", avc_record({0x67}), kAvc1, false, {11, 22, 33, 44}},
      {"no SPS", patched(avc({}), 5, 0xE0), kAvc1, false, {11, 22, 33, 44}},
      {"SPS longer than the record", cut(avc({}), 1), kAvc1, false, {11, 22, 33, 44}},
      {"configuration version 0", patched(avc({}), 0, 0), kAvc1, false, {11, 22, 33, 44}},
      {"seven bytes", cut(kAvcBaseline, kAvcBaseline.size() - 7), kAvc1, false, {11, 22, 33, 44}},
      // Layer headers the encoders above never write.
      {"extended of zero height", vol({.aspect = 15, .par = 0x0500}), kMp4v, true, {352, 288, 33, 44}},
      {"forbidden aspect 0", vol({.aspect = 0}), kMp4v, true, {352, 288, 33, 44}},
      {"layer identifier", vol({.verid = 2}), kMp4v, true, {352, 288, 10, 11}},
      {"VBV parameters", vol({.vbv = true}), kMp4v, true, {352, 288, 10, 11}},
      {"fixed rate, resolution 1", vol({.time_resolution = 1, .increment_bits = 1}), kMp4v, true, {352, 288, 10, 11}},
      {"fixed rate, resolution 32768", vol({.time_resolution = 32768, .increment_bits = 15}), kMp4v, true, {352, 288, 10, 11}},
      {"fixed rate, resolution 32769", vol({.time_resolution = 32769, .increment_bits = 16}), kMp4v, true, {352, 288, 10, 11}},
      {"binary shape has no size", vol({.shape = 1}), kMp4v, true, {0, 0, 10, 11}},
      {"grayscale shape, version 2", vol({.verid = 2, .shape = 3}), kMp4v, true, {0, 0, 10, 11}},
      // Ending with its time increment: the shape extension of version 2 would read past the end.
      {"grayscale shape, version 1", vol({.verid = 1, .shape = 3, .time_resolution = 16, .increment_bits = 4}), kMp4v, true, {0, 0, 10, 11}},
      {"behind a BITMAPINFOHEADER", behind(bitmap_info(), vol({})), kMp4v, true, {352, 288, 10, 11}},
      {"last layer start code 0x2F", vol({.code = 0x2F}), kMp4v, true, {352, 288, 10, 11}},
      {"start code 0x30 is no layer", vol({.code = 0x30}), kMp4v, false, {11, 22, 33, 44}},
      {"no start code", from(vol({}), 3), kMp4v, false, {11, 22, 33, 44}},
      {"start code at the very end", {0x11, 0x00, 0x00, 0x01, 0x20}, kMp4v, false, {11, 22, 33, 44}},
      {"cut inside the height", cut(vol({}), 2), kMp4v, false, {11, 22, 33, 44}},
      {"time resolution 0", vol({.time_resolution = 0}), kMp4v, false, {11, 22, 33, 44}},
      {"fine granularity scalable layer", vol({.object_type = 0x12}), kMp4v, false, {11, 22, 33, 44}},
      {"FLAC: the 42 bytes of a stream header", stream_header(), kFlac, true, {4096, 4096, 5000, 14, 44100, 2, 16, 0x123456789}},
      {"FLAC: 41 bytes", stream_header({}, 41), kFlac, false, {}},
      {"FLAC: maximum of each pair first", stream_header({{8, 0x00}, {9, 0x10}, {14, 0x0F}}), kFlac, true,
       {4096, 16, 5000, 15, 44100, 2, 16, 0x123456789}},
      {"FLAC: marker other than fLaC", stream_header({{3, 'c'}}), kFlac, false, {}},
      {"FLAC: a comment block first", stream_header({{4, 0x04}}), kFlac, false, {}},
      {"FLAC: block length 33", stream_header({{7, 0x21}}), kFlac, false, {}},
      {"FLAC: block length 34 + 65536", stream_header({{5, 0x01}}), kFlac, false, {}},
      {"FLAC: minimum block above maximum", stream_header({{8, 0x10}, {9, 0x01}}), kFlac, false, {}},
      {"FLAC: minimum frame 14, maximum unknown", stream_header({{15, 0}, {16, 0}, {17, 0}}), kFlac, false, {}},
      {"FLAC: both frame sizes unknown", stream_header({{14, 0}, {15, 0}, {16, 0}, {17, 0}}), kFlac, true,
       {4096, 4096, 0, 0, 44100, 2, 16, 0x123456789}},
      {"FLAC: sample rate 0", stream_header({{18, 0}, {19, 0}, {20, 0x02}}), kFlac, false, {}},
      {"FLAC: 1 channel of 1 bit at 1 Hz", stream_header({{18, 0}, {19, 0}, {20, 0x10}, {21, 0x01}}), kFlac, true,
       {4096, 4096, 5000, 14, 1, 1, 1, 0x123456789}},
      {"FLAC: 36-bit sample count", stream_header({{21, 0xFF}, {22, 0xFF}, {23, 0xFF}, {24, 0xFF}, {25, 0xFF}}), kFlac, true,
       {4096, 4096, 5000, 14, 44100, 2, 16, 0xFFFFFFFFF}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    if (c.fourcc == kFlac) {
      // A 1128-byte stand-in for the media format; the record belongs at bytes
      // 28..75, in the machine-order words the decoder reads; nothing else changes.
      Bytes format(1128, 0xA5), want = format;
      if (c.understood) {
        uint32_t words[12] = {};
        std::copy(c.want.begin(), c.want.begin() + 7, words);
        words[10] = 1;
        std::memcpy(&want[28], words, sizeof words);
        std::memcpy(&want[28 + 32], &c.want[7], sizeof c.want[7]);
      }
      uint8_t* extra_ptr = format.data();  // left from an earlier set-up
      uint32_t extra_size = 99;
      EXPECT_EQ(setup_flac_codec_config(format.data() + kFlacConfigFormatOffset, &extra_ptr, &extra_size, c.config.data(),
                                        static_cast<uint32_t>(c.config.size())),
                c.understood ? kStatusOk : kStatusInvalidArgument);
      EXPECT_EQ(extra_ptr, c.understood ? format.data() + 28 : nullptr);
      EXPECT_EQ(extra_size, c.understood ? 48u : 0u);
      EXPECT_EQ(format, want);
      continue;
    }
    MmDecoderConfigInfo info = {11, 22, 33, 44};
    EXPECT_EQ(MmParseDecoderConfig(c.config.data(), static_cast<uint32_t>(c.config.size()), c.fourcc, &info, 0) == 0,
              c.understood);
    EXPECT_EQ(std::vector<uint64_t>({info.Width, info.Height, info.PixelAspectWidth, info.PixelAspectHeight}), c.want);
  }
  EXPECT_NE(MmParseDecoderConfig(nullptr, 0, kAvc1, nullptr, 0), 0);
}

// Exp-Golomb codes up to the largest (31 zeros) and no further.
TEST(BitReaderTest, GolombCodesEndAtThirtyOneZeros) {
  const Bytes largest = {0x00, 0x00, 0x00, 0x01, 0xFF, 0xFF, 0xFF, 0xFE}, too_long = {0x00, 0x00, 0x00, 0x00, 0xFF};
  host::BitReader a(largest.data(), largest.size()), b(too_long.data(), too_long.size()), c(largest.data(), 7);
  EXPECT_EQ(a.Golomb(), 0xFFFFFFFEu);
  EXPECT_FALSE(a.failed());
  EXPECT_EQ(b.Golomb(), 0u);
  EXPECT_TRUE(b.failed());
  EXPECT_EQ(c.SignedGolomb(), 0);
  EXPECT_TRUE(c.failed());
}

}  // namespace
