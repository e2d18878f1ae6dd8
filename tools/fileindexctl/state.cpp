#include "state.h"

#include <fcntl.h>
#include <fileindex/root.h>
#include <poll.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <utility>

namespace fi = WEZO::FILEINDEX;

namespace fileindexctl {

namespace {

constexpr char kIdent[] = "fileindexctl";
constexpr char kLinePrefix[] = "fileindexctl: ";

void WriteAll(int fd, const std::string& text) {
  size_t done = 0;
  while (done < text.size()) {
    const ssize_t wrote = write(fd, text.data() + done, text.size() - done);
    if (wrote < 0 && errno == EINTR) {
      continue;
    }
    if (wrote <= 0) {
      return;
    }
    done += static_cast<size_t>(wrote);
  }
}

// Reads `fd` to its end into `text`, for at most `milliseconds`; false when time ran out first.
bool ReadWithin(int fd, int milliseconds, std::string& text) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(milliseconds);
  char buffer[4096];
  for (;;) {
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    pollfd ready{fd, POLLIN, 0};
    const int polled = left.count() > 0 ? poll(&ready, 1, static_cast<int>(left.count())) : 0;
    if (polled < 0 && errno == EINTR) {
      continue;
    }
    if (polled <= 0) {
      return false;
    }
    const ssize_t got = read(fd, buffer, sizeof buffer);
    if (got < 0 && errno == EINTR) {
      continue;
    }
    if (got <= 0) {
      return true;
    }
    text.append(buffer, static_cast<size_t>(got));
  }
}

}  // namespace

LibraryCall::LibraryCall(bool verbose) : m_verbose(verbose) {
  m_capture = memfd_create("fileindexctl-log", MFD_CLOEXEC);
  if (m_capture >= 0) {
    m_savedStderr = fcntl(STDERR_FILENO, F_DUPFD_CLOEXEC, 3);
    if (m_savedStderr < 0 || dup2(m_capture, STDERR_FILENO) < 0) {
      if (m_savedStderr >= 0) {
        close(m_savedStderr);
        m_savedStderr = -1;
      }
      close(m_capture);
      m_capture = -1;
    }
  }
  // Without a capture the lines would land on the user's terminal unasked.
  openlog(kIdent, m_capture >= 0 || m_verbose ? LOG_PERROR : 0, LOG_USER);
}

LibraryCall::~LibraryCall() { Stop(); }

void LibraryCall::Stop() {
  if (m_capture < 0) {
    return;
  }
  (void)dup2(m_savedStderr, STDERR_FILENO);
  close(m_savedStderr);
  m_savedStderr = -1;
  std::string captured;
  // The capture is a file in memory: it is always ready, so the bound is never reached.
  if (lseek(m_capture, 0, SEEK_SET) == 0) {
    constexpr int kAlwaysReadyMs = 1000;
    (void)ReadWithin(m_capture, kAlwaysReadyMs, captured);
  }
  close(m_capture);
  m_capture = -1;
  openlog(kIdent, m_verbose ? LOG_PERROR : 0, LOG_USER);

  std::string others;
  size_t start = 0;
  while (start < captured.size()) {
    size_t end = captured.find('\n', start);
    end = end == std::string::npos ? captured.size() : end + 1;
    const std::string line = captured.substr(start, end - start);
    start = end;
    if (line.rfind(kLinePrefix, 0) == 0) {
      std::string message = line.substr(sizeof kLinePrefix - 1);
      if (!message.empty() && message.back() == '\n') {
        message.pop_back();
      }
      m_lines.push_back(message);
    } else {
      others += line;
    }
  }
  WriteAll(STDERR_FILENO, m_verbose ? captured : others);
}

std::string DaemonSocket() { return fi::GetRootPrefix() + "/var/run/fileindexd.sock"; }

std::string DaemonProblem() {
  const std::string path = DaemonSocket();
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) {
    return "the socket path is too long to connect to";
  }
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) {
    return std::strerror(errno);
  }
  const int rc = connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address);
  const int error = errno;
  close(fd);
  // A full backlog (EAGAIN) still means that a daemon listens.
  if (rc == 0 || error == EAGAIN || error == EINPROGRESS) {
    return "";
  }
  return std::strerror(error);
}

