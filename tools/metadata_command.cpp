// `kelvane metadata [--plugin PATH] FILE`: the metadata block that the plug-in's
// Parser_ParseMetadata builds for a file, entry by entry, read through
// Parser_IterateMetadata. The plug-in is loaded with dlopen as a framework
// loads it: from --plugin, else kelvane.so in the directory of this executable
// (the build puts it there).

#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>

#include "host/input_streams.h"
#include "host/plugin_loader.h"
#include "platform/interfaces.h"
#include "tools/commands.h"

namespace {

void PrintType(uint32_t type) {
  std::printf("%c%c%c%c", static_cast<char>(type >> 24), static_cast<char>(type >> 16), static_cast<char>(type >> 8),
              static_cast<char>(type));
}

void PrintValue(const MmfMetadataValue& value) {
  const void* data = MmfMetadataData(&value);
  if (value.Type == kMmfMetadataUtf8) {
    std::printf("%.*s", static_cast<int>(value.Size), static_cast<const char*>(data));
  } else if (value.Type == kMmfMetadataNum4 && value.Size == 4) {
    uint32_t number;
    std::memcpy(&number, data, sizeof number);
    std::printf("%" PRIu32 " (0x%08" PRIX32 ")", number, number);
  } else if (value.Type == kMmfMetadataNum8 && value.Size == 8) {
    int64_t number;
    std::memcpy(&number, data, sizeof number);
    std::printf("%" PRId64, number);
  } else {
    std::printf("%" PRId64 " bytes", value.Size);
  }
}

int Usage() {
  std::fprintf(stderr, "usage: kelvane metadata [--plugin PATH] FILE\n");
  return 2;
}

}  // namespace

int RunMetadata(int argc, char** argv) {
  std::string plugin_path = host::PluginBesideExecutable();
  const char* file = nullptr;
  for (int i = 0; i < argc; ++i) {
    if (!std::strcmp(argv[i], "--plugin") && i + 1 < argc) {
      plugin_path = argv[++i];
    } else if (!file && argv[i][0] != '-') {
      file = argv[i];
    } else {
      return Usage();
    }
  }
  if (!file) return Usage();

  std::string error;
  auto plugin = host::Plugin::Load(plugin_path, &error);
  if (!plugin) {
    std::fprintf(stderr, "kelvane: cannot load the plug-in %s: %s\n", plugin_path.c_str(), error.c_str());
    return 1;
  }
  const auto* parser = plugin->Get<MmfMetadataParserOps>("MediaMetadataParser");
  if (!parser) {
    std::fprintf(stderr, "kelvane: %s has no MediaMetadataParser interface\n", plugin_path.c_str());
    return 1;
  }
  auto stream = host::OpenFileStream(file, true);
  if (!stream) {
    std::fprintf(stderr, "kelvane: cannot open %s\n", file);
    return 1;
  }

  MmfMetadata* block = nullptr;
  int result = parser->Parser_ParseMetadata(stream->record(), 0, &block);
  if (result != 0) {
    std::fprintf(stderr, "kelvane: %s: Parser_ParseMetadata answered %d\n", file, result);
    return 1;
  }
  std::printf("Metadata of %s\n", file);
  int32_t index = 0;
  char* key = nullptr;
  MmfMetadataValue value{};
  while (parser->Parser_IterateMetadata(block, &index, &key, &value) == 1) {
    std::printf("  %s (", key);
    PrintType(value.Type);
    std::printf("): ");
    PrintValue(value);
    std::printf("\n");
  }
  std::printf("Entries: %d\n", index);
  parser->Parser_FreeMetadata(block);
  return 0;
}
