#include "core/cluster/mkv_inbuff.h"

#include "core/cluster/buff_cursor.h"
#include "core/cluster/ebml_number.h"
#include "core/status.h"

uint64_t mkvinbuff_position(const mkvinbuff* inbuff1, const mkvinbuff* inbuff2) {
  if (inbuff1->buff_left || !inbuff2) return inbuff1->buff_fileoff + inbuff1->buff_pos;
  return inbuff2->buff_fileoff + inbuff2->buff_pos;
}

int ebml_get_byte_from_buff(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint8_t* byte) {
  buff_cursor cursor{inbuff1, inbuff2};
  return cursor.next(byte) ? kBuffGotByte : kBuffEmpty;
}

int skip_buffbytes(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint32_t count) {
  buff_cursor cursor{inbuff1, inbuff2};
  if (cursor.available() < count) return kBuffSkipShort;
  cursor.skip_up_to(count);
  return kBuffSkipped;
}

int ebml_get_var_uint_from_buff(mkvinbuff* inbuff1, mkvinbuff* inbuff2, uint64_t* value, uint32_t* length) {
  buff_cursor cursor{inbuff1, inbuff2};
  ebml_partial_number number{};
  switch (ebml_continue_number(&cursor, ebml_number_form::vint, 0, &number)) {
    case ebml_number_result::done:
      *value = number.value;
      if (length) *length = number.length;
      return kStatusOk;
    case ebml_number_result::invalid:
      return kStatusMalformed;
    case ebml_number_result::short_read:
      break;
  }
  return kStatusReadFailed;
}
