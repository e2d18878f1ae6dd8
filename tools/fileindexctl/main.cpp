// fileindexctl: the administrators' command-line face of the file-index library.
//
// Every subcommand is one library operation, run against the appliance (or against a sandbox
// root given with --root). The tool adds no rule of its own: it turns arguments into the
// library's requests and the library's results into text, and it checks beforehand what the
// library accepts but will not act on, so that what it says is what the library did.
#include <sys/stat.h>
#include <syslog.h>

#include <CLI/CLI.hpp>
#include <iostream>

#include "commands.h"

namespace fi = WEZO::FILEINDEX;
using namespace fileindexctl;  // NOLINT(google-build-using-namespace): the tool's own namespace

namespace {

constexpr char kFooter[] =
    "Exit status: 0 done; 1 the library refused or failed the operation (the message names its "
    "error code), or --strict met a warning; 2 usage error. \"is-indexed -q\" answers by exit "
    "status: 0 indexed, 1 not.";

class Tool {
 public:
  Tool() : m_out(m_json, m_strict), m_ctx{m_out, false} { Build(); }

  int Main(int argc, char** argv) {
    try {
      m_app.parse(argc, argv);
    } catch (const CLI::ParseError& e) {
      return ParseFailure(e);
    }
    if (!fi::SetRootPrefix(m_root)) {
      std::cerr << "fileindexctl: --root must be an absolute path: " << Printable(m_root) << '\n';
      return kExitUsage;
    }
    struct stat st {};
    if (!m_root.empty() && (stat(m_root.c_str(), &st) != 0 || !S_ISDIR(st.st_mode))) {
      std::cerr << "fileindexctl: --root must name an existing directory: " << Printable(m_root)
                << '\n';
      return kExitUsage;
    }
    m_ctx.verbose = m_verbose;
    if (m_verbose) {
      // The library logs through syslog; LOG_PERROR copies each line to stderr.
      openlog("fileindexctl", LOG_PERROR, LOG_USER);
    }
    fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_NONE);
    try {
      return m_run();
    } catch (const CLI::ValidationError& e) {
      (void)m_app.exit(e);
      return kExitUsage;
    }
  }

 private:
  // Help and --version end the parse with success; anything else is a usage error. A word where
  // a command was due is named, as CLI11 would only say that a command is missing.
  int ParseFailure(const CLI::ParseError& e) {
    if (e.get_exit_code() == static_cast<int>(CLI::ExitCodes::Success)) {
      (void)m_app.exit(e);
      return 0;
    }
    const CLI::App* level = &m_app;
    std::string path;
    for (bool deeper = true; deeper;) {
      deeper = false;
      for (const CLI::App* sub : level->get_subcommands()) {
        level = sub;
        path += sub->get_name() + " ";
        deeper = true;
        break;
      }
    }
    if (!level->get_subcommands({}).empty() && level->get_subcommands().empty()) {
      for (const std::string& word : m_app.remaining()) {
        if (!word.empty() && word[0] != '-') {
          std::cerr << "fileindexctl: unknown command \"" << Printable(path + word)
                    << "\"; fileindexctl " << path << "--help lists the commands\n";
          return kExitUsage;
        }
      }
    }
    (void)m_app.exit(e);
    return kExitUsage;
  }

  // Registers a subcommand of `parent` whose run is `run`.
  CLI::App* Command(CLI::App& parent, const std::string& name, const std::string& description,
                    std::function<int()> run) {
    CLI::App* command = parent.add_subcommand(name, description);
    command->callback([this, run = std::move(run)] { m_run = run; });
    return command;
  }

