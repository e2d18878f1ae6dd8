// The subcommands of fileindexctl, one function each, grouped as the help groups them: folders,
// the service's state, shares, and questions. Each returns the tool's exit status.
//
// A change command first checks what the library would accept without doing what the user
// expects (a path not in the list, an unknown share, a folder that cannot be indexed) and warns;
// then it makes exactly one library call and reports what changed, or what a failure left
// behind.
#ifndef FILEINDEXCTL_COMMANDS_H_
#define FILEINDEXCTL_COMMANDS_H_

#include <fileindex/fileindex.h>

#include <climits>
#include <functional>
#include <string>
#include <vector>

#include "output.h"
#include "state.h"

namespace fileindexctl {

// What every subcommand gets: where to print, and whether to pass the library's log on.
struct Context {
  Output& out;
  bool verbose;
};

// Makes the one library call of a change command. `describe`, asked after the call, says what it
// changed (on failure: what it saved, when the log names one of `steps` as the failing step).
// `noCode` explains a failure that sets no code and logs no known step.
int RunCall(const Context& ctx, const std::string& what, const Steps& steps,
            const std::function<bool()>& operation,
            const std::function<std::vector<Change>()>& describe, const std::string& noCode = "");

// True when `path` is itself an entry of `folders`.
bool IsListed(const std::string& path, const std::vector<WEZO::FILEINDEX::Folder>& folders);

// ---- folders ----

struct ListArgs {
  unsigned long offset = 0;
  unsigned long limit = ULONG_MAX;
  std::string sortBy = "path";
  bool descending = false;
  std::vector<std::string> additional;
};

struct AddArgs {
  std::string path;
  std::string name;
  bool document = false;
  bool audio = false;
  bool video = false;
  bool photo = false;
  std::string request;
};

int RunList(const Context& ctx, const ListArgs& args);
int RunGet(const Context& ctx, const std::string& path);
int RunAdd(const Context& ctx, const AddArgs& args);
int RunRemove(const Context& ctx, const std::vector<std::string>& paths);
int RunReindex(const Context& ctx, const std::vector<std::string>& paths);
int RunUpdate(const Context& ctx, const std::string& path, const std::string& data);

// Parses a JSON argument strictly; text that is not JSON, or JSON nested too deep, is a usage
// error (CLI::ValidationError).
Json::Value ParseJsonArgument(const std::string& option, const std::string& text);

// ---- the service's state ----

int RunStatus(const Context& ctx, const std::vector<std::string>& paths);
int RunPause(const Context& ctx, int hours);
int RunResume(const Context& ctx);
int RunMigrate(const Context& ctx);

// ---- shares ----

// A share operation of the lifecycle or a per-share flag, by the name the tool gives it.
int RunShareOperation(const Context& ctx, const std::string& operation, const std::string& share);
int RunShareRename(const Context& ctx, const std::string& oldShare, const std::string& newShare);
// Shows the flag ("no-space", "need-reindex") when `value` is empty, else sets ("on") or clears it.
int RunShareFlag(const Context& ctx, const std::string& flag, const std::string& share,
                 const std::string& value);

// ---- questions ----

// The C interface's answer; with `quiet` only the exit status says it (0 indexed, 1 not).
int RunIsIndexed(const Context& ctx, const std::string& question, const std::string& argument,
                 bool quiet);
int RunStorage(const Context& ctx, const std::string& share);
int RunExplain(const Context& ctx, const std::string& path, bool fullPathGiven);

}  // namespace fileindexctl

#endif  // FILEINDEXCTL_COMMANDS_H_
