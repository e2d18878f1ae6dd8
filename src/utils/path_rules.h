// What a share path or a share name handed in by a caller must look like.
//
// A path that a caller names becomes a place the file-change monitor watches, the daemon indexes
// and the library queues events for, all with root's rights; a share name selects the share whose
// folders, registration, worker and index data an operation changes. Both are checked here, in
// one place, before they are used. Pure string work: nothing is looked up.
#ifndef FILEINDEX_SRC_UTILS_PATH_RULES_H_
#define FILEINDEX_SRC_UTILS_PATH_RULES_H_

#include <string>

namespace WEZO {
namespace FILEINDEX {

// True when `path` is a share path that names one place and no other: it starts with "/", none
// of its components is empty (a doubled or trailing slash), "." or "..", and it holds no NUL
// byte, which the C interfaces below the library would take for the path's end.
inline bool IsCleanSharePath(const std::string& path) {
  if (path.empty() || path.front() != '/' || path.find('\0') != std::string::npos) {
    return false;
  }
  size_t start = 1;
  while (true) {
    const size_t slash = path.find('/', start);
    const size_t length = slash == std::string::npos ? path.size() - start : slash - start;
    if (length == 0 || path.compare(start, length, ".") == 0 ||
        path.compare(start, length, "..") == 0) {
      return false;
    }
    if (slash == std::string::npos) {
      return true;
    }
    start = slash + 1;
  }
}

// True when `name` can be the name of one share: the one component of a clean share path. An
// empty name is refused in particular, because the folder list reads it as "every share".
inline bool IsShareName(const std::string& name) {
  return name.find('/') == std::string::npos && IsCleanSharePath("/" + name);
}

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_PATH_RULES_H_
