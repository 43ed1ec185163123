#include "tools/command_line.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "tools/reading/header_reading.h"

const char kPluginOptionHelp[] =
    "  --plugin PATH    the plug-in to load (default: kelvane.so beside this program)\n";

namespace {

void Report(const char* command, const char* format, va_list args) {
  std::fprintf(stderr, "kelvane %s: ", command);
  std::vfprintf(stderr, format, args);
  std::fputc('\n', stderr);
}

}  // namespace

bool IsHelpOption(const char* arg) { return !std::strcmp(arg, "--help") || !std::strcmp(arg, "-h"); }

int PrintHelp(const char* text) {
  std::fputs(text, stdout);
  return kExitOk;
}

int UsageError(const char* command, const char* format, ...) {
  va_list args;
  va_start(args, format);
  Report(command, format, args);
  va_end(args);
  std::fprintf(stderr, "try 'kelvane %s --help'\n", command);
  return kExitUsage;
}

int Failure(const char* command, const char* format, ...) {
  va_list args;
  va_start(args, format);
  Report(command, format, args);
  va_end(args);
  return kExitFailed;
}

int CheckInput(const char* command, const char* path, InputUse use, bool* stream) {
  *stream = !std::strcmp(path, "-");
  struct stat status;
  if (!*stream) {
    if (stat(path, &status) != 0) return Failure(command, "cannot open %s: %s", path, std::strerror(errno));
    if (S_ISDIR(status.st_mode)) return Failure(command, "cannot read %s: %s", path, std::strerror(EISDIR));
    *stream = !S_ISREG(status.st_mode) && !S_ISBLK(status.st_mode);
  }
  if (*stream && use == InputUse::kTwice) {
    return UsageError(command, "FILE cannot be %s: %s reads its input more than once (save it to a file first)",
                      !std::strcmp(path, "-") ? "standard input" : "a pipe or FIFO", command);
  }
  if (*stream) return kExitOk;
  FILE* file = std::fopen(path, "rb");
  if (!file) return Failure(command, "cannot open %s: %s", path, std::strerror(errno));
  std::fclose(file);
  return kExitOk;
}

int CheckInputFile(const char* command, const char* path) {
  bool stream = false;
  return CheckInput(command, path, InputUse::kTwice, &stream);
}

bool LogRequested() { return std::getenv("KELVANE_LOG") != nullptr; }

int RefusedFile(const char* command, const char* path, int rating) {
  return RefusedFile(command, path, "the plug-in rated it " + std::to_string(rating) + "; a file it plays rates " +
                                        std::to_string(kAcceptedRating));
}

int RefusedFile(const char* command, const char* path, const std::string& plugin_answer) {
  struct stat status;
  const bool regular = std::strcmp(path, "-") && stat(path, &status) == 0 && S_ISREG(status.st_mode);
  std::string reason = regular ? reading::RefusalReason(path) : std::string();
  if (reason.empty()) reason = "not a Matroska file the plug-in plays";
  if (LogRequested()) return Failure(command, "%s: %s (%s)", path, reason.c_str(), plugin_answer.c_str());
  return Failure(command, "%s: %s", path, reason.c_str());
}

bool ParseNumber(const char* text, unsigned long maximum, unsigned long* value) {
  if (*text < '0' || *text > '9') return false;
  char* end = nullptr;
  errno = 0;
  unsigned long parsed = std::strtoul(text, &end, 10);
  if (*end || errno == ERANGE || parsed > maximum) return false;
  *value = parsed;
  return true;
}

std::unique_ptr<host::Plugin> LoadPlugin(const char* command, const std::string& path) {
  std::string error;
  std::unique_ptr<host::Plugin> plugin = host::Plugin::Load(path, &error);
  if (!plugin) Failure(command, "cannot load the plug-in %s: %s", path.c_str(), error.c_str());
  return plugin;
}

int TakeFile(const char* command, const char* arg, const char** file) {
  if (arg[0] == '-' && arg[1]) return UsageError(command, "unknown option '%s'", arg);
  if (*file) return UsageError(command, "one FILE only ('%s' and '%s' given)", *file, arg);
  *file = arg;
  return kExitOk;
}
