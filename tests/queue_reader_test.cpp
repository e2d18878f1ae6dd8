#include "utils/queue_reader.h"

#include <algorithm>
#include <cctype>
#include <memory>
#include <random>

#include "fileindex/utils.h"
#include "test_support.h"
#include "utils/line_index.h"

namespace WEZO::FILEINDEX {
namespace {

using namespace std::string_literals;

// {"event":<code>,"path":"<path>"<rest>}
std::string Ev(const std::string& code, const std::string& path, const std::string& rest = "") {
  return R"({"event":)" + code + R"(,"path":")" + path + '"' + rest + "}";
}

// "<event> <path> <path_old>" as the parser (`quick`: the scan) reads it, "none", or "unsure".
std::string LineAs(const std::string& line, bool quick = false) {
  QueueEvent e;
  using V = detail::LineVerdict;
  const V v = quick ? detail::ScanQueueLine(line.data(), line.size(), e)
              : ParseQueueLine(line.data(), line.size(), e) ? V::kEvent
                                                            : V::kNoEvent;
  if (v == V::kUnsure) return "unsure";
  return v == V::kEvent ? std::to_string(e.event) + " " + e.path + " " + e.pathOld : "none";
}

const detail::ReadOptions kPlain{size_t{1} << 20, false};

void Append(const std::string& path, const std::string& text) {
  std::ofstream(path, std::ios::app | std::ios::binary) << text;
}

class QueueReaderTest : public testsupport::LibraryTest {
 protected:
  const std::string& Queue(const std::string& text) {
    WriteFile(queue, text);
    return queue;
  }
  std::string queue = At("/queue");
};

TEST_F(QueueReaderTest, LineIsAnEventExactlyWhenTheStrictParserSaysSo) {
  const struct {
    std::string line;
    std::string event;
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
               {R"({"event":2,"path":"/caf\u00e9\/x\"\\\b\f\n\r\t"})",
                "2 /caf\xC3\xA9/x\"\\\b\f\n\r\t ", true},
               {R"({"event":2,"path":"\uD83D\uDE00\uD800\u0041\uDC00\u0000"})",
                "2 \xF0\x9F\x98\x80\xF0\x90\x81\x81\xED\xB0\x80\0 "s, true},
               {"{\"event\":2,\"path\":\"\x01\t\xFF\"}", "2 \x01\t\xFF ", true},
               {R"({"ev\u0065nt":2,"pa\u0074h":"/p","path_ol\u0064":"/o"})", "2 /p /o", true},
               {R"({"event":2,"path":"\uD800"})", "none", true},
               {R"({"event":2,"path":"\uD800\n"})", "none", true},
               {R"({"event":2,"path":"\uD800\uDC0"})", "none", true},
               {R"({"event":2,"path":"\u12G4"})", "none", true},
               {R"({"event":2,"path":"\x"})", "none", true},
               {R"({"event":2,"path":"/p\)", "none", true},
               {R"({"event":2,"path":"/p","data":{"a":[1,2)", "none", true},
               {R"({"event":2,"path":"/p","pa\u0074h":"/q"})", "none", false},
               {R"({"event":2,"path":"/p","data":nul)", "none", true},
               {R"({"event":2,"path":"/p"} {})", "none", false},
               {R"({"event":4294967296,"path":"/p"})", "none", false},
               {R"({"event":2,"path":3})", "none", false},
               {R"({"event":2})", "none", false},
               {R"([{"event":2,"path":"/p"}])", "none", false},
               {R"({"event":2,"path":"/p","data":)" + std::string(2000, '[') + "]}", "none", false},
               {"", "none", false}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.line);
    EXPECT_EQ(LineAs(c.line), c.event);
    const std::string scanned = LineAs(c.line, true);
    EXPECT_TRUE(scanned == c.event || (!c.quick && scanned == "unsure")) << scanned;
  }
}

