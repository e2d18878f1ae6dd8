// Questions: is-indexed through the C interface, storage locations, and explain.
#include <fileindex/fileindex_c.h>

#include <CLI/CLI.hpp>
#include <climits>
#include <iostream>
#include <memory>

#include "commands.h"

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

namespace {

struct Question {
  const char* name;
  const char* function;
  int (*ask)(const char*);
};

const Question kQuestions[] = {
    {"path", "FILEIDXIsPathIndexed", FILEIDXIsPathIndexed},
    {"full-path", "FILEIDXIsFullPathIndexed", FILEIDXIsFullPathIndexed},
    {"share", "FILEIDXIsShareIndexed", FILEIDXIsShareIndexed},
};

// The share path and full path that `path` names: a share path ("/photo/2019") when its first
// component is a share and `fullPathGiven` is false, otherwise a full path.
void ResolveBoth(const std::string& path, bool fullPathGiven, std::string& sharePath,
                 std::string& fullPath) {
  if (!fullPathGiven && fi::GetFullPath(fullPath, path)) {
    sharePath = path;
    return;
  }
  fullPath = path;
  std::string shareName;
  std::string shareRoot;
  if (fi::GetShareNamePathByFullPath(shareName, shareRoot, path)) {
    sharePath = "/" + shareName + path.substr(shareRoot.size());
  }
}

int RunIsIndexed(const Context& ctx, const std::string& question, const std::string& argument,
                 bool quiet) {
  for (const Question& entry : kQuestions) {
    if (question != entry.name) {
      continue;
    }
    const int answer = entry.ask(argument.c_str());
    if (quiet) {
      return answer == 1 ? 0 : 1;
    }
    if (ctx.out.Json()) {
      Json::Value result(Json::objectValue);
      result["indexed"] = answer == 1;
      PrintJson(result);
    } else {
      std::cout << entry.function << "(\"" << Printable(argument) << "\") = " << answer << "  ("
                << (answer == 1 ? "indexed" : "not indexed") << ")\n";
    }
    return 0;
  }
  return ctx.out.Fail("is-indexed " + question, "no such question");
}

int RunStorage(const Context& ctx, const std::string& share) {
  char queue[PATH_MAX];
  char database[PATH_MAX];
  if (FILEIDXQueuePathGet(share.c_str(), queue, sizeof queue) < 0 ||
      FILEIDXDBPathGet(share.c_str(), database, sizeof database) < 0) {
    return ctx.out.Fail("storage " + share, "no share named " + share);
  }
  if (ctx.out.Json()) {
    Json::Value result(Json::objectValue);
    result["queue"] = queue;
    result["database"] = database;
    PrintJson(result);
  } else {
    std::cout << "queue: " << Printable(queue) << "\ndatabase: " << Printable(database) << '\n';
  }
  return 0;
}

int RunExplain(const Context& ctx, const std::string& path, bool fullPathGiven) {
  std::string sharePath;
  std::string fullPath;
  ResolveBoth(path, fullPathGiven, sharePath, fullPath);
  const fi::IndexRule rule = fi::FullPathIndexRule(fullPath);

  // The indexed folder that holds the path, asked one folder at a time so that the membership
  // rule stays the library's.
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return ctx.out.Fail("explain " + path);
  }
  std::string holder;
  for (const fi::Folder& folder : folders) {
    if (fi::IndexMgr::IsFullPathIndexed(fullPath, {folder})) {
      holder = folder.GetPath();
      break;
    }
  }

  if (ctx.out.Json()) {
    Json::Value result(Json::objectValue);
    result["path"] = sharePath;
    result["full_path"] = fullPath;
    result["indexable"] = rule == fi::IndexRule::kIndexable;
    result["rule"] = fi::IndexRuleKey(rule);
    result["reason"] = fi::DescribeIndexRule(rule);
    result["indexed"] = !holder.empty();
    result["folder"] = holder;
    PrintJson(result);
    return 0;
  }
  std::cout << "path: " << (sharePath.empty() ? "(in no share)" : Printable(sharePath))
            << "\nfull path: " << Printable(fullPath) << "\nmay be indexed: "
            << (rule == fi::IndexRule::kIndexable
                    ? std::string("yes")
                    : std::string("no, ") + fi::DescribeIndexRule(rule))
            << "\nin an indexed folder: "
            << (holder.empty() ? "no" : "yes (" + Printable(holder) + ")") << '\n';
  return 0;
}

}  // namespace

void AddQuestionCommands(CLI::App& app, Context& ctx) {
  struct QuestionArgs {
    std::string argument;   // is-indexed, explain
    std::string share;      // storage
    bool quiet = false;     // is-indexed
    bool fullPath = false;  // explain
  };
  const auto args = std::make_shared<QuestionArgs>();
  CLI::App* isIndexed = app.add_subcommand(
      "is-indexed", "ask the C interface what is indexed (-q: answer by exit status)");
  isIndexed->require_subcommand(1);
  isIndexed->add_flag("-q,--quiet", args->quiet, "print nothing; exit 0 when indexed, 1 when not");
  for (const auto& [name, argument] : {
           std::pair{"path", "share path (/photo/2019)"},
           std::pair{"full-path", "full path (/volume1/photo/2019)"},
           std::pair{"share", "share name (photo)"},
       }) {
    const std::string question = name;
    CLI::App* command =
        AddCommand(*isIndexed, ctx, name, std::string("is this ") + argument + " indexed",
                   [&ctx, args, question] {
                     return RunIsIndexed(ctx, question, args->argument, args->quiet);
                   });
    command->add_option("ARG", args->argument, argument)->required();
  }

  CLI::App* storage =
      AddCommand(app, ctx, "storage", "show where a share keeps its queue and index",
                 [&ctx, args] { return RunStorage(ctx, args->share); });
  storage->add_option("NAME", args->share, "share name")->required();

  CLI::App* explain =
      AddCommand(app, ctx, "explain",
                 "say whether a path may be indexed, which rule decides, "
                 "and whether an indexed folder holds it",
                 [&ctx, args] { return RunExplain(ctx, args->argument, args->fullPath); });
  explain->add_option("PATH", args->argument, "share path, or full path")->required();
  explain->add_flag("--full-path", args->fullPath, "PATH is a full path");
}

}  // namespace fileindexctl
