#include "utils/folder_set.h"

#include <algorithm>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

FolderSet::FolderSet(const std::vector<std::string>& fullPaths) : m_paths(fullPaths) {
  for (size_t i = 0; i < m_paths.size(); ++i) {
    const std::string& path = m_paths[i];
    if (path.find('\0') != std::string::npos) {
      m_odd.push_back(i);
      continue;
    }
    m_byPath[path].push_back(i);
    if (m_byPath.size() == 1) {
      m_common = path;
      m_minSize = path.size();
    }
    size_t same = 0;
    while (same < m_common.size() && same < path.size() && m_common[same] == path[same]) {
      ++same;
    }
    m_common.resize(same);
    m_minSize = std::min(m_minSize, path.size());
    m_maxSize = std::max(m_maxSize, path.size());
    if (m_sizes.size() <= path.size()) {
      m_sizes.resize(path.size() + 1, 0);
    }
    m_sizes[path.size()] = 1;
  }
  for (const size_t i : m_odd) {
    m_maxSize = std::max(m_maxSize, m_paths[i].size());
  }
  m_sizes.resize(m_maxSize + 1, 0);
  size_t slots = 8;
  m_shift = 61;
  while (slots < 2 * m_byPath.size()) {
    slots *= 2;
    --m_shift;
  }
  m_table.resize(slots);
  for (const auto& entry : m_byPath) {
    const uint64_t key = Key(entry.first.data(), entry.first.size());
    size_t h = key >> m_shift;
    while (m_table[h].folders != nullptr) {
      h = (h + 1) & (slots - 1);
    }
    m_table[h] = Slot{key, &entry.first, &entry.second};
  }
}

// Marks in `found` the folders that hold the path (its first `path.size()` bytes of
// `fullSize`); returns how many of those marked anew are `asked`.
size_t FolderSet::Mark(std::string_view path, size_t fullSize, const std::vector<bool>& asked,
                       std::vector<bool>& found, std::vector<size_t>& marks) const {
  size_t marked = 0;
  const size_t upto = std::min(fullSize, m_maxSize);
  // Every folder begins with the folders' common start; then only the ends of the path's
  // components can be folders.
  // Siblings differ near the end of the common start, so its last byte is looked at first.
  const size_t common = m_common.size();
  if (!m_byPath.empty() && fullSize >= m_minSize &&
      (common == 0 || (path[common - 1] == m_common[common - 1] &&
                       std::memcmp(path.data(), m_common.data(), common) == 0))) {
    for (size_t end = m_minSize; end <= upto; ++end) {
      if (m_sizes[end] == 0 || (end != fullSize && path[end] != '/')) {
        continue;
      }
      const uint64_t key = Key(path.data(), end);
      for (size_t h = key >> m_shift; m_table[h].folders != nullptr;
           h = (h + 1) & (m_table.size() - 1)) {
        const Slot& slot = m_table[h];
        if (slot.key != key) {
          continue;
        }
        // A path already found needs no comparing.
        const std::vector<size_t>& folders = *slot.folders;
        if (std::all_of(folders.begin(), folders.end(), [&found](size_t f) { return found[f]; }) ||
            slot.path->size() != end ||
            (end != 0 && std::memcmp(slot.path->data(), path.data(), end) != 0)) {
          continue;
        }
        for (const size_t f : folders) {
          if (!found[f]) {
            found[f] = true;
            marks.push_back(f);
            marked += asked[f] ? 1 : 0;
          }
        }
      }
    }
  }
  for (const size_t f : m_odd) {
    if (!found[f] && HoldsOdd(m_paths[f], path, fullSize)) {
      found[f] = true;
      marks.push_back(f);
      marked += asked[f] ? 1 : 0;
    }
  }
  return marked;
}

bool FolderSet::HoldsOdd(const std::string& folder, std::string_view path, size_t fullSize) {
  if (folder.size() > fullSize) {
    return false;
  }
  for (size_t i = 0; i <= folder.size(); ++i) {
    const char want = i < folder.size() ? folder[i] : '/';
    const char have = i < fullSize ? path[i] : '/';
    if (have != want) {
      return false;
    }
    if (have == '\0') {
      return true;
    }
  }
  return true;
}

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO
