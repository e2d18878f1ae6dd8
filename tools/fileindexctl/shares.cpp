// Shares: the lifecycle the appliance reports (removed, renamed, offline, back) and the
// per-share flags.
#include <fileindex/fileindex_c.h>

#include <CLI/CLI.hpp>
#include <climits>
#include <iostream>
#include <memory>

#include "commands.h"

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

namespace {

// True when the share database knows a share named `share`.
bool IsShare(const std::string& share) {
  std::string fullPath;
  return !share.empty() && share.find('/') == std::string::npos &&
         fi::GetFullPath(fullPath, "/" + share);
}

void CheckShare(Output& out, const std::string& share) {
  if (!IsShare(share)) {
    out.Warn("unknown_share", share, "no share named " + Printable(share));
  }
}

// The listed folders of the share `share`; `ok` is false when the list cannot be read.
std::vector<std::string> FoldersOf(const std::string& share, bool& ok) {
  std::vector<fi::Folder> folders;
  ok = fi::IndexMgr::List(folders);
  std::vector<std::string> paths;
  for (const fi::Folder& folder : folders) {
    std::string name;
    if (fi::GetShareNameByPath(name, folder.GetPath()) && name == share) {
      paths.push_back(folder.GetPath());
    }
  }
  return paths;
}

struct Operation {
  const char* name;
  const char* action;
  const char* done;
  bool (*call)(const std::string&);
  Steps steps;
};

const Operation kOperations[] = {
    {"pause", "share_paused", "paused", fi::IndexMgr::SharePause, {}},
    {"resume", "share_resumed", "resumed", fi::IndexMgr::ShareResume, {}},
    {"clean", "index_data_removed", "index data removed", fi::IndexMgr::CleanShareIndexData, {}},
    {"revive", "revived", "revived", fi::StatusMgr::ShareRevive, {"daemon"}},
};

struct Flag {
  const char* name;
  const char* key;
  bool (*set)(const std::string&, bool);
  bool (*get)(const std::string&);
};

const Flag kFlags[] = {
    {"no-space", "no_space", fi::StatusMgr::ShareSetNoSpace, fi::StatusMgr::ShareIsNoSpace},
    {"need-reindex", "need_reindex", fi::StatusMgr::ShareSetNeedReindex,
     fi::StatusMgr::ShareIsNeedReindex},
};

int RunShareOperation(const Context& ctx, const std::string& operation, const std::string& share) {
  const std::string what = "share " + operation + " " + share;
  const std::string shown = Printable(share);
  if (operation == "remove") {
    // The share is usually gone from the share database by now; what matters is its folders.
    bool ok = true;
    const std::vector<std::string> paths = FoldersOf(share, ok);
    if (!ok) {
      return ctx.out.Fail(what);
    }
    if (paths.empty()) {
      ctx.out.Warn("no_folders", share,
                   "no folder of the share " + shown + " is in the list; nothing dropped");
    }
    if (ctx.out.RefusedByStrict("share remove")) {
      return kExitFailed;
    }
    std::vector<Change> changes;
    changes.reserve(paths.size());
    for (const std::string& path : paths) {
      changes.push_back({"removed", path, "removed " + Printable(path)});
    }
    return RunCall(
        ctx, what, {}, [&] { return fi::IndexMgr::ShareRemove(share); }, [&] { return changes; });
  }
  for (const Operation& entry : kOperations) {
    if (operation != entry.name) {
      continue;
    }
    CheckShare(ctx.out, share);
    if (ctx.out.RefusedByStrict("share " + operation)) {
      return kExitFailed;
    }
    return RunCall(
        ctx, what, entry.steps, [&] { return entry.call(share); },
        [&] {
          return std::vector<Change>{{entry.action, share, shown + ": " + entry.done}};
        });
  }
  return ctx.out.Fail(what, "no such share operation");
}

int RunShareRename(const Context& ctx, const std::string& oldShare, const std::string& newShare) {
  const std::string what = "share rename " + oldShare;
  bool ok = true;
  const std::vector<std::string> paths = FoldersOf(oldShare, ok);
  if (!ok) {
    return ctx.out.Fail(what);
  }
  // The old name has usually left the share database already; the new one should be in it.
  if (paths.empty()) {
    ctx.out.Warn(
        "no_folders", oldShare,
        "no folder of the share " + Printable(oldShare) + " is in the list; nothing moved");
  }
  CheckShare(ctx.out, newShare);
  if (ctx.out.RefusedByStrict("share rename")) {
    return kExitFailed;
  }
  std::vector<Change> changes;
  for (const std::string& path : paths) {
    const std::string moved = fi::ReplaceShareName(path, newShare);
    Change change{"moved", path, "moved " + Printable(path) + " to " + Printable(moved)};
    change.extra["to"] = moved;
    changes.push_back(change);
  }
  return RunCall(
      ctx, what, {}, [&] { return fi::IndexMgr::ShareRename(oldShare, newShare); },
      [&] { return changes; });
}

int RunShareFlag(const Context& ctx, const std::string& flag, const std::string& share,
                 const std::string& value) {
  const Flag* entry = nullptr;
  for (const Flag& candidate : kFlags) {
    if (flag == candidate.name) {
      entry = &candidate;
    }
  }
  if (entry == nullptr) {
    return ctx.out.Fail("share " + flag, "no such flag");
  }
  CheckShare(ctx.out, share);
  if (ctx.out.RefusedByStrict("share " + flag)) {
    return kExitFailed;
  }
  if (value.empty()) {
    const bool isSet = entry->get(share);
    if (ctx.out.Json()) {
      Json::Value result(Json::objectValue);
      result["share"] = share;
      result[entry->key] = isSet;
      result["warnings"] = ctx.out.Warnings();
      PrintJson(result);
    } else {
      std::cout << flag << ": " << (isSet ? "yes" : "no") << '\n';
    }
    return 0;
  }
  const bool on = value == "on";
  return RunCall(
      ctx, "share " + flag + " " + share, {}, [&] { return entry->set(share, on); },
      [&] {
        Change change{on ? "flag_set" : "flag_cleared", share,
                      Printable(share) + ": " + flag + " " + value};
        change.extra["flag"] = entry->key;
        return std::vector<Change>{change};
      });
}

}  // namespace

