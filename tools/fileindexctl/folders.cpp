// The folder list: list, get, add, remove, reindex, update.
#include <json/reader.h>
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <climits>
#include <iostream>
#include <memory>
#include <set>

#include "commands.h"

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

namespace {

// Deeper than any request of the library needs; jsoncpp's reader recurses once per level.
constexpr int kMaxJsonDepth = 100;

std::string YesNo(bool value) { return value ? "yes" : "no"; }

std::string Kinds(const Json::Value& folder) {
  std::string kinds;
  for (const char* kind : {"document", "audio", "video", "photo"}) {
    if (folder[kind].isBool() && folder[kind].asBool()) {
      kinds += kinds.empty() ? kind : std::string(",") + kind;
    }
  }
  return kinds.empty() ? "-" : kinds;
}

// The columns a text takes: one per character, not per byte.
size_t Columns(const std::string& text) {
  return static_cast<size_t>(std::count_if(text.begin(), text.end(), [](char c) {
    return (static_cast<unsigned char>(c) & 0xC0U) != 0x80;
  }));
}

std::string StringOf(const Json::Value& value) { return value.isString() ? value.asString() : ""; }

// The indexed folder that holds `path`, or "".
std::string Holder(const std::string& path, const std::vector<fi::Folder>& folders) {
  for (const fi::Folder& folder : folders) {
    if (fi::IndexMgr::IsPathIndexed(path, {folder})) {
      return folder.GetPath();
    }
  }
  return "";
}

// Warns when the folder at share path `path` will be listed but not indexed.
void CheckIndexable(Output& out, const std::string& path) {
  const std::string shown = Printable(path);
  std::string fullPath;
  std::string share;
  if (!fi::GetFullPath(fullPath, path)) {
    (void)fi::GetShareNameByPath(share, path);
    out.Warn("unknown_share", path, shown + ": no share named " + Printable(share));
    return;
  }
  struct stat st {};
  if (stat(fullPath.c_str(), &st) != 0 || !S_ISDIR(st.st_mode)) {
    out.Warn("no_directory", path,
             shown + ": the directory " + Printable(fullPath) +
                 " does not exist; nothing is indexed there");
    return;
  }
  const fi::IndexRule rule = fi::FullPathIndexRule(fullPath);
  if (rule != fi::IndexRule::kIndexable) {
    out.Warn("not_indexable", path,
             shown + " cannot be indexed: " + fi::DescribeIndexRule(rule) + " (" +
                 fi::IndexRuleKey(rule) + "); listing it indexes nothing");
  }
}

// Warns when an event for `path` would concern nothing indexed: the path is in no indexed folder
// and holds none. A share without any indexed folder is left to the library, which refuses it.
void CheckEventTarget(Output& out, const std::string& path,
                      const std::vector<fi::Folder>& folders) {
  std::string share;
  if (!fi::GetShareNameByPath(share, path) || !fi::IndexMgr::IsShareIndexed(share) ||
      fi::IndexMgr::IsPathIndexed(path, folders) ||
      fi::IndexMgr::IsPathContainIndexed(path, folders)) {
    return;
  }
  out.Warn("not_indexed", path,
           Printable(path) +
               " is in no indexed folder and holds none; an event for it makes the daemon index "
               "nothing");
}

Json::Value ParseJsonArgument(const std::string& option, const std::string& text) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  builder["stackLimit"] = kMaxJsonDepth;
  std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  try {
    if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors)) {
      throw CLI::ValidationError(option, "not JSON: " + errors);
    }
  } catch (const Json::Exception&) {
    // jsoncpp throws, instead of failing, when the nesting passes the stack limit.
    throw CLI::ValidationError(
        option, "JSON nested deeper than " + std::to_string(kMaxJsonDepth) + " levels");
  }
  return value;
}

// The folder commands' arguments.
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

struct FolderArgs {
  ListArgs list;
  AddArgs add;
  std::string path;                // get, update
  std::vector<std::string> paths;  // remove, reindex
  std::string data = "{}";         // update
};

