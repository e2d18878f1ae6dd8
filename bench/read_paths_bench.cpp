// The library's read paths and its single-folder write, each timed against the cheapest thing
// that could answer the same question (its floor) in the same run, so that the machine's speed
// cancels out of the ratio. Runs the shipped generic-Linux platform in a sandbox root under
// $TMPDIR (default /tmp), made once per process:
//   root "a": 10 shares of 100 indexed folders each (at depths 1 to 3), saved through the library,
//             and a queue of 100,000 event lines per share; half the folders have events, the
//             other half must be scanned to the end of their share's queue;
//   root "b": the shares "big" (1,000,000 plain lines), "bigesc" (1,000,000 lines, every tenth
//             holding a "\" escape in "path") and "huge" (one line of 32 MiB).
// A stand-in daemon (a forked child) takes the commands of both roots; the sandbox's systemctl
// and notification tool are those of scripts/sandbox-appliance.sh.
//
// Each benchmark reports the counters "measured" and "floor" (in the unit after the "|" of its
// label), "ratio" and "goal" (0: reported only); scripts/bench.sh prints them as a table.
// "cold" iterations first drop the library's per-process caches, untimed; "warm" ones keep them.
//
//   build-bench/bench/read_paths_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <json/value.h>
#include <poll.h>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "fileindex/error.h"
#include "fileindex/fileindex_c.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue.h"
#include "fileindex/root.h"
#include "fileindex/status_mgr.h"
#include "config/snapshot.h"
#include "json_io.h"
#include "layout.h"
#include "paths.h"
#include "utils/log.h"
#include "utils/queue_reader.h"

namespace {

namespace fi = WEZO::FILEINDEX;
using Clock = std::chrono::steady_clock;

constexpr int kShares = 10;
constexpr int kFoldersPerShare = 100;
constexpr int kLinesPerShare = 100000;
constexpr int kBigLines = 1000000;
constexpr size_t kBlock = 1 << 20;
constexpr size_t kHugeLine = 32U << 20;
constexpr char kSandboxScript[] = FILEINDEX_SANDBOX_SCRIPT;

void DropLine(int /*priority*/, const char* /*line*/) {}

void ForgetCaches() {
  fi::detail::ForgetQueueScans();
  fi::detail::ForgetConfigSnapshots();
}

// xorshift64*: the same queues every run, quickly.
struct Rng {
  uint64_t state = 0x9E3779B97F4A7C15ULL;
  uint64_t operator()() {
    state ^= state >> 12;
    state ^= state << 25;
    state ^= state >> 27;
    return state * 0x2545F4914F6CDD1DULL;
  }
};

// The folder j of a share, relative to the share: depth 1, 2 or 3.
std::string FolderRel(int j) {
  std::string leaf = "f" + std::to_string(j);
  const std::string group = "g" + std::to_string(j % 10);
  switch (j % 3) {
    case 0:
      return leaf;
    case 1:
      return group + "/" + leaf;
    default:
      return group + "/h/" + leaf;
  }
}

// Writes a file through a large buffer: lines go into Buffer(), MaybeFlush() after each.
class BulkWriter {
 public:
  explicit BulkWriter(const std::string& path)
      : m_fd(open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644)) {
    m_buffer.reserve(kFlushAt + 4096);
  }
  ~BulkWriter() { Close(); }
  BulkWriter(const BulkWriter&) = delete;
  BulkWriter& operator=(const BulkWriter&) = delete;
  std::string& Buffer() { return m_buffer; }
  void MaybeFlush() {
    if (m_buffer.size() >= kFlushAt) {
      Flush();
    }
  }
  bool Close() {
    Flush();
    if (m_fd >= 0 && close(m_fd) != 0) {
      m_ok = false;
    }
    m_fd = -1;
    return m_ok;
  }

 private:
  static constexpr size_t kFlushAt = 8U << 20;
  void Flush() {
    size_t done = 0;
    while (m_fd >= 0 && done < m_buffer.size()) {
      const ssize_t n = write(m_fd, m_buffer.data() + done, m_buffer.size() - done);
      if (n <= 0) {
        m_ok = false;
        break;
      }
      done += static_cast<size_t>(n);
    }
    m_ok = m_ok && m_fd >= 0;
    m_buffer.clear();
  }
  int m_fd;
  bool m_ok = true;
  std::string m_buffer;
};

