#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "host/log_control.h"
#include "tools/command_line.h"
#include "tools/commands.h"

namespace {

struct Command {
  const char* name;
  int (*run)(int argc, char** argv);
  const char* summary;
};

const Command kCommands[] = {
    {"extract", RunExtract, "write each channel of a file as a file players open (Annex B, ADTS, FLAC, Ogg, WAV...)"},
    {"info", RunInfo, "list the EBML header, Segment Info, tracks, cues and tags of a Matroska file"},
    {"metadata", RunMetadata, "print the metadata entries the plug-in offers for a file"},
    {"packets", RunPackets, "play a file through the plug-in and print every channel's frames"},
    {"probe", RunProbe, "connect the plug-in to a file (or - for standard input) and print its channels"},
};

void PrintUsage(FILE* out) {
  std::fprintf(out,
               "usage: kelvane COMMAND [OPTIONS] FILE\n"
               "       kelvane COMMAND --help     (or: kelvane help COMMAND)\n"
               "\n"
               "kelvane drives the Matroska demultiplexer plug-in (kelvane.so) through a host that\n"
               "calls it exactly as the media framework does.\n"
               "\ncommands:\n");
  for (const Command& command : kCommands) std::fprintf(out, "  %-10s %s\n", command.name, command.summary);
  std::fprintf(out,
               "\n"
               "info, metadata, packets and probe take --json: one JSON document on standard output\n"
               "(its fields are described in docs/json.md).\n"
               "\n"
               "exit codes:\n"
               "  0  ok\n"
               "  1  the file was refused by the plug-in, could not be read, or failed to play\n"
               "  2  usage: an unknown command or option, a malformed value, a missing FILE, or a\n"
               "     track or channel the file does not offer\n"
               "\n"
               "environment:\n"
               "  KELVANE_LOG=LEVEL  show the plug-in's log messages up to LEVEL on standard error:\n"
               "                     2 failures (default), 3 also degraded results, 5 also notices\n"
               "\n"
               "examples:\n"
               "  kelvane info movie.mkv\n"
               "  kelvane probe --json movie.mkv\n"
               "  kelvane help packets\n");
}

const Command* Find(const char* name) {
  for (const Command& command : kCommands) {
    if (!std::strcmp(name, command.name)) return &command;
  }
  return nullptr;
}

// The plug-in's failures by default; its degraded results and notices only on request.
constexpr int kDefaultLogLevel = 2;

void SetLogLevel() {
  const char* level = std::getenv("KELVANE_LOG");
  unsigned long value = kDefaultLogLevel;
  if (level && !ParseNumber(level, 9, &value)) {
    std::fprintf(stderr, "kelvane: KELVANE_LOG='%s' is not a level from 0 to 9; using %d\n", level, kDefaultLogLevel);
  }
  host::SetLogThreshold(static_cast<int>(value));
}

int UnknownCommand(const char* name) {
  std::fprintf(stderr, "kelvane: unknown command '%s'\ntry 'kelvane --help'\n", name);
  return kExitUsage;
}

}  // namespace

int main(int argc, char** argv) {
  SetLogLevel();
  if (argc < 2) {
    std::fprintf(stderr, "kelvane: no command given\n");
    PrintUsage(stderr);
    return kExitUsage;
  }
  const char* name = argv[1];
  if (IsHelpOption(name) || (!std::strcmp(name, "help") && argc == 2)) {
    PrintUsage(stdout);
    return kExitOk;
  }
  if (!std::strcmp(name, "help")) {
    // `kelvane help COMMAND` is `kelvane COMMAND --help`.
    const Command* command = Find(argv[2]);
    if (!command) return UnknownCommand(argv[2]);
    char help[] = "--help";
    char* help_argv[] = {help, nullptr};
    return command->run(1, help_argv);
  }
  const Command* command = Find(name);
  if (!command) return UnknownCommand(name);
  return command->run(argc - 2, argv + 2);
}
