// A stand-in for the indexing daemon: listens on the daemon's command socket and prints one line
// per command it receives, so that a person or a script can watch what the library tells the
// daemon. It indexes nothing.
//
// A connection carries frames until EOF: a 4-byte length in host byte order, then that many bytes
// of compact JSON text {"type": <name>, "data": <arguments>} ending with a zero byte that the
// length counts. A malformed frame is reported and ends its connection. Connections are served one
// after the other, as the library's each carry one command and are closed at once.
//
// With --consume it also plays the daemon's side of the event queues: on SIGUSR1 it takes every
// queue that the library registered with the file-change monitor (var/lib/wezotifyd/fileindex
// under --root), under the queue's lock, prints how many events it held and removes it, as the
// daemon does once it has indexed them.
#include <dirent.h>
#include <fcntl.h>
#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <exception>
#include <memory>
#include <string>

namespace {

constexpr uint32_t kMaxFrame = 1024 * 1024;

volatile std::sig_atomic_t g_stop = 0;
volatile std::sig_atomic_t g_consume = 0;
sigset_t g_waitMask;     // the mask while waiting: the signals get through only then
std::string g_registry;  // where the queues to consume are registered; empty without --consume

void OnStopSignal(int /*signal*/) { g_stop = 1; }
void OnConsumeSignal(int /*signal*/) { g_consume = 1; }

FILE* g_out = stdout;

void PrintLine(const std::string& line) {
  (void)std::fprintf(g_out, "fileindexd: %s\n", line.c_str());
  (void)std::fflush(g_out);
}

bool ParseJson(const std::string& text, Json::Value& value) {
  Json::CharReaderBuilder reader;
  Json::CharReaderBuilder::strictMode(&reader.settings_);
  const std::unique_ptr<Json::CharReader> parser(reader.newCharReader());
  return parser->parse(text.data(), text.data() + text.size(), &value, nullptr);
}

std::string ReadAll(int fd) {
  std::string text;
  char buffer[65536];
  for (ssize_t got; (got = read(fd, buffer, sizeof buffer)) > 0;) {
    text.append(buffer, static_cast<size_t>(got));
  }
  return text;
}

// Takes the queue at `queue` (and its ".tmp" companion): reads it under its lock and removes it
// before letting the lock go, so a writer waiting for the lock finds it gone and makes a new one.
void ConsumeQueue(const std::string& queue) {
  size_t events = 0;
  for (const std::string& path : {queue, queue + ".tmp"}) {
    const int fd = open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) {
      continue;
    }
    struct stat st {};
    if (fstat(fd, &st) == 0 && S_ISREG(st.st_mode) && flock(fd, LOCK_EX) == 0) {
      const std::string text = ReadAll(fd);
      for (const char c : text) {
        events += c == '\n' ? 1 : 0;
      }
      unlink(path.c_str());
    }
    close(fd);
  }
  PrintLine("consumed " + std::to_string(events) + " events of " + queue);
}

void ConsumeQueues() {
  DIR* dir = opendir(g_registry.c_str());
  if (dir == nullptr) {
    PrintLine("no registrations in " + g_registry);
    return;
  }
  while (const dirent* entry = readdir(dir)) {
    const std::string name = entry->d_name;
    if (name.size() <= 5 || name.compare(name.size() - 5, 5, ".json") != 0) {
      continue;
    }
    std::string file = g_registry + "/";
    file += name;
    const int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
      continue;
    }
    Json::Value registration;
    if (ParseJson(ReadAll(fd), registration) && registration.isObject() &&
        registration["queue"].isString()) {
      ConsumeQueue(registration["queue"].asString());
    }
    close(fd);
  }
  closedir(dir);
}

// Says on stderr what could not be done with `path`, with errno's reason; returns the exit status.
int Fail(const char* what, const std::string& path) {
  (void)std::fprintf(stderr, "fileindexd-standin: %s %s: %s\n", what, path.c_str(),
                     std::strerror(errno));
  return 1;
}

// Waits until `fd` can be read; false once a stop is requested. The signals are let through only
// inside ppoll, so none is lost between the check and the wait.
bool WaitReadable(int fd) {
  pollfd entry{fd, POLLIN, 0};
  while (g_stop == 0) {
    if (g_consume != 0) {
      g_consume = 0;
      ConsumeQueues();
    }
    if (ppoll(&entry, 1, nullptr, &g_waitMask) > 0) {
      return true;
    }
  }
  return false;
}