// Appends one event line for a file in the directory `dir` (a full path, no trailing slash).
// `escape`: 0 none, else which of three "\" escapes the path gets.
void AppendEvent(std::string& out, Rng& rng, const std::string& dir, int escape) {
  static constexpr int kEvents[] = {2, 4, 8, 64, 256};
  const uint64_t r = rng();
  const int event = kEvents[r % 5];
  const std::string album = "Album " + std::to_string((r >> 8) % 40);
  const std::string number = std::to_string(100000 + (r >> 16) % 900000);
  out += R"({"event":)";
  out += std::to_string(event);
  out += R"(,"path":")";
  out += dir;
  out += '/';
  out += album;
  switch (escape) {
    case 1:
      out += R"(\/IMG_20190712_)";
      break;
    case 2:
      out += R"(/caf\u00e9_)";
      break;
    case 3:
      out += R"(/IMG_\"best\"_)";
      break;
    default:
      out += "/IMG_20190712_";
  }
  out += number;
  out += ".JPG\"";
  if (event == 256) {
    out += R"(,"path_old":")";
    out += dir;
    out += '/';
    out += album;
    out += "/IMG_20190712_";
    out += number;
    out += ".tmp\"";
  }
  out += "}\n";
}

// Listens on each root's daemon socket in a child of its own and takes every command it is sent.
pid_t StartDaemonStandIn(const std::vector<std::string>& roots) {
  std::vector<int> listeners;
  for (const std::string& root : roots) {
    fi::SetRootPrefix(root);
    const std::string path = fi::DaemonSocketPath();
    const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (fd < 0 || path.size() >= sizeof(address.sun_path)) {
      return -1;
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) != 0 ||
        listen(fd, 256) != 0) {
      return -1;
    }
    listeners.push_back(fd);
  }
  const pid_t pid = fork();
  if (pid != 0) {
    for (const int fd : listeners) {
      close(fd);
    }
    return pid;
  }
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  std::vector<pollfd> polls;
  polls.reserve(listeners.size());
  for (const int fd : listeners) {
    polls.push_back({fd, POLLIN, 0});
  }
  static char buffer[1 << 16];
  for (;;) {
    if (poll(polls.data(), polls.size(), 1000) < 0 && errno != EINTR) {
      _exit(1);
    }
    for (const pollfd& listener : polls) {
      if ((listener.revents & POLLIN) == 0) {
        continue;
      }
      const int connection = accept4(listener.fd, nullptr, nullptr, SOCK_CLOEXEC);
      if (connection < 0) {
        continue;
      }
      // The library sends one frame and closes; a silent peer is given two seconds.
      pollfd peer{connection, POLLIN, 0};
      while (poll(&peer, 1, 2000) > 0 && read(connection, buffer, sizeof(buffer)) > 0) {
      }
      close(connection);
    }
  }
}

bool RunProgram(const char* program, const std::string& argument) {
  const pid_t pid = fork();
  if (pid == 0) {
    execl(program, program, argument.c_str(), static_cast<char*>(nullptr));
    _exit(127);
  }
  int status = 0;
  return pid > 0 && waitpid(pid, &status, 0) == pid && WIFEXITED(status) &&
         WEXITSTATUS(status) == 0;
}

// The two sandbox roots, made on first use and removed at exit.
class Sandbox {
 public:
  static Sandbox& Get() {
    static Sandbox sandbox;
    fi::detail::SetLogSink(DropLine);
    return sandbox;
  }

  const std::string& Error() const { return m_error; }
  const std::string& A() const { return m_a; }
  const std::string& B() const { return m_b; }

  // Makes `root` the library's root, once the configuration files there are old enough for the
  // library to keep what it read of them (a file changed in the last two seconds is read again on
  // every call).
  static void Use(const std::string& root) {
    fi::SetRootPrefix(root);
    for (const std::string& file :
         {fi::FolderConfPath(), fi::StatusConfPath(), root + "/etc/samba/smb.conf"}) {
      struct stat st {};
      if (stat(file.c_str(), &st) != 0) {
        continue;
      }
      const auto changed = std::chrono::system_clock::from_time_t(
          std::max(st.st_ctim.tv_sec, st.st_mtim.tv_sec) + 3);
      if (changed > std::chrono::system_clock::now()) {
        std::this_thread::sleep_until(changed);
      }
    }
  }

  static std::string SharePath(const std::string& root, const std::string& share) {
    return root + "/volume1/" + share;
  }
  static std::string QueueFile(const std::string& root, const std::string& share) {
    return fi::QueueOf(SharePath(root, share));
  }

  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

