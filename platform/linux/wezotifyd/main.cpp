// The platform's file-change monitor: serves the registrations that clients write under
// var/lib/wezotifyd, appending one JSON line per file-system event to each registration's queue.
// A registration whose events may have been lost gets its share flagged for a full reindex
// through the indexing library. Runs in the foreground until SIGTERM or SIGINT.
#include <sys/signalfd.h>

#include <CLI/CLI.hpp>
#include <csignal>
#include <cstdio>
#include <exception>
#include <string>

#include "fileindex/root.h"
#include "fileindex/status_mgr.h"
#include "fileindex/utils.h"
#include "unique_fd.h"
#include "watcher.h"

namespace {

void FlagForReindex(const std::string& queue, const std::string& /*why*/) {
  std::string share;
  std::string sharePath;
  if (!WEZO::FILEINDEX::GetShareNamePathByFullPath(share, sharePath, queue) ||
      !WEZO::FILEINDEX::StatusMgr::ShareSetNeedReindex(share, true)) {
    (void)std::fprintf(stderr, "wezotifyd: cannot flag the share of %s for a reindex\n",
                       queue.c_str());
  }
}

int Run(int argc, char** argv) {
  std::string root;
  CLI::App app{
      "Watches the folders registered under var/lib/wezotifyd and appends their "
      "file-system events to the registered queues"};
  app.add_option("--root", root, "run under the sandbox root DIR instead of /");
  CLI11_PARSE(app, argc, argv);
  // The library's own prefix, so that the registry and the status file it flags resolve alike.
  if (!WEZO::FILEINDEX::SetRootPrefix(root)) {
    (void)std::fprintf(stderr, "wezotifyd: --root must be an absolute path\n");
    return 2;
  }

  sigset_t stop;
  sigemptyset(&stop);
  sigaddset(&stop, SIGTERM);
  sigaddset(&stop, SIGINT);
  sigprocmask(SIG_BLOCK, &stop, nullptr);
  const WEZO::FILEINDEX::UniqueFd stopFd(signalfd(-1, &stop, SFD_CLOEXEC));
  if (!stopFd) {
    std::perror("wezotifyd: signalfd");
    return 1;
  }

  WEZO::WEZOTIFYD::Watcher watcher(WEZO::FILEINDEX::GetRootPrefix() + "/var/lib/wezotifyd",
                                   FlagForReindex);
  if (!watcher.Start()) {
    return 1;
  }
  return watcher.Run(stopFd.get());
}

}  // namespace

int main(int argc, char** argv) {
  (void)std::setvbuf(stderr, nullptr, _IOLBF, 0);
  try {
    return Run(argc, argv);
  } catch (const std::exception& e) {
    (void)std::fprintf(stderr, "wezotifyd: %s\n", e.what());
    return 1;
  }
}
