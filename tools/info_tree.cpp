// `kelvane info --tree`: every element of the file with its byte offset,
// header and data size, name and, for a leaf, its value; where the file is
// damaged, all that could be read and the offset where the walk stopped.

#include <cinttypes>
#include <cstdio>

#include "tools/command_line.h"
#include "tools/info_output.h"
#include "tools/json_writer.h"
#include "tools/media_words.h"
#include "tools/reading/walk_facts.h"

using namespace reading;

namespace {

constexpr int kSchemaVersion = 2;

std::string Hex(uint64_t value) {
  char text[24];
  std::snprintf(text, sizeof text, "0x%" PRIX64, value);
  return text;
}

std::string HexBytes(const std::string& bytes, bool cut) {
  std::string text;
  char pair[4];
  for (unsigned char byte : bytes) {
    std::snprintf(pair, sizeof pair, "%s%02x", text.empty() ? "" : " ", byte);
    text += pair;
  }
  return text + (cut ? " ..." : "");
}

// EBML variable-size integer at bytes[*at]; false when cut short.
bool Vint(const std::string& bytes, size_t* at, uint64_t* value) {
  if (*at >= bytes.size()) return false;
  const auto first = static_cast<unsigned char>(bytes[*at]);
  int length = 1;
  while (length <= 8 && !(first & (0x80 >> (length - 1)))) ++length;
  if (length > 8 || *at + static_cast<size_t>(length) > bytes.size()) return false;
  *value = first & (0xFF >> length);
  for (int i = 1; i < length; ++i) *value = *value << 8 | static_cast<unsigned char>(bytes[*at + static_cast<size_t>(i)]);
  *at += static_cast<size_t>(length);
  return true;
}

// "track 1, timecode 0, keyframe" from a block's first bytes.
std::string BlockValue(const Element& element) {
  size_t at = 0;
  uint64_t track = 0;
  if (!Vint(element.bytes, &at, &track) || at + 3 > element.bytes.size()) return HexBytes(element.bytes, true);
  const auto high = static_cast<unsigned char>(element.bytes[at]), low = static_cast<unsigned char>(element.bytes[at + 1]);
  const auto timecode = static_cast<int16_t>(high << 8 | low);
  const auto flags = static_cast<unsigned char>(element.bytes[at + 2]);
  static const char* const kLacing[] = {"", ", Xiph lacing", ", fixed-size lacing", ", EBML lacing"};
  return "track " + std::to_string(track) + ", timecode " + std::to_string(timecode) +
         (element.id == 0xA3 && (flags & 0x80) ? ", keyframe" : "") + kLacing[flags >> 1 & 3];
}

std::string ValueText(const Element& element) {
  if (!element.kind || !element.has_value) return {};
  switch (element.kind->type) {
    case ValueType::uint: return std::to_string(element.uint_value);
    case ValueType::sint: return std::to_string(element.int_value);
    case ValueType::date: return IsoDate(element.int_value);
    case ValueType::floating: {
      char text[40];
      std::snprintf(text, sizeof text, "%.10g", element.float_value);
      return text;
    }
    case ValueType::ascii:
    case ValueType::utf8: return element.bytes + (element.bytes_cut ? "..." : "");
    case ValueType::binary: {
      if (element.id == ids::kVoid) return {};
      if (element.id == 0xA3 || element.id == 0xA1) return BlockValue(element);
      if (element.id == ids::kSeekId && element.bytes.size() <= 4) {
        uint32_t id = 0;
        for (unsigned char byte : element.bytes) id = id << 8 | byte;
        const ElementKind* kind = FindElementKind(id);
        return Hex(id) + (kind ? std::string(" (") + kind->name + ")" : "");
      }
      return HexBytes(element.bytes, element.bytes_cut);
    }
    case ValueType::master: break;
  }
  return {};
}

std::string NameOf(const Element& element) { return element.kind ? element.kind->name : "unknown " + Hex(element.id); }

class TextTree : public ElementVisitor {
 public:
  bool Enter(const Element& element) override {
    Line(element, element.unknown_size ? "(unknown size)" : "");
    return true;
  }
  void Leaf(const Element& element) override { Line(element, ValueText(element)); }

 private:
  static void Line(const Element& element, const std::string& value) {
    std::printf("%12" PRIu64 " %2u %12" PRIu64 "  %*s%s%s%s\n", element.offset, element.header_size,
                element.data_size, 2 * element.depth, "", NameOf(element).c_str(), value.empty() ? "" : ": ",
                value.c_str());
  }
};

class JsonTree : public ElementVisitor {
 public:
  explicit JsonTree(JsonWriter& out) : out_(out) {}
  bool Enter(const Element& element) override {
    Object(element, nullptr);
    return true;
  }
  void Leaf(const Element& element) override {
    const std::string value = ValueText(element);
    Object(element, element.has_value ? &value : nullptr);
  }

 private:
  void Object(const Element& element, const std::string* value) {
    out_.BeginObject(true);
    out_.Field("offset", element.offset);
    out_.Field("header_size", element.header_size);
    out_.Key("data_size");
    element.unknown_size ? out_.Null() : out_.Uint(element.data_size);
    out_.Field("depth", element.depth);
    out_.Field("id", Hex(element.id));
    out_.Field("name", NameOf(element));
    if (value) out_.Field("value", *value);
    out_.EndObject();
  }
  JsonWriter& out_;
};

}  // namespace

int PrintElementTree(const char* file, bool json) {
  WalkOptions options;
  options.max_text_bytes = 256;
  bool opened = false;
  WalkEnd end;
  if (json) {
    JsonWriter out(stdout);
    out.BeginObject();
    out.Field("schema_version", kSchemaVersion);
    out.Field("command", "info");
    out.Field("file", file);
    out.Key("elements");
    out.BeginArray();
    JsonTree tree(out);
    end = WalkFile(file, tree, options, &opened);
    out.EndArray();
    out.Field("complete", opened && end.complete);
    out.Key("stopped_at");
    end.complete ? out.Null() : out.Uint(end.stopped_at);
    out.FieldOrNull("stop_reason", end.complete ? nullptr : end.reason.c_str());
    out.EndObject();
    out.Finish();
  } else {
    std::printf("%12s %2s %12s  %s\n", "OFFSET", "HD", "DATA", "ELEMENT");
    TextTree tree;
    end = WalkFile(file, tree, options, &opened);
    if (opened && !end.complete) std::printf("stopped at byte %" PRIu64 ": %s\n", end.stopped_at, end.reason.c_str());
  }
  if (!opened) return Failure("info", "cannot open %s", file);
  if (!end.complete) return Failure("info", "%s: damaged: stopped at byte %" PRIu64 ": %s", file, end.stopped_at,
                                    end.reason.c_str());
  return kExitOk;
}
