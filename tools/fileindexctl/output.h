// How fileindexctl speaks: text for people, JSON for scripts, warnings and failures on stderr.
//
// Everything a subcommand prints goes through Output, so that every path and name a person sees
// is escaped, every JSON document is valid UTF-8, and warnings, --strict and the exit statuses
// follow one rule for all subcommands.
#ifndef FILEINDEXCTL_OUTPUT_H_
#define FILEINDEXCTL_OUTPUT_H_

#include <json/value.h>

#include <string>
#include <vector>

namespace fileindexctl {

constexpr int kExitFailed = 1;
constexpr int kExitUsage = 2;

// `text` as a terminal may show it: control characters, the backslash and bytes that are not
// UTF-8 are written as escapes ("\n", "\\", "\x1b"), so that a path cannot break a line or steer
// the terminal.
std::string Printable(const std::string& text);

// `value` with every string and key made valid UTF-8: a byte that does not belong to a valid
// sequence becomes U+FFFD.
Json::Value ValidUtf8(const Json::Value& value);

// Prints `value` as indented JSON, always valid UTF-8.
void PrintJson(const Json::Value& value);

Json::Value StringArray(const std::vector<std::string>& items);

// One thing a change command did, for both outputs: `action` and `target` ("removed",
// "/photo/2019") and any `extra` members in JSON, `text` for people.
struct Change {
  std::string action;
  std::string target;
  std::string text;
  Json::Value extra = Json::Value(Json::objectValue);
};

// What the library logged and what a failure left behind, for the failure report.
struct Aftermath {
  std::vector<std::string> logLines;  // the library's own lines, as "unit:line message"
  std::vector<Change> saved;          // what was saved before the failing step
  std::string failedStep;             // "telling the daemon", or "" when unknown
  std::string failedLine;             // the log line that names the failing step
  std::vector<std::string> notDone;   // the steps after it, which did not run
  std::vector<std::string> state;     // the daemon's and the service's state, one line each
  std::string retry;                  // how to finish the job
};

class Output {
 public:
  Output(const bool& json, const bool& strict) : m_json(json), m_strict(strict) {}

  bool Json() const { return m_json; }

  // Tells the user that the library will accept what they asked but it will not do what they
  // expect. `key` names the kind of warning for scripts ("not_listed").
  void Warn(const std::string& key, const std::string& subject, const std::string& message);

  // True, after saying so, when --strict turns the warnings given so far into a refusal; the
  // subcommand must then stop before the library is called and return kExitFailed.
  bool RefusedByStrict(const std::string& command) const;

  const Json::Value& Warnings() const { return m_warnings; }

  // Reports a change command that succeeded: a line per change, or the JSON envelope.
  int Done(const std::vector<Change>& changes) const;

  // Reports a failed operation `what` with the library's last error code; `detail` stands in for
  // the code's description when the failing call set no code of its own. `aftermath`, when
  // given, tells what was saved, which step failed and how to finish.
  int Fail(const std::string& what, const std::string& detail = "",
           const Aftermath* aftermath = nullptr) const;

 private:
  const bool& m_json;
  const bool& m_strict;
  Json::Value m_warnings = Json::Value(Json::arrayValue);
};

}  // namespace fileindexctl

#endif  // FILEINDEXCTL_OUTPUT_H_