 private:
  Sandbox() {
    const char* tmp = getenv("TMPDIR");
    std::string pattern =
        std::string(tmp != nullptr && *tmp != '\0' ? tmp : "/tmp") + "/fi-rp.XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) {
      m_error = "mkdtemp failed";
      return;
    }
    m_base = pattern;
    m_a = m_base + "/a";
    m_b = m_base + "/b";
    std::vector<std::string> sharesA;
    sharesA.reserve(kShares);
    for (int i = 0; i < kShares; ++i) {
      sharesA.push_back("share" + std::to_string(i));
    }
    if (!MakeRoot(m_a, sharesA) || !MakeRoot(m_b, {"big", "bigesc", "huge"})) {
      m_error = "cannot make the sandbox roots under " + m_base;
      return;
    }
    m_daemon = StartDaemonStandIn({m_a, m_b});
    if (m_daemon < 0) {
      m_error = "cannot start the stand-in daemon";
      return;
    }
    fi::detail::SetLogSink(DropLine);
    if (!AddFoldersA() || !AddFoldersB()) {
      return;
    }
    if (!WriteQueuesA() || !WriteQueuesB()) {
      m_error = "cannot write the queues";
      return;
    }
    // The queues' writeback would otherwise run during the first measurements.
    sync();
  }

  ~Sandbox() {
    if (m_daemon > 0) {
      kill(m_daemon, SIGKILL);
      waitpid(m_daemon, nullptr, 0);
    }
    fi::SetRootPrefix("");
    if (!m_base.empty()) {
      std::error_code ignored;
      std::filesystem::remove_all(m_base, ignored);
    }
  }

  static bool MakeRoot(const std::string& root, const std::vector<std::string>& shares) {
    std::error_code error;
    std::filesystem::create_directories(root, error);
    if (error || !RunProgram(kSandboxScript, root)) {
      return false;
    }
    // The appliance's own shares give way to ours; Spotlight is on already, as it is once the
    // first folder was added.
    const std::string conf = root + "/etc/samba/smb.conf";
    {
      std::ofstream out(conf, std::ios::trunc);
      out << "[global]\n\tworkgroup = BENCH\n\tspotlight = yes\n";
      for (const std::string& share : shares) {
        out << "\n[" << share << "]\n\tpath = " << SharePath(root, share) << "\n\tread only = no\n";
        std::filesystem::create_directories(SharePath(root, share) + "/@eaDir", error);
      }
      if (!out || error) {
        return false;
      }
    }
    std::filesystem::last_write_time(
        conf, std::filesystem::last_write_time(conf) - std::chrono::hours(1), error);
    return !error;
  }

  bool Upsert(const Json::Value& request) {
    if (!fi::IndexMgr::Upsert(request)) {
      m_error = "IndexMgr::Upsert failed with code " + std::to_string(fi::ErrorHandler::GetError());
      return false;
    }
    return true;
  }

  static Json::Value FolderElement(const std::string& path, const std::string& name) {
    Json::Value element(Json::objectValue);
    element["path"] = path;
    element["name"] = name;
    element["photo"] = true;
    element["document"] = true;
    return element;
  }

  bool AddFoldersA() {
    fi::SetRootPrefix(m_a);
    for (int i = 0; i < kShares; ++i) {
      const std::string share = "share" + std::to_string(i);
      Json::Value request(Json::arrayValue);
      for (int j = 0; j < kFoldersPerShare; ++j) {
        std::filesystem::create_directories(SharePath(m_a, share) + "/" + FolderRel(j));
        request.append(FolderElement("/" + share + "/" + FolderRel(j), "f" + std::to_string(j)));
      }
      if (!Upsert(request)) {
        return false;
      }
    }
    return true;
  }

  bool AddFoldersB() {
    fi::SetRootPrefix(m_b);
    Json::Value request(Json::arrayValue);
    for (const char* folder : {"big/a", "big/b", "bigesc/a", "bigesc/b", "huge/a"}) {
      std::filesystem::create_directories(m_b + "/volume1/" + folder);
      request.append(FolderElement(std::string("/") + folder, folder));
    }
    return Upsert(request);
  }

  // Each share's queue: 85% of the lines in the even folders, the rest in the share but in no
  // folder.
  bool WriteQueuesA() const {
    Rng rng;
    for (int i = 0; i < kShares; ++i) {
      const std::string share = "share" + std::to_string(i);
      const std::string full = SharePath(m_a, share) + "/";
      BulkWriter out(QueueFile(m_a, share));
      for (int k = 0; k < kLinesPerShare; ++k) {
        const uint64_t r = rng();
        const std::string dir = r % 100 < 85
                                    ? full + FolderRel(static_cast<int>(2 * ((r >> 8) % 50)))
                                    : full + "misc" + std::to_string((r >> 8) % 7);
        AppendEvent(out.Buffer(), rng, dir, 0);
        out.MaybeFlush();
      }
      if (!out.Close()) {
        return false;
      }
    }
    return true;
  }

  // "big" and "bigesc": events only in their folder "a" and outside any folder, so that "b" is
  // read to the end. "huge": a line of 32 MiB between two plain ones, in no folder.
  bool WriteQueuesB() const {
    for (const char* share : {"big", "bigesc"}) {
      Rng rng;
      const bool escapes = std::strcmp(share, "bigesc") == 0;
      const std::string full = SharePath(m_b, share) + "/";
      BulkWriter out(QueueFile(m_b, share));
      for (int k = 0; k < kBigLines; ++k) {
        const std::string dir = rng() % 100 < 85 ? full + "a" : full + "misc";
        AppendEvent(out.Buffer(), rng, dir, escapes && k % 10 == 0 ? 1 + (k / 10) % 3 : 0);
        out.MaybeFlush();
      }
      if (!out.Close()) {
        return false;
      }
    }
    Rng rng;
    const std::string misc = SharePath(m_b, "huge") + "/misc";
    BulkWriter out(QueueFile(m_b, "huge"));
    AppendEvent(out.Buffer(), rng, misc, 0);
    out.Buffer() += R"({"event":2,"data":")";
    out.Buffer().append(kHugeLine, 'x');
    out.Buffer() += R"(","path":")" + misc + "/huge.bin\"}\n";
    AppendEvent(out.Buffer(), rng, misc, 0);
    return out.Close();
  }

  std::string m_error;
  std::string m_base;
  std::string m_a;
  std::string m_b;
  pid_t m_daemon = -1;
};

