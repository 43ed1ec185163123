#include "core/cluster/ebml_number.h"

#include <bit>

namespace {

// Length of an ID or vint from its first byte; 0 when the byte is invalid.
uint8_t length_from_first(ebml_number_form form, uint8_t first) {
  if (form == ebml_number_form::id) {
    if ((first & 0xF0) == 0) return 0;
  } else if (first == 0) {
    return 0;
  }
  return static_cast<uint8_t>(std::countl_zero(first) + 1);
}

uint64_t value_bits_of_first(ebml_number_form form, uint8_t first, uint8_t length) {
  return form == ebml_number_form::id ? first : first & (0xFFu >> length);
}

}  // namespace

ebml_number_result ebml_continue_number(buff_cursor* cursor, ebml_number_form form, uint8_t raw_width,
                                        ebml_partial_number* number) {
  if (number->left == 0) {
    if (form == ebml_number_form::raw) {
      *number = {0, raw_width, raw_width};
    } else {
      // Fast path: the whole number lies in inbuff1.
      if (const uint8_t* bytes = cursor->contiguous(8)) {
        uint8_t length = length_from_first(form, bytes[0]);
        cursor->skip_up_to(length ? length : 1);
        if (length == 0) {
          *number = {};
          return ebml_number_result::invalid;
        }
        uint64_t value = value_bits_of_first(form, bytes[0], length);
        for (uint8_t i = 1; i < length; ++i) value = value << 8 | bytes[i];
        *number = {value, 0, length};
        return ebml_number_result::done;
      }
      uint8_t first;
      if (!cursor->next(&first)) return ebml_number_result::short_read;
      uint8_t length = length_from_first(form, first);
      if (length == 0) {
        *number = {};
        return ebml_number_result::invalid;
      }
      *number = {value_bits_of_first(form, first, length), static_cast<uint8_t>(length - 1), length};
    }
  }
  while (number->left) {
    uint8_t byte;
    if (!cursor->next(&byte)) return ebml_number_result::short_read;
    number->value = number->value << 8 | byte;
    --number->left;
  }
  return ebml_number_result::done;
}
