#pragma once
// Matroska facts in the words people read: codec names, times, dates, sizes
// and bit rates, as `kelvane info` prints them.

#include <cstdint>
#include <string>
#include <vector>

// "H.264/AVC" for V_MPEG4/ISO/AVC; for V_MS/VFW/FOURCC the code in the
// BITMAPINFOHEADER ("Video for Windows: XVID"); empty when not known.
std::string CodecName(const std::string& codec_id, const std::vector<uint8_t>& codec_private);

// The compression code of a V_MS/VFW/FOURCC track's BITMAPINFOHEADER; empty when it has none.
std::string VfwCompression(const std::vector<uint8_t>& codec_private);

// "video", "audio", "subtitles", "buttons", "complex", "logo", "control" or "other".
const char* TrackTypeName(uint64_t type);

// "01:02:03.456": hours, minutes, seconds and milliseconds (rounded down).
std::string ClockTime(uint64_t ns);

// "2024-06-01T12:30:00Z" for nanoseconds since 2001-01-01T00:00:00 UTC.
std::string IsoDate(int64_t ns_since_2001);

// "58,810 bytes (57.4 KiB)".
std::string ByteCount(uint64_t bytes);

// "64 kb/s" (1000 bits per kilobit, as bit rates are counted).
std::string BitRate(uint64_t bits_per_second);
