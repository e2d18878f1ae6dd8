#include "utils/queue_reader.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <random>
#include <sstream>

#include "fileindex/utils.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using namespace std::string_literals;

// {"event":<code>,"path":"<path>"<rest>}
std::string Ev(const std::string& code, const std::string& path, const std::string& rest = "") {
  return R"({"event":)" + code + R"(,"path":")" + path + '"' + rest + "}";
}

std::string EscapeSlashes(const std::string& path) {
  std::string out;
  for (const char c : path) out += c == '/' ? "\\/"s : std::string(1, c);
  return out;
}

// "<event> <path> <path_old>" as the parser, or the quick scan, reads the line; "none" for no
// event, "unsure" when the scan gives up.
std::string Parsed(const std::string& line) {
  QueueEvent e;
  return ParseQueueLine(line.data(), line.size(), e)
             ? std::to_string(e.event) + " " + e.path + " " + e.pathOld
             : "none";
}
std::string Scanned(const std::string& line) {
  detail::ScannedEvent e;
  return detail::ScanQueueLine(line.data(), line.size(), e)
             ? std::to_string(e.event) + " " + std::string(e.path, e.pathSize) + " " +
                   (e.pathOld == nullptr ? "" : std::string(e.pathOld, e.pathOldSize))
             : "unsure";
}

class QueueReaderTest : public testsupport::LibraryTest {
 protected:
  const std::string& Queue(const std::string& text) {
    testsupport::WriteFile(queue, text);
    return queue;
  }
  std::string queue = sandbox.Path("/queue");
};

TEST_F(QueueReaderTest, LineIsAnEventExactlyWhenTheStrictParserSaysSo) {
  const struct {
    std::string line;
    const char* event;
    bool quick;  // what the writers produce must not need the parser
  } cases[] = {{R"({"event":2,"path":"/p"})", "2 /p ", true},
               {R"( {"path_old":"/o", "path":"/p","event":256 } )", "256 /p /o", true},
               {R"({"event":256,"path":"/p","path_old":7})", "256 /p ", true},
               {R"({"event":2,"path":"/p","data":{"a":[1,-2.5,"x",true,false,null,{}],"b":[]}})",
                "2 /p ", true},
               {R"({"event":4294967295,"path":"/p"})", "4294967295 /p ", true},
               {R"({"event":+1,"path":"/p"})", "1 /p ", false},
               {R"({"event":1.5,"path":"/p"})", "1 /p ", false},
               {R"({"event":true,"path":"/p"})", "1 /p ", false},
               {"{\"event\":2,\"path\":\"/p\"}\0 x"s, "2 /p ", false},
               {R"({"event":2,"path":"/caf\u00e9\/x"})", "2 /caf\xC3\xA9/x ", false},
               {R"({"event":4294967296,"path":"/p"})", "none", false},
               {R"({"event":2,"path":3})", "none", false},
               {R"({"event":2})", "none", false},
               {R"([{"event":2,"path":"/p"}])", "none", false},
               {R"({"event":2,"path":"/p","data":)" + std::string(2000, '[') + "]}", "none", false},
               {"", "none", false}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.line);
    EXPECT_EQ(Parsed(c.line), c.event);
    const std::string scanned = Scanned(c.line);
    EXPECT_TRUE(scanned == c.event || (!c.quick && scanned == "unsure")) << scanned;
  }
}

// A queue that is missing or is no file is no error; a path outside every share is.
TEST_F(QueueReaderTest, QueueThatCannotBeReadAnswersFalse) {
  ASSERT_EQ(mkdir(sandbox.Path("/dir").c_str(), 0755), 0);
  for (const std::string& none : {sandbox.Path("/missing"), sandbox.Path("/dir")}) {
    EXPECT_FALSE(IsReindexQueued(volume + "/photo/a", none));
    EXPECT_FALSE(QueueHasFolderEvent("/photo/a", none));
  }
  EXPECT_FALSE(QueueHasFolderEvent("/nosuch/a", Queue(Ev("65536", volume + "/nosuch/a") + "\n")));
  EXPECT_THAT(log.Lines(), ElementsAre("status_mgr:N Cannot get full path: /nosuch/a"));
}