// A queue that is missing or is no file is no error; a path outside every share is.
TEST_F(QueueReaderTest, QueueThatCannotBeReadAnswersFalse) {
  ASSERT_EQ(mkdir(At("/dir").c_str(), 0755), 0);
  for (const std::string& none : {At("/missing"), At("/dir")}) {
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
        "/photo/caf\xC3\xA9/x"s, "/photo/a\0b/x"s, "/photo/cafe\xCC\x81"s, "/photo/q\"\\/x"s,
        "/photo/\xF0\x9F\x98\x80/x"s, "/photo/a/" + std::string(300, 'l')}) {
    paths.push_back(volume + p);
  }
  // Mostly what the writers use, then what the parser accepts or refuses in odd ways.
  const std::vector<std::string> codes = Split(
      "2 2 8 8 256 256 131072 65536 2 8 256 1 4 65536.0 01 +1 -1 null true 1e2 -0 4294967296 "
      "4294967295 \"65536\" [256] 256.9 2.5 6.5536e4 65535.99999999999999999 655.36E+2 6553.6e1 "
      "0256 065536 00000065536 4294967295 9999999999",
      ' ');
  const std::vector<std::string> loose = Split(
      "not json||{}|[]|null|{\"\":1,}|\t|\xEF\xBB\xBF{}|{|\"x\"|\x01\x02|"
      "{\"event\":2,\"path\":\"/x\"}/**/|{\"event\":2,/*quirk*/\"path\":\"/v\"}",
      '|');
  // As the writers put a path in a line, or with any character escaped.
  const auto render = [&](const std::string& path) {
    std::string out;
    const bool escapeMore = rng() % 3 == 0;
    for (size_t i = 0; i < path.size(); ++i) {
      const auto c = static_cast<unsigned char>(path[i]);
      char hex[8];
      snprintf(hex, sizeof hex, "\\u%04x", c);
      if (path.compare(i, 4, "\xF0\x9F\x98\x80") == 0 && escapeMore) {
        out += "\\uD83D\\uDE00";
        i += 3;
      } else if (path.compare(i, 2, "\xC3\xA9") == 0 && escapeMore) {
        out += "\\u00E9";
        ++i;
      } else if (c == '"' || c == '\\') {
        out += '\\' + std::string(1, static_cast<char>(c));
      } else if (c == '/' && escapeMore) {
        out += "\\/";
      } else if (c < 0x80 && escapeMore && rng() % 8 == 0) {
        out += hex;
      } else {
        out += static_cast<char>(c);
      }
    }
    return out;
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
      {"\xFF", "\x01", "\0"s, "\\", "\"", "}", "\\u12", "\\uD800", "\\q"}};
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
    // Short queues give "no" answers, long ones "yes"; the first is empty. Every tenth is read
    // in 64 KiB blocks, so in two halves at once.
    detail::ForgetQueueScans();
    const bool halves = round % 10 == 9;
    const std::string text = MixedQueue(volume, rng,
                                        round == 0       ? 0
                                        : halves         ? 3000
                                        : round % 2 == 0 ? 6
                                                         : 100);
    Queue(text);
    ASSERT_TRUE(!halves || text.size() >= 4 * (size_t{64} << 10));
    const std::vector<size_t> blockSizes = halves ? std::vector<size_t>{size_t{64} << 10}
                                                  : std::vector<size_t>{size_t{1} << 20, 61, 7, 1};
    const detail::ReadOptions remembered{blockSizes[0], true};
    std::vector<std::string> lines = Split(text, '\n');
    if (lines.back().empty()) lines.pop_back();  // no line after the last "\n"
    std::vector<QueueEvent> events(lines.size());
    std::vector<bool> isEvent(lines.size());
    for (size_t i = 0; i < lines.size(); ++i) {
      // The quick scan may give up on any line, but never answers otherwise than the parser.
      const std::string scanned = LineAs(lines[i], true);
      EXPECT_TRUE(scanned == "unsure" || scanned == LineAs(lines[i])) << lines[i];
      isEvent[i] = ParseQueueLine(lines[i].data(), lines[i].size(), events[i]);
    }
    std::vector<std::string> folders;
    std::vector<bool> inFolders;
    size_t lastNeeded = 0;  // a read for all folders ends after this line
    for (const std::string& relative :
         {"/photo/a"s, "/photo/a/"s, "/photo/a/x.jpg"s, "/photo/a/b/c"s, "/photo/ab"s, "/photo"s,
          "/photo/caf\xC3\xA9"s, "/video/a"s, "/video/a/b"s, "/photo/a\x01\xFF"s, "/photo/a\0c"s,
          "/photo/q\"\\"s, "/photo/\xF0\x9F\x98\x80"s, "/photo/a/" + std::string(300, 'l')}) {
      const std::string path = volume + relative;
      bool reindex = false;
      size_t first = lines.size();
      for (size_t i = 0; i < lines.size(); ++i) {
        const QueueEvent& event = events[i];
        reindex = reindex || (isEvent[i] && event.event == 65536 && event.path == path);
        if (first == lines.size() && isEvent[i] &&
            (StringStartWith(event.path + "/", path + "/") ||
             (event.event == 256 && StringStartWith(event.pathOld + "/", path + "/")))) {
          first = i;
        }
      }
      const bool inFolder = first < lines.size();
      lastNeeded = std::max(lastNeeded, inFolder ? first : lines.size());
      ++answers[reindex];
      ++answers[inFolder];
      folders.push_back(path);
      inFolders.push_back(inFolder);
      for (const size_t blockSize : blockSizes) {
        SCOPED_TRACE(std::to_string(round) + " " + relative + " / " + std::to_string(blockSize));
        EXPECT_EQ(detail::IsReindexQueued(path, queue, {blockSize, false}), reindex);
      }
      // What the process remembers answers the same, whatever was asked before.
      EXPECT_EQ(detail::IsReindexQueued(path, queue, remembered), reindex);
    }
    std::vector<std::string> malformed;  // the log line ends where the line has a NUL byte
    for (size_t i = 0; i < lines.size() && i <= lastNeeded; ++i) {
      if (!isEvent[i]) {
        malformed.push_back("status_mgr:N Malformed command: " +
                            lines[i].substr(0, lines[i].find('\0')));
      }
    }
    // All folders in one read, wherever blocks end; each malformed line read is logged once.
    for (const size_t blockSize : blockSizes) {
      SCOPED_TRACE(std::to_string(round) + " / " + std::to_string(blockSize));
      log.Clear();
      std::vector<bool> found;
      detail::QueueFoldersWithEvents(folders, queue, found, {blockSize, false});
      EXPECT_EQ(found, inFolders);
      EXPECT_EQ(log.Lines(), malformed);
    }
    // Folder by folder twice through what the process remembers: a line is logged once.
    detail::ForgetQueueScans();
    Queue(text.empty() ? text : text + "\n");
    log.Clear();
    for (int pass = 0; pass < 2; ++pass) {
      for (size_t i = 0; i < folders.size(); ++i) {
        std::vector<bool> found;
        detail::QueueFoldersWithEvents({folders[i]}, queue, found, remembered);
        EXPECT_EQ(found[0], inFolders[i]) << folders[i];
      }
    }
    EXPECT_EQ(log.Lines(), malformed);
  }
  // Both answers come up often, or the comparison would prove little.
  EXPECT_GT(answers[0], 200);
  EXPECT_GT(answers[1], 200);
}

