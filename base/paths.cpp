#include "paths.h"

#include "fileindex/root.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

std::string& Root() {
  static std::string root;
  return root;
}

}  // namespace

bool SetRootPrefix(const std::string& root) {
  if (root.find('\0') != std::string::npos || (!root.empty() && root.front() != '/')) {
    return false;
  }
  std::string trimmed = root;
  while (!trimmed.empty() && trimmed.back() == '/') {
    trimmed.pop_back();
  }
  Root() = trimmed;
  return true;
}

std::string GetRootPrefix() { return Root(); }

std::string RootedPath(const char* fixedPath) { return Root() + fixedPath; }

}  // namespace FILEINDEX
}  // namespace WEZO
