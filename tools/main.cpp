#include <cstdio>
#include <cstring>

#include "tools/commands.h"

namespace {

struct Command {
  const char* name;
  int (*run)(int argc, char** argv);
  const char* summary;
};

const Command kCommands[] = {
    {"info", RunInfo, "parse the headers of a Matroska file and print what they say"},
    {"metadata", RunMetadata, "print the metadata entries the plug-in offers for a file"},
    {"packets", RunPackets, "play a file through the plug-in and print every channel's frames"},
    {"probe", RunProbe, "connect the plug-in to a file (or - for standard input) and print its channels"},
};

void PrintUsage(FILE* out) {
  std::fprintf(out, "usage: kelvane COMMAND [options] FILE\n\ncommands:\n");
  for (const Command& command : kCommands) std::fprintf(out, "  %-10s %s\n", command.name, command.summary);
  std::fprintf(out, "\nexit codes: 0 ok, 1 the file was refused or failed, 2 usage\n");
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 2) {
    PrintUsage(stderr);
    return 2;
  }
  if (!std::strcmp(argv[1], "--help") || !std::strcmp(argv[1], "-h")) {
    PrintUsage(stdout);
    return 0;
  }
  for (const Command& command : kCommands) {
    if (!std::strcmp(argv[1], command.name)) return command.run(argc - 2, argv + 2);
  }
  std::fprintf(stderr, "kelvane: unknown command '%s'\n", argv[1]);
  PrintUsage(stderr);
  return 2;
}
