#include "utils/folder_set.h"

#include <algorithm>
#include <limits>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

namespace {

// Where the next component of `path` that begins at `pos` ends: at a "/" before `scan` bytes, or
// at `size` when `size` is no more than `most`; `std::string_view::npos` otherwise.
size_t NextEnd(const char* path, size_t pos, size_t scan, size_t size, size_t most) {
  for (; pos < scan; ++pos) {  // components are short
    if (path[pos] == '/') {
      return pos;
    }
  }
  return size <= most ? size : std::string_view::npos;
}

}  // namespace

FolderSet::FolderSet(const std::vector<std::string>& fullPaths, const std::vector<bool>& found)
    : m_paths(fullPaths) {
  std::vector<size_t> order;
  for (size_t i = 0; i < m_paths.size(); ++i) {
    if (m_paths[i].find('\0') != std::string::npos) {
      if (!found[i]) {
        m_odd.push_back(i);
      }
    } else {
      order.push_back(i);
    }
  }
  std::stable_sort(order.begin(), order.end(),
                   [this](size_t a, size_t b) { return m_paths[a] < m_paths[b]; });
  for (const size_t i : order) {
    if (m_groups.empty() || m_groups.back().path != m_paths[i]) {
      m_groups.emplace_back();
      m_groups.back().path = m_paths[i];
      m_groups.back().left = false;
    }
    m_groups.back().folders.push_back(i);
    m_groups.back().left = m_groups.back().left || !found[i];
  }
  for (const Group& group : m_groups) {
    m_left += group.left ? 1 : 0;
  }
  Build();
}

void FolderSet::Build() {
  m_built = m_left;
  m_nodes.assign(1, Node{});
  m_common.clear();
  m_minSize = std::numeric_limits<size_t>::max();
  m_maxSize = 0;
  for (const size_t f : m_odd) {
    m_maxSize = std::max(m_maxSize, m_paths[f].size());
  }
  size_t bound = 1;  // nodes at most
  bool first = true;
  for (const Group& group : m_groups) {
    if (!group.left) {
      continue;
    }
    const std::string_view path = group.path;
    if (first) {
      m_common = std::string(path);
      first = false;
    }
    size_t same = 0;
    while (same < m_common.size() && same < path.size() && m_common[same] == path[same]) {
      ++same;
    }
    m_common.resize(same);
    m_minSize = std::min(m_minSize, path.size());
    m_maxSize = std::max(m_maxSize, path.size());
  }
  for (const Group& group : m_groups) {
    if (group.left) {
      bound += 1 + static_cast<size_t>(
                       std::count(group.path.begin() + m_common.size(), group.path.end(), '/'));
    }
  }
  size_t slots = 8;
  m_shift = 61;
  while (slots < 2 * bound) {
    slots *= 2;
    --m_shift;
  }
  m_table.assign(slots, Slot{});
  const size_t common = m_common.size();
  m_starts.assign((size_t{1} << kStartBits) / 64, 0);
  for (size_t g = 0; g < m_groups.size(); ++g) {
    if (!m_groups[g].left) {
      continue;
    }
    const std::string_view path = m_groups[g].path;
    // A path in the folder has the same bytes up to the "/" or the end where the folder ends.
    const uint64_t start = Start(path, common);
    m_starts[start >> 6] |= uint64_t{1} << (start & 63);
    size_t parent = 0;
    for (size_t pos = common;;) {
      const size_t end = NextEnd(path.data(), pos, path.size(), path.size(), path.size());
      parent = Find(parent, path.data(), end, true);
      ++m_nodes[parent].live;
      if (end == path.size()) {
        m_nodes[parent].group = g;
        break;
      }
      pos = end + 1;
    }
  }
}

uint64_t FolderSet::StartOfShort(std::string_view path, size_t from) {
  uint64_t word = 0;
  for (size_t i = 0; i < sizeof word; ++i) {
    const char c = from + i < path.size() ? path[from + i] : '/';
    word |= uint64_t{static_cast<unsigned char>(c)} << (8 * i);
  }
  return word;
}

size_t FolderSet::Find(size_t parent, const char* path, size_t size, bool add) {
  const size_t from = parent == 0 ? m_common.size() : m_nodes[parent].size;
  const uint64_t key = Key(parent, path, size);
  const size_t mask = m_table.size() - 1;
  size_t h = key >> m_shift;
  for (; m_table[h].node != 0; h = (h + 1) & mask) {
    const Slot& slot = m_table[h];
    if (slot.key != key) {
      continue;
    }
    const Node& node = m_nodes[slot.node];
    if (node.parent == parent && node.size == size &&
        (size == from || std::memcmp(node.path + from, path + from, size - from) == 0)) {
      return slot.node;
    }
  }
  if (!add) {
    return 0;
  }
  Node node;
  node.path = path;
  node.size = size;
  node.parent = parent;
  m_nodes.push_back(node);
  m_table[h] = Slot{key, m_nodes.size() - 1};
  return m_nodes.size() - 1;
}

size_t FolderSet::MarkIn(std::string_view path, size_t fullSize, bool in,
                         const std::vector<bool>& asked, std::vector<bool>& found,
                         std::vector<size_t>& marks) {
  size_t marked = 0;
  size_t newly = 0;
  const auto mark = [&](size_t f) {
    if (!found[f]) {
      found[f] = true;
      marks.push_back(f);
      marked += asked[f] ? 1 : 0;
    }
  };
  // Walk the path's components from the common start down the nodes, while some folder is left
  // under the one reached.
  if (in) {
    const size_t scan = std::min(fullSize, m_maxSize + 1);
    size_t parent = 0;
    for (size_t pos = m_common.size();;) {
      const size_t end = NextEnd(path.data(), pos, scan, fullSize, m_maxSize);
      const size_t node = end == std::string_view::npos ? 0 : Find(parent, path.data(), end, false);
      if (node == 0 || m_nodes[node].live == 0) {
        break;
      }
      const size_t g = m_nodes[node].group;
      if (g != kNone && m_groups[g].left) {
        for (const size_t f : m_groups[g].folders) {
          mark(f);
        }
        m_groups[g].left = false;
        --m_left;
        ++newly;
        for (size_t n = node; n != 0; n = m_nodes[n].parent) {
          --m_nodes[n].live;
        }
      }
      if (end == fullSize) {
        break;
      }
      parent = node;
      pos = end + 1;
    }
  }
  for (size_t i = 0; i < m_odd.size();) {
    if (HoldsOdd(m_paths[m_odd[i]], path, fullSize)) {
      mark(m_odd[i]);
      m_odd.erase(m_odd.begin() + static_cast<std::ptrdiff_t>(i));
    } else {
      ++i;
    }
  }
  // Rebuilt once half the groups are found: the common start and the lengths then only cover
  // folders left, at a cost that stays in proportion to the folders.
  if (newly != 0 && 2 * m_left <= m_built) {
    Build();
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
