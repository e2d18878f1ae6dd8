// The folders a queue reader looks for, looked up by the ancestors of each event's path.
#ifndef FILEINDEX_SRC_UTILS_FOLDER_SET_H_
#define FILEINDEX_SRC_UTILS_FOLDER_SET_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <vector>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Folder full paths, looked up by the ancestors of an event's path. A path lies in a folder as
// StringStartWith(path + "/", full + "/") says: byte for byte, except that the comparison ends
// at a NUL byte that both hold, so a folder with a NUL in its path is tested on its own.
// Only the folders not found yet are looked for: a folder found costs nothing afterwards.
class FolderSet {
 public:
  // `found` tells the folders that need no looking for.
  FolderSet(const std::vector<std::string>& fullPaths, const std::vector<bool>& found);

  // Bytes of an event's path that the test needs; it never grows.
  size_t Limit() const { return m_maxSize + 1; }

  // Marks in `found` the folders that hold the path (its first `path.size()` bytes of
  // `fullSize`, at least Limit() of them when it has that many) and appends them to `marks`;
  // returns how many of those marked anew are `asked`.
  size_t Mark(std::string_view path, size_t fullSize, const std::vector<bool>& asked,
              std::vector<bool>& found, std::vector<size_t>& marks) {
    const bool in = MayHold(path, fullSize);
    if (!in && m_odd.empty()) {
      return 0;
    }
    return MarkIn(path, fullSize, in, asked, found, marks);
  }

  // Whether Mark would surely mark nothing for the path, known without a call.
  bool Dismisses(std::string_view path, size_t fullSize) const {
    return !MayHold(path, fullSize) && m_odd.empty();
  }

 private:
  // Most paths are too short for every folder left, do not begin with their common start or go on
  // from it as none of them does.
  bool MayHold(std::string_view path, size_t fullSize) const {
    return fullSize >= m_minSize && EndsCommon(path) && StartLeft(path) && InCommon(path);
  }

  // Whether the path may begin as the folders' common start: its last eight bytes, where
  // siblings differ, or all of a shorter one. The path has at least m_minSize bytes.
  bool EndsCommon(std::string_view path) const {
    const size_t n = m_common.size();
    if (n < sizeof(uint64_t)) {
      return std::equal(m_common.begin(), m_common.end(), path.begin());
    }
    return Load(path.data() + n - sizeof(uint64_t)) == Load(m_common.data() + n - sizeof(uint64_t));
  }
  // Whether it does, once EndsCommon said so: the rest a word at a time.
  bool InCommon(std::string_view path) const {
    const char* a = path.data();
    const char* b = m_common.data();
    for (size_t n = m_common.size(); n > sizeof(uint64_t); n -= sizeof(uint64_t)) {
      if (Load(a) != Load(b)) {
        return false;
      }
      a += sizeof(uint64_t);
      b += sizeof(uint64_t);
    }
    return true;
  }
  // Whether the eight bytes after the common start, up to the first "/" (that ends what is past
  // the path's end), can begin a folder left; a bit for each begin, by its hash.
  bool StartLeft(std::string_view path) const {
    const uint64_t start = Start(path, m_common.size());
    return (m_starts[start >> 6] >> (start & 63) & 1) != 0;
  }
  static uint64_t Start(std::string_view path, size_t from) {
    uint64_t word = 0;
    if (path.size() >= from + sizeof word) {
      std::memcpy(&word, path.data() + from, sizeof word);
#if defined(__BYTE_ORDER__) && __BYTE_ORDER__ == __ORDER_BIG_ENDIAN__
      word = __builtin_bswap64(word);  // the first byte lowest
#endif
    } else {
      word = StartOfShort(path, from);
    }
    // `slash` has the top bit of each byte that is "/"; the bytes after the first are left out.
    constexpr uint64_t kOnes = 0x0101010101010101ULL;
    constexpr uint64_t kLow = 0x7F7F7F7F7F7F7F7FULL;
    const uint64_t other = word ^ ('/' * kOnes);  // 0 where "/"
    const uint64_t slash = ~(((other & kLow) + kLow) | other | kLow);
    const uint64_t first = slash & (~slash + 1);  // the first one's bit; 0 for none
    word &= (first << 1) - 1;                     // all bytes when none or the last is "/"
    return (word * 0x9E3779B97F4A7C15ULL) >> (64 - kStartBits);
  }
  static uint64_t StartOfShort(std::string_view path, size_t from);
  static constexpr unsigned int kStartBits = 16;
  static uint64_t Load(const char* at) {
    uint64_t word;
    std::memcpy(&word, at, sizeof word);
    return word;
  }

  // Folders with the same path.
  struct Group {
    std::string_view path;
    std::vector<size_t> folders;
    bool left = true;  // some of them not found yet
  };
  // An ancestor of a folder left, or the folder itself: the first `size` bytes of `path`, which
  // end where the path ends or before a "/". Its parent is the one before it (0 for the common
  // start).
  struct Node {
    const char* path = nullptr;
    size_t size = 0;
    size_t parent = 0;
    size_t live = 0;  // folders left at or under it
    size_t group = kNone;
  };
  struct Slot {
    uint64_t key = 0;
    size_t node = 0;  // 0 for an empty slot
  };
  static constexpr size_t kNone = ~size_t{0};

  // The key of a node: the parent, the length and the eight bytes before its end, mixed.
  static uint64_t Key(size_t parent, const char* path, size_t size) {
    uint64_t last = 0;
    const size_t n = size < sizeof last ? size : sizeof last;
    if (n != 0) {  // an empty path may have no bytes at all
      std::memcpy(&last, path + size - n, n);
    }
    return ((last ^ (size * 0x9E3779B97F4A7C15ULL)) + parent * 0xD6E8FEB86659FD93ULL) *
           0xBF58476D1CE4E5B9ULL;
  }

  // `in`: the path is long enough and begins with the common start.
  size_t MarkIn(std::string_view path, size_t fullSize, bool in, const std::vector<bool>& asked,
                std::vector<bool>& found, std::vector<size_t>& marks);
  // Builds the nodes and their table for the groups left.
  void Build();
  // The node of the first `size` bytes of `path` under `parent`, or 0; with `add`, made if missing.
  size_t Find(size_t parent, const char* path, size_t size, bool add);
  static bool HoldsOdd(const std::string& folder, std::string_view path, size_t fullSize);

  const std::vector<std::string>& m_paths;
  std::vector<Group> m_groups;     // the folders without a NUL, by path
  std::vector<size_t> m_odd;       // the folders with a NUL, not found yet
  std::vector<Node> m_nodes;       // the common start first
  std::vector<Slot> m_table;       // open addressing on Key; at most half full
  std::vector<uint64_t> m_starts;  // the hashes of how folders left begin, see StartLeft
  unsigned int m_shift = 61;       // a key's top bits choose its slot
  size_t m_left = 0;               // groups left
  size_t m_built = 0;              // groups left when the nodes were built
  std::string m_common;            // what all groups left begin with
  size_t m_minSize = 0;            // the shortest path of a group left
  size_t m_maxSize = 0;            // the longest path of a folder left, at most
};

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_FOLDER_SET_H_