  void Build() {
    m_app.description(
        "Administer the file-index service: indexed folders, pausing, share flags and "
        "questions.");
    m_app.require_subcommand(1);
    // Subcommands pass the options they do not know to the tool, so --json may follow them.
    m_app.fallthrough();
    m_app.set_version_flag("--version", std::string("fileindexctl ") + FILEINDEX_VERSION,
                           "print the version and exit");
    m_app.add_option("--root", m_root, "run against the sandbox root DIR (an existing directory)")
        ->option_text("DIR");
    m_app.add_flag("--json", m_json,
                   "print JSON for scripts: the library's result, or what changed "
                   "(docs/fileindexctl.md gives each shape)");
    m_app.add_flag("--strict", m_strict,
                   "treat warnings as errors: a command that would warn does not run, exit 1");
    m_app.add_flag("-v,--verbose", m_verbose, "also write the library's log lines to stderr");

    BuildFolderCommands();
    BuildServiceCommands();
    BuildShareCommands();
    BuildQuestions();
    // Set last, so that the subcommands' help does not repeat it.
    m_app.footer(kFooter);
  }

  void BuildFolderCommands() {
    CLI::App* list = Command(m_app, "list", "list the indexed folders, one page at a time",
                             [this] { return RunList(m_ctx, m_list); });
    list->add_option("--offset", m_list.offset, "skip this many folders")->capture_default_str();
    list->add_option("--limit", m_list.limit, "show at most this many folders (default: all)");
    list->add_option("--sort-by", m_list.sortBy, "sort key")
        ->check(CLI::IsMember({"path", "name", "document", "audio", "video", "photo"}))
        ->capture_default_str();
    list->add_flag("--desc", m_list.descending,
                   "descending: the ascending page at offset 0, reversed (the library's paging)");
    list->add_option("-a,--additional", m_list.additional, "add a value per folder")
        ->check(CLI::IsMember({"status", "is_valid"}))
        ->delimiter(',');

    CLI::App* get =
        Command(m_app, "get", "show one indexed folder", [this] { return RunGet(m_ctx, m_path); });
    get->add_option("PATH", m_path, "share path of the folder (/photo/2019)")->required();

    CLI::App* add = Command(m_app, "add",
                            "add a folder, or change a listed one (settings not given return to "
                            "their defaults); warns when the folder cannot be indexed",
                            [this] { return RunAdd(m_ctx, m_add); });
    add->alias("set");
    CLI::Option* path = add->add_option("PATH", m_add.path, "share path of the folder");
    CLI::Option* request = add->add_option("--request", m_add.request,
                                           "a JSON array of folder descriptions instead of PATH");
    path->excludes(request);
    add->add_option("--name", m_add.name, "display name")->needs(path);
    for (auto [flag, value] :
         {std::pair{"--document", &m_add.document}, std::pair{"--audio", &m_add.audio},
          std::pair{"--video", &m_add.video}, std::pair{"--photo", &m_add.photo}}) {
      add->add_flag(flag, *value, std::string("index ") + (flag + 2) + " files")->needs(path);
    }

    CLI::App* remove = Command(m_app, "remove", "stop indexing folders; warns of unlisted paths",
                               [this] { return RunRemove(m_ctx, m_paths); });
    remove->add_option("PATH", m_paths, "share paths of listed folders")->required();

    CLI::App* reindex = Command(m_app, "reindex", "queue a full reindex of paths",
                                [this] { return RunReindex(m_ctx, m_paths); });
    reindex->add_option("PATH", m_paths, "share paths in indexed shares")->required();

    CLI::App* update = Command(m_app, "update", "queue an update event for a path",
                               [this] { return RunUpdate(m_ctx, m_path, m_data); });
    update->add_option("PATH", m_path, "share path")->required();
    update->add_option("--data", m_data, "the event's JSON payload")->capture_default_str();
  }

  void BuildServiceCommands() {
    CLI::App* status = Command(m_app, "status",
                               "show the indexing status, whether the daemon answers, the "
                               "service's state, and the status of the folders given",
                               [this] { return RunStatus(m_ctx, m_paths); });
    status->add_option("PATH", m_paths, "share paths of indexed folders");

    CLI::App* pause =
        Command(m_app, "pause", "pause indexing", [this] { return RunPause(m_ctx, m_hours); });
    pause->add_option("HOURS", m_hours, "resume by itself after this many hours (0: never)")
        ->capture_default_str();

    Command(m_app, "resume", "resume indexing", [this] { return RunResume(m_ctx); });

    Command(m_app, "migrate", "run the upgrade step that brings everything in line with the list",
            [this] { return RunMigrate(m_ctx); });
  }

