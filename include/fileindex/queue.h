/// \file
/// Each share's event queue: the append-only file through which work reaches the indexing daemon.
///
/// The queue lies in the share's metadata directory (FILEIDXQueuePathGet, fileindex/fileindex_c.h).
/// It holds one event per line, each a JSON object on one line ended by "\n":
///   "event"     unsigned integer; the event code (below, or one of the file-change monitor's)
///   "path"      string; the full path the event concerns
///   "data"      any JSON value; a custom event's payload (null when there is none)
///   "path_old"  string; only on kEventMoved, the path before the change
/// The file-change monitor and this library append to it, each line in one write under an
/// exclusive flock of the file; the daemon consumes it. Pending work may also sit in a companion
/// file, the queue path followed by ".tmp".
#ifndef FILEINDEX_QUEUE_H_
#define FILEINDEX_QUEUE_H_

#include <json/value.h>

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// Event codes of the queue.
inline constexpr int kEventMoved = 256;      ///< written by the monitor, with "path_old"
inline constexpr int kEventReindex = 65536;  ///< index the folder at "path" again from scratch
inline constexpr int kEventUpdate = 131072;  ///< update what is indexed for "path"

/// Appends the event {"event": event, "path": path, "data": data} to the queue of the share that
/// holds the full path `path`. Writes nothing and returns true when a reindex of exactly `path`
/// is already queued (in the queue or its ".tmp" companion), whatever `event` is: the reindex
/// covers it. Also returns true, with nothing written, when other writers keep the queue locked
/// through three short attempts.
/// Returns false when the share or its queue cannot be resolved, the queue cannot be opened (a
/// symbolic link below the share, or anything but a regular file, is refused), locking fails for
/// another reason, or the line could not be written whole (what was written of it is cut off
/// again); the share (an empty name when `path` lies in no share) is then flagged for a full
/// reindex in the status file, so that the change is not lost. Logs each failure; sets no error
/// code.
FILEINDEX_EXPORT bool AddCustomEvent(const int& event, const std::string& path,
                                     const Json::Value& data);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_QUEUE_H_
