#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

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
    {"extract", RunExtract, "write each track as a file players open (Annex B, ADTS, FLAC, Ogg, WAV...), attachments, chapters"},
    {"info", RunInfo, "list a Matroska file's headers: tracks, chapters, attachments, tags (--tree: every element)"},
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
               "options are written --opt VALUE or --opt=VALUE; after --, every word is a FILE\n"
               "(for a file whose name starts with -). kelvane --version prints the version.\n"
               "\n"
               "environment:\n"
               "  KELVANE_LOG=LEVEL  show the plug-in's and the framework's own log messages up to\n"
               "                     LEVEL on standard error, and the answer codes behind a\n"
               "                     refusal: 2 failures, 3 also degraded results, 5 also notices\n"
               "                     (unset: none; the tool says in words what went wrong)\n"
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

// The plug-in's own messages only on request: they speak the framework's
// language, and the tool says in words what went wrong.
constexpr int kDefaultLogLevel = 0;
constexpr int kRequestedLogLevel = 2;

void SetLogLevel() {
  const char* level = std::getenv("KELVANE_LOG");
  unsigned long value = level ? kRequestedLogLevel : kDefaultLogLevel;
  if (level && !ParseNumber(level, 9, &value)) {
    std::fprintf(stderr, "kelvane: KELVANE_LOG='%s' is not a level from 0 to 9; using %d\n", level, kRequestedLogLevel);
  }
  host::SetLogThreshold(static_cast<int>(value));
}

int UnknownCommand(const char* name) {
  std::fprintf(stderr, "kelvane: unknown command '%s'\ntry 'kelvane --help'\n", name);
  return kExitUsage;
}

// The command's words as every command reads them: "--opt=value" becomes
// "--opt" "value", and after "--" a FILE that starts with '-' is given as
// "./-name", which no command takes for an option.
std::vector<std::string> NormalWords(int argc, char** argv) {
  std::vector<std::string> words;
  bool files_only = false;
  for (int i = 0; i < argc; ++i) {
    const std::string word = argv[i];
    if (files_only) {
      words.push_back(word.size() > 1 && word[0] == '-' ? "./" + word : word);
    } else if (word == "--") {
      files_only = true;
    } else if (word.rfind("--", 0) == 0 && word.find('=') != std::string::npos) {
      words.push_back(word.substr(0, word.find('=')));
      words.push_back(word.substr(word.find('=') + 1));
    } else {
      words.push_back(word);
    }
  }
  return words;
}

int PrintVersion() {
  std::printf("kelvane %s\n", KELVANE_VERSION);
  return kExitOk;
}

}  // namespace

int main(int argc, char** argv) {
  SetLogLevel();
  if (argc >= 2 && (!std::strcmp(argv[1], "--version") || !std::strcmp(argv[1], "-V"))) return PrintVersion();
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
  std::vector<std::string> words = NormalWords(argc - 2, argv + 2);
  std::vector<char*> command_argv;
  for (std::string& word : words) {
    if (word == "--version") return PrintVersion();
    command_argv.push_back(word.data());
  }
  command_argv.push_back(nullptr);
  return command->run(static_cast<int>(words.size()), command_argv.data());
}
