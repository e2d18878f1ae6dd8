// The monitor's event loop: watches every directory of every registration with inotify (one
// watch per directory), turns the kernel's events into queue lines and appends them to each
// registration's queue. Single-threaded; one Watcher per process.
#ifndef WEZO_WEZOTIFYD_WATCHER_H_
#define WEZO_WEZOTIFYD_WATCHER_H_

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "registry.h"
#include "unique_fd.h"

namespace WEZO {
namespace WEZOTIFYD {

class Watcher {
 public:
  // Called with a registration's queue when events for it may have been lost, so that its share
  // is indexed again from scratch; `why` is for the log.
  using LostEvents = std::function<void(const std::string& queue, const std::string& why)>;

  Watcher(std::string registryDir, LostEvents lost);

  // Creates the registry folder if needed, reads the registrations and watches their folders.
  // False, with a line on stderr, when inotify cannot be set up.
  bool Start();

  // Serves events until `stopFd` becomes readable. Returns the process's exit status.
  int Run(int stopFd);

 private:
  struct PendingMove {
    std::string path;
    bool isDir;
  };

  void Reload();
  void Resync();
  void WatchTree(const std::string& top, bool reportEntries, std::unordered_set<std::string>* seen);
  void AddWatch(const std::string& dir);
  void Unwatch(const std::string& top);
  void MoveWatches(const std::string& from, const std::string& to);
  bool InAnyTree(const std::string& path) const;

  void ReadRegistryEvents();
  void ReadTreeEvents();
  void Handle(int wd, uint32_t mask, uint32_t cookie, const std::string& name);
  void FlushMoves();
  void MovedAway(const PendingMove& move);
  void Renamed(const PendingMove& move, const std::string& to);
  void MovedIn(const std::string& path, bool isDir);
  void Emit(uint32_t event, const std::string& path, uint32_t filterBit);
  void ClearFlags();
  void Flag(Registration& registration, const std::string& why);
  void Flush();

  std::string m_registryDir;
  LostEvents m_lost;
  FILEINDEX::UniqueFd m_tree;      // inotify instance of the watched folders
  FILEINDEX::UniqueFd m_registry;  // inotify instance of the registry
  std::vector<Registration> m_registrations;
  uint32_t m_mask = 0;
  std::unordered_map<int, std::string> m_wdPath;
  std::map<std::string, int> m_pathWd;      // ordered, so that a folder's subtree is one range
  std::map<uint32_t, PendingMove> m_moves;  // IN_MOVED_FROM waiting for its IN_MOVED_TO
  std::map<std::string, std::vector<std::string>> m_lines;  // queue -> lines not yet appended
};

}  // namespace WEZOTIFYD
}  // namespace WEZO

#endif  // WEZO_WEZOTIFYD_WATCHER_H_