// Reads the files whole, 1 MiB at a time into one buffer: the floor of every queue scan.
bool RawRead(const std::vector<std::string>& files) {
  static std::vector<char> buffer(kBlock);
  for (const std::string& file : files) {
    const int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0) {
      return false;
    }
    ssize_t n = 0;
    while ((n = read(fd, buffer.data(), buffer.size())) > 0) {
    }
    close(fd);
    if (n < 0) {
      return false;
    }
  }
  return true;
}

// " (<n> MB)": the files' size in all, for the labels.
std::string SizeOf(const std::vector<std::string>& files) {
  double bytes = 0;
  for (const std::string& file : files) {
    struct stat st {};
    bytes += stat(file.c_str(), &st) == 0 ? static_cast<double>(st.st_size) : 0;
  }
  char text[32];
  std::snprintf(text, sizeof(text), " (%.0f MB)", bytes / 1e6);
  return text;
}

// What a durable change of folder.conf costs at least: parse it, render it, replace a file beside
// it atomically (temporary file, fsync, rename, fsync of the folder).
bool DurableSave() {
  Json::Value list;
  return fi::JsonFromFile(list, fi::FolderConfPath()) &&
         fi::JsonToFile(list, fi::FolderConfPath() + "-bench-floor", 0644) !=
             fi::ReplaceResult::kFailed;
}

template <class F>
double SecondsOf(F&& f) {
  const auto start = Clock::now();
  f();
  return std::chrono::duration<double>(Clock::now() - start).count();
}

// Times the measured operation on every iteration (the benchmark's manual time) and its floor
// alongside, spending about as long on the floor as on the measured operation. `calls`:
// how many times the function repeats the operation; the figures are per operation.
class Ratio {
 public:
  explicit Ratio(benchmark::State& state) : m_state(state) {}

  template <class F>
  void Measure(F&& f, int calls = 1) {
    const double seconds = SecondsOf(f);
    m_measured += seconds;
    m_measuredRuns += calls;
    m_state.SetIterationTime(seconds);
  }

  template <class F>
  void Floor(F&& f, int calls = 1) {
    // At least three samples in all, up to ten an iteration while the floor is the cheaper one.
    for (int i = 0; i < 10 && (m_floorSamples < 3 || m_floor < m_measured); ++i) {
      m_floor += SecondsOf(f);
      m_floorRuns += calls;
      ++m_floorSamples;
    }
  }

  // `figure` names the row; times are reported in microseconds.
  void Report(const std::string& figure, double goal) {
    Counters(m_state, figure + "|us",
             1e6 * m_measured / static_cast<double>(std::max(1L, m_measuredRuns)),
             1e6 * m_floor / static_cast<double>(std::max(1L, m_floorRuns)), goal);
  }

  static void Counters(benchmark::State& state, const std::string& label, double measured,
                       double floor, double goal) {
    state.SetLabel(label);
    state.counters["measured"] = measured;
    state.counters["floor"] = floor;
    state.counters["ratio"] = floor > 0 ? measured / floor : 0;
    state.counters["goal"] = goal;
  }

 private:
  benchmark::State& m_state;
  double m_measured = 0;
  double m_floor = 0;
  long m_measuredRuns = 0;
  long m_floorRuns = 0;
  int m_floorSamples = 0;
};

// Returns the sandbox with `root` in use, or nullptr after failing the benchmark.
Sandbox* Prepare(benchmark::State& state, bool rootA) {
  Sandbox& box = Sandbox::Get();
  if (!box.Error().empty()) {
    state.SkipWithError(box.Error().c_str());
    return nullptr;
  }
  Sandbox::Use(rootA ? box.A() : box.B());
  return &box;
}

