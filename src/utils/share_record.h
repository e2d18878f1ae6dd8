// Share records of the platform's share database, released when they go out of scope.
#ifndef FILEINDEX_SRC_UTILS_SHARE_RECORD_H_
#define FILEINDEX_SRC_UTILS_SHARE_RECORD_H_

#include <wezo/platform.h>

#include <cstring>
#include <memory>
#include <string>

namespace WEZO {
namespace FILEINDEX {

struct ShareRecordFree {
  void operator()(PWEZOSHARE share) const { WEZOShareFree(share); }
};
using ShareRecord = std::unique_ptr<WEZOSHARE, ShareRecordFree>;

// Looks the share `name` up. Returns the platform's result (negative on failure) and, on success,
// the record in `out`.
inline int LookUpShare(const std::string& name, ShareRecord& out) {
  PWEZOSHARE share = nullptr;
  const int rc = WEZOShareGet(name.c_str(), &share);
  out.reset(share);
  return rc;
}

// The share's own full path, read up to its terminating zero (or the field's end).
inline std::string SharePathOf(const WEZOSHARE& share) {
  return std::string(share.szPath, strnlen(share.szPath, sizeof share.szPath));
}

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_SHARE_RECORD_H_
