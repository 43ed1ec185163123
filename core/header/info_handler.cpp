#include <cstring>
#include <initializer_list>

#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/memory.h"
#include "core/status.h"

namespace {

constexpr uint64_t kDefaultTimecodeScale = 1000000;

void free_info_strings(mkv_file_info* info) {
  for (char** field : {&info->segment_filename, &info->prev_filename, &info->next_filename, &info->title,
                       &info->muxing_app, &info->writing_app}) {
    mem_free(*field);
    *field = nullptr;
  }
}

int read_uid(mkvvstream* stream, uint64_t size, uint8_t (&uid)[16]) {
  if (size != sizeof uid) return kStatusMalformed;
  return ebml_read_exact(stream, uid, sizeof uid);
}

int read_info_string(mkv_file_info* info, mkvvstream* stream, uint64_t size, char** field) {
  mem_free(*field);  // a repeated element replaces the earlier value
  return ebml_read_string(stream, size, string_limit(info), field);
}

}  // namespace

int mkv_info_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  // A later Info element replaces the earlier one as a whole; the earlier
  // strings are freed here rather than left unreferenced.
  free_info_strings(info);
  std::memset(reinterpret_cast<char*>(info) + kInfoBlockBegin, 0, kInfoBlockEnd - kInfoBlockBegin);
  info->parse_flags |= kMetInfo;
  info->timecode_scale = kDefaultTimecodeScale;

  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  while (mkvvstream_tell(stream) < end) {
    uint32_t child = 0;
    uint64_t child_size = 0;
    // An unreadable child header ends the handler quietly: the walker skips
    // whatever is left of the element.
    if (ebml_read_id(stream, &child) != kStatusOk || ebml_read_size(stream, &child_size) != kStatusOk) {
      return kStatusOk;
    }
    int status;
    switch (child) {
      case 0x73A4: status = read_uid(stream, child_size, info->segment_uid); break;
      case 0x3CB923: status = read_uid(stream, child_size, info->prev_uid); break;
      case 0x3EB923: status = read_uid(stream, child_size, info->next_uid); break;
      case 0x4444: status = read_uid(stream, child_size, info->segment_family); break;
      case 0x7384: status = read_info_string(info, stream, child_size, &info->segment_filename); break;
      case 0x3C83AB: status = read_info_string(info, stream, child_size, &info->prev_filename); break;
      case 0x3E83BB: status = read_info_string(info, stream, child_size, &info->next_filename); break;
      case 0x7BA9: status = read_info_string(info, stream, child_size, &info->title); break;
      case 0x4D80: status = read_info_string(info, stream, child_size, &info->muxing_app); break;
      case 0x5741: status = read_info_string(info, stream, child_size, &info->writing_app); break;
      case 0x2AD7B1: status = ebml_read_uint(stream, child_size, &info->timecode_scale); break;
      case 0x4489: status = ebml_read_float(stream, child_size, &info->duration); break;
      case 0x4461: status = ebml_read_signed(stream, child_size, &info->date_utc); break;
      default: status = ebml_skip(stream, child_size); break;
    }
    if (status != kStatusOk) return status;
  }
  return kStatusOk;
}
