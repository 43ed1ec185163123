#include "tools/extract/header_outputs.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <vector>

#include "tools/command_line.h"
#include "tools/media_words.h"
#include "tools/reading/header_reading.h"

namespace {

// A name from the file must not lead out of the directory it is written to.
std::string SafeName(const std::string& name, size_t index) {
  std::string safe = name.substr(name.find_last_of('/') == std::string::npos ? 0 : name.find_last_of('/') + 1);
  if (safe.empty() || safe == "." || safe == "..") safe = "attachment" + std::to_string(index + 1);
  return safe;
}

bool CopyRange(int from, uint64_t offset, uint64_t size, int to) {
  std::vector<char> buffer(1 << 16);
  while (size > 0) {
    const size_t want = size < buffer.size() ? static_cast<size_t>(size) : buffer.size();
    const ssize_t got = ::pread(from, buffer.data(), want, static_cast<off_t>(offset));
    if (got <= 0) {
      if (got < 0 && errno == EINTR) continue;
      if (got == 0) errno = EIO;
      return false;
    }
    for (ssize_t done = 0; done < got;) {
      const ssize_t written = ::write(to, buffer.data() + done, static_cast<size_t>(got - done));
      if (written < 0 && errno != EINTR) return false;
      if (written > 0) done += written;
    }
    offset += static_cast<uint64_t>(got);
    size -= static_cast<uint64_t>(got);
  }
  return true;
}

}  // namespace

int ExtractFromHeaders(const char* command, const char* path, const char* attachments, const char* chapters) {
  reading::HeaderReading reading = reading::ReadHeaders(path, {true, true});
  if (!reading.ok) return Failure(command, "%s: %s", path, reading.failure.c_str());
  if (attachments && !WriteAttachments(command, path, reading.facts, attachments)) return kExitFailed;
  if (chapters && !WriteSimpleChapters(command, reading.facts, chapters)) return kExitFailed;
  return kExitOk;
}

bool MakeDirectories(const std::string& path) {
  std::string partial;
  for (size_t i = 0; i <= path.size(); ++i) {
    if ((i == path.size() || path[i] == '/') && !partial.empty() && mkdir(partial.c_str(), 0755) != 0 &&
        errno != EEXIST) {
      return false;
    }
    if (i < path.size()) partial += path[i];
  }
  struct stat status;
  if (stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) return true;
  errno = ENOTDIR;
  return false;
}

bool WriteAttachments(const char* command, const std::string& path, const reading::FileFacts& facts,
                      const std::string& directory) {
  if (!MakeDirectories(directory)) {
    Failure(command, "cannot make the directory %s: %s", directory.c_str(), std::strerror(errno));
    return false;
  }
  const int from = ::open(path.c_str(), O_RDONLY);
  if (from < 0) {
    Failure(command, "cannot open %s: %s", path.c_str(), std::strerror(errno));
    return false;
  }
  bool ok = true;
  for (size_t i = 0; i < facts.attachments.size() && ok; ++i) {
    const reading::AttachmentFacts& file = facts.attachments[i];
    const std::string target = directory + "/" + SafeName(file.name, i);
    const int to = ::open(target.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    ok = to >= 0 && CopyRange(from, file.data_offset, file.size, to);
    const int error = errno;
    if (to >= 0 && ::close(to) != 0) ok = false;
    if (!ok) {
      Failure(command, "cannot write %s: %s", target.c_str(), std::strerror(error));
    } else {
      std::printf("attachment %zu %s: %s, %s\n", i + 1, file.mime_type.c_str(), target.c_str(),
                  ByteCount(file.size).c_str());
    }
  }
  ::close(from);
  return ok;
}

bool WriteSimpleChapters(const char* command, const reading::FileFacts& facts, const std::string& file) {
  // The format has no editions and no nesting: the top-level chapters of
  // every edition, by start time, each with its first name.
  std::vector<const reading::ChapterFacts*> chapters;
  for (const reading::EditionFacts& edition : facts.editions) {
    for (const reading::ChapterFacts& chapter : edition.chapters) chapters.push_back(&chapter);
  }
  std::stable_sort(chapters.begin(), chapters.end(),
                   [](const auto* a, const auto* b) { return a->start_ns < b->start_ns; });
  FILE* out = std::fopen(file.c_str(), "w");
  if (!out) {
    Failure(command, "cannot write %s: %s", file.c_str(), std::strerror(errno));
    return false;
  }
  for (size_t i = 0; i < chapters.size(); ++i) {
    const reading::ChapterFacts& chapter = *chapters[i];
    std::fprintf(out, "CHAPTER%02zu=%s\n", i + 1, ClockTime(chapter.start_ns).c_str());
    std::fprintf(out, "CHAPTER%02zuNAME=%s\n", i + 1, chapter.names.empty() ? "" : chapter.names[0].text.c_str());
  }
  if (std::fclose(out) != 0) {
    Failure(command, "cannot write %s: %s", file.c_str(), std::strerror(errno));
    return false;
  }
  std::printf("chapters: %s, %zu chapters\n", file.c_str(), chapters.size());
  return true;
}
