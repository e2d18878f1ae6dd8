/// \file
/// The root prefix under which every fixed path of the library resolves.
///
/// The library's fixed locations (the folder list and status files, their lock files, the daemon's
/// command socket, the notification tool) are absolute paths such as
/// "/usr/wezo/etc/fileindex/folder.conf". Each is resolved as the root prefix followed by that
/// path. In production the prefix is empty; tests and the sandbox demo point it at a directory of
/// their own so that nothing outside it is touched. The prefix is process-wide and set only through
/// this API, never from the environment. Set it before the first operation and not while another
/// thread is inside the library.
#ifndef FILEINDEX_ROOT_H_
#define FILEINDEX_ROOT_H_

#include <string>

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// Makes `root` the prefix of every fixed path. `root` must be empty (production) or an absolute
/// path; trailing slashes are dropped ("/tmp/sb/" becomes "/tmp/sb", "/" becomes empty). Returns
/// false and keeps the previous prefix when `root` is relative or holds a NUL byte. The directory
/// need not exist yet.
FILEINDEX_EXPORT bool SetRootPrefix(const std::string& root);

/// Returns the current prefix: empty unless SetRootPrefix changed it.
FILEINDEX_EXPORT std::string GetRootPrefix();

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_ROOT_H_
