#include "core/cluster/element_header.h"

#include "core/cluster/ebml_number.h"

header_result read_element_header(buff_cursor* cursor, mkv_cluster_resume* resume, mkv_resume_step step,
                                  element_header* header) {
  if (resume->step != step) {
    resume->step = step;
    resume->header_part = 0;
    resume->number = {};
  }
  if (resume->header_part == 0) {
    switch (ebml_continue_number(cursor, ebml_number_form::id, 0, &resume->number)) {
      case ebml_number_result::short_read:
        return header_result::short_read;
      case ebml_number_result::invalid:
        resume->step = mkv_resume_step::none;
        return header_result::invalid_id;
      case ebml_number_result::done:
        break;
    }
    resume->id = static_cast<uint32_t>(resume->number.value);
    resume->header_part = 1;
    resume->number = {};
  }
  switch (ebml_continue_number(cursor, ebml_number_form::vint, 0, &resume->number)) {
    case ebml_number_result::short_read:
      return header_result::short_read;
    case ebml_number_result::invalid:
      resume->step = mkv_resume_step::none;
      return header_result::invalid_size;
    case ebml_number_result::done:
      break;
  }
  header->id = resume->id;
  header->size = resume->number.value;
  resume->step = mkv_resume_step::none;
  resume->header_part = 0;
  resume->number = {};
  return header_result::done;
}
