// `kelvane metadata [--json] [--plugin PATH] FILE`: the metadata block that
// the plug-in's Parser_ParseMetadata builds for a file, entry by entry, read
// through Parser_IterateMetadata. The plug-in is loaded with dlopen as a
// framework loads it: from --plugin, else kelvane.so in the directory of this
// executable (the build puts it there).

#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "host/input_streams.h"
#include "host/plugin_loader.h"
#include "platform/interfaces.h"
#include "tools/command_line.h"
#include "tools/commands.h"
#include "tools/json_writer.h"

const char kMetadataHelp[] =
    "usage: kelvane metadata [--json] [--plugin PATH] FILE\n"
    "\n"
    "Asks the plug-in for the file's metadata block, as a framework's media library does\n"
    "(the MediaMetadataParser interface), and prints every entry: its key, its type (UTF8:\n"
    "text, NUM4: 32-bit number, NUM8: 64-bit number) and its value. The entries come from\n"
    "the tags (Name, Artist, Album...), the file (Seekable, TrackCount) and each offered\n"
    "track in turn (MediaType, Fourcc, Width, Height, Duration, Channels, SampleRate...).\n"
    "\n"
    "FILE must be a file that can seek: the plug-in reads its start twice.\n"
    "\n"
    "options:\n"
    "  --json           one JSON document instead of text (docs/json.md, section metadata)\n"
    "%s"
    "  -h, --help       this text\n"
    "\n"
    "exit codes: 0 ok; 1 the plug-in refused the file or it cannot be read; 2 usage\n"
    "\n"
    "examples:\n"
    "  kelvane metadata song.mka\n"
    "  kelvane metadata --json movie.mkv | jq -r '.entries[] | select(.key == \"Name\") | .value'\n";

namespace {

constexpr int kSchemaVersion = 1;
constexpr int kParseMalformed = 48;      // the plug-in's answer for data it cannot read as Matroska
constexpr int kParseCannotSeek = 4002;   // its answer when the stream does not seek back to the start

const char* ParseFailure(int result) {
  switch (result) {
    case kParseCannotSeek: return "the input cannot seek";
    default: return "the metadata parse failed";
  }
}

std::string TypeName(uint32_t type) {
  std::string text;
  for (int shift = 24; shift >= 0; shift -= 8) {
    char c = static_cast<char>(type >> shift);
    text += (c >= 32 && c < 127) ? c : '?';
  }
  return text;
}

struct Entry {
  std::string key;
  std::string type;
  enum { kText, kNumber, kBytes } kind = kBytes;
  std::string text;
  int64_t number = 0;
  int64_t size = 0;
};

Entry ReadEntry(const char* key, const MmfMetadataValue& value) {
  Entry entry;
  entry.key = key ? key : "";
  entry.type = TypeName(value.Type);
  entry.size = value.Size;
  const void* data = MmfMetadataData(&value);
  if (value.Type == kMmfMetadataUtf8 && data && value.Size >= 0) {
    entry.kind = Entry::kText;
    entry.text.assign(static_cast<const char*>(data), static_cast<size_t>(value.Size));
  } else if (value.Type == kMmfMetadataNum4 && value.Size == 4) {
    uint32_t number;
    std::memcpy(&number, data, sizeof number);
    entry.kind = Entry::kNumber;
    entry.number = number;
  } else if (value.Type == kMmfMetadataNum8 && value.Size == 8) {
    std::memcpy(&entry.number, data, sizeof entry.number);
    entry.kind = Entry::kNumber;
  }
  return entry;
}

void PrintText(const char* file, const std::vector<Entry>& entries) {
  std::printf("Metadata of %s\n", file);
  for (const Entry& entry : entries) {
    std::printf("  %s (%s): ", entry.key.c_str(), entry.type.c_str());
    if (entry.kind == Entry::kText) {
      std::printf("%s", entry.text.c_str());
    } else if (entry.kind == Entry::kNumber && entry.type == "NUM4") {
      std::printf("%" PRId64 " (0x%08" PRIX64 ")", entry.number, entry.number);
    } else if (entry.kind == Entry::kNumber) {
      std::printf("%" PRId64, entry.number);
    } else {
      std::printf("%" PRId64 " bytes", entry.size);
    }
    std::printf("\n");
  }
  std::printf("Entries: %zu\n", entries.size());
}

void WriteJson(const char* file, const std::vector<Entry>& entries) {
  JsonWriter out(stdout);
  out.BeginObject();
  out.Field("schema_version", kSchemaVersion);
  out.Field("command", "metadata");
  out.Field("file", file);
  out.Key("entries");
  out.BeginArray();
  for (const Entry& entry : entries) {
    out.BeginObject(true);
    out.Field("key", entry.key);
    out.Field("type", entry.type);
    out.Key("value");
    if (entry.kind == Entry::kText) {
      out.String(entry.text);
    } else if (entry.kind == Entry::kNumber) {
      out.Int(entry.number);
    } else {
      out.Null();
    }
    out.Field("size", entry.size);
    out.EndObject();
  }
  out.EndArray();
  out.EndObject();
  out.Finish();
}

}  // namespace

int RunMetadata(int argc, char** argv) {
  std::string plugin_path = host::PluginBesideExecutable();
  const char* file = nullptr;
  bool json = false;
  for (int i = 0; i < argc; ++i) {
    const char* arg = argv[i];
    if (IsHelpOption(arg)) {
      std::printf(kMetadataHelp, kPluginOptionHelp);
      return kExitOk;
    }
    if (!std::strcmp(arg, "--plugin")) {
      if (i + 1 >= argc) return UsageError("metadata", "--plugin needs a PATH");
      plugin_path = argv[++i];
    } else if (!std::strcmp(arg, "--json")) {
      json = true;
    } else if (!std::strcmp(arg, "-")) {
      return UsageError("metadata", "FILE cannot be standard input: the plug-in seeks back to its start");
    } else if (int code = TakeFile("metadata", arg, &file); code != kExitOk) {
      return code;
    }
  }
  if (!file) return UsageError("metadata", "no FILE given");
  if (int code = CheckInputFile("metadata", file); code != kExitOk) return code;

  auto plugin = LoadPlugin("metadata", plugin_path);
  if (!plugin) return kExitFailed;
  const auto* parser = plugin->Get<MmfMetadataParserOps>("MediaMetadataParser");
  if (!parser) return Failure("metadata", "%s has no MediaMetadataParser interface", plugin_path.c_str());
  auto stream = host::OpenFileStream(file, true);
  if (!stream) return Failure("metadata", "cannot open %s", file);

  MmfMetadata* block = nullptr;
  int result = parser->Parser_ParseMetadata(stream->record(), 0, &block);
  if (result == kParseMalformed) {
    return RefusedFile("metadata", file, "Parser_ParseMetadata answered " + std::to_string(result));
  }
  if (result != 0) return Failure("metadata", "%s: %s", file, ParseFailure(result));
  std::vector<Entry> entries;
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  while (parser->Parser_IterateMetadata(block, &index, &key, &value) == 1) entries.push_back(ReadEntry(key, value));
  parser->Parser_FreeMetadata(block);
  json ? WriteJson(file, entries) : PrintText(file, entries);
  return kExitOk;
}