// P3: the C question for a path inside a folder at depth 3 (hit) or beside it (miss).
void BM_IsPathIndexed(benchmark::State& state) {
  const bool hit = state.range(0) != 0;
  const bool cold = state.range(1) != 0;
  if (Prepare(state, true) == nullptr) {
    return;
  }
  const char* path = hit ? "/share3/g5/h/f5/Album 1/IMG_1.JPG" : "/share3/g5/h/IMG_1.JPG";
  if (FILEIDXIsPathIndexed(path) != (hit ? 1 : 0)) {
    state.SkipWithError("FILEIDXIsPathIndexed gave the wrong answer");
    return;
  }
  const std::string conf = fi::FolderConfPath();
  constexpr int kBatch = 64;  // a stat() or a warm call is too short to time alone
  const int batch = cold ? 1 : kBatch;
  Ratio ratio(state);
  for (auto _ : state) {
    if (cold) {
      ForgetCaches();
    }
    ratio.Measure(
        [&] {
          for (int i = 0; i < batch; ++i) {
            benchmark::DoNotOptimize(FILEIDXIsPathIndexed(path));
          }
        },
        batch);
    ratio.Floor(
        [&] {
          for (int i = 0; i < kBatch; ++i) {
            struct stat st {};
            benchmark::DoNotOptimize(stat(conf.c_str(), &st));
          }
        },
        kBatch);
  }
  ratio.Report(std::string("P3 FILEIDXIsPathIndexed, ") + (hit ? "hit" : "miss") +
                   (cold ? ", cold" : ", warm") + " vs stat() of folder.conf",
               cold ? 0 : 3);
}
BENCHMARK(BM_IsPathIndexed)
    ->ArgsProduct({{1, 0}, {0, 1}})
    ->ArgNames({"hit", "cold"})
    ->UseManualTime()
    ->Unit(benchmark::kMicrosecond);

void CollectShares(const Json::Value& value, std::set<std::string>& shares) {
  if (value.isObject() && value["path"].isString()) {
    const std::string path = value["path"].asString();
    shares.insert(path.substr(1, path.find('/', 1) - 1));
  }
  if (value.isObject() || value.isArray()) {
    for (const Json::Value& member : value) {
      CollectShares(member, shares);
    }
  }
}

// P2: the listing with "status" and "is_valid", whole (1000) or a page of 50.
void BM_List(benchmark::State& state) {
  const auto limit = static_cast<unsigned long>(state.range(0));
  const bool cold = state.range(1) != 0;
  Sandbox* box = Prepare(state, true);
  if (box == nullptr) {
    return;
  }
  Json::Value additional(Json::arrayValue);
  additional.append("status");
  additional.append("is_valid");
  Json::Value result;
  std::set<std::string> shares;
  if (!fi::IndexMgr::List(result, 0, limit, "", "ASC", additional)) {
    state.SkipWithError("IndexMgr::List failed");
    return;
  }
  // The floor is the list's queues, whole or a page: a page costs at most a few raw reads of them.
  CollectShares(result, shares);
  if (limit < 1000) {
    Json::Value whole;
    if (!fi::IndexMgr::List(whole, 0, 1000, "", "ASC", additional)) {
      state.SkipWithError("IndexMgr::List failed");
      return;
    }
    CollectShares(whole, shares);
  }
  std::vector<std::string> queues;
  queues.reserve(shares.size());
  for (const std::string& share : shares) {
    queues.push_back(Sandbox::QueueFile(box->A(), share));
  }
  Ratio ratio(state);
  for (auto _ : state) {
    if (cold) {
      ForgetCaches();
    }
    ratio.Measure([&] {
      benchmark::DoNotOptimize(fi::IndexMgr::List(result, 0, limit, "", "ASC", additional));
    });
    ratio.Floor([&] { benchmark::DoNotOptimize(RawRead(queues)); });
  }
  ratio.Report("P2 IndexMgr::List " + std::to_string(limit) +
                   " of 1000 folders, status+is_valid, " + (cold ? "cold" : "warm") +
                   " vs raw read of " + std::to_string(queues.size()) + " queue(s)" +
                   SizeOf(queues),
               cold ? (limit >= 1000 ? 5 : 3) : 0);
}
BENCHMARK(BM_List)
    ->ArgsProduct({{1000, 50}, {1, 0}})
    ->ArgNames({"limit", "cold"})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

