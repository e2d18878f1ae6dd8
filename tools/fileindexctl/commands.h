// The subcommands of fileindexctl, grouped as the help groups them: folders, the service's state,
// shares, questions, and the consistency check. Each group registers its own subcommands and owns
// their arguments; a subcommand's run returns the tool's exit status.
//
// A change command first checks what the library would accept without doing what the user
// expects (a path not in the list, an unknown share, a folder that cannot be indexed) and warns;
// then it makes exactly one library call and reports what changed, or what a failure left
// behind.
#ifndef FILEINDEXCTL_COMMANDS_H_
#define FILEINDEXCTL_COMMANDS_H_

#include <fileindex/fileindex.h>

#include <functional>
#include <string>
#include <vector>

#include "output.h"
#include "state.h"

namespace CLI {
class App;
}  // namespace CLI

namespace fileindexctl {

// What every subcommand gets: where to print, and whether to pass the library's log on. `run` is
// set by the subcommand the parse chose.
struct Context {
  Output& out;
  bool verbose;
  std::function<int()> run;
};

// Registers the subcommand `name` of `parent`; when the parse chooses it, `run` is what runs.
CLI::App* AddCommand(CLI::App& parent, Context& ctx, const std::string& name,
                     const std::string& description, std::function<int()> run);

// list, get, add (set), remove, reindex, update.
void AddFolderCommands(CLI::App& app, Context& ctx);
// status, pause, resume, migrate.
void AddServiceCommands(CLI::App& app, Context& ctx);
// share remove|pause|resume|clean|revive|rename|no-space|need-reindex.
void AddShareCommands(CLI::App& app, Context& ctx);
// is-indexed path|full-path|share, storage, explain.
void AddQuestionCommands(CLI::App& app, Context& ctx);
// check [--repair].
void AddCheckCommand(CLI::App& app, Context& ctx);

// Makes the one library call of a change command. `describe`, asked after the call, says what it
// changed (on failure: what it saved, when the log names one of `steps` as the failing step).
// `noCode` explains a failure that sets no code and logs no known step.
int RunCall(const Context& ctx, const std::string& what, const Steps& steps,
            const std::function<bool()>& operation,
            const std::function<std::vector<Change>()>& describe, const std::string& noCode = "");

// True when `path` is itself an entry of `folders`.
bool IsListed(const std::string& path, const std::vector<WEZO::FILEINDEX::Folder>& folders);

}  // namespace fileindexctl

#endif  // FILEINDEXCTL_COMMANDS_H_