// A queue of four 64 KiB blocks is read in two halves at once. What the second half finds
// counts, the reading goes on past a malformed line in it, and each malformed line is logged
// once, in order.
TEST_F(QueueReaderTest, TwoHalvesAnswerAndLogAsOneReading) {
  const std::string a = volume + "/photo/a";
  const std::string b = volume + "/photo/b";
  const auto filler = [this](size_t size) {  // lines in no folder asked about
    std::string text;
    while (text.size() < size)
      text += Ev("2", volume + "/photo/x/" + std::to_string(text.size())) + "\n";
    return text;
  };
  // The middle falls in the second filler: "bad 1" is in the first half, the rest in the second.
  Queue(filler(100 << 10) + "bad 1\n" + filler(150 << 10) + filler(150 << 10) + Ev("2", b + "/y") +
        "\nbad 2\n" + Ev("65536", a) + "\n" + Ev("2", a + "/z") + "\n");
  std::vector<bool> found;
  detail::QueueFoldersWithEvents({a, b, volume + "/photo/none"}, queue, found, {64 << 10, false});
  EXPECT_EQ(found, (std::vector<bool>{true, true, false}));
  EXPECT_THAT(log.Lines(), ElementsAre("status_mgr:N Malformed command: bad 1",
                                       "status_mgr:N Malformed command: bad 2"));
  EXPECT_TRUE(detail::IsReindexQueued(a, queue, {64 << 10, false}));
  EXPECT_FALSE(detail::IsReindexQueued(b, queue, {64 << 10, false}));
}