int RunList(const Context& ctx, const ListArgs& args) {
  Json::Value page;
  if (!fi::IndexMgr::List(page, args.offset, args.limit, args.sortBy,
                          args.descending ? "DESC" : "ASC", StringArray(args.additional))) {
    return ctx.out.Fail("list");
  }
  if (ctx.out.Json()) {
    PrintJson(page);
    return 0;
  }
  std::vector<std::vector<std::string>> rows;
  std::vector<std::string> header = {"PATH", "NAME", "KINDS"};
  for (const std::string& name : args.additional) {
    header.push_back(name == "is_valid" ? "VALID" : name == "status" ? "STATUS" : name);
  }
  rows.push_back(header);
  for (const Json::Value& folder : page["folder"]) {
    std::vector<std::string> row = {Printable(StringOf(folder["path"])),
                                    Printable(StringOf(folder["name"])), Kinds(folder)};
    for (const std::string& name : args.additional) {
      const Json::Value& value = folder["additional"][name];
      row.push_back(value.isBool()     ? YesNo(value.asBool())
                    : value.isString() ? Printable(value.asString())
                                       : "?");
    }
    rows.push_back(row);
  }
  std::vector<size_t> widths(header.size(), 0);
  for (const auto& row : rows) {
    for (size_t i = 0; i < row.size(); ++i) {
      widths[i] = std::max(widths[i], Columns(row[i]));
    }
  }
  for (const auto& row : rows) {
    std::string line;
    for (size_t i = 0; i < row.size(); ++i) {
      line += row[i];
      if (i + 1 < row.size()) {
        line += std::string(widths[i] - Columns(row[i]) + 2, ' ');
      }
    }
    std::cout << line << '\n';
  }
  std::cout << page["folder"].size() << " of " << page["total"].asUInt() << " folder(s)\n";
  return 0;
}

int RunGet(const Context& ctx, const std::string& path) {
  Json::Value folder;
  if (!fi::IndexMgr::Get(folder, path)) {
    return ctx.out.Fail("get " + path);
  }
  if (ctx.out.Json()) {
    PrintJson(folder);
    return 0;
  }
  std::cout << "path: " << Printable(StringOf(folder["path"]))
            << "\nname: " << Printable(StringOf(folder["name"])) << "\nkinds: " << Kinds(folder)
            << '\n';
  return 0;
}

int RunAdd(const Context& ctx, const AddArgs& args) {
  if (args.path.empty() && args.request.empty()) {
    throw CLI::ValidationError("PATH", "give a share path or --request");
  }
  Json::Value request;
  if (!args.request.empty()) {
    request = ParseJsonArgument("--request", args.request);
  } else {
    Json::Value folder(Json::objectValue);
    folder["path"] = args.path;
    folder["name"] = args.name;
    folder["document"] = args.document;
    folder["audio"] = args.audio;
    folder["video"] = args.video;
    folder["photo"] = args.photo;
    request.append(folder);
  }
  // The paths of the request, each once, in its order; the library refuses the malformed ones.
  std::vector<std::string> paths;
  if (request.isArray()) {
    for (const Json::Value& element : request) {
      if (element.isObject() && element["path"].isString() &&
          std::find(paths.begin(), paths.end(), element["path"].asString()) == paths.end()) {
        paths.push_back(element["path"].asString());
      }
    }
  }
  for (const std::string& path : paths) {
    CheckIndexable(ctx.out, path);
  }
  if (ctx.out.RefusedByStrict("add")) {
    return kExitFailed;
  }
  std::vector<fi::Folder> before;
  (void)fi::IndexMgr::List(before);
  std::vector<Change> changes;
  for (const std::string& path : paths) {
    const bool listed = IsListed(path, before);
    changes.push_back(
        {listed ? "updated" : "added", path, (listed ? "updated " : "added ") + Printable(path)});
  }
  return RunCall(
      ctx, "add", {"monitor", "service", "daemon", "queue"},
      [&] { return fi::IndexMgr::Upsert(request); }, [&] { return changes; });
}

int RunRemove(const Context& ctx, const std::vector<std::string>& paths) {
  std::vector<fi::Folder> before;
  if (!fi::IndexMgr::List(before)) {
    return ctx.out.Fail("remove");
  }
  std::vector<Change> changes;
  for (const std::string& path : paths) {
    if (IsListed(path, before)) {
      changes.push_back({"removed", path, "removed " + Printable(path)});
      continue;
    }
    const std::string holder = Holder(path, before);
    ctx.out.Warn(
        "not_listed", path,
        Printable(path) + " is not in the list of indexed folders; nothing removed" +
            (holder.empty() ? "" : " (it lies in the indexed folder " + Printable(holder) + ")"));
  }
  if (ctx.out.RefusedByStrict("remove")) {
    return kExitFailed;
  }
  return RunCall(
      ctx, "remove", {"daemon", "queue", "monitor", "clean", "unregister"},
      [&] { return fi::IndexMgr::Delete(StringArray(paths)); }, [&] { return changes; });
}

