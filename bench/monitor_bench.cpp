// Costs of the file-change monitor program, run as a child against the real kernel in a
// temporary root (under $TMPDIR when set, else /tmp):
//   - start-up: time from exec to every folder watched, and the program's resident memory, for
//     10,000 and 100,000 watched directories (the kernel's own memory for the watches comes on
//     top: about 1 KiB each);
//   - throughput: a burst of changes queued by the kernel while the program is stopped, then the
//     time until all their lines are in the queue;
//   - lag: from a file created to its line in the queue, median and 99th percentile.
//
//   build/bench/monitor_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

class Sandbox {
 public:
  Sandbox() {
    const char* tmp = std::getenv("TMPDIR");
    std::string pattern =
        std::string(tmp != nullptr && tmp[0] == '/' ? tmp : "/tmp") + "/wezotifyd-bench.XXXXXX";
    m_root = mkdtemp(pattern.data());
    std::filesystem::create_directories(m_root + "/volume1/s/@eaDir");
    std::filesystem::create_directories(Folder());
    std::filesystem::create_directories(m_root + "/var/lib/wezotifyd/fileindex");
    std::ofstream(m_root + "/var/lib/wezotifyd/fileindex/q.json")
        << R"({"queue": ")" << Queue() << R"(", "config": [{"path": ")" << Folder()
        << R"(", "mask": 65486, "ignore": ["@eaDir"]}]})";
  }
  ~Sandbox() {
    Stop();
    std::error_code ec;
    std::filesystem::remove_all(m_root, ec);
  }
  Sandbox(const Sandbox&) = delete;
  Sandbox& operator=(const Sandbox&) = delete;

  std::string Folder() const { return m_root + "/volume1/s/f"; }
  std::string Queue() const { return m_root + "/volume1/s/@eaDir/q"; }

  // `count` directories below the folder, 100 to a parent.
  void MakeDirs(int count) const {
    for (int i = 0; i < count; ++i) {
      const std::string parent = Folder() + "/d" + std::to_string(i / 100);
      if (i % 100 == 0) {
        mkdir(parent.c_str(), 0755);
      }
      mkdir((parent + "/" + std::to_string(i)).c_str(), 0755);
    }
  }

  void Start() {
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 2, (m_root + "/log").c_str(),
                                     O_WRONLY | O_CREAT | O_TRUNC, 0644);
    char* argv[] = {const_cast<char*>(WEZOTIFYD_BIN), const_cast<char*>("--root"), m_root.data(),
                    nullptr};
    posix_spawn(&m_pid, WEZOTIFYD_BIN, &actions, nullptr, argv, environ);
    posix_spawn_file_actions_destroy(&actions);
  }
  void Stop() {
    if (m_pid > 0) {
      kill(m_pid, SIGTERM);
      waitpid(m_pid, nullptr, 0);
      m_pid = -1;
    }
  }
  void Pause() const { kill(m_pid, SIGSTOP); }
  void Resume() const { kill(m_pid, SIGCONT); }

  bool LogHas(const std::string& text) const {
    std::ostringstream log;
    log << std::ifstream(m_root + "/log").rdbuf();
    return log.str().find(text) != std::string::npos;
  }
  off_t QueueSize() const {
    struct stat st {};
    return stat(Queue().c_str(), &st) == 0 ? st.st_size : 0;
  }
  size_t QueueLines() const {
    std::ifstream queue(Queue());
    return static_cast<size_t>(
        std::count(std::istreambuf_iterator<char>(queue), std::istreambuf_iterator<char>(), '\n'));
  }
  // The program's peak resident memory in KiB.
  long PeakRssKiB() const {
    std::ifstream status("/proc/" + std::to_string(m_pid) + "/status");
    std::string key;
    long value = 0;
    while (status >> key) {
      if (key == "VmHWM:") {
        status >> value;
        return value;
      }
    }
    return 0;
  }

 private:
  std::string m_root;
  pid_t m_pid = -1;
};

void CreateFile(const std::string& path) {
  const int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0644);
  close(fd);
}

void BM_StartUp(benchmark::State& state) {
  const int dirs = static_cast<int>(state.range(0));
  Sandbox sandbox;
  sandbox.MakeDirs(dirs);
  const std::string ready = "watching " + std::to_string(dirs + dirs / 100 + 1) + " directories";
  long rss = 0;
  for (auto _ : state) {
    const auto start = Clock::now();
    sandbox.Start();
    while (!sandbox.LogHas(ready)) {
      std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    state.SetIterationTime(std::chrono::duration<double>(Clock::now() - start).count());
    rss = sandbox.PeakRssKiB();
    sandbox.Stop();
  }
  state.counters["peak_rss_KiB"] = static_cast<double>(rss);
}
BENCHMARK(BM_StartUp)
    ->Arg(10000)
    ->Arg(100000)
    ->UseManualTime()
    ->Iterations(3)
    ->Unit(benchmark::kMillisecond);

// Files created while the program is stopped stay in the kernel's queue (two events each:
// created, closed after writing); the time runs from its resumption to the last line.
void BM_Burst(benchmark::State& state) {
  const int files = static_cast<int>(state.range(0));
  int round = 0;
  for (auto _ : state) {
    Sandbox sandbox;
    sandbox.Start();
    while (!sandbox.LogHas("for 1 queues")) {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    sandbox.Pause();
    for (int i = 0; i < files; ++i) {
      CreateFile(sandbox.Folder() + "/" + std::to_string(round) + "-" + std::to_string(i));
    }
    const auto start = Clock::now();
    sandbox.Resume();
    while (sandbox.QueueLines() < 2 * static_cast<size_t>(files)) {
      std::this_thread::sleep_for(std::chrono::microseconds(200));
    }
    state.SetIterationTime(std::chrono::duration<double>(Clock::now() - start).count());
    ++round;
  }
  state.counters["events_per_s"] =
      benchmark::Counter(2.0 * files, benchmark::Counter::kIsIterationInvariantRate);
}
BENCHMARK(BM_Burst)->Arg(4000)->UseManualTime()->Iterations(5)->Unit(benchmark::kMillisecond);

void BM_Lag(benchmark::State& state) {
  Sandbox sandbox;
  sandbox.Start();
  while (!sandbox.LogHas("for 1 queues")) {
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  std::vector<double> lags;
  int i = 0;
  for (auto _ : state) {
    const off_t before = sandbox.QueueSize();
    const auto start = Clock::now();
    CreateFile(sandbox.Folder() + "/" + std::to_string(i++));
    while (sandbox.QueueSize() == before) {
    }
    const double lag = std::chrono::duration<double>(Clock::now() - start).count();
    state.SetIterationTime(lag);
    lags.push_back(lag * 1e6);
    // Lets the close's line arrive too, so the next change starts from a quiet queue.
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  std::sort(lags.begin(), lags.end());
  state.counters["median_us"] = lags[lags.size() / 2];
  state.counters["p99_us"] = lags[lags.size() * 99 / 100];
}
BENCHMARK(BM_Lag)->UseManualTime()->Iterations(1000)->Unit(benchmark::kMicrosecond);

}  // namespace
