#include "core/header/ebml_read.h"
#include "core/header/element_handlers.h"
#include "core/status.h"
#include "platform/ao_log.h"

int ebml_document_header_handler(mkv_file_info* info, mkvvstream* stream, uint32_t*, uint64_t* size) {
  if (info->parse_flags & kMetEbmlHeader) {
    // Concatenated documents: the first one's result stands, the walk ends here.
    info->parse_flags |= kMetSecondEbmlHeader;
    AoLog(kAoLogDegraded, "vorlith:  Only single EBML document files supported.");
    return kStatusReadFailed;
  }
  info->doc_type[0] = '\0';
  info->parse_flags |= kMetEbmlHeader;

  uint64_t end = ebml_end_of(mkvvstream_tell(stream), *size);
  while (mkvvstream_tell(stream) < end) {
    uint32_t child = 0;
    uint64_t child_size = 0;
    int status = ebml_read_id(stream, &child);
    if (status == kStatusOk) status = ebml_read_size(stream, &child_size);
    if (status != kStatusOk) return status;

    switch (child) {
      case 0x4286: status = ebml_read_uint(stream, child_size, &info->ebml_version); break;
      case 0x42F7: status = ebml_read_uint(stream, child_size, &info->ebml_read_version); break;
      case 0x42F2: status = ebml_read_uint(stream, child_size, &info->ebml_max_id_length); break;
      case 0x42F3: status = ebml_read_uint(stream, child_size, &info->ebml_max_size_length); break;
      case 0x4287: status = ebml_read_uint(stream, child_size, &info->doc_type_version); break;
      case 0x4285: status = ebml_read_uint(stream, child_size, &info->doc_type_read_version); break;
      case 0x4282:  // DocType, kept in place
        if (child_size > kMaxDocTypeLength) return kStatusNoMemory;
        status = ebml_read_exact(stream, info->doc_type, static_cast<uint32_t>(child_size));
        info->doc_type[status == kStatusOk ? child_size : 0] = '\0';
        break;
      default: status = ebml_skip(stream, child_size); break;
    }
    if (status != kStatusOk) return status;
  }
  return kStatusOk;
}