// The progress of one folder without events, its share's queue 1,000,000 lines long.
void BM_GetFolderStatus(benchmark::State& state) {
  const bool cold = state.range(0) != 0;
  Sandbox* box = Prepare(state, false);
  if (box == nullptr) {
    return;
  }
  if (fi::StatusMgr::GetFolderStatus("/big/b") != "finished" ||
      fi::StatusMgr::GetFolderStatus("/big/a") != "processing") {
    state.SkipWithError("GetFolderStatus gave the wrong answer");
    return;
  }
  const std::vector<std::string> queue{Sandbox::QueueFile(box->B(), "big")};
  Ratio ratio(state);
  for (auto _ : state) {
    if (cold) {
      ForgetCaches();
    }
    ratio.Measure([&] { benchmark::DoNotOptimize(fi::StatusMgr::GetFolderStatus("/big/b")); });
    ratio.Floor([&] { benchmark::DoNotOptimize(RawRead(queue)); });
  }
  ratio.Report(std::string("StatusMgr::GetFolderStatus, folder without events, ") +
                   (cold ? "cold" : "warm") + " vs raw read of its 1,000,000-line queue" +
                   SizeOf(queue),
               cold ? 2 : 0);
}
BENCHMARK(BM_GetFolderStatus)
    ->Arg(1)
    ->Arg(0)
    ->ArgNames({"cold"})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

// P1: one update event appended to a 1,000,000-line queue (which grows by a line per iteration),
// after the check for a queued reindex of the same path.
void BM_AddCustomEvent(benchmark::State& state) {
  const bool escapes = state.range(0) != 0;
  const bool cold = state.range(1) != 0;
  Sandbox* box = Prepare(state, false);
  if (box == nullptr) {
    return;
  }
  const std::string share = escapes ? "bigesc" : "big";
  const std::string path = Sandbox::SharePath(box->B(), share) + "/a/Album 3/IMG_1.JPG";
  Json::Value data(Json::objectValue);
  data["mtime"] = 1562939412;
  data["size"] = 4711;
  const std::vector<std::string> queue{Sandbox::QueueFile(box->B(), share)};
  Ratio ratio(state);
  for (auto _ : state) {
    if (cold) {
      ForgetCaches();
    }
    bool added = false;
    ratio.Measure([&] { added = fi::AddCustomEvent(fi::kEventUpdate, path, data); });
    if (!added) {
      state.SkipWithError("AddCustomEvent failed");
      break;
    }
    ratio.Floor([&] { benchmark::DoNotOptimize(RawRead(queue)); });
  }
  ratio.Report(std::string("P1 AddCustomEvent, ") + (escapes ? "10% escapes" : "plain") + ", " +
                   (cold ? "cold" : "warm") + " vs raw read of the 1,000,000-line queue" +
                   SizeOf(queue),
               2);
}
BENCHMARK(BM_AddCustomEvent)
    ->ArgsProduct({{0, 1}, {1, 0}})
    ->ArgNames({"escapes", "cold"})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

Json::Value ChangeOf(const std::string& path, bool document) {
  Json::Value request(Json::arrayValue);
  request[0]["path"] = path;
  request[0]["name"] = path.substr(path.rfind('/') + 1);
  request[0]["photo"] = true;
  request[0]["document"] = document;
  return request;
}

// P4: one existing folder's settings changed in a list of 1000.
void BM_UpsertOneOfThousand(benchmark::State& state) {
  if (Prepare(state, true) == nullptr) {
    return;
  }
  Ratio ratio(state);
  bool document = false;
  for (auto _ : state) {
    const Json::Value request = ChangeOf("/share1/f0", document);
    document = !document;
    bool done = false;
    ratio.Measure([&] { done = fi::IndexMgr::Upsert(request); });
    if (!done) {
      state.SkipWithError(
          ("IndexMgr::Upsert failed with code " + std::to_string(fi::ErrorHandler::GetError()))
              .c_str());
      break;
    }
    bool saved = true;  // the floor may be sampled no more this iteration
    ratio.Floor([&] { saved = DurableSave() && saved; });
    if (!saved) {
      state.SkipWithError("the durable save failed");
      break;
    }
  }
  ratio.Report(
      "P4 IndexMgr::Upsert of one folder's settings into 1000 vs parse+render+durable save", 1.5);
}
BENCHMARK(BM_UpsertOneOfThousand)->UseManualTime()->Unit(benchmark::kMillisecond);

// Waits up to `seconds` for `pid`; kills it when it takes longer. True when it exited with 0.
bool Reap(pid_t pid, double seconds) {
  const auto deadline = Clock::now() + std::chrono::duration<double>(seconds);
  int status = 0;
  for (;;) {
    const pid_t done = waitpid(pid, &status, WNOHANG);
    if (done == pid) {
      return WIFEXITED(status) && WEXITSTATUS(status) == 0;
    }
    if (done < 0 || Clock::now() > deadline) {
      kill(pid, SIGKILL);
      waitpid(pid, nullptr, 0);
      return false;
    }
    usleep(1000);
  }
}

struct WriterCounts {
  int done = 0;
  int refused = 0;    // FILEINDEX_ERR_LOCK
  int failed = 0;     // any other failure
  int otherCode = 0;  // the code of the last such failure
};

