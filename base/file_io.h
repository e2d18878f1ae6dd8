// Whole-file reading and atomic replacement, shared by the library's configuration files and the
// generic-Linux platform's own files. Nothing here logs; on failure errno tells why.
#ifndef FILEINDEX_BASE_FILE_IO_H_
#define FILEINDEX_BASE_FILE_IO_H_

#include <sys/types.h>

#include <string>

namespace WEZO {
namespace FILEINDEX {

// Reads the whole file at `path` (symbolic links followed) into `out`. Returns false with errno
// set, `out` untouched, when it cannot be opened or read.
bool ReadWholeFile(const std::string& path, std::string& out);

enum class ReplaceResult {
  kReplaced,            // the file holds `data` and has the requested mode
  kReplacedModeNotSet,  // the file holds `data`, but its mode could not be set
  kFailed,              // nothing was replaced; the old file, if any, is as it was
};

// Replaces the file at `path` with `data`: writes a temporary file in the same directory, flushes
// it to disk, gives it `mode` and renames it over `path`, then flushes the directory. A reader
// sees the old file or the new one, never a part of either; a symbolic link at `path` is replaced,
// not written through. The temporary file is removed on every failure, errno kept. The directory
// must exist.
ReplaceResult ReplaceFile(const std::string& path, const std::string& data, mode_t mode);

// Removes the temporary files that ReplaceFile(`path`, ...) leaves behind when its process dies
// between creating one and renaming it: regular files in `path`'s directory named `path`'s file
// name, a '.' and six letters or digits, last modified at least `minAgeSeconds` ago. Symbolic
// links, directories and every other name are left alone. Removing another writer's temporary
// file fails that writer's replace, so the caller either holds the lock that all writers of
// `path` take (`minAgeSeconds` 0) or gives an age that no live writer reaches. Best effort: a
// file that cannot be removed stays, and nothing is reported.
void RemoveStaleTemporaries(const std::string& path, time_t minAgeSeconds);

// Appends `line` to the end of the file `fd`, which the caller holds locked against the file's
// other writers, in one write. A last line without its "\n", left by a writer that failed
// part-way, is ended first, so that `line` never joins it; a write of ours that falls short is
// cut off again, since the next writer's line would otherwise be glued to the torn one and both
// lost. Returns true when `line` is in the file whole. On false, `written` and `wanted` hold what
// the write returned and the bytes it was given, both 0 when the file could not be inspected and
// nothing was written.
bool AppendLineAligned(int fd, const std::string& line, ssize_t& written, size_t& wanted);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_FILE_IO_H_
