// Program execution and service control through systemd.
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <string>
#include <vector>

#include "internal.h"
#include "layout.h"

namespace {

using WEZO::FILEINDEX::kIndexService;
using WEZO::FILEINDEX::kSmbService;
using WEZO::PLATFORM::kErrNotFound;
using WEZO::PLATFORM::kErrProgram;

// Runs `path` with `argv` (null-terminated) and waits for it. 0 when it exited with status 0.
int Spawn(const char* path, const char* const argv[]) {
  // The child starts with every signal at its default and none blocked, whatever the calling
  // process ignores (a caller that ignores SIGPIPE would otherwise hand that on).
  posix_spawnattr_t attr;
  if (posix_spawnattr_init(&attr) != 0) {
    return PLATFORM_FAIL(kErrProgram);
  }
  sigset_t all;
  sigset_t none;
  sigfillset(&all);
  sigemptyset(&none);
  posix_spawnattr_setsigdefault(&attr, &all);
  posix_spawnattr_setsigmask(&attr, &none);
  posix_spawnattr_setflags(&attr, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);

  pid_t pid = -1;
  // posix_spawn does not write to argv; its prototype only predates const.
  const int rc = posix_spawn(&pid, path, nullptr, &attr, const_cast<char* const*>(argv), environ);
  posix_spawnattr_destroy(&attr);
  if (rc != 0) {
    return PLATFORM_FAIL(rc == ENOENT ? kErrNotFound : kErrProgram);
  }
  int status = 0;
  while (waitpid(pid, &status, 0) < 0) {
    if (errno != EINTR) {
      return PLATFORM_FAIL(kErrProgram);
    }
  }
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
    return PLATFORM_FAIL(kErrProgram);
  }
  return 0;
}

// The systemd unit of each service the library controls, and the verb that brings a running
// unit to its current configuration. smbd re-reads smb.conf when reloaded and keeps its clients'
// sessions, which a restart would drop, so Samba is reloaded; reload-or-restart still starts a
// unit that is not running and restarts one that cannot reload.
struct Unit {
  const char* service;
  const char* unit;
  const char* restartVerb;
};
constexpr Unit kUnits[] = {
    {kSmbService, "smbd.service", "reload-or-restart"},
    {kIndexService, "fileindexd.service", "restart"},
};

const Unit* UnitOf(const char* service) {
  if (service == nullptr) {
    return nullptr;
  }
  for (const Unit& unit : kUnits) {
    if (std::strcmp(service, unit.service) == 0) {
      return &unit;
    }
  }
  return nullptr;
}

// systemctl's start and stop leave a running or stopped unit as it is, and the restart verbs
// start a unit that is not running: each verb already has the meaning the service operations
// promise. A null verb is the unit's own restart verb.
int Systemctl(const char* verb, const char* service) {
  const Unit* unit = UnitOf(service);
  if (unit == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  const std::string systemctl = WEZO::PLATFORM::Rooted("/usr/bin/systemctl");
  const char* const argv[] = {systemctl.c_str(), verb != nullptr ? verb : unit->restartVerb,
                              unit->unit, nullptr};
  return Spawn(systemctl.c_str(), argv) == 0 ? 0 : -1;
}

}  // namespace

extern "C" {

int WLIBCExec(const char* szPath, const char* szArg1, const char* szArg2, const char* szArg3,
              const char* szArg4) {
  if (szPath == nullptr || szPath[0] == '\0') {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  // The first null argument ends the list; the ones after it are not looked at.
  const char* argv[6] = {szPath, szArg1, nullptr, nullptr, nullptr, nullptr};
  if (szArg1 != nullptr) {
    argv[2] = szArg2;
    if (szArg2 != nullptr) {
      argv[3] = szArg3;
      if (szArg3 != nullptr) {
        argv[4] = szArg4;
      }
    }
  }
  return Spawn(szPath, argv);
}

int WLIBCExecv(const char* szPath, const char* const argv[], int /*flags*/) {
  if (szPath == nullptr || szPath[0] == '\0' || argv == nullptr || argv[0] == nullptr) {
    return PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
  }
  return Spawn(szPath, argv);
}

int WLIBServiceStart(const char* szService, int /*flags*/) { return Systemctl("start", szService); }

int WLIBServiceStop(const char* szService, int /*flags*/) { return Systemctl("stop", szService); }

int WLIBServiceRestart(const char* szService) { return Systemctl(nullptr, szService); }

}  // extern "C"
