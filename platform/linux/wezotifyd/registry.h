// The registrations the monitor serves, as its clients wrote them under
// var/lib/wezotifyd/<client>/<encoded queue path>.json.
#ifndef WEZO_WEZOTIFYD_REGISTRY_H_
#define WEZO_WEZOTIFYD_REGISTRY_H_

#include <cstdint>
#include <set>
#include <string>
#include <vector>

namespace WEZO {
namespace WEZOTIFYD {

// One watched folder of a registration: everything below `path` except entries named in `ignore`
// (at any depth) and what lies below them.
struct Tree {
  std::string path;   // absolute, without a trailing slash
  uint32_t mask = 0;  // the event classes the client wants (inotify's IN_* bits)
  std::set<std::string> ignore;
};

struct Registration {
  std::string file;   // the registration file, for the log
  std::string queue;  // where the events go
  std::vector<Tree> trees;
  bool flagged = false;  // already sent for a full reindex in this batch of events

  // The first tree that holds `path` (a tree's own folder counts), or nullptr.
  const Tree* TreeOf(const std::string& path) const;
};

// Reads every registration below `registryDir`; files that cannot be read or are malformed are
// reported in `problems` (one line each) and skipped. Registrations of different clients for one
// queue are all kept.
std::vector<Registration> LoadRegistry(const std::string& registryDir,
                                       std::vector<std::string>& problems);

}  // namespace WEZOTIFYD
}  // namespace WEZO

#endif  // WEZO_WEZOTIFYD_REGISTRY_H_
