// The service's state: status, pause, resume, migrate; and the one way a change command calls
// the library.
#include <CLI/CLI.hpp>
#include <algorithm>
#include <ctime>
#include <iostream>
#include <memory>

#include "commands.h"

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

int RunCall(const Context& ctx, const std::string& what, const Steps& steps,
            const std::function<bool()>& operation,
            const std::function<std::vector<Change>()>& describe, const std::string& noCode) {
  // The checks before the call may have left a code; a failure must show the call's own.
  fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_NONE);
  LibraryCall call(ctx.verbose);
  const bool ok = operation();
  call.Stop();
  if (ok) {
    return ctx.out.Done(describe());
  }
  const Aftermath aftermath = Diagnose(call, steps, describe());
  return ctx.out.Fail(what, noCode, &aftermath);
}

bool IsListed(const std::string& path, const std::vector<fi::Folder>& folders) {
  return std::any_of(folders.begin(), folders.end(),
                     [&](const fi::Folder& folder) { return folder.GetPath() == path; });
}

namespace {

// A Unix time as "2026-11-21 14:00:00 UTC".
std::string UtcTime(long long seconds) {
  const auto t = static_cast<std::time_t>(seconds);
  std::tm parts{};
  char text[64];
  if (gmtime_r(&t, &parts) == nullptr ||
      std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S UTC", &parts) == 0) {
    return std::to_string(seconds);
  }
  return text;
}

std::string PauseText(long long resumeTime) {
  if (resumeTime < 0) {
    return "no";
  }
  if (resumeTime == 0) {
    return "until resumed";
  }
  return "until " + UtcTime(resumeTime) + " (" + std::to_string(resumeTime) + ")";
}

// Nothing is processed while the daemon is away, whatever the queues hold.
std::string Shown(const std::string& status, bool daemonAnswers) {
  return status == "processing" && !daemonAnswers ? "stalled" : status;
}

int RunStatus(const Context& ctx, const std::vector<std::string>& paths) {
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return ctx.out.Fail("status");
  }
  for (const std::string& path : paths) {
    if (!IsListed(path, folders)) {
      ctx.out.Warn(
          "not_listed", path,
          Printable(path) + " is not in the list of indexed folders; its status says nothing");
    }
  }
  if (ctx.out.RefusedByStrict("status")) {
    return kExitFailed;
  }
  fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_NONE);
  std::string status;
  long long resumeTime = -1;
  if (!fi::StatusMgr::GetStatus(status) || !fi::StatusMgr::GetPauseInfo(resumeTime)) {
    return ctx.out.Fail("status");
  }
  const std::string problem = DaemonProblem();
  const std::string service = ServiceState();
  const bool answers = problem.empty();

  if (ctx.out.Json()) {
    Json::Value result(Json::objectValue);
    result["status"] = status;
    result["indexing"] = Shown(status, answers);
    result["resume_time"] = static_cast<Json::Int64>(resumeTime);
    result["daemon"]["socket"] = DaemonSocket();
    result["daemon"]["answers"] = answers;
    result["daemon"]["problem"] = problem;
    result["service"]["unit"] = kServiceUnit;
    result["service"]["state"] = service;
    result["folders"] = Json::Value(Json::objectValue);
    for (const std::string& path : paths) {
      result["folders"][path] = fi::StatusMgr::GetFolderStatus(path);
    }
    result["warnings"] = ctx.out.Warnings();
    PrintJson(result);
    return 0;
  }
  std::cout << "indexing: " << Shown(status, answers)
            << (Shown(status, answers) != status ? " (events are waiting, but no daemon takes them)"
                                                 : "")
            << "\npaused: " << PauseText(resumeTime) << "\ndaemon: "
            << (answers ? "answers on " + Printable(DaemonSocket())
                        : "does not answer on " + Printable(DaemonSocket()) + " (" + problem + ")")
            << "\nservice " << kServiceUnit << ": " << Printable(service) << '\n';
  for (const std::string& path : paths) {
    std::cout << Printable(path) << ": " << Shown(fi::StatusMgr::GetFolderStatus(path), answers)
              << '\n';
  }
  return 0;
}

int RunPause(const Context& ctx, int hours) {
  return RunCall(
      ctx, "pause", {"daemon"}, [&] { return fi::StatusMgr::Pause(hours); },
      [] {
        long long resumeTime = -1;
        if (!fi::StatusMgr::GetPauseInfo(resumeTime) || resumeTime < 0) {
          return std::vector<Change>();
        }
        Change change{"paused", "indexing", "paused " + PauseText(resumeTime)};
        change.extra["resume_time"] = static_cast<Json::Int64>(resumeTime);
        return std::vector<Change>{change};
      });
}

int RunResume(const Context& ctx) {
  return RunCall(
      ctx, "resume", {"daemon"}, [] { return fi::StatusMgr::Resume(); },
      [] {
        long long resumeTime = 0;
        if (!fi::StatusMgr::GetPauseInfo(resumeTime) || resumeTime >= 0) {
          return std::vector<Change>();
        }
        return std::vector<Change>{{"resumed", "indexing", "resumed"}};
      });
}

int RunMigrate(const Context& ctx) {
  return RunCall(
      ctx, "migrate", {}, [] { return fi::Updater_hxo60_beta2(); },
      [] {
        return std::vector<Change>{{"migrated", "configuration", "migration done"}};
      });
}

}  // namespace

void AddServiceCommands(CLI::App& app, Context& ctx) {
  struct ServiceArgs {
    std::vector<std::string> paths;  // status
    int hours = 0;                   // pause
  };
  const auto args = std::make_shared<ServiceArgs>();
  CLI::App* status = AddCommand(app, ctx, "status",
                                "show the indexing status, whether the daemon answers, the "
                                "service's state, and the status of the folders given",
                                [&ctx, args] { return RunStatus(ctx, args->paths); });
  status->add_option("PATH", args->paths, "share paths of indexed folders");

  CLI::App* pause = AddCommand(app, ctx, "pause", "pause indexing",
                               [&ctx, args] { return RunPause(ctx, args->hours); });
  pause->add_option("HOURS", args->hours, "resume by itself after this many hours (0: never)")
      ->capture_default_str();

  AddCommand(app, ctx, "resume", "resume indexing", [&ctx] { return RunResume(ctx); });

  AddCommand(app, ctx, "migrate",
             "run the upgrade step that brings everything in line with the list",
             [&ctx] { return RunMigrate(ctx); });
}

}  // namespace fileindexctl