int RunReindex(const Context& ctx, const std::vector<std::string>& paths) {
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return ctx.out.Fail("reindex");
  }
  std::vector<Change> changes;
  for (const std::string& path : paths) {
    CheckEventTarget(ctx.out, path, folders);
    changes.push_back({"reindex_queued", path, "queued a full reindex of " + Printable(path)});
  }
  if (ctx.out.RefusedByStrict("reindex")) {
    return kExitFailed;
  }
  return RunCall(
      ctx, "reindex", {}, [&] { return fi::IndexMgr::Reindex(StringArray(paths)); },
      [&] { return changes; }, "a path lies in a share without indexed folders");
}

int RunUpdate(const Context& ctx, const std::string& path, const std::string& data) {
  const Json::Value payload = ParseJsonArgument("--data", data);
  std::vector<fi::Folder> folders;
  if (!fi::IndexMgr::List(folders)) {
    return ctx.out.Fail("update " + path);
  }
  CheckEventTarget(ctx.out, path, folders);
  if (ctx.out.RefusedByStrict("update")) {
    return kExitFailed;
  }
  return RunCall(
      ctx, "update " + path, {}, [&] { return fi::IndexMgr::Update(path, payload); },
      [&] {
        return std::vector<Change>{
            {"update_queued", path, "queued an update of " + Printable(path)}};
      });
}

}  // namespace

void AddFolderCommands(CLI::App& app, Context& ctx) {
  const auto args = std::make_shared<FolderArgs>();
  CLI::App* list = AddCommand(app, ctx, "list", "list the indexed folders, one page at a time",
                              [&ctx, args] { return RunList(ctx, args->list); });
  list->add_option("--offset", args->list.offset, "skip this many folders")->capture_default_str();
  list->add_option("--limit", args->list.limit, "show at most this many folders (default: all)");
  list->add_option("--sort-by", args->list.sortBy, "sort key")
      ->check(CLI::IsMember({"path", "name", "document", "audio", "video", "photo"}))
      ->capture_default_str();
  list->add_flag("--desc", args->list.descending,
                 "descending: the ascending page at offset 0, reversed (the library's paging)");
  list->add_option("-a,--additional", args->list.additional, "add a value per folder")
      ->check(CLI::IsMember({"status", "is_valid"}))
      ->delimiter(',');

  CLI::App* get = AddCommand(app, ctx, "get", "show one indexed folder",
                             [&ctx, args] { return RunGet(ctx, args->path); });
  get->add_option("PATH", args->path, "share path of the folder (/photo/2019)")->required();

  CLI::App* add = AddCommand(app, ctx, "add",
                             "add a folder, or change a listed one (settings not given return to "
                             "their defaults); warns when the folder cannot be indexed",
                             [&ctx, args] { return RunAdd(ctx, args->add); });
  add->alias("set");
  CLI::Option* path = add->add_option("PATH", args->add.path, "share path of the folder");
  CLI::Option* request = add->add_option("--request", args->add.request,
                                         "a JSON array of folder descriptions instead of PATH");
  path->excludes(request);
  add->add_option("--name", args->add.name, "display name")->needs(path);
  for (auto [flag, value] :
       {std::pair{"--document", &args->add.document}, std::pair{"--audio", &args->add.audio},
        std::pair{"--video", &args->add.video}, std::pair{"--photo", &args->add.photo}}) {
    add->add_flag(flag, *value, std::string("index ") + (flag + 2) + " files")->needs(path);
  }

  CLI::App* remove =
      AddCommand(app, ctx, "remove", "stop indexing folders; warns of unlisted paths",
                 [&ctx, args] { return RunRemove(ctx, args->paths); });
  remove->add_option("PATH", args->paths, "share paths of listed folders")->required();

  CLI::App* reindex = AddCommand(app, ctx, "reindex", "queue a full reindex of paths",
                                 [&ctx, args] { return RunReindex(ctx, args->paths); });
  reindex->add_option("PATH", args->paths, "share paths in indexed shares")->required();

  CLI::App* update = AddCommand(app, ctx, "update", "queue an update event for a path",
                                [&ctx, args] { return RunUpdate(ctx, args->path, args->data); });
  update->add_option("PATH", args->path, "share path")->required();
  update->add_option("--data", args->data, "the event's JSON payload")->capture_default_str();
}

}  // namespace fileindexctl