// Reads up to `count` bytes; fewer only at EOF, an error or a stop.
size_t ReadFull(int fd, char* buffer, size_t count) {
  size_t done = 0;
  while (done < count && WaitReadable(fd)) {
    const ssize_t got = read(fd, buffer + done, count - done);
    if (got <= 0) {
      break;
    }
    done += static_cast<size_t>(got);
  }
  return done;
}

std::string Describe(const std::string& text) {
  Json::Value command;
  if (!ParseJson(text, command) || !command.isObject() || !command["type"].isString()) {
    return text;
  }
  Json::StreamWriterBuilder writer;
  writer["indentation"] = "";
  writer["emitUTF8"] = true;
  return command["type"].asString() + " " + Json::writeString(writer, command["data"]);
}

// Prints every frame of the connection until EOF or a stop. Returns what is wrong with the first
// malformed frame, which ends the connection, or "".
std::string Serve(int fd) {
  for (;;) {
    uint32_t length = 0;
    const size_t head = ReadFull(fd, reinterpret_cast<char*>(&length), sizeof length);
    if (head == 0 || g_stop != 0) {
      return "";
    }
    if (head < sizeof length) {
      return "length cut short after " + std::to_string(head) + " bytes";
    }
    if (length == 0 || length > kMaxFrame) {
      return "absurd length " + std::to_string(length);
    }
    std::string text(length, '\0');
    const size_t got = ReadFull(fd, text.data(), length);
    if (g_stop != 0) {
      return "";
    }
    if (got < length) {
      return std::to_string(got) + " of " + std::to_string(length) + " bytes";
    }
    if (text.back() != '\0') {
      return "no terminating zero";
    }
    text.pop_back();
    PrintLine(Describe(text));
  }
}

int Run(int argc, char** argv) {
  std::string socketPath;
  std::string logPath;
  CLI::App app{"Stand-in for the indexing daemon: prints the commands sent to its socket"};
  app.add_option("--socket", socketPath, "the Unix stream socket to listen on")->required();
  app.add_option("--log", logPath, "append the lines to this file instead of stdout");
  std::string root;
  bool consume = false;
  app.add_option("--root", root, "the sandbox root whose registrations --consume reads");
  app.add_flag("--consume", consume,
               "on SIGUSR1, take and remove the event queues registered with the file-change "
               "monitor");
  CLI11_PARSE(app, argc, argv);
  if (consume) {
    g_registry = root + "/var/lib/wezotifyd/fileindex";
  }

  if (!logPath.empty()) {
    g_out = std::fopen(logPath.c_str(), "ae");
    if (g_out == nullptr) {
      return Fail("cannot open", logPath);
    }
  }
  sigset_t stopSignals;
  sigemptyset(&stopSignals);
  sigaddset(&stopSignals, SIGTERM);
  sigaddset(&stopSignals, SIGINT);
  sigaddset(&stopSignals, SIGUSR1);
  sigprocmask(SIG_BLOCK, &stopSignals, &g_waitMask);
  struct sigaction action {};
  action.sa_handler = OnStopSignal;
  sigaction(SIGTERM, &action, nullptr);
  sigaction(SIGINT, &action, nullptr);
  if (consume) {
    action.sa_handler = OnConsumeSignal;
    sigaction(SIGUSR1, &action, nullptr);
  }

  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (socketPath.size() >= sizeof address.sun_path) {
    errno = ENAMETOOLONG;
    return Fail("cannot listen on", socketPath);
  }
  std::memcpy(address.sun_path, socketPath.c_str(), socketPath.size() + 1);
  struct stat st {};
  if (lstat(socketPath.c_str(), &st) == 0 && S_ISSOCK(st.st_mode)) {
    unlink(socketPath.c_str());  // left behind by an earlier run
  }
  const int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (listener < 0 || bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      listen(listener, SOMAXCONN) != 0) {
    return Fail("cannot listen on", socketPath);
  }
  PrintLine("listening on " + socketPath);

  while (WaitReadable(listener)) {
    const int connection = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
    if (connection < 0) {
      continue;
    }
    const std::string problem = Serve(connection);
    if (!problem.empty()) {
      PrintLine("malformed frame (" + problem + ")");
    }
    close(connection);
  }
  close(listener);
  unlink(socketPath.c_str());
  PrintLine("stopped");
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  try {
    return Run(argc, argv);
  } catch (const std::exception& e) {
    (void)std::fprintf(stderr, "fileindexd-standin: %s\n", e.what());
    return 1;
  }
}
