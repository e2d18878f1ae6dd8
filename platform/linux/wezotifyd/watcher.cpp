#include "watcher.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <memory>
#include <utility>

#include "json_io.h"
#include "queue_writer.h"

namespace WEZO {
namespace WEZOTIFYD {
namespace {

// What every watch needs to keep the set of watched folders right, whatever the clients ask for.
constexpr uint32_t kStructural = IN_CREATE | IN_MOVED_FROM | IN_MOVED_TO | IN_DELETE_SELF;
constexpr uint32_t kRegistryMask = IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO |
                                   IN_CLOSE_WRITE | IN_DELETE_SELF | IN_ONLYDIR;
// An IN_MOVED_FROM that ends the events read so far waits this long for its IN_MOVED_TO.
constexpr int kMovePairMs = 20;

void Log(const std::string& line) { (void)std::fprintf(stderr, "wezotifyd: %s\n", line.c_str()); }

std::string Line(uint32_t event, const std::string& path, const std::string& pathOld) {
  Json::Value entry(Json::objectValue);
  entry["event"] = event;
  entry["path"] = path;
  if (!pathOld.empty()) {
    entry["path_old"] = pathOld;
  }
  return FILEINDEX::JsonToString(entry) + "\n";
}

bool IsDirAt(int dirFd, const dirent& entry) {
  if (entry.d_type != DT_UNKNOWN) {
    return entry.d_type == DT_DIR;
  }
  struct stat st {};
  return fstatat(dirFd, entry.d_name, &st, AT_SYMLINK_NOFOLLOW) == 0 && S_ISDIR(st.st_mode);
}

// Reads every event the inotify descriptor `fd` holds now and hands each to `handle` with its
// name ("" when it has none).
template <typename Handle>
void DrainEvents(int fd, Handle handle) {
  alignas(inotify_event) char buffer[65536];
  for (;;) {
    const ssize_t got = read(fd, buffer, sizeof buffer);
    if (got <= 0) {
      return;
    }
    for (ssize_t at = 0; at < got;) {
      const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
      handle(*event, event->len > 0 ? std::string(event->name) : std::string());
      at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
    }
  }
}

}  // namespace

Watcher::Watcher(std::string registryDir, LostEvents lost)
    : m_registryDir(std::move(registryDir)), m_lost(std::move(lost)) {}

bool Watcher::Start() {
  m_tree = FILEINDEX::UniqueFd(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  m_registry = FILEINDEX::UniqueFd(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!m_tree || !m_registry) {
    Log(std::string("cannot set up inotify: ") + std::strerror(errno));
    return false;
  }
  std::string dir;
  for (size_t start = 1; start <= m_registryDir.size(); ++start) {
    if (start == m_registryDir.size() || m_registryDir[start] == '/') {
      dir = m_registryDir.substr(0, start);
      (void)mkdir(dir.c_str(), 0755);
    }
  }
  if (inotify_add_watch(m_registry.get(), m_registryDir.c_str(), kRegistryMask) < 0) {
    Log("cannot watch the registry " + m_registryDir + ": " + std::strerror(errno));
    return false;
  }
  Reload();
  return true;
}

int Watcher::Run(int stopFd) {
  for (;;) {
    pollfd fds[] = {{stopFd, POLLIN, 0}, {m_registry.get(), POLLIN, 0}, {m_tree.get(), POLLIN, 0}};
    const int ready = poll(fds, 3, m_moves.empty() ? -1 : kMovePairMs);
    if (ready < 0 && errno != EINTR) {
      Log(std::string("poll failed: ") + std::strerror(errno));
      return 1;
    }
    if (fds[0].revents != 0) {
      return 0;
    }
    if (ready == 0) {
      FlushMoves();  // no IN_MOVED_TO came in time: they left the watched folders
    }
    if (fds[2].revents != 0) {
      ReadTreeEvents();
    }
    Flush();
    if (fds[1].revents != 0) {
      ReadRegistryEvents();
    }
  }
}

void Watcher::Reload() {
  std::vector<std::string> problems;
  m_registrations = LoadRegistry(m_registryDir, problems);
  for (const std::string& problem : problems) {
    Log(problem);
  }
  // Each client's folder is watched for its registrations coming and going.
  const std::unique_ptr<DIR, int (*)(DIR*)> clients(opendir(m_registryDir.c_str()), closedir);
  while (const dirent* entry = clients ? readdir(clients.get()) : nullptr) {
    const std::string name = entry->d_name;
    if (name != "." && name != ".." && IsDirAt(dirfd(clients.get()), *entry)) {
      (void)inotify_add_watch(m_registry.get(), (m_registryDir + "/" + name).c_str(),
                              kRegistryMask | IN_DONT_FOLLOW);
    }
  }
  Resync();
}

// Brings the watches in line with the registrations: every folder of every tree is watched with
// the union of the classes asked for; folders no tree holds any more are let go.
void Watcher::Resync() {
  ClearFlags();
  m_mask = kStructural;
  for (const Registration& registration : m_registrations) {
    for (const Tree& tree : registration.trees) {
      m_mask |= tree.mask & IN_ALL_EVENTS;
    }
  }
  std::unordered_set<std::string> seen;
  for (const Registration& registration : m_registrations) {
    for (const Tree& tree : registration.trees) {
      WatchTree(tree.path, false, &seen);
    }
  }
  for (auto it = m_pathWd.begin(); it != m_pathWd.end();) {
    if (seen.count(it->first) != 0) {
      ++it;
      continue;
    }
    (void)inotify_rm_watch(m_tree.get(), it->second);
    m_wdPath.erase(it->second);
    it = m_pathWd.erase(it);
  }
  size_t trees = 0;
  for (const Registration& registration : m_registrations) {
    trees += registration.trees.size();
  }
  Log("watching " + std::to_string(m_pathWd.size()) + " directories of " + std::to_string(trees) +
      " folders for " + std::to_string(m_registrations.size()) + " queues");
}

// Watches `top` and every folder below it that a tree holds. The watch is set before the folder
// is listed, so an entry made in between is reported by the kernel or found by the listing;
// with `reportEntries` the entries found are reported as created.
void Watcher::WatchTree(const std::string& top, bool reportEntries,
                        std::unordered_set<std::string>* seen) {
  std::vector<std::string> stack{top};
  while (!stack.empty()) {
    const std::string dir = std::move(stack.back());
    stack.pop_back();
    if (seen != nullptr && !seen->insert(dir).second) {
      continue;
    }
    AddWatch(dir);
    const int fd = open(dir.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
    if (fd < 0) {
      continue;
    }
    const std::unique_ptr<DIR, int (*)(DIR*)> stream(fdopendir(fd), closedir);
    if (!stream) {
      close(fd);
      continue;
    }
    while (const dirent* entry = readdir(stream.get())) {
      const std::string name = entry->d_name;
      if (name == "." || name == "..") {
        continue;
      }
      std::string path = dir + "/";
      path += name;
      if (!InAnyTree(path)) {
        continue;
      }
      if (reportEntries) {
        Emit(IN_CREATE, path, IN_CREATE);
      }
      if (IsDirAt(fd, *entry)) {
        stack.push_back(path);
      }
    }
  }
}

void Watcher::AddWatch(const std::string& dir) {
  const int wd = inotify_add_watch(m_tree.get(), dir.c_str(),
                                   m_mask | IN_ONLYDIR | IN_DONT_FOLLOW | IN_EXCL_UNLINK);
  if (wd < 0) {
    if (errno == ENOSPC || errno == ENOMEM) {
      const std::string why = "cannot watch " + dir + ": " + std::strerror(errno) +
                              " (fs.inotify.max_user_watches reached)";
      for (Registration& registration : m_registrations) {
        if (registration.TreeOf(dir) != nullptr) {
          Flag(registration, why);
        }
      }
    }
    return;  // a folder that is gone or not a folder any more needs no watch
  }
  const auto known = m_wdPath.find(wd);
  if (known != m_wdPath.end() && known->second != dir) {
    m_pathWd.erase(known->second);
  }
  m_wdPath[wd] = dir;
  m_pathWd[dir] = wd;
}

// Lets go of `top` and every watched folder below it.
void Watcher::Unwatch(const std::string& top) {
  auto it = m_pathWd.lower_bound(top);
  while (it != m_pathWd.end() && it->first.compare(0, top.size(), top) == 0 &&
         (it->first.size() == top.size() || it->first[top.size()] == '/')) {
    (void)inotify_rm_watch(m_tree.get(), it->second);
    m_wdPath.erase(it->second);
    it = m_pathWd.erase(it);
  }
}

// A watched folder was renamed: its watches stay, under their new paths.
void Watcher::MoveWatches(const std::string& from, const std::string& to) {
  std::vector<std::pair<std::string, int>> moved;
  auto it = m_pathWd.lower_bound(from);
  while (it != m_pathWd.end() && it->first.compare(0, from.size(), from) == 0 &&
         (it->first.size() == from.size() || it->first[from.size()] == '/')) {
    moved.emplace_back(to + it->first.substr(from.size()), it->second);
    it = m_pathWd.erase(it);
  }
  for (const auto& entry : moved) {
    m_pathWd[entry.first] = entry.second;
    m_wdPath[entry.second] = entry.first;
  }
}

bool Watcher::InAnyTree(const std::string& path) const {
  return std::any_of(m_registrations.begin(), m_registrations.end(),
                     [&](const Registration& r) { return r.TreeOf(path) != nullptr; });
}

void Watcher::ReadRegistryEvents() {
  bool changed = false;
  DrainEvents(m_registry.get(), [&](const inotify_event& event, const std::string& name) {
    // A writer's temporary files come and go without changing a registration.
    changed = changed || (event.mask & (IN_ISDIR | IN_Q_OVERFLOW | IN_DELETE_SELF)) != 0 ||
              (name.size() > 5 && name.compare(name.size() - 5, 5, ".json") == 0);
  });
  if (changed) {
    Reload();
  }
}

void Watcher::ReadTreeEvents() {
  ClearFlags();
  DrainEvents(m_tree.get(), [&](const inotify_event& event, const std::string& name) {
    Handle(event.wd, event.mask, event.cookie, name);
  });
}

void Watcher::Handle(int wd, uint32_t mask, uint32_t cookie, const std::string& name) {
  // The kernel queues the halves of a rename one after the other: an IN_MOVED_FROM followed by
  // anything but its IN_MOVED_TO was a move out of the watched folders. Ending it here keeps the
  // lines in the order of the changes.
  if (!m_moves.empty() && ((mask & IN_MOVED_TO) == 0 || m_moves.count(cookie) == 0)) {
    FlushMoves();
  }
  if ((mask & IN_Q_OVERFLOW) != 0) {
    for (Registration& registration : m_registrations) {
      Flag(registration, "the kernel's event queue overflowed (fs.inotify.max_queued_events)");
    }
    Resync();  // folders made while events were dropped have no watch yet
    return;
  }
  const auto known = m_wdPath.find(wd);
  if (known == m_wdPath.end()) {
    return;
  }
  const std::string dir = known->second;
  if ((mask & IN_IGNORED) != 0) {
    m_pathWd.erase(dir);
    m_wdPath.erase(known);
    return;
  }
  const bool isDir = (mask & IN_ISDIR) != 0;
  const std::string path = name.empty() ? dir : dir + "/" + name;
  if ((mask & IN_MOVED_FROM) != 0) {
    m_moves[cookie] = PendingMove{path, isDir};
    return;
  }
  if ((mask & IN_MOVED_TO) != 0) {
    const auto from = m_moves.find(cookie);
    if (from == m_moves.end()) {
      MovedIn(path, isDir);
    } else {
      Renamed(from->second, path);
      m_moves.erase(from);
    }
    return;
  }
  if (name.empty()) {
    // The parent's watch reports the same change of a folder with the folder's name; only a
    // tree's own folder, whose parent is not watched, is reported from its own watch.
    for (Registration& registration : m_registrations) {
      const Tree* tree = registration.TreeOf(path);
      if (tree == nullptr || tree->path != path) {
        continue;
      }
      for (uint32_t bit = 1; bit <= IN_MOVE_SELF; bit <<= 1) {
        if ((mask & tree->mask & bit) != 0) {
          m_lines[registration.queue].push_back(Line(bit, path, ""));
        }
      }
    }
    return;
  }
  for (uint32_t bit = 1; bit <= IN_DELETE; bit <<= 1) {
    if ((mask & bit) != 0) {
      Emit(bit, path, bit);
    }
  }
  if (isDir && (mask & IN_CREATE) != 0 && InAnyTree(path)) {
    WatchTree(path, true, nullptr);
  }
}

void Watcher::FlushMoves() {
  for (const auto& move : m_moves) {
    MovedAway(move.second);
  }
  m_moves.clear();
}

void Watcher::MovedAway(const PendingMove& move) {
  if (move.isDir) {
    Unwatch(move.path);
  }
  Emit(IN_MOVED_FROM, move.path, IN_MOVED_FROM);
}

void Watcher::MovedIn(const std::string& path, bool isDir) {
  Emit(IN_CREATE, path, IN_MOVED_TO);
  if (isDir && InAnyTree(path)) {
    WatchTree(path, false, nullptr);
  }
}

void Watcher::Renamed(const PendingMove& move, const std::string& to) {
  for (Registration& registration : m_registrations) {
    const Tree* before = registration.TreeOf(move.path);
    const Tree* after = registration.TreeOf(to);
    if (before != nullptr && after != nullptr) {
      if ((after->mask & IN_MOVED_TO) != 0) {
        m_lines[registration.queue].push_back(Line(IN_CREATE, to, move.path));
      }
    } else if (before != nullptr) {
      if ((before->mask & IN_MOVED_FROM) != 0) {
        m_lines[registration.queue].push_back(Line(IN_MOVED_FROM, move.path, ""));
      }
    } else if (after != nullptr && (after->mask & IN_MOVED_TO) != 0) {
      m_lines[registration.queue].push_back(Line(IN_CREATE, to, ""));
    }
  }
  if (!move.isDir) {
    return;
  }
  if (!InAnyTree(to)) {
    Unwatch(move.path);
  } else if (m_pathWd.count(move.path) != 0) {
    MoveWatches(move.path, to);
  } else {
    WatchTree(to, false, nullptr);
  }
}

// Queues the line of `event` for `path` for every registration whose tree holds the path and
// asks for `filterBit`.
void Watcher::Emit(uint32_t event, const std::string& path, uint32_t filterBit) {
  for (Registration& registration : m_registrations) {
    const Tree* tree = registration.TreeOf(path);
    if (tree != nullptr && (tree->mask & filterBit) != 0) {
      m_lines[registration.queue].push_back(Line(event, path, ""));
    }
  }
}

// A share is flagged at most once per batch of events or resync: a watch limit reached fails
// every folder that follows.
void Watcher::ClearFlags() {
  for (Registration& registration : m_registrations) {
    registration.flagged = false;
  }
}

void Watcher::Flag(Registration& registration, const std::string& why) {
  if (registration.flagged) {
    return;
  }
  registration.flagged = true;
  Log(why + "; queue " + registration.queue + " needs a full reindex");
  m_lost(registration.queue, why);
}

void Watcher::Flush() {
  for (const auto& queue : m_lines) {
    switch (AppendLines(queue.first, queue.second)) {
      case AppendResult::kWritten:
        break;
      case AppendResult::kRefused:
        Log("cannot append to queue " + queue.first + ": " + std::strerror(errno));
        break;
      case AppendResult::kLost:
        Log("lost events of queue " + queue.first + ": " + std::strerror(errno));
        m_lost(queue.first, "events could not be appended");
        break;
    }
  }
  m_lines.clear();
}

}  // namespace WEZOTIFYD
}  // namespace WEZO
