// Share lookups remembered for the length of one pass over the folder list.
//
// Loading the list places every folder, and a list of a thousand folders names a handful of
// shares. While a ShareLookupMemo lives on a thread, GetFullPath on that thread asks the platform
// of each share once and answers the share's other folders from that answer, found or not. The
// memo lives no longer than the pass: the platform's share table may change between calls.
#ifndef FILEINDEX_SRC_UTILS_SHARE_MEMO_H_
#define FILEINDEX_SRC_UTILS_SHARE_MEMO_H_

#include <map>
#include <optional>
#include <string>

namespace WEZO {
namespace FILEINDEX {

class ShareLookupMemo {
 public:
  // Share name -> the volume the share lies on, or none when the share is unknown.
  using Volumes = std::map<std::string, std::optional<std::string>>;

  ShareLookupMemo();  // an outer memo of the thread, if any, stays the one in use
  ~ShareLookupMemo();
  ShareLookupMemo(const ShareLookupMemo&) = delete;
  ShareLookupMemo& operator=(const ShareLookupMemo&) = delete;

  // The memo in use on this thread, or null.
  static Volumes* Current();

 private:
  bool m_installed = false;
  Volumes m_volumes;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_SHARE_MEMO_H_