// Forks a process that waits for a byte on `go` (when not -1), then changes `path` `changes`
// times and writes its counts to `report`.
pid_t ForkWriter(const std::string& path, int changes, int go, int report) {
  const pid_t pid = fork();
  if (pid != 0) {
    return pid;
  }
  char start = 0;
  pollfd wait{go, POLLIN, 0};
  if (go >= 0 && (poll(&wait, 1, 10000) != 1 || read(go, &start, 1) != 1)) {
    _exit(1);
  }
  WriterCounts counts;
  for (int i = 0; i < changes; ++i) {
    fi::ErrorHandler::SetError(fi::FILEINDEX_ERR_NONE);
    if (fi::IndexMgr::Upsert(ChangeOf(path, i % 2 == 0))) {
      ++counts.done;
    } else if (fi::ErrorHandler::GetError() == fi::FILEINDEX_ERR_LOCK) {
      ++counts.refused;
    } else {
      ++counts.failed;
      counts.otherCode = fi::ErrorHandler::GetError();
    }
  }
  _exit(write(report, &counts, sizeof(counts)) == sizeof(counts) ? 0 : 1);
}

// How long one change holds the folder lock: one process changes a folder in a loop while this
// one tries the lock without waiting, as often as it can; the share of tries that found it held,
// times the time taken, over the changes made, is the hold per change.
void BM_LockHold(benchmark::State& state) {
  if (Prepare(state, true) == nullptr) {
    return;
  }
  constexpr int kChanges = 40;
  for (auto _ : state) {
    double save = 0;
    for (int i = 0; i < 10; ++i) {
      save += SecondsOf([] { DurableSave(); }) / 10;
    }
    const int lock = open(fi::FolderLockPath().c_str(), O_RDWR | O_CLOEXEC);
    int report[2];
    if (lock < 0 || pipe2(report, O_CLOEXEC) != 0) {
      state.SkipWithError("cannot open the folder lock or a pipe");
      return;
    }
    long held = 0;
    long tries = 0;
    const auto start = Clock::now();
    const pid_t writer = ForkWriter("/share2/f0", kChanges, -1, report[1]);
    int status = 0;
    bool ok = false;
    for (;;) {
      const pid_t done = waitpid(writer, &status, WNOHANG);
      if (done != 0) {
        ok = done == writer && WIFEXITED(status) && WEXITSTATUS(status) == 0;
        break;
      }
      if (Clock::now() - start > std::chrono::seconds(120)) {
        kill(writer, SIGKILL);
        waitpid(writer, nullptr, 0);
        break;
      }
      ++tries;
      if (flock(lock, LOCK_EX | LOCK_NB) == 0) {
        flock(lock, LOCK_UN);
      } else {
        ++held;
      }
      usleep(20);
    }
    const double window = std::chrono::duration<double>(Clock::now() - start).count();
    close(lock);
    WriterCounts counts;
    ok = ok && read(report[0], &counts, sizeof(counts)) == sizeof(counts) && counts.done > 0;
    if (!ok) {
      close(report[0]);
      close(report[1]);
      state.SkipWithError("the writer failed or took too long");
      return;
    }
    const double hold =
        window * static_cast<double>(held) / static_cast<double>(tries) / counts.done;
    state.counters["changes"] = counts.done;
    state.counters["tries"] = static_cast<double>(tries);
    state.counters["change_us"] = 1e6 * window / counts.done;  // the writer's whole change
    Ratio::Counters(state, "Folder lock held per change (1 writer) vs durable save|us", 1e6 * hold,
                    1e6 * save, 2);

    close(report[0]);
    close(report[1]);
  }
}
BENCHMARK(BM_LockHold)->Iterations(1)->Unit(benchmark::kMillisecond);