  void BuildShareCommands() {
    CLI::App* share = m_app.add_subcommand("share", "share lifecycle and per-share flags");
    share->require_subcommand(1);

    for (const auto& [name, description] : {
             std::pair{"remove", "the share was removed: drop its folders"},
             std::pair{"pause", "the share went offline"},
             std::pair{"resume", "the share is back"},
             std::pair{"clean", "remove the share's queue and index database"},
             std::pair{"revive", "clear the no-space flag and restart the share's worker"},
         }) {
      const std::string operation = name;
      CLI::App* command = Command(*share, name, description, [this, operation] {
        return RunShareOperation(m_ctx, operation, m_share);
      });
      command->add_option("NAME", m_share, "share name")->required();
    }

    CLI::App* rename = Command(
        *share, "rename",
        "the share was renamed: move its folders (only the list changes; pause the share before "
        "the rename and resume it under its new name)",
        [this] { return RunShareRename(m_ctx, m_share, m_newShare); });
    rename->add_option("OLD", m_share, "old share name")->required();
    rename->add_option("NEW", m_newShare, "new share name")->required();

    for (const char* flag : {"no-space", "need-reindex"}) {
      const std::string name = flag;
      CLI::App* command =
          Command(*share, flag, "show, set (on) or clear (off) the flag",
                  [this, name] { return RunShareFlag(m_ctx, name, m_share, m_flag); });
      command->add_option("NAME", m_share, "share name")->required();
      command->add_option("VALUE", m_flag, "on or off")->check(CLI::IsMember({"on", "off"}));
    }
  }

  void BuildQuestions() {
    CLI::App* isIndexed = m_app.add_subcommand(
        "is-indexed", "ask the C interface what is indexed (-q: answer by exit status)");
    isIndexed->require_subcommand(1);
    isIndexed->add_flag("-q,--quiet", m_quiet, "print nothing; exit 0 when indexed, 1 when not");
    for (const auto& [name, argument] : {
             std::pair{"path", "share path (/photo/2019)"},
             std::pair{"full-path", "full path (/volume1/photo/2019)"},
             std::pair{"share", "share name (photo)"},
         }) {
      const std::string question = name;
      CLI::App* command =
          Command(*isIndexed, name, std::string("is this ") + argument + " indexed",
                  [this, question] { return RunIsIndexed(m_ctx, question, m_path, m_quiet); });
      command->add_option("ARG", m_path, argument)->required();
    }

    CLI::App* storage = Command(m_app, "storage", "show where a share keeps its queue and index",
                                [this] { return RunStorage(m_ctx, m_share); });
    storage->add_option("NAME", m_share, "share name")->required();

    CLI::App* explain = Command(m_app, "explain",
                                "say whether a path may be indexed, which rule decides, "
                                "and whether an indexed folder holds it",
                                [this] { return RunExplain(m_ctx, m_path, m_fullPath); });
    explain->add_option("PATH", m_path, "share path, or full path")->required();
    explain->add_flag("--full-path", m_fullPath, "PATH is a full path");
  }

  CLI::App m_app{"", "fileindexctl"};
  std::function<int()> m_run;
  bool m_json = false;
  bool m_strict = false;
  bool m_verbose = false;
  bool m_quiet = false;
  std::string m_root;
  Output m_out;
  Context m_ctx;

  ListArgs m_list;
  AddArgs m_add;
  std::string m_path;
  std::vector<std::string> m_paths;
  std::string m_data = "{}";
  int m_hours = 0;
  std::string m_share;
  std::string m_newShare;
  std::string m_flag;
  bool m_fullPath = false;
};

}  // namespace

int main(int argc, char** argv) {
  try {
    Tool tool;
    return tool.Main(argc, argv);
  } catch (const std::exception& e) {
    std::cerr << "fileindexctl: " << Printable(e.what()) << '\n';
    return kExitFailed;
  }
}
