// The two readers of a share's event queue (fileindex/queue.h): whether a reindex of a path is
// queued, and whether any event falls inside a folder.
//
// Queue files grow to millions of lines and are read on every progress report, so the readers
// read in large blocks and leave to the JSON parser only the lines that a quick look at their
// text cannot settle. Their answers are exactly those of parsing every line: a line that does not
// parse, is not an object, lacks "event" or "path", has an "event" that is not convertible to an
// unsigned integer or a "path" that is not a string counts as no event. A last line without "\n"
// (a writer still busy) is read like any other line. Neither reader locks the file. The file is
// opened as OpenLocationFile (storage.h) opens it: a link below the share, or anything but a
// regular file, counts as a file that cannot be opened. Reentrant.
#ifndef FILEINDEX_SRC_UTILS_QUEUE_READER_H_
#define FILEINDEX_SRC_UTILS_QUEUE_READER_H_

#include <cstddef>
#include <string>

namespace WEZO {
namespace FILEINDEX {

// One event line, as the readers see it.
struct QueueEvent {
  unsigned int event = 0;
  std::string path;
  std::string pathOld;  // empty unless the line carries a string "path_old"
};

// Parses the `size` bytes at `line` (without the "\n") into `out`. Returns false, with `out`
// unspecified, for a line that counts as no event (see above).
bool ParseQueueLine(const char* line, size_t size, QueueEvent& out);

// True when the queue file `queueFile` holds a reindex event whose "path" equals `path` byte for
// byte. False when the file is missing or holds none; a file that exists but cannot be opened is
// logged ("utils") and answers false. Malformed lines are skipped silently.
bool IsReindexQueued(const std::string& path, const std::string& queueFile);

// True when the queue file `queueFile` holds an event inside the folder `folder` (a share path,
// resolved with GetFullPath): its "path", or on a moved event its "path_old", is the folder's
// full path or lies below it at a "/" boundary. Reads the whole file and logs each malformed line
// ("status_mgr: Malformed command: <line>"). False, logged, when the folder cannot be resolved
// or the file cannot be opened; false without a line when the file is missing.
bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile);

namespace detail {

// What a quick scan found in an event line: the spans point into the scanned line.
struct ScannedEvent {
  unsigned int event = 0;
  const char* path = nullptr;
  size_t pathSize = 0;
  const char* pathOld = nullptr;  // nullptr unless "path_old" is a string
  size_t pathOldSize = 0;
};

// Looks at the `size` bytes at `line` without a JSON parse. True only for a line that
// ParseQueueLine surely takes as an event, with `out` holding what it would give. False means
// "unsure" and says nothing: only ParseQueueLine can tell. The scan gives up on every line with a
// backslash, on numbers other than plain decimals, on comments, on deep nesting and on objects
// of many members.
bool ScanQueueLine(const char* line, size_t size, ScannedEvent& out);

// The readers with the size of their read blocks chosen by the caller (the public ones read
// 1 MiB at a time), so that tests can put block boundaries inside lines.
bool IsReindexQueued(const std::string& path, const std::string& queueFile, size_t blockSize);
bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile, size_t blockSize);

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_QUEUE_READER_H_