// Lines ending at or across the readers' 64-byte and 16 KiB steps, odd ones too (odd codes in
// the writers' shape), with or without a last "\n", answer as the parser says.
TEST_F(QueueReaderTest, LinesAtTheEdgesOfWhatIsLookedAtOnceAnswerAsTheParser) {
  const std::string f = volume + "/photo/a";
  const std::string probes[] = {
      Ev("2", f + "/x"),
      Ev("65536", f),
      Ev("256", "/z", R"(,"path_old":")" + f + "/y\""),
      R"({"event":2,"path":")" + f + R"("x"})",                // a quote inside the path
      R"({"event":256,"path":"/z","path_old:"")" + f + "\"}",  // one quote of the name moved
      R"({"event":256,"path":")" + f + R"(/","path_old":"/z"})",
      Ev("2", f + "\\/x"),
      R"({"ev\u0065nt":65536,"path":")" + f + "\"}",
      Ev("65536", f, R"(,"data":"\\")"),
      Ev("65536", f) + "x",
      Ev("0256", "/x", R"(,"path_old":")" + f + "/y\""),
      Ev("00256", f + "x", R"(,"path_old":")" + f + '"'),
      Ev("065536", f),
      Ev("00000065536", f),
      Ev("4294967295", f),
      Ev("4294967296", f),
      Ev("1065536", f),
      R"({"data":null,"event":065536,"path":")" + f + "\"}"};
  for (const std::string& probe : probes) {
    QueueEvent e;
    const bool isEvent = ParseQueueLine(probe.data(), probe.size(), e);
    const bool inFolder =
        isEvent && (StringStartWith(e.path + "/", f + "/") ||
                    (e.event == 256 && StringStartWith(e.pathOld + "/", f + "/")));
    const bool reindex = isEvent && e.event == 65536 && e.path == f;
    // Its "\n" (or the file's end) at byte 63, 0 or 1 of a 64-byte chunk, or of a 16 KiB stretch.
    for (const size_t at : {1023, 1024, 1025, 16383, 16384, 16385, 16400}) {
      std::string text;
      for (size_t left = at - probe.size(); left > 0;) {  // plain lines outside the folder
        const size_t size = left <= 200 ? left : left - 200 >= 26 ? 200 : left - 26;
        text += R"({"event":2,"path":"/v/)" + std::string(size - 25, 'x') + "\"}\n";
        left -= size;
      }
      for (const char* end : {"\n", ""}) {
        Queue(text + probe + end);
        for (const size_t blockSize : {size_t{1} << 20, size_t{61}}) {
          SCOPED_TRACE(probe + " at " + std::to_string(at) + end + " / " +
                       std::to_string(blockSize));
          std::vector<bool> found;
          log.Clear();
          detail::QueueFoldersWithEvents({f}, queue, found, {blockSize, false});
          EXPECT_EQ(found[0], inFolder);
          EXPECT_EQ(log.Lines(),
                    isEvent ? std::vector<std::string>()
                            : std::vector<std::string>{"status_mgr:N Malformed command: " + probe});
          EXPECT_EQ(detail::IsReindexQueued(f, queue, {blockSize, false}), reindex);
        }
      }
    }
  }
}

