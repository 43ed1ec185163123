#include "tools/json_writer.h"

#include <charconv>
#include <cinttypes>
#include <cmath>

namespace {

// Length of the well-formed UTF-8 sequence at text[i], or 0.
size_t Utf8SequenceLength(std::string_view text, size_t i) {
  const auto byte = [&](size_t k) { return static_cast<unsigned char>(text[k]); };
  const unsigned char lead = byte(i);
  size_t length = 0;
  uint32_t minimum = 0;
  uint32_t code = 0;
  if (lead >= 0xC2 && lead <= 0xDF) {
    length = 2, minimum = 0x80, code = lead & 0x1Fu;
  } else if (lead >= 0xE0 && lead <= 0xEF) {
    length = 3, minimum = 0x800, code = lead & 0x0Fu;
  } else if (lead >= 0xF0 && lead <= 0xF4) {
    length = 4, minimum = 0x10000, code = lead & 0x07u;
  } else {
    return 0;
  }
  if (i + length > text.size()) return 0;
  for (size_t k = 1; k < length; ++k) {
    if ((byte(i + k) & 0xC0) != 0x80) return 0;
    code = code << 6 | (byte(i + k) & 0x3Fu);
  }
  // Overlong forms, surrogates and code points past U+10FFFF are not UTF-8.
  if (code < minimum || (code >= 0xD800 && code <= 0xDFFF) || code > 0x10FFFF) return 0;
  return length;
}

}  // namespace

std::string JsonQuote(std::string_view text) {
  std::string out = "\"";
  for (size_t i = 0; i < text.size();) {
    const unsigned char c = static_cast<unsigned char>(text[i]);
    if (c >= 0x80) {
      const size_t length = Utf8SequenceLength(text, i);
      if (length) {
        out.append(text.substr(i, length));
        i += length;
      } else {
        out += "\xEF\xBF\xBD";  // U+FFFD for a byte that starts no UTF-8 sequence
        ++i;
      }
      continue;
    }
    switch (c) {
      case '"': out += "\\\""; break;
      case '\\': out += "\\\\"; break;
      case '\n': out += "\\n"; break;
      case '\r': out += "\\r"; break;
      case '\t': out += "\\t"; break;
      case '\b': out += "\\b"; break;
      case '\f': out += "\\f"; break;
      default:
        if (c < 0x20 || c == 0x7F) {
          char escaped[8];
          std::snprintf(escaped, sizeof escaped, "\\u%04x", c);
          out += escaped;
        } else {
          out += static_cast<char>(c);
        }
    }
    ++i;
  }
  out += '"';
  return out;
}

void JsonWriter::NewLine() {
  std::fputc('\n', out_);
  for (size_t i = 0; i < levels_.size(); ++i) std::fputs("  ", out_);
}

void JsonWriter::BeforeValue() {
  if (after_key_) {
    after_key_ = false;
    return;
  }
  if (levels_.empty()) return;
  Level& level = levels_.back();
  if (!level.empty) std::fputc(',', out_);
  if (level.inline_container) {
    if (!level.empty) std::fputc(' ', out_);
  } else {
    NewLine();
  }
  level.empty = false;
}

void JsonWriter::Open(char bracket, bool inline_container) {
  BeforeValue();
  std::fputc(bracket, out_);
  // A container inside an inline one stays inline too.
  const bool parent_inline = !levels_.empty() && levels_.back().inline_container;
  levels_.push_back(Level{inline_container || parent_inline});
}

void JsonWriter::Close(char bracket) {
  const Level level = levels_.back();
  levels_.pop_back();
  if (!level.empty && !level.inline_container) NewLine();
  std::fputc(bracket, out_);
}

void JsonWriter::Key(std::string_view key) {
  BeforeValue();
  std::fputs(JsonQuote(key).c_str(), out_);
  std::fputs(": ", out_);
  after_key_ = true;
}

void JsonWriter::String(std::string_view text) {
  BeforeValue();
  std::fputs(JsonQuote(text).c_str(), out_);
}

void JsonWriter::Int(int64_t value) {
  BeforeValue();
  std::fprintf(out_, "%" PRId64, value);
}

void JsonWriter::Uint(uint64_t value) {
  BeforeValue();
  std::fprintf(out_, "%" PRIu64, value);
}

void JsonWriter::Double(double value) {
  if (!std::isfinite(value)) return Null();
  BeforeValue();
  char text[32];
  // The shortest text that reads back as the same double.
  auto result = std::to_chars(text, text + sizeof text, value);
  std::fwrite(text, 1, static_cast<size_t>(result.ptr - text), out_);
}

void JsonWriter::Bool(bool value) {
  BeforeValue();
  std::fputs(value ? "true" : "false", out_);
}

void JsonWriter::Null() {
  BeforeValue();
  std::fputs("null", out_);
}