std::string ServiceState() {
  const std::string systemctl = fi::GetRootPrefix() + "/usr/bin/systemctl";
  std::array<int, 2> pipeFds{};
  if (pipe2(pipeFds.data(), O_CLOEXEC) != 0) {
    return std::string("unknown (") + std::strerror(errno) + ")";
  }
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, pipeFds[1], STDOUT_FILENO);
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, "/dev/null", O_WRONLY, 0);
  std::string verb = "is-active";
  std::string unit = kServiceUnit;
  std::string program = systemctl;
  std::array<char*, 4> argv = {program.data(), verb.data(), unit.data(), nullptr};
  pid_t pid = -1;
  const int spawned = posix_spawn(&pid, systemctl.c_str(), &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  close(pipeFds[1]);
  if (spawned != 0) {
    close(pipeFds[0]);
    return "unknown (cannot run " + systemctl + ": " + std::strerror(spawned) + ")";
  }
  std::string text;
  const bool answered = ReadWithin(pipeFds[0], kServiceQuerySeconds * 1000, text);
  close(pipeFds[0]);
  // A systemctl that hangs (a bus that does not answer) must not hang the status report.
  if (!answered) {
    (void)kill(pid, SIGKILL);
  }
  int status = 0;
  while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  if (!answered) {
    return "unknown (" + systemctl + " gave no answer within " +
           std::to_string(kServiceQuerySeconds) + " s)";
  }
  text = text.substr(0, text.find('\n'));
  if (!text.empty()) {
    return text;
  }
  // systemctl always names the state; a program that names none answers by exit status only.
  return WIFEXITED(status) && WEXITSTATUS(status) == 0 ? "active" : "inactive";
}

namespace {

struct StepInfo {
  const char* key;
  const char* description;
};

constexpr StepInfo kSteps[] = {
    {"monitor", "registering the folders with the file-change monitor"},
    {"service", "starting the service fileindexd"},
    {"daemon", "telling the daemon"},
    {"queue", "queueing the update events"},
    {"clean", "removing the share's index data"},
    {"unregister", "dropping the share's registration with the file-change monitor"},
};

// The library's lines that name each step's failure; the last such line of a call is the outermost.
constexpr std::pair<const char*, const char*> kFailureLines[] = {
    {"MonitorQueue::Add failed", "monitor"},
    {"UpsertWEZtifydCfg failed", "monitor"},
    {"UpsertWEZotifydCfg failed", "monitor"},
    {"WLIBServiceStart failed", "service"},
    {"SendCammandToDaemon failed", "daemon"},
    {"AddCustomEvent failed", "queue"},
    {"Update failed", "queue"},
    {"CleanShareIndexData failed", "clean"},
    {"MonitorQueue::Delete failed", "unregister"},
    {"DeleteWEZtifydCfg failed", "unregister"},
    {"DeleteWEZotifydCfg failed", "unregister"},
};

std::string Describe(const std::string& key) {
  for (const StepInfo& step : kSteps) {
    if (key == step.key) {
      return step.description;
    }
  }
  return key;
}

}  // namespace

Aftermath Diagnose(const LibraryCall& call, const Steps& steps, std::vector<Change> saved) {
  Aftermath result;
  result.logLines = call.LogLines();
  result.saved = std::move(saved);
  std::string failedKey;
  for (const std::string& line : result.logLines) {
    for (const auto& [text, key] : kFailureLines) {
      if (line.find(text) != std::string::npos) {
        failedKey = key;
        result.failedLine = line;
      }
    }
  }
  size_t failedAt = steps.size();
  for (size_t i = 0; i < steps.size(); ++i) {
    if (steps[i] == failedKey) {
      failedAt = i;
    }
  }
  if (failedAt < steps.size()) {
    result.failedStep = Describe(failedKey) + " (the library logged: " + result.failedLine + ")";
    for (size_t i = failedAt + 1; i < steps.size(); ++i) {
      result.notDone.push_back(Describe(steps[i]));
    }
  } else {
    // The failure came before the save, or the log does not say where: claim nothing was kept.
    result.saved.clear();
  }
  if (failedKey != "service" && failedKey != "daemon" && result.failedStep.empty()) {
    return result;
  }

  const std::string problem = DaemonProblem();
  const std::string service = ServiceState();
  result.state.push_back(problem.empty() ? "the daemon answers on " + DaemonSocket()
                                         : "the daemon does not answer on " + DaemonSocket() +
                                               " (" + problem + ")");
  result.state.push_back(std::string("service ") + kServiceUnit + ": " + service);
  const std::string again = "run the same command again, as every step may be repeated";
  if (failedKey == "service" || service != "active") {
    result.retry =
        "start the service (systemctl start " + std::string(kServiceUnit) + "), then " + again;
  } else if (failedKey == "daemon" || !problem.empty()) {
    result.retry = "once the daemon answers on its socket, " + again;
  } else {
    result.retry = again + "; -v shows the library's log";
  }
  return result;
}

}  // namespace fileindexctl
