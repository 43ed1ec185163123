#include "tests/support/ebml_builder.h"

#include <bit>

namespace ebml {

// The low `width` bytes of `value`, most significant first.
static Bytes big_endian(uint64_t value, int width) {
  Bytes out(static_cast<size_t>(width));
  for (int i = width - 1; i >= 0; --i, value >>= 8) out[static_cast<size_t>(i)] = static_cast<uint8_t>(value);
  return out;
}

Bytes id_bytes(uint32_t id) { return big_endian(id, id > 0xFFFFFF ? 4 : id > 0xFFFF ? 3 : id > 0xFF ? 2 : 1); }

Bytes size_bytes(uint64_t size, int width) {
  if (width == 0) {
    width = 1;
    // All ones in the value bits would read as "unknown": go one byte wider.
    while (width < 8 && size >= (uint64_t{1} << (7 * width)) - 1) ++width;
  }
  Bytes out = big_endian(size, width);
  out[0] |= static_cast<uint8_t>(0x80 >> (width - 1));
  return out;
}

Bytes cat(std::initializer_list<Bytes> parts) {
  Bytes out;
  for (const Bytes& part : parts) out.insert(out.end(), part.begin(), part.end());
  return out;
}

Bytes element(uint32_t id, const Bytes& payload, int size_width) {
  return cat({id_bytes(id), size_bytes(payload.size(), size_width), payload});
}

Bytes master(uint32_t id, std::initializer_list<Bytes> children) { return element(id, cat(children)); }

Bytes master_sized(uint32_t id, uint64_t size, std::initializer_list<Bytes> children, int size_width) {
  return cat({id_bytes(id), size_bytes(size, size_width), cat(children)});
}

Bytes unknown_size(uint32_t id, std::initializer_list<Bytes> children) {
  return cat({id_bytes(id), Bytes{0x01, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF}, cat(children)});
}

Bytes uinteger(uint32_t id, uint64_t value, int width) {
  if (width == 0) {
    width = 1;
    while (width < 8 && (value >> (8 * width)) != 0) ++width;
  }
  return element(id, big_endian(value, width));
}

Bytes sinteger(uint32_t id, int64_t value, int width) { return element(id, big_endian(static_cast<uint64_t>(value), width)); }

Bytes str(uint32_t id, std::string_view text) { return element(id, Bytes(text.begin(), text.end())); }

Bytes f64(uint32_t id, double value) { return element(id, big_endian(std::bit_cast<uint64_t>(value), 8)); }

Bytes bin(uint32_t id, const Bytes& payload) { return element(id, payload); }

Bytes filler(size_t n, uint8_t fill) { return Bytes(n, fill); }

Bytes ebml_header(std::string_view doc_type) {
  return master(kEbmlHeader, {uinteger(kEbmlVersion, 1), uinteger(kEbmlReadVersion, 1), uinteger(kEbmlMaxIdLength, 4),
                              uinteger(kEbmlMaxSizeLength, 8), str(kDocType, doc_type), uinteger(kDocTypeVersion, 4),
                              uinteger(kDocTypeReadVersion, 2)});
}

}  // namespace ebml