std::vector<std::string> Split(const std::string& text, char by) {
  std::vector<std::string> parts;
  std::istringstream in(text + by);
  for (std::string part; std::getline(in, part, by);) parts.push_back(part);
  return parts;
}

// `count` lines of every kind the readers meet, valid or not, the last one without "\n".
std::string MixedQueue(const std::string& volume, std::mt19937& rng, int count) {
  const auto pick = [&rng](const std::vector<std::string>& from) -> const std::string& {
    return from[rng() % from.size()];
  };
  std::vector<std::string> paths = {"/elsewhere", ""};
  for (const std::string& p :
       {"/photo/a"s, "/photo/a/"s, "/photo/a/x.jpg"s, "/photo/a/b/c"s, "/photo/ab"s, "/photo/ab/x"s,
        "/photo"s, "/video/a"s, "/video/a/b"s, "/photo/a\x01\xFF/x"s, "/photo/caf\xC3\xA9"s,
        "/photo/caf\xC3\xA9/x"s, "/photo/a\0b/x"s, "/photo/cafe\xCC\x81"s}) {
    paths.push_back(volume + p);
  }
  // Mostly what the writers use, then what the parser accepts or refuses in odd ways.
  const std::vector<std::string> codes = Split(
      "2 2 8 8 256 256 131072 65536 2 8 256 1 4 65536.0 01 +1 -1 null true 1e2 -0 4294967296 "
      "4294967295 \"65536\" [256] 256.9 2.5",
      ' ');
  const std::vector<std::string> loose = Split(
      "not json||{}|[]|null|{\"\":1,}|\t|\xEF\xBB\xBF{}|{|\"x\"|\x01\x02|"
      "{\"event\":2,\"path\":\"/x\"}/**/|{\"event\":2,/*quirk*/\"path\":\"/v\"}",
      '|');
  const auto render = [&](const std::string& path) {
    std::string out = rng() % 6 == 0 ? EscapeSlashes(path) : path;
    const size_t at = out.find("caf\xC3\xA9");
    return at == std::string::npos || rng() % 2 == 0 ? out : out.replace(at, 5, "caf\\u00e9");
  };
  const auto data = [&]() -> std::string {
    const std::string& p = pick(paths);
    return pick({"null", "{}", R"({"path":")" + p + R"("})", '"' + p + '"',
                 R"([1,-2.25,{"path":")" + p + R"(","n":[true,false,null,{}]},[]])",
                 R"({"a":{"b":{"c":[[["deep"]]]}},"x":12345678901234567890})",
                 R"({"k":"\")" + p + R"(\""})"});
  };
  // Damage at the end, after "{", before "}", at the start or in the middle of a line.
  const std::vector<std::string> damage[] = {
      {" ", " x", ",", "}", "\0tail"s, "/*c*/", "\r"},
      {"/*c*/", " ", "\t", R"("event":3,)", R"("path":"/d",)", ","},
      {",", R"(,"data":1,"data":2)", R"(,"":1,)", " ", "\f", R"(,"data":tru)", R"(,"data":[1,])",
       R"(,"data":1.)", R"(,"data":-)", R"(,"data":{"a":1,"a":2})"},
      {"\xEF\xBB\xBF"},
      {"\xFF", "\x01", "\0"s, "\\", "\"", "}"}};
  std::string text;
  for (int i = 0; i < count; ++i) {
    std::string line = "{";
    if (rng() % 12 == 0) {
      line = pick(loose);
    } else {
      const std::string& code = pick(codes);
      std::vector<std::string> members = {R"("event":)" + code,
                                          R"("path":")" + render(pick(paths)) + '"'};
      if (code == "256" || rng() % 8 == 0) {
        const std::string old = '"' + render(pick(paths)) + '"';
        members.push_back(R"("path_old":)" + (rng() % 10 == 0 ? '[' + old + ']' : old));
      }
      if (rng() % 3 == 0) members.push_back(R"("data":)" + data());
      std::shuffle(members.begin(), members.end(), rng);
      for (size_t m = 0; m < members.size(); ++m) {
        line += (m == 0 ? "" : rng() % 4 == 0 ? " , " : ",") + members[m];
      }
      line += "}";
      const unsigned kind = rng() % 30;
      if (kind == 0) line.resize(rng() % line.size());
      const size_t at[] = {line.size(), 1, line.size() - 1, 0, line.size() / 2};
      if (kind >= 1 && kind <= 5) line.insert(at[kind - 1], pick(damage[kind - 1]));
    }
    text += line + (i + 1 < count ? "\n" : "");
  }
  return text;
}

