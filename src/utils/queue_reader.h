// The readers of a share's event queue (fileindex/queue.h): whether a reindex of a path is
// queued, and which of a set of folders hold an event.
//
// Queue files grow to millions of lines and are read on every progress report and every queued
// event, so the readers read in blocks of 1 MiB, settle almost every line with a scanner of
// their own (JSON string escapes included) and leave to the JSON parser only the rare lines the
// scanner cannot settle. Their answers are exactly those of parsing every line: a line that does
// not parse, is not an object, lacks "event" or "path", has an "event" that is not convertible to
// an unsigned integer or a "path" that is not a string counts as no event. A last line without
// "\n" (a writer still busy) is read like any other line.
//
// Memory stays within the block for any line length: a line longer than the block is scanned as
// it streams past. Only such a line that the scanner cannot settle (a number or a nesting the
// scanner leaves to the parser) is read a second time, whole, for the parser.
//
// The queue is append-only until the daemon replaces it (rename) or truncates it, so each process
// remembers per queue file how far it has read (the end of the last complete line), a check of
// the bytes before that point and what it found there, and next time reads only what was
// appended; a file that is not the same file with the same bytes is read again from its start.
// Neither reader locks the file. The file is opened as OpenLocationFile (storage.h) opens it: a
// link below the share, or anything but a regular file, counts as a file that cannot be opened.
// Safe for several threads.
#ifndef FILEINDEX_SRC_UTILS_QUEUE_READER_H_
#define FILEINDEX_SRC_UTILS_QUEUE_READER_H_

#include <cstddef>
#include <string>
#include <vector>

namespace WEZO {
namespace FILEINDEX {

// One event line, as the readers see it.
struct QueueEvent {
  unsigned int event = 0;
  std::string path;
  std::string pathOld;  // empty unless the line carries a string "path_old"
};

// Parses the `size` bytes at `line` (without the "\n") with the JSON parser into `out`. Returns
// false, with `out` unspecified, for a line that counts as no event (see above).
bool ParseQueueLine(const char* line, size_t size, QueueEvent& out);

// True when the queue file `queueFile` holds a reindex event whose "path" equals `path` byte for
// byte. False when the file is missing or holds none; a file that exists but cannot be opened is
// logged ("utils") and answers false. Malformed lines are skipped silently.
bool IsReindexQueued(const std::string& path, const std::string& queueFile);

// True when the queue file `queueFile` holds an event inside the folder `folder` (a share path,
// resolved with GetFullPath): its "path", or on a moved event its "path_old", is the folder's
// full path or lies below it at a "/" boundary. False, logged, when the folder cannot be resolved
// or the file cannot be opened; false without a line when the file is missing. Reads the file
// plainly, without what the process remembers, up to the first such event, and logs each
// malformed line on the way ("status_mgr: Malformed command: <line>"): the folder-by-folder
// reading that QueueFoldersWithEvents answers as.
bool QueueHasFolderEvent(const std::string& folder, const std::string& queueFile);

// For each full path in `fullPaths`, whether the queue file `queueFile` holds an event inside
// it (as QueueHasFolderEvent), in one read of the file that stops once every folder has one.
// `found` gets one entry per path. False, logged, when the file exists but cannot be opened;
// false without a line when it is missing; `found` is then all false. A malformed line is
// logged the first time this process reads it while the file stays the same file.
bool QueueFoldersWithEvents(const std::vector<std::string>& fullPaths, const std::string& queueFile,
                            std::vector<bool>& found);

namespace detail {

// What the scanner makes of a line.
enum class LineVerdict {
  kEvent,    // an event, in `out`
  kNoEvent,  // surely no event
  kUnsure,   // only the parser can tell
};

// Scans the `size` bytes at `line` without the JSON parser. kEvent and kNoEvent are what
// ParseQueueLine says of the line; kUnsure is answered for numbers other than plain decimals,
// comments, deep nesting and objects of many members, among others.
LineVerdict ScanQueueLine(const char* line, size_t size, QueueEvent& out);

// How a reader reads: the size of its blocks (1 MiB for the public readers; tests put block
// boundaries inside lines and escapes) and whether it uses and updates what the process
// remembers of the file.
struct ReadOptions {
  size_t blockSize = size_t{1} << 20;
  bool remember = true;
};

bool IsReindexQueued(const std::string& path, const std::string& queueFile,
                     const ReadOptions& options);
bool QueueFoldersWithEvents(const std::vector<std::string>& fullPaths, const std::string& queueFile,
                            std::vector<bool>& found, const ReadOptions& options);

// Forgets what this process remembers of every queue file, so that the next read of each starts
// from its beginning.
void ForgetQueueScans();

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_QUEUE_READER_H_
