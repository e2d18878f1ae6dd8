// Costs of the two queue readers on a queue of a million lines of about 150 bytes, as the
// file-change monitor and the library write them: whether a reindex of a path is queued (no
// match, so the whole file is read), whether a folder holds events (no match; a few matches), and
// for comparison a reader that parses every line. The queue is written once, in a temporary root
// of its own, over the fake platform; log lines are dropped.
//
//   build/bench/fileindex_bench --benchmark_filter=Queue
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <ftw.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "fake_platform.h"
#include "utils/log.h"
#include "utils/queue_reader.h"

namespace {

using WEZO::FILEINDEX::IsReindexQueued;
using WEZO::FILEINDEX::QueueHasFolderEvent;

constexpr int kLines = 1000000;

int RemoveEntry(const char* path, const struct stat* /*st*/, int /*flag*/, struct FTW* /*ftw*/) {
  return remove(path);
}

void DropLine(int /*priority*/, const char* /*line*/) {}

// The queue of share "photo", made on first use and removed at exit.
class Queue {
 public:
  static const Queue& Get() {
    static const Queue queue;
    // Other benchmarks reset the fake platform.
    fake::Reset();
    fake::Get().AddShare("photo", queue.m_volume + "/photo");
    WEZO::FILEINDEX::detail::SetLogSink(DropLine);
    return queue;
  }

  const std::string& Path() const { return m_path; }
  const std::string& Volume() const { return m_volume; }

  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

 private:
  Queue() {
    char pattern[] = "/tmp/fileindex-bench.XXXXXX";
    m_dir = mkdtemp(pattern);
    m_volume = m_dir + "/volume1";
    m_path = m_dir + "/queue";
    std::mt19937 rng(7);  // NOLINT(cert-msc32-c,cert-msc51-cpp): the same queue every run
    const auto photo = [&] {
      return m_volume + "/photo/" + std::to_string(2010 + rng() % 12) + "/Album " +
             std::to_string(rng() % 400) + " - holidays and family/IMG_20190712_" +
             std::to_string(100000 + rng() % 900000) + ".JPG";
    };
    std::ofstream out(m_path, std::ios::binary);
    for (int i = 0; i < kLines; ++i) {
      if (i % 200000 == 100000) {
        // The few events of the folder "/photo/rare".
        out << R"({"event":2,"path":")" << m_volume << "/photo/rare/IMG_" << i << ".JPG\"}\n";
        continue;
      }
      const unsigned kind = rng() % 10;
      if (kind < 6) {
        out << R"({"event":2,"path":")" << photo() << "\"}\n";
      } else if (kind < 8) {
        out << R"({"event":8,"path":")" << photo() << "\"}\n";
      } else if (kind < 9) {
        out << R"({"event":256,"path":")" << photo() << R"(","path_old":")" << photo() << "\"}\n";
      } else {
        out << R"({"data":{"mtime":1562939412,"size":)" << rng() % 10000000
            << R"(,"tags":["family","summer"]},"event":131072,"path":")" << photo() << "\"}\n";
      }
    }
    out << R"({"event":2,"path":")";  // a writer still busy
  }

  ~Queue() { nftw(m_dir.c_str(), RemoveEntry, 16, FTW_DEPTH | FTW_PHYS); }

  std::string m_dir;
  std::string m_volume;
  std::string m_path;
};

void BM_QueueReindexNoMatch(benchmark::State& state) {
  const Queue& queue = Queue::Get();
  const std::string path = queue.Volume() + "/photo/2015/Album 7 - holidays and family";
  for (auto _ : state) {
    WEZO::FILEINDEX::detail::ForgetQueueScans();  // a cold read each time
    benchmark::DoNotOptimize(IsReindexQueued(path, queue.Path()));
  }
}
BENCHMARK(BM_QueueReindexNoMatch)->Unit(benchmark::kMillisecond);

void BM_QueueFolderNoMatch(benchmark::State& state) {
  const Queue& queue = Queue::Get();
  for (auto _ : state) {
    WEZO::FILEINDEX::detail::ForgetQueueScans();  // a cold read each time
    benchmark::DoNotOptimize(QueueHasFolderEvent("/photo/none", queue.Path()));
  }
}
BENCHMARK(BM_QueueFolderNoMatch)->Unit(benchmark::kMillisecond);

void BM_QueueFolderFewMatches(benchmark::State& state) {
  const Queue& queue = Queue::Get();
  for (auto _ : state) {
    WEZO::FILEINDEX::detail::ForgetQueueScans();  // a cold read each time
    benchmark::DoNotOptimize(QueueHasFolderEvent("/photo/rare", queue.Path()));
  }
}
BENCHMARK(BM_QueueFolderFewMatches)->Unit(benchmark::kMillisecond);

// The floor: the queue read in 1 MiB blocks, nothing done with the bytes.
void BM_QueueRawRead(benchmark::State& state) {
  const Queue& queue = Queue::Get();
  std::vector<char> block(size_t{1} << 20);
  for (auto _ : state) {
    const int fd = open(queue.Path().c_str(), O_RDONLY | O_CLOEXEC);
    while (read(fd, block.data(), block.size()) > 0) {
    }
    close(fd);
  }
}
BENCHMARK(BM_QueueRawRead)->Unit(benchmark::kMillisecond);

// The readers' definition, line by line: what the block readers are measured against.
void BM_QueueParseEveryLine(benchmark::State& state) {
  const Queue& queue = Queue::Get();
  const std::string path = queue.Volume() + "/photo/2015/Album 7 - holidays and family";
  for (auto _ : state) {
    std::ifstream in(queue.Path(), std::ios::binary);
    std::string line;
    bool found = false;
    while (!found && std::getline(in, line)) {
      WEZO::FILEINDEX::QueueEvent event;
      found = WEZO::FILEINDEX::ParseQueueLine(line.data(), line.size(), event) &&
              event.event == 65536 && event.path == path;
    }
    benchmark::DoNotOptimize(found);
  }
}
BENCHMARK(BM_QueueParseEveryLine)->Unit(benchmark::kMillisecond);

}  // namespace
