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
    "status: 0 indexed, 1 not. \"check\" exits 1 when something disagrees (with --repair: when "
    "something is left).";

class Tool {
 public:
  Tool() : m_out(m_json, m_strict), m_ctx{m_out, false, {}} { Build(); }

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
      return m_ctx.run();
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

  void Build() {
    m_app.description(
        "Administer the file-index service: indexed folders, pausing, share flags, questions "
        "and a consistency check.");
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

    AddFolderCommands(m_app, m_ctx);
    AddServiceCommands(m_app, m_ctx);
    AddShareCommands(m_app, m_ctx);
    AddQuestionCommands(m_app, m_ctx);
    AddCheckCommand(m_app, m_ctx);
    // Set last, so that the subcommands' help does not repeat it.
    m_app.footer(kFooter);
  }

  CLI::App m_app{"", "fileindexctl"};
  bool m_json = false;
  bool m_strict = false;
  bool m_verbose = false;
  std::string m_root;
  Output m_out;
  Context m_ctx;
};

}  // namespace

namespace fileindexctl {

CLI::App* AddCommand(CLI::App& parent, Context& ctx, const std::string& name,
                     const std::string& description, std::function<int()> run) {
  CLI::App* command = parent.add_subcommand(name, description);
  command->callback([&ctx, run = std::move(run)] { ctx.run = run; });
  return command;
}

}  // namespace fileindexctl

int main(int argc, char** argv) {
  try {
    Tool tool;
    return tool.Main(argc, argv);
  } catch (const std::exception& e) {
    std::cerr << "fileindexctl: " << Printable(e.what()) << '\n';
    return kExitFailed;
  }
}
