#pragma once
// What every kelvane command does the same way: answer --help, report a usage
// error, check that the input file can be read, load the plug-in, report a
// refused file. Messages go to standard error as "kelvane COMMAND: ...";
// the functions that report answer the exit code to return.

#include <memory>
#include <string>

#include "host/plugin_loader.h"

constexpr int kExitOk = 0;
constexpr int kExitFailed = 1;  // the file was refused, or reading or playing it failed
constexpr int kExitUsage = 2;

bool IsHelpOption(const char* arg);

// Prints the command's help text to standard output; answers kExitOk.
int PrintHelp(const char* text);

// "kelvane COMMAND: <message>" and "try 'kelvane COMMAND --help'"; answers kExitUsage.
[[gnu::format(printf, 2, 3)]] int UsageError(const char* command, const char* format, ...);

// "kelvane COMMAND: <message>"; answers kExitFailed.
[[gnu::format(printf, 2, 3)]] int Failure(const char* command, const char* format, ...);

// kExitOk when `path` ("-": standard input) names a readable file, else the
// reason with the file's name and the system's words for the error.
int CheckInputFile(const char* command, const char* path);

// The rating that a Matroska file gets from the plug-in.
constexpr int kAcceptedRating = 80;

// "FILE: the plug-in refused it: rating N (a Matroska file it can play rates 80)".
int RefusedFile(const char* command, const char* path, int rating);

// Takes `arg` as the command's one FILE ("-" for standard input), or reports
// an unknown option or a second FILE; answers kExitOk or kExitUsage.
int TakeFile(const char* command, const char* arg, const char** file);

// Parses a non-negative decimal number no greater than `maximum`; false for anything else.
bool ParseNumber(const char* text, unsigned long maximum, unsigned long* value);

// The plug-in from --plugin PATH or beside the executable; null after reporting why.
std::unique_ptr<host::Plugin> LoadPlugin(const char* command, const std::string& path);

// The option help shared by the commands that load the plug-in.
extern const char kPluginOptionHelp[];