// The readers scan blocks quickly; they must answer as the parser would on every line.
TEST_F(QueueReaderTest, ReadersAnswerAsParsingEveryLineWhereverBlocksEnd) {
  std::mt19937 rng(1234567);  // NOLINT(cert-msc32-c,cert-msc51-cpp): the same queues every run
  int answers[2] = {0, 0};
  for (int round = 0; round < 40; ++round) {
    // Short queues give "no" answers, long ones "yes"; the first is empty.
    const std::string text = MixedQueue(volume, rng, round == 0 ? 0 : round % 2 == 0 ? 6 : 100);
    Queue(text);
    std::vector<QueueEvent> events;
    std::vector<std::string> malformed;
    std::vector<std::string> lines = Split(text, '\n');
    if (lines.back().empty()) lines.pop_back();  // no line after the last "\n"
    for (const std::string& line : lines) {
      // The quick scan may give up on any line, but never answers otherwise than the parser.
      const std::string scanned = Scanned(line);
      EXPECT_TRUE(scanned == "unsure" || scanned == Parsed(line)) << line;
      QueueEvent event;
      if (ParseQueueLine(line.data(), line.size(), event)) {
        events.push_back(event);
      } else {  // the log line ends where the line has a NUL byte
        malformed.push_back("status_mgr:N Malformed command: " + line.substr(0, line.find('\0')));
      }
    }
    for (const std::string& relative :
         {"/photo/a"s, "/photo/a/"s, "/photo/a/x.jpg"s, "/photo/a/b/c"s, "/photo/ab"s, "/photo"s,
          "/photo/caf\xC3\xA9"s, "/video/a"s, "/video/a/b"s, "/photo/a\x01\xFF"s, "/photo/a\0c"s}) {
      const std::string path = volume + relative;
      bool reindex = false;
      bool inFolder = false;
      for (const QueueEvent& event : events) {
        reindex = reindex || (event.event == 65536 && event.path == path);
        inFolder = inFolder || StringStartWith(event.path + "/", path + "/") ||
                   (event.event == 256 && StringStartWith(event.pathOld + "/", path + "/"));
      }
      ++answers[reindex];
      ++answers[inFolder];
      for (const size_t blockSize : {size_t{1} << 20, size_t{61}, size_t{1}}) {
        SCOPED_TRACE(std::to_string(round) + " " + relative + " / " + std::to_string(blockSize));
        EXPECT_EQ(detail::IsReindexQueued(path, queue, blockSize), reindex);
        log.Clear();
        EXPECT_EQ(detail::QueueHasFolderEvent(relative, queue, blockSize), inFolder);
        EXPECT_EQ(log.Lines(), malformed);
      }
    }
  }
  // Both answers come up often, or the comparison would prove little.
  EXPECT_GT(answers[0], 200);
  EXPECT_GT(answers[1], 200);
}

}  // namespace
}  // namespace WEZO::FILEINDEX
