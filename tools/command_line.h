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

// How a command reads its FILE: once, front to back (standard input, a FIFO
// or a pipe will do), or more than once (a regular file only).
enum class InputUse { kOnce, kTwice };

// kExitOk when `path` ("-": standard input) names an input the command can
// read, with *stream telling whether it is a stream (standard input, a FIFO,
// a pipe) rather than a regular file; else the reason, with the file's name
// and the system's words for the error. A FIFO is never opened here: that
// would wait for its writer, and a second open would find it gone.
int CheckInput(const char* command, const char* path, InputUse use, bool* stream);

// For a regular file only: kExitOk when it can be read (CheckInput's errors otherwise).
int CheckInputFile(const char* command, const char* path);

// Whether KELVANE_LOG asks for the plug-in's and the framework's own words.
bool LogRequested();

// The rating that a Matroska file gets from the plug-in.
constexpr int kAcceptedRating = 80;

// "FILE: not a Matroska file" and the like: why the plug-in refused it, in the
// same words from every command (the rating too with KELVANE_LOG).
int RefusedFile(const char* command, const char* path, int rating);
// The same, with the plug-in's own answer (shown with KELVANE_LOG) in other words.
int RefusedFile(const char* command, const char* path, const std::string& plugin_answer);

// Takes `arg` as the command's one FILE ("-" for standard input), or reports
// an unknown option or a second FILE; answers kExitOk or kExitUsage.
int TakeFile(const char* command, const char* arg, const char** file);

// Parses a non-negative decimal number no greater than `maximum`; false for anything else.
bool ParseNumber(const char* text, unsigned long maximum, unsigned long* value);

// The plug-in from --plugin PATH or beside the executable; null after reporting why.
std::unique_ptr<host::Plugin> LoadPlugin(const char* command, const std::string& path);

// The option help shared by the commands that load the plug-in.
extern const char kPluginOptionHelp[];
