// `kelvane metadata [--plugin PATH] FILE`: the metadata block that the plug-in's
// Parser_ParseMetadata builds for a file, entry by entry, read through
// Parser_IterateMetadata. The plug-in is loaded with dlopen as a framework
// loads it: from --plugin, else kelvane.so in the directory of this executable
// (the build puts it there).

#include <dlfcn.h>
#include <unistd.h>

#include <cinttypes>
#include <cstdio>
#include <cstring>
#include <string>

#include "host/input_streams.h"
#include "platform/interfaces.h"
#include "tools/commands.h"

namespace {

std::string DefaultPluginPath() {
  char self[4096];
  ssize_t length = readlink("/proc/self/exe", self, sizeof self - 1);
  if (length <= 0) return "kelvane.so";
  std::string path(self, static_cast<size_t>(length));
  size_t slash = path.rfind('/');
  return (slash == std::string::npos ? std::string(".") : path.substr(0, slash)) + "/kelvane.so";
}

const MmfMetadataParserOps* FindMetadataParser(void* library) {
  const auto* rows = static_cast<const AoInterface*>(dlsym(library, AO_INTERFACES_SYMBOL));
  for (const AoInterface* row = rows; row && row->Name; ++row) {
    if (std::strcmp(row->Name, "MediaMetadataParser") == 0) return static_cast<const MmfMetadataParserOps*>(row->Interface);
  }
  return nullptr;
}

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
  std::string plugin_path = DefaultPluginPath();
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

  void* library = dlopen(plugin_path.c_str(), RTLD_NOW | RTLD_LOCAL);
  if (!library) {
    std::fprintf(stderr, "kelvane: cannot load the plug-in %s: %s\n", plugin_path.c_str(), dlerror());
    return 1;
  }
  const MmfMetadataParserOps* parser = FindMetadataParser(library);
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
