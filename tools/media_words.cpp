#include "tools/media_words.h"

#include <cinttypes>
#include <cstdio>
#include <ctime>

namespace {

struct CodecWords {
  const char* codec_id;  // a trailing '*' matches any rest
  const char* words;
};

constexpr CodecWords kCodecWords[] = {
    {"V_MPEG4/ISO/AVC", "H.264/AVC"},     {"V_MPEGH/ISO/HEVC", "H.265/HEVC"},
    {"V_MPEG4/ISO/SP", "MPEG-4 Part 2 Simple Profile"}, {"V_MPEG4/ISO/ASP", "MPEG-4 Part 2 Advanced Simple Profile"},
    {"V_MPEG4/ISO/AP", "MPEG-4 Part 2 Advanced Profile"}, {"V_MPEG4/MS/V3", "Microsoft MPEG-4 V3"},
    {"V_MPEG1", "MPEG-1 video"},          {"V_MPEG2", "MPEG-2 video"},
    {"V_THEORA", "Theora"},               {"V_VP8", "VP8"},
    {"V_VP9", "VP9"},                     {"V_AV1", "AV1"},
    {"V_QUICKTIME", "QuickTime video"},   {"V_MJPEG", "Motion JPEG"},
    {"V_FFV1", "FFV1"},                   {"V_PRORES", "Apple ProRes"},
    {"V_UNCOMPRESSED", "uncompressed video"}, {"V_REAL/*", "RealVideo"},
    {"A_AAC*", "AAC"},                    {"A_AC3*", "AC-3"},
    {"A_EAC3", "E-AC-3"},                 {"A_DTS*", "DTS"},
    {"A_MPEG/L3", "MP3"},                 {"A_MPEG/L2", "MPEG audio layer II"},
    {"A_MPEG/L1", "MPEG audio layer I"},  {"A_VORBIS", "Vorbis"},
    {"A_OPUS", "Opus"},                   {"A_FLAC", "FLAC"},
    {"A_ALAC", "ALAC"},                   {"A_TRUEHD", "Dolby TrueHD"},
    {"A_MLP", "MLP"},                     {"A_TTA1", "TTA"},
    {"A_WAVPACK4", "WavPack"},            {"A_PCM/INT/LIT", "PCM, little endian"},
    {"A_PCM/INT/BIG", "PCM, big endian"}, {"A_PCM/FLOAT/IEEE", "PCM, floating point"},
    {"A_MS/ACM", "Windows audio (ACM)"},  {"A_REAL/*", "RealAudio"},
    {"S_TEXT/UTF8", "SubRip text"},       {"S_TEXT/SSA", "SSA"},
    {"S_TEXT/ASS", "ASS"},                {"S_TEXT/WEBVTT", "WebVTT"},
    {"S_TEXT/USF", "USF"},                {"S_VOBSUB", "VobSub"},
    {"S_HDMV/PGS", "PGS"},                {"S_HDMV/TEXTST", "HDMV text"},
    {"S_DVBSUB", "DVB subtitles"},        {"S_KATE", "Kate"},
    {"B_VOBBTN", "VobBtn buttons"},
};

bool Matches(const char* pattern, const std::string& codec_id) {
  const std::string text = pattern;
  if (!text.empty() && text.back() == '*') return codec_id.compare(0, text.size() - 1, text, 0, text.size() - 1) == 0;
  return codec_id == text;
}

// The BITMAPINFOHEADER's biCompression, four bytes at offset 16.
constexpr size_t kCompressionOffset = 16;

}  // namespace

std::string VfwCompression(const std::vector<uint8_t>& codec_private) {
  if (codec_private.size() < kCompressionOffset + 4) return {};
  std::string code;
  for (size_t i = 0; i < 4; ++i) {
    const char c = static_cast<char>(codec_private[kCompressionOffset + i]);
    code += c >= 32 && c < 127 ? c : '?';
  }
  return code;
}

std::string CodecName(const std::string& codec_id, const std::vector<uint8_t>& codec_private) {
  if (codec_id == "V_MS/VFW/FOURCC") {
    const std::string code = VfwCompression(codec_private);
    return "Video for Windows" + (code.empty() ? std::string() : ": " + code);
  }
  for (const CodecWords& row : kCodecWords) {
    if (Matches(row.codec_id, codec_id)) return row.words;
  }
  return {};
}

const char* TrackTypeName(uint64_t type) {
  switch (type) {
    case 1: return "video";
    case 2: return "audio";
    case 3: return "complex";
    case 16: return "logo";
    case 17: return "subtitles";
    case 18: return "buttons";
    case 32: return "control";
    default: return "other";
  }
}

std::string ClockTime(uint64_t ns) {
  const uint64_t ms = ns / 1000000;
  char text[40];
  std::snprintf(text, sizeof text, "%02" PRIu64 ":%02" PRIu64 ":%02" PRIu64 ".%03" PRIu64, ms / 3600000,
                ms / 60000 % 60, ms / 1000 % 60, ms % 1000);
  return text;
}

std::string IsoDate(int64_t ns_since_2001) {
  constexpr int64_t kUnixSecondsAt2001 = 978307200;
  const int64_t seconds = ns_since_2001 / 1000000000 - (ns_since_2001 % 1000000000 < 0 ? 1 : 0);
  const std::time_t unix_seconds = static_cast<std::time_t>(seconds + kUnixSecondsAt2001);
  std::tm parts{};
  char text[40];
  if (!gmtime_r(&unix_seconds, &parts) || !std::strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%SZ", &parts)) {
    return "unknown";
  }
  return text;
}

std::string ByteCount(uint64_t bytes) {
  std::string digits = std::to_string(bytes);
  for (int i = static_cast<int>(digits.size()) - 3; i > 0; i -= 3) digits.insert(static_cast<size_t>(i), ",");
  const char* units[] = {"KiB", "MiB", "GiB", "TiB"};
  double amount = static_cast<double>(bytes);
  int unit = -1;
  while (amount >= 1024 && unit < 3) {
    amount /= 1024;
    ++unit;
  }
  if (unit < 0) return digits + " bytes";
  char scaled[32];
  std::snprintf(scaled, sizeof scaled, " (%.1f %s)", amount, units[unit]);
  return digits + " bytes" + scaled;
}

std::string BitRate(uint64_t bits_per_second) {
  char text[32];
  if (bits_per_second >= 10000000) {
    std::snprintf(text, sizeof text, "%.1f Mb/s", static_cast<double>(bits_per_second) / 1e6);
  } else {
    std::snprintf(text, sizeof text, "%" PRIu64 " kb/s", (bits_per_second + 500) / 1000);
  }
  return text;
}