void AddShareCommands(CLI::App& app, Context& ctx) {
  struct ShareArgs {
    std::string share;     // every share command
    std::string newShare;  // rename
    std::string flag;      // no-space, need-reindex
  };
  const auto args = std::make_shared<ShareArgs>();
  CLI::App* share = app.add_subcommand("share", "share lifecycle and per-share flags");
  share->require_subcommand(1);

  for (const auto& [name, description] : {
           std::pair{"remove", "the share was removed: drop its folders"},
           std::pair{"pause", "the share went offline"},
           std::pair{"resume", "the share is back"},
           std::pair{"clean", "remove the share's queue and index database"},
           std::pair{"revive", "clear the no-space flag and restart the share's worker"},
       }) {
    const std::string operation = name;
    CLI::App* command = AddCommand(*share, ctx, name, description, [&ctx, args, operation] {
      return RunShareOperation(ctx, operation, args->share);
    });
    command->add_option("NAME", args->share, "share name")->required();
  }

  CLI::App* rename = AddCommand(
      *share, ctx, "rename",
      "the share was renamed: move its folders (only the list changes; pause the share before "
      "the rename and resume it under its new name)",
      [&ctx, args] { return RunShareRename(ctx, args->share, args->newShare); });
  rename->add_option("OLD", args->share, "old share name")->required();
  rename->add_option("NEW", args->newShare, "new share name")->required();

  for (const char* flag : {"no-space", "need-reindex"}) {
    const std::string name = flag;
    CLI::App* command =
        AddCommand(*share, ctx, flag, "show, set (on) or clear (off) the flag",
                   [&ctx, args, name] { return RunShareFlag(ctx, name, args->share, args->flag); });
    command->add_option("NAME", args->share, "share name")->required();
    command->add_option("VALUE", args->flag, "on or off")->check(CLI::IsMember({"on", "off"}));
  }
}

}  // namespace fileindexctl