// Four processes at once, each changing a folder of its own: the share of their changes refused
// because the folder lock was busy (FILEINDEX_ERR_LOCK).
void BM_ConcurrentWriters(benchmark::State& state) {
  if (Prepare(state, true) == nullptr) {
    return;
  }
  constexpr int kWriters = 4;
  constexpr int kChangesEach = 25;
  for (auto _ : state) {
    int report[2];
    if (pipe2(report, O_CLOEXEC) != 0) {
      state.SkipWithError("cannot make a pipe");
      return;
    }
    int go[2];
    if (pipe2(go, O_CLOEXEC) != 0) {
      close(report[0]);
      close(report[1]);
      state.SkipWithError("cannot make a pipe");
      return;
    }
    std::vector<pid_t> writers;
    writers.reserve(kWriters);
    for (int k = 0; k < kWriters; ++k) {
      writers.push_back(ForkWriter("/share" + std::to_string(k) + "/" + FolderRel(2), kChangesEach,
                                   go[0], report[1]));
    }
    const char bytes[kWriters] = {};
    bool ok = write(go[1], bytes, kWriters) == kWriters;
    WriterCounts all;
    for (const pid_t pid : writers) {
      WriterCounts one;
      ok = Reap(pid, 120) && read(report[0], &one, sizeof(one)) == sizeof(one) && ok;
      all.done += one.done;
      all.refused += one.refused;
      all.failed += one.failed;
      all.otherCode = std::max(all.otherCode, one.otherCode);
    }
    for (const int fd : {go[0], go[1], report[0], report[1]}) {
      close(fd);
    }
    if (!ok || all.failed > 0) {
      const std::string error = "of the concurrent writers' changes, " + std::to_string(all.done) +
                                " done, " + std::to_string(all.refused) + " refused, " +
                                std::to_string(all.failed) + " failed otherwise (code " +
                                std::to_string(all.otherCode) + ")" +
                                (ok ? "" : "; a writer failed or hung");
      state.SkipWithError(error.c_str());
      return;
    }
    Ratio::Counters(state, "4 concurrent writers: changes refused with code 9|%",
                    100.0 * all.refused / static_cast<double>(kWriters * kChangesEach), 0, 0);
  }
}
BENCHMARK(BM_ConcurrentWriters)->Iterations(1)->Unit(benchmark::kMillisecond);

// The growth of the peak resident set of a fresh process over one GetFolderStatus of `folder`
// under `root`, in bytes; -1 when it cannot be had.
double PeakGrowthOfScan(const std::string& root, const std::string& folder) {
  int out[2];
  if (pipe2(out, O_CLOEXEC) != 0) {
    return -1;
  }
  const pid_t pid = fork();
  if (pid == 0) {
    dup2(out[1], STDOUT_FILENO);
    execl("/proc/self/exe", "read_paths_bench", "--scan-peak", root.c_str(), folder.c_str(),
          static_cast<char*>(nullptr));
    _exit(127);
  }
  close(out[1]);
  char text[64] = {};
  pollfd wait{out[0], POLLIN, 0};
  const bool got = poll(&wait, 1, 120000) == 1 && read(out[0], text, sizeof(text) - 1) > 0;
  close(out[0]);
  const bool ok = Reap(pid, 10) && got;
  return ok ? std::strtod(text, nullptr) : -1;
}

// Peak memory of a queue scan, against the scan's block size.
void BM_ScanPeakMemory(benchmark::State& state) {
  const bool huge = state.range(0) != 0;
  Sandbox* box = Prepare(state, false);
  if (box == nullptr) {
    return;
  }
  for (auto _ : state) {
    const double growth = PeakGrowthOfScan(box->B(), huge ? "/huge/a" : "/big/b");
    if (growth < 0) {
      state.SkipWithError("the measuring process failed");
      return;
    }
    Ratio::Counters(state,
                    std::string("Peak memory of a queue scan, ") +
                        (huge ? "one 32 MiB line" : "1,000,000 lines") + " vs 1 MiB block|MiB",
                    growth / (1 << 20), 1, huge ? 1.5 : 0);
  }
}
BENCHMARK(BM_ScanPeakMemory)->Arg(1)->Arg(0)->ArgNames({"huge"})->Iterations(1);

long StatusField(const char* name) {
  std::ifstream in("/proc/self/status");
  std::string line;
  const size_t length = std::strlen(name);
  while (std::getline(in, line)) {
    if (line.compare(0, length, name) == 0 && line.size() > length && line[length] == ':') {
      return std::strtol(line.c_str() + length + 1, nullptr, 10);  // kB
    }
  }
  return -1;
}

// In a fresh process: prints the growth of the peak resident set over one GetFolderStatus of
// `folder` under `root`, in bytes, after a first call that loads what every call needs.
int ScanPeakChild(const char* root, const char* folder) {
  fi::detail::SetLogSink(DropLine);
  fi::SetRootPrefix(root);
  fi::StatusMgr::GetFolderStatus("/big/a");  // an event on the first lines: a short scan
  ForgetCaches();
  const long before = StatusField("VmRSS");
  {
    std::ofstream reset("/proc/self/clear_refs");
    reset << "5";  // the peak starts again from the current resident set
  }
  const long peakBefore = StatusField("VmHWM");
  fi::StatusMgr::GetFolderStatus(folder);
  const long peak = StatusField("VmHWM");
  if (before < 0 || peak < 0) {
    return 1;
  }
  // Without a reset, a peak reached before the call hides the call's own below it.
  const long base = peakBefore > before ? peakBefore : before;
  std::printf("%ld\n", 1024 * std::max(0L, peak - base));
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 4 && std::strcmp(argv[1], "--scan-peak") == 0) {
    return ScanPeakChild(argv[2], argv[3]);
  }
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
    return 1;
  }
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  return 0;
}
