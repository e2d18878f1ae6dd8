// The queue readers against a reader that parses every line.
//
// Input: one byte choosing the read block size and where the queue is cut in two, then a line
// with the full path asked about ("/volume1/photo/a"), then the queue file's content. The folder
// asked about is the same location as a share path. Both readers must answer exactly as the
// reference below, read plainly and through what the process remembers, with the file's second
// part appended between two questions; the folder reader must log each malformed line it reads
// once and stop at the first event in the folder, and answer for many folders at once (the one
// asked about, its ancestors and those of the first events) as for each alone; the scanner must
// never answer otherwise than the parser.
#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "fileindex/queue.h"
#include "fileindex/utils.h"
#include "fuzz_support.h"
#include "json_io.h"
#include "utils/queue_reader.h"

namespace {

using WEZO::FILEINDEX::QueueEvent;

constexpr char kVolume[] = "/volume1";

// Every line of `content`: split at "\n"; a last line without "\n" counts, nothing after a final
// "\n" does.
std::vector<std::string> SplitLines(const std::string& content) {
  std::vector<std::string> lines;
  size_t start = 0;
  while (start < content.size()) {
    size_t end = content.find('\n', start);
    if (end == std::string::npos) {
      end = content.size();
    }
    lines.push_back(content.substr(start, end - start));
    start = end + 1;
  }
  return lines;
}

// A line is an event when it parses as one JSON object with an "event" convertible to an unsigned
// integer and a string "path"; "path_old" counts only when it is a string.
bool ReferenceParse(const std::string& line, QueueEvent& out) {
  Json::Value parsed;
  const Json::Value& root = parsed;
  if (!WEZO::FILEINDEX::JsonFromString(parsed, line) || !root.isObject() ||
      !root.isMember("event") || !root.isMember("path")) {
    return false;
  }
  const Json::Value& event = root["event"];
  const Json::Value& path = root["path"];
  if (!event.isConvertibleTo(Json::uintValue) || !path.isString()) {
    return false;
  }
  out.event = event.asUInt();
  out.path = path.asString();
  const Json::Value& pathOld = root["path_old"];
  out.pathOld = pathOld.isString() ? pathOld.asString() : std::string();
  return true;
}

bool Inside(const std::string& path, const std::string& folder) {
  return WEZO::FILEINDEX::StringStartWith(path + "/", folder + "/");
}

void CheckScanAgreesWithParse(const std::string& line) {
  QueueEvent scanned;
  const auto verdict = WEZO::FILEINDEX::detail::ScanQueueLine(line.data(), line.size(), scanned);
  if (verdict == WEZO::FILEINDEX::detail::LineVerdict::kUnsure) {
    return;
  }
  QueueEvent parsed;
  const bool isEvent = WEZO::FILEINDEX::ParseQueueLine(line.data(), line.size(), parsed);
  if (isEvent != (verdict == WEZO::FILEINDEX::detail::LineVerdict::kEvent) ||
      (isEvent && (scanned.event != parsed.event || scanned.path != parsed.path ||
                   scanned.pathOld != parsed.pathOld))) {
    fuzzsupport::Fail("the scanner and the parser disagree on: " + line);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 2) {
    return 0;
  }
  const std::string& root = fuzzsupport::Root();
  fuzzsupport::ResetPlatform(kVolume);
  const size_t blockSize = data[0] == 0xFF ? size_t{1} << 20 : size_t{1} + data[0] % 64;
  const WEZO::FILEINDEX::detail::ReadOptions plain{blockSize, false};
  const std::string rest(reinterpret_cast<const char*>(data) + 1, size - 1);
  const size_t newline = rest.find('\n');
  const std::string fullPath = rest.substr(0, newline);
  const std::string content = newline == std::string::npos ? "" : rest.substr(newline + 1);
  const size_t cut = content.size() * (data[0] % 5) / 4;
  const std::string queue = root + "/queue";

  // The folder reader's share path for the same location; a path outside the volume has none.
  const bool onVolume = fullPath.rfind(std::string(kVolume) + "/", 0) == 0;
  const std::string folder = onVolume ? fullPath.substr(sizeof kVolume - 1) : fullPath;
  std::string folderFull;
  const bool resolvable = WEZO::FILEINDEX::GetFullPath(folderFull, folder);

  bool reindexQueued = false;
  bool folderEvent = false;
  size_t malformed = 0;  // up to the first event in the folder
  std::vector<QueueEvent> events;
  for (const std::string& line : SplitLines(content)) {
    CheckScanAgreesWithParse(line);
    QueueEvent event;
    if (!ReferenceParse(line, event)) {
      malformed += folderEvent ? 0 : 1;
      continue;
    }
    events.push_back(event);
    reindexQueued =
        reindexQueued || (event.event == static_cast<unsigned>(WEZO::FILEINDEX::kEventReindex) &&
                          event.path == fullPath);
    folderEvent = folderEvent || Inside(event.path, folderFull) ||
                  (event.event == static_cast<unsigned>(WEZO::FILEINDEX::kEventMoved) &&
                   Inside(event.pathOld, folderFull));
  }

  // Through what the process remembers: asked once with the first part only, then again.
  WEZO::FILEINDEX::detail::ForgetQueueScans();
  fuzzsupport::WriteBytes(queue, reinterpret_cast<const uint8_t*>(content.data()), cut);
  std::vector<bool> found;
  (void)WEZO::FILEINDEX::IsReindexQueued(fullPath, queue);
  (void)WEZO::FILEINDEX::QueueFoldersWithEvents({folderFull}, queue, found);
  fuzzsupport::WriteBytes(queue, reinterpret_cast<const uint8_t*>(content.data()), content.size());
  if (WEZO::FILEINDEX::IsReindexQueued(fullPath, queue) != reindexQueued) {
    fuzzsupport::Fail("IsReindexQueued, remembering, answered " + std::to_string(!reindexQueued));
  }
  WEZO::FILEINDEX::QueueFoldersWithEvents({folderFull}, queue, found);
  if (resolvable && found[0] != folderEvent) {
    fuzzsupport::Fail("QueueFoldersWithEvents, remembering, answered " + std::to_string(found[0]));
  }

  if (WEZO::FILEINDEX::detail::IsReindexQueued(fullPath, queue, plain) != reindexQueued) {
    fuzzsupport::Fail("IsReindexQueued answered " + std::to_string(!reindexQueued));
  }
  (void)fuzzsupport::TakeMalformedLineCount();
  if (!resolvable) {
    if (WEZO::FILEINDEX::QueueHasFolderEvent(folder, queue) ||
        fuzzsupport::TakeMalformedLineCount() != 0) {
      fuzzsupport::Fail("QueueHasFolderEvent read the queue of a folder it cannot place");
    }
    return 0;
  }
  WEZO::FILEINDEX::detail::QueueFoldersWithEvents({folderFull}, queue, found, plain);
  const size_t logged = fuzzsupport::TakeMalformedLineCount();
  if (found[0] != folderEvent) {
    fuzzsupport::Fail("QueueFoldersWithEvents answered " + std::to_string(found[0]));
  }
  if (logged != malformed) {
    fuzzsupport::Fail("logged " + std::to_string(logged) + " malformed lines of " +
                      std::to_string(malformed));
  }

  // Many folders in one read: the one asked about, its ancestors and those of the first events'
  // paths, so that nested folders, siblings and duplicates are looked for together.
  std::vector<std::string> folders{folderFull};
  const auto addAncestors = [&folders](const std::string& path) {
    for (size_t at = path.find('/', 1); at != std::string::npos && folders.size() < 24;
         at = path.find('/', at + 1)) {
      folders.push_back(path.substr(0, at));
    }
  };
  addAncestors(folderFull);
  for (size_t i = 0; i < events.size() && i < 8; ++i) {
    addAncestors(events[i].path);
  }
  WEZO::FILEINDEX::detail::QueueFoldersWithEvents(folders, queue, found, plain);
  (void)fuzzsupport::TakeMalformedLineCount();
  for (size_t f = 0; f < folders.size(); ++f) {
    bool expected = false;
    for (const QueueEvent& event : events) {
      expected = expected || Inside(event.path, folders[f]) ||
                 (event.event == static_cast<unsigned>(WEZO::FILEINDEX::kEventMoved) &&
                  Inside(event.pathOld, folders[f]));
    }
    if (found[f] != expected) {
      fuzzsupport::Fail("QueueFoldersWithEvents of " + std::to_string(folders.size()) +
                        " folders answered " + std::to_string(found[f]) + " for " + folders[f]);
    }
  }
  return 0;
}
