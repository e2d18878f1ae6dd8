// The C interface's questions whether something is indexed.
#include <string>

#include "fileindex/fileindex_c.h"
#include "fileindex/index_mgr.h"

namespace {

using WEZO::FILEINDEX::IndexMgr;

// Asks `query` about `text`. Nothing may unwind into a C caller: a failure of any kind, and a null
// pointer, answer "not indexed".
int Ask(bool (*query)(const std::string&), const char* text) noexcept {
  if (text == nullptr) {
    return 0;
  }
  try {
    return query(text) ? 1 : 0;
  } catch (...) {
    return 0;
  }
}

}  // namespace

extern "C" {

int FILEIDXIsFullPathIndexed(const char* fullPath) {
  return Ask(&IndexMgr::IsFullPathIndexed, fullPath);
}

int FILEIDXIsPathIndexed(const char* path) { return Ask(&IndexMgr::IsPathIndexed, path); }

int FILEIDXIsShareIndexed(const char* shareName) {
  return Ask(&IndexMgr::IsShareIndexed, shareName);
}

}  // extern "C"
