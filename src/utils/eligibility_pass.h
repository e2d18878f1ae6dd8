// The folder check for many folders in one call: the listing's "is_valid" and the progress of a
// list of folders.
//
// While an EligibilityPass lives, each share is looked up, and its encryption and read-only state
// read, once, whatever number of its folders is asked about; a directory that holds folders is
// resolved once; and GetFullPath on this thread asks the platform of each share once
// (ShareLookupMemo). Each folder is still asked what is its own: its place in a recycle bin or
// snapshot, its file system, whether it is a mount point, and whether it is a link. The answers
// are those of CanPathBeIndexed folder by folder over a share table that does not change during
// the pass; a failed share lookup is logged once per share per pass. A pass belongs to one thread
// and lives no longer than the call that made it.
#ifndef FILEINDEX_SRC_UTILS_ELIGIBILITY_PASS_H_
#define FILEINDEX_SRC_UTILS_ELIGIBILITY_PASS_H_

#include <memory>
#include <string>

#include "fileindex/eligibility.h"
#include "utils/share_memo.h"

namespace WEZO {
namespace FILEINDEX {

class EligibilityPass {
 public:
  EligibilityPass();
  ~EligibilityPass();
  EligibilityPass(const EligibilityPass&) = delete;
  EligibilityPass& operator=(const EligibilityPass&) = delete;

  // FullPathIndexRule(fullPath), from what this pass already knows of its share and directory.
  IndexRule FullPathRule(const std::string& fullPath);
  // CanPathBeIndexed(path): the same lines and codes, from what this pass already knows.
  bool CanPathBeIndexed(const std::string& path);

  struct Memo;

 private:
  ShareLookupMemo m_lookups;
  std::unique_ptr<Memo> m_memo;
};

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_ELIGIBILITY_PASS_H_