// Only appends are read on; a queue replaced or rewritten, at the same size too, is read anew.
TEST_F(QueueReaderTest, RemembersWhatItReadOnlyWhileTheQueueIsTheSameFileWithTheSameBytes) {
  const std::string a = volume + "/photo/a";
  const std::string b = volume + "/photo/b";
  const auto line = [](const char* code, const std::string& path) { return Ev(code, path) + "\n"; };
  const auto rewrite = [this](const std::string& text) {  // same inode
    FILE* f = fopen(queue.c_str(), "r+");
    ASSERT_NE(f, nullptr);
    ASSERT_EQ(ftruncate(fileno(f), 0), 0);
    fputs(text.c_str(), f);
    fclose(f);
  };
  const auto replace = [this](const std::string& text) {  // a new inode renamed over it
    WriteFile(queue + ".new", text);
    ASSERT_EQ(rename((queue + ".new").c_str(), queue.c_str()), 0);
  };
  const std::string start = line("65536", a) + "junk\n" + line("2", b + "/x");
  const std::string swapped = line("65536", b) + "knuj\n" + line("2", a + "/x");
  const struct {
    std::function<void()> change;
    const char* logged;  // what a read through the memory logs, "" for nothing
  } steps[] = {
      {[&] { Queue(start); }, "junk"},
      {[&] { Append(queue, line("2", a + "/y")); }, ""},
      {[&] { Append(queue, "{\"event\":65536,\"path\":\"" + b); }, ""},
      // Every folder has an event: nothing more is read.
      {[&] { Append(queue, "\"}\n" + std::string("tail\n")); }, ""},
      {[&] {
         rewrite(swapped + line("2", b + "/y") + "{\"event\":65536,\"path\":\"" + a +
                 "\"}\nliat\n");
       },
       "liat"},
      {[&] {
         replace(start + line("2", a + "/y") + "{\"event\":65536,\"path\":\"" + b + "\"}\ntail\n");
       },
       "junk"},
      {[&] { rewrite(line("2", b + "/z")); }, ""},
      {[&] { rewrite(""); }, ""},
  };
  for (size_t s = 0; s < std::size(steps); ++s) {
    SCOPED_TRACE(s);
    steps[s].change();
    const std::vector<std::string> folders = {a, b, b + "/x", a + "/y", volume + "/photo"};
    std::vector<bool> plain;
    std::vector<bool> remembered;
    detail::QueueFoldersWithEvents(folders, queue, plain, kPlain);
    log.Clear();
    QueueFoldersWithEvents(folders, queue, remembered);
    EXPECT_EQ(remembered, plain);
    const std::vector<std::string> logged = log.Lines();
    EXPECT_EQ(
        logged.empty() ? "" : logged.back(),
        *steps[s].logged == '\0' ? "" : "status_mgr:N Malformed command: "s + steps[s].logged);
    for (const std::string& path : folders) {
      EXPECT_EQ(IsReindexQueued(path, queue), detail::IsReindexQueued(path, queue, kPlain)) << path;
    }
  }
}

// Stops and reindex hints as a byte-by-byte reading finds them, for stretches ending around the
// 16, 32 and 64-byte steps, with and without AVX2.
TEST(LineIndexTest, FindsWhatAReadingByteByByteFinds) {
  std::mt19937 rng(7);
  static constexpr char kBytes[] = "ab\"\\\n/{}6553eE0.9u:_-";
  std::string bytes(600, 'x');
  for (char& c : bytes) c = kBytes[rng() % (sizeof kBytes - 1)];
  for (const size_t at : {13, 29, 30, 62, 63, 127, 300, 596}) bytes.replace(at, 4, "6553");
  // A hint: "6553", or an exponent after digits and points where a number can begin.
  const auto hint = [&bytes](size_t i, size_t size) {
    if (bytes.compare(i, 4, "6553") == 0 && i + 4 <= size) return true;
    if ((bytes[i] | 0x20) != 'e') return false;
    size_t j = i;
    while (j > 0 &&
           (std::isdigit(static_cast<unsigned char>(bytes[j - 1])) || bytes[j - 1] == '.')) {
      --j;
    }
    return j < i && (j == 0 || std::string_view(" \t\r\n:,[/-+").find(bytes[j - 1]) !=
                                   std::string_view::npos);
  };
  const auto index = std::make_unique<detail::LineIndex>();
  for (const bool baseline : {false, true}) {
    detail::UseBaselineLineIndex(baseline);
    for (const size_t size : {1, 15, 16, 17, 31, 32, 33, 63, 64, 65, 200, 600}) {
      SCOPED_TRACE(testing::Message() << size << (baseline ? " baseline" : ""));
      const char* const begin = bytes.data();
      const char* const end = begin + size;
      index->Build(begin, end);
      const char* next = nullptr;  // asked only where a stop follows
      for (const char* p = end; p-- != begin;) {
        next = *p == '"' || *p == '\\' || *p == '\n' ? p : next;
        EXPECT_TRUE(next == nullptr || index->NextStop(p) == next) << p - begin;
      }
      for (size_t from = 0; from < size; from += 7) {
        size_t first = from;
        while (first < size && !hint(first, size)) ++first;
        const char* found = detail::NextReindexHint(begin, begin + from, end);
        EXPECT_EQ(found == nullptr ? size : static_cast<size_t>(found - begin), first) << from;
      }
    }
  }
  detail::UseBaselineLineIndex(false);
}

}  // namespace
}  // namespace WEZO::FILEINDEX
