/// \file
/// The command channel to the indexing daemon fileindexd.
///
/// The library tells the daemon of each change by sending it one command per connection over the
/// local stream socket /var/run/fileindexd.sock; the daemon never answers. A command is the JSON
/// object {"type": \<name\>, "data": \<arguments\>}, sent as a 4-byte length in host byte order
/// followed by the compact JSON text and a terminating zero (the length counts the zero). Callable
/// from any process and thread; each call uses its own socket.
#ifndef FILEINDEX_DAEMON_H_
#define FILEINDEX_DAEMON_H_

#include <json/value.h>

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// Sends the command `type` with the arguments `data` to the daemon on a fresh connection and
/// closes it. Returns true when the whole frame was written; false when the daemon cannot be
/// reached (no socket, nobody listening, a backlog that stays full for a second) or stops taking
/// the frame, in which case the call gives up within a few seconds. A daemon that goes away
/// mid-frame fails the call without raising SIGPIPE; the process's SIGPIPE disposition is left as
/// it is. Neither logs nor sets an error code: the caller decides what a lost command means.
FILEINDEX_EXPORT bool SendCammandToDaemon(const std::string& type, const Json::Value& data);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_DAEMON_H_
