#include "core/codec_table.h"

#include <cstring>

const mkv_codec_row supported_codec_id[kSupportedCodecCount] = {
    {"V_MPEG4/ISO/AVC", "AVC1"},    {"V_MS/VFW/FOURCC", "MP4V"},    {"V_MPEG4/ISO/SP", "MP4V"},
    {"V_MPEG4/ISO/ASP", "MP4V"},    {"V_MPEG4/ISO/AP", "MP4V"},     {"V_MPEG4/MS/V3", "MP43"},
    {"V_MPEG1", "MP1V"},            {"V_MPEG2", "MP2V"},            {"V_QUICKTIME", "SVQ3"},
    {"V_THEORA", "THEO"},           {"A_MPEG/L3", "M2A3"},          {"A_MPEG/L2", "M2A2"},
    {"A_MPEG/L1", "M2A1"},          {"A_PCM/INT/BIG", "RAWA"},      {"A_PCM/INT/LIT", "RAWA"},
    {"A_DTS", "DTSA"},              {"A_VORBIS", "VRBS"},           {"A_FLAC", "FLAC"},
    {"A_AAC", "M4AC"},              {"A_AAC/MPEG2/LC", "M2AC"},     {"A_AAC/MPEG2/LC/SBR", "M2AC"},
    {"A_AAC/MPEG4/LC", "M4AC"},     {"A_AAC/MPEG4/LC/SBR", "M4AC"}, {"A_AAC/MPEG2/MAIN", "M2AC"},
    {"A_AAC/MPEG2/SSR", "M2AC"},    {"A_AAC/MPEG4/MAIN", "M4AC"},   {"A_AAC/MPEG4/SSR", "M4AC"},
    {"A_AAC/MPEG4/LTP", "M4AC"},    {"A_AC3", "AC3A"},
};

uint32_t lookup_codec_fourcc(const char* codec_id) {
  if (!codec_id) return 0;
  for (const mkv_codec_row& row : supported_codec_id) {
    if (std::strcmp(row.codec_id, codec_id) == 0) return fourcc_value(row.fourcc);
  }
  return 0;
}
