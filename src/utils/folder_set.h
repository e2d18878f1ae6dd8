// The folders a queue reader looks for, looked up by the ancestors of each event's path.
#ifndef FILEINDEX_SRC_UTILS_FOLDER_SET_H_
#define FILEINDEX_SRC_UTILS_FOLDER_SET_H_

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace WEZO {
namespace FILEINDEX {
namespace detail {

// Folder full paths, looked up by the ancestors of an event's path. A path lies in a folder as
// StringStartWith(path + "/", full + "/") says: byte for byte, except that the comparison ends
// at a NUL byte that both hold, so a folder with a NUL in its path is tested on its own.
class FolderSet {
 public:
  explicit FolderSet(const std::vector<std::string>& fullPaths);

  // Bytes of an event's path that the test needs.
  size_t Limit() const { return m_maxSize + 1; }
  size_t Size() const { return m_paths.size(); }

  // Marks in `found` the folders that hold the path (its first `path.size()` bytes of
  // `fullSize`); returns how many of those marked anew are `asked`.
  size_t Mark(std::string_view path, size_t fullSize, const std::vector<bool>& asked,
              std::vector<bool>& found, std::vector<size_t>& marks) const;

 private:
  // A folder path in the table: its key, the path, the folders with that path.
  struct Slot {
    uint64_t key = 0;
    const std::string_view* path = nullptr;
    const std::vector<size_t>* folders = nullptr;
  };

  // The key of the first `size` bytes at `path`: their length and last eight bytes, mixed.
  static uint64_t Key(const char* path, size_t size) {
    uint64_t last = 0;
    const size_t n = std::min<size_t>(size, sizeof last);
    if (n != 0) {  // an empty path may have no bytes at all
      std::memcpy(&last, path + size - n, n);
    }
    return (last ^ (size * 0x9E3779B97F4A7C15ULL)) * 0xBF58476D1CE4E5B9ULL;
  }

  static bool HoldsOdd(const std::string& folder, std::string_view path, size_t fullSize);

  const std::vector<std::string>& m_paths;
  std::unordered_map<std::string_view, std::vector<size_t>> m_byPath;
  std::vector<size_t> m_odd;
  std::vector<char> m_sizes;  // whether some folder's path is this long
  std::vector<Slot> m_table;  // open addressing on Key; at most half full
  unsigned int m_shift = 61;  // a key's top bits choose its slot
  std::string m_common;       // what all folders without a NUL begin with
  size_t m_minSize = 0;
  size_t m_maxSize = 0;
};

}  // namespace detail
}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_UTILS_FOLDER_SET_H_
