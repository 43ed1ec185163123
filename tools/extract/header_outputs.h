#pragma once
// What `kelvane extract` writes from the file's headers alone, as
// mkvextract's attachments and chapters modes do: each attachment as the
// file it was, and the chapters in the simple chapter format that players
// read (CHAPTERnn=HH:MM:SS.mmm, CHAPTERnnNAME=...).

#include <string>

#include "tools/reading/file_facts.h"

// Writes every attachment to DIR/FILENAME (DIR made when missing); false
// after reporting why on standard error.
bool WriteAttachments(const char* command, const std::string& path, const reading::FileFacts& facts,
                      const std::string& directory);

// Writes the top-level chapters of every edition, by start time, to `file`;
// false after reporting why.
bool WriteSimpleChapters(const char* command, const reading::FileFacts& facts, const std::string& file);

// Reads the headers of `path` and writes its attachments to `attachments`
// and its chapters to `chapters` (each when not null); the exit code.
int ExtractFromHeaders(const char* command, const char* path, const char* attachments, const char* chapters);

// Like mkdir -p: the directory and any missing parents; false with errno set.
bool MakeDirectories(const std::string& path);
