// The folder list: list, get, add, remove, reindex, update.
#include <json/reader.h>
#include <sys/stat.h>

#include <CLI/CLI.hpp>
#include <algorithm>
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

}  // namespace

bool IsListed(const std::string& path, const std::vector<fi::Folder>& folders) {
  return std::any_of(folders.begin(), folders.end(),
                     [&](const fi::Folder& folder) { return folder.GetPath() == path; });
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

}  // namespace fileindexctl
