// The configuration files under crashes and concurrent processes. A writer killed with SIGKILL at
// any moment leaves each file as it was before its change or as the change made it, and the next
// writer goes on; writers and readers in several processes at once either get a change done or
// FILEINDEX_ERR_LOCK, a done change stays, and readers always see the folders nobody touches.
//
// The counts keep the suite quick. A longer run is asked for through two variables that only
// this test reads: FILEINDEX_STRESS_TRIALS (kills per crash test, default 100) and
// FILEINDEX_STRESS_ROUNDS (changes per writer process, default 30), for example
//   FILEINDEX_STRESS_TRIALS=5000 build/tests/fileindex_tests --gtest_filter='CrashTest.*'
#include <fcntl.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <map>
#include <new>
#include <random>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/index_mgr.h"
#include "fileindex/status_mgr.h"
#include "json_io.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using testsupport::FakeDaemon;

int CountFromEnv(const char* name, int fallback) {
  const char* text = std::getenv(name);
  const long value = text != nullptr ? std::strtol(text, nullptr, 10) : 0;
  return value > 0 && value <= INT_MAX ? static_cast<int>(value) : fallback;
}

// What the two files say: {"folders": {path: name}, "reindex": {share: true}}.
Json::Value EmptyState() {
  Json::Value state(Json::objectValue);
  state["folders"] = Json::Value(Json::objectValue);
  state["reindex"] = Json::Value(Json::objectValue);
  return state;
}

// Reads both files as a reader that takes no lock does. False, with the reason, when one of them
// does not parse.
bool ReadState(Json::Value& out, std::string& why) {
  out = EmptyState();
  std::vector<Folder> folders;
  if (!IndexMgr::List(folders)) {
    why = "folder.conf does not load: " + testsupport::ReadFile(FolderConfPath());
    return false;
  }
  for (const Folder& folder : folders) {
    out["folders"][folder.GetPath()] = folder.GetName();
  }
  Json::Value status(Json::objectValue);
  if (std::filesystem::exists(StatusConfPath()) &&
      (!JsonFromFile(status, StatusConfPath()) || !status.isObject())) {
    why = "status.conf does not load: " + testsupport::ReadFile(StatusConfPath());
    return false;
  }
  out["reindex"] = status.get("need_reindex", out["reindex"]);
  return true;
}

// The change sequence every crash-test writer follows, from k = 1: three of four changes go to
// folder.conf through the index manager (two upserts, then the removal of the first of them),
// the fourth to status.conf through the status manager. A change run twice leaves what it left
// once, so a writer killed after its save but before it counted the change may run it again.
std::string FolderOf(long k) {
  return std::string(k / 4 % 2 == 0 ? "/photo" : "/video") + "/f" + std::to_string(k % 5);
}

bool RunChange(long k) {
  Json::Value request(Json::arrayValue);
  switch (k % 4) {
    case 0:
      return StatusMgr::ShareSetNeedReindex("s" + std::to_string(k % 5), k % 8 == 0);
    case 3:
      request.append(FolderOf(k - 2));
      return IndexMgr::Delete(request);
    default:
      request[0]["path"] = FolderOf(k);
      request[0]["name"] = "n" + std::to_string(k);
      request[0]["photo"] = true;
      return IndexMgr::Upsert(request);
  }
}

void ApplyChange(Json::Value& state, long k) {
  switch (k % 4) {
    case 0:
      if (k % 8 == 0) {
        state["reindex"]["s" + std::to_string(k % 5)] = true;
      } else {
        state["reindex"].removeMember("s" + std::to_string(k % 5));
      }
      break;
    case 3:
      state["folders"].removeMember(FolderOf(k - 2));
      break;
    default:
      state["folders"][FolderOf(k)] = "n" + std::to_string(k);
  }
}

// How many temporary files of the configuration file `name` lie beside it.
int Temporaries(const std::string& name) {
  int count = 0;
  const std::filesystem::path dir = std::filesystem::path(FolderConfPath()).parent_path();
  for (const auto& entry : std::filesystem::directory_iterator(dir)) {
    count += entry.path().filename().string().rfind(name + ".", 0) == 0 ? 1 : 0;
  }
  return count;
}

int AllTemporaries() { return Temporaries("folder.conf") + Temporaries("status.conf"); }

class StressTest : public testsupport::LibraryTest {
 protected:
  StressTest() {
    std::filesystem::create_directories(volume + "/photo");
    std::filesystem::create_directories(volume + "/video");
  }

  FakeDaemon daemon;
};

class CrashTest : public StressTest {
 protected:
  CrashTest() {
    void* shared = mmap(nullptr, sizeof(std::atomic<long>), PROT_READ | PROT_WRITE,
                        MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    EXPECT_NE(shared, MAP_FAILED);
    counted = new (shared) std::atomic<long>(0);
  }
  ~CrashTest() override { munmap(counted, sizeof(std::atomic<long>)); }

  enum class KillAt {
    kRandomMoment,  // a random time after the writer starts, wherever it then is
    kInASave,       // a random time after the writer created a temporary file
  };

  // Starts a writer that runs the change sequence on from the last counted change, counting each
  // change once it returns, kills it, and checks that each file is as the last counted change or
  // the next one left it. Then makes the next change itself, which must succeed.
  void KillOneWriter(KillAt when) {
    const int watch = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
    ASSERT_GE(watch, 0);
    ASSERT_GE(inotify_add_watch(
                  watch, std::filesystem::path(FolderConfPath()).parent_path().c_str(), IN_CREATE),
              0);
    const int temporariesBefore = AllTemporaries();

    const pid_t writer = fork();
    ASSERT_GE(writer, 0);
    if (writer == 0) {
      for (long k = counted->load() + 1;; ++k) {
        if (!RunChange(k)) {
          _exit(1);
        }
        counted->store(k);
      }
    }
    bool sawSave = true;
    if (when == KillAt::kInASave) {
      pollfd event{watch, POLLIN, 0};
      sawSave = poll(&event, 1, 5000) == 1;
      std::this_thread::sleep_for(std::chrono::microseconds(rng() % 1500));
    } else {
      std::this_thread::sleep_for(
          std::chrono::microseconds(rng() % static_cast<unsigned>(3 * changeMicros + 1)));
    }
    kill(writer, SIGKILL);
    int status = 0;
    ASSERT_EQ(waitpid(writer, &status, 0), writer);
    close(watch);
    ASSERT_TRUE(sawSave) << "the writer created no temporary file within 5 s";
    ASSERT_TRUE(WIFSIGNALED(status)) << "a change of the writer failed before the kill";
    ++kills;
    insideSave += AllTemporaries() > temporariesBefore ? 1 : 0;

    const long last = counted->load();
    for (; modelAt < last; ApplyChange(model, ++modelAt)) {
    }
    Json::Value next = model;
    ApplyChange(next, last + 1);
    Json::Value actual;
    std::string why;
    ASSERT_TRUE(ReadState(actual, why)) << "after kill " << kills << ": " << why;
    if (actual == next && actual != model) {
      ++afterSave;
      model = next;
      modelAt = last + 1;
    } else {
      ASSERT_EQ(actual, model) << "after kill " << kills << ", change " << last + 1;
    }

    const auto start = std::chrono::steady_clock::now();
    ASSERT_TRUE(RunChange(modelAt + 1)) << "the change after kill " << kills;
    changeMicros = static_cast<int>(std::chrono::duration_cast<std::chrono::microseconds>(
                                        std::chrono::steady_clock::now() - start)
                                        .count());
    ApplyChange(model, ++modelAt);
    counted->store(modelAt);
    ASSERT_TRUE(ReadState(actual, why)) << why;
    ASSERT_EQ(actual, model) << "after the change that followed kill " << kills;
  }

  std::atomic<long>* counted = nullptr;  // shared with the writers
  Json::Value model = EmptyState();      // what the changes up to modelAt leave
  long modelAt = 0;
  int changeMicros = 2000;  // how long the last change took, to spread the random kills over it
  std::mt19937 rng{std::random_device{}()};
  int kills = 0;
  int insideSave = 0;  // kills that left a temporary file: the writer was inside a save
  int afterSave = 0;   // kills after a save, before the writer counted its change
};

TEST_F(CrashTest, AKilledWriterLeavesEachFileBeforeOrAfterItsChange) {
  const int trials = CountFromEnv("FILEINDEX_STRESS_TRIALS", 100);
  for (int trial = 0; trial < trials && !HasFatalFailure(); ++trial) {
    KillOneWriter(trial % 2 == 0 ? KillAt::kInASave : KillAt::kRandomMoment);
  }
  std::printf(
      "[ figures  ] %d kills, %ld changes: %d kills inside a save, %d after a save but "
      "before the call returned\n",
      kills, modelAt, insideSave, afterSave);
}

TEST_F(CrashTest, KilledSavesLeaveNoTemporariesBehind) {
  for (int trial = 0; trial < 30 && !HasFatalFailure(); ++trial) {
    KillOneWriter(KillAt::kInASave);
  }
  // Four changes in a row save each file at least once.
  for (int i = 0; i < 4; ++i) {
    ASSERT_TRUE(RunChange(++modelAt));
  }
  EXPECT_LE(Temporaries("folder.conf"), 1) << insideSave << " kills inside a save";
  EXPECT_LE(Temporaries("status.conf"), 1) << insideSave << " kills inside a save";
}

// One child process's findings, sent through a pipe: "ok ..." or what went wrong.
struct Child {
  pid_t pid;
  int report;
};

Child Spawn(const std::function<std::string()>& body) {
  int fds[2];
  if (pipe2(fds, O_CLOEXEC) != 0) {
    return {-1, -1};
  }
  const pid_t pid = fork();
  if (pid == 0) {
    close(fds[0]);
    const std::string report = body();
    const ssize_t written = write(fds[1], report.data(), report.size());
    _exit(written == static_cast<ssize_t>(report.size()) ? 0 : 1);
  }
  close(fds[1]);
  return {pid, fds[0]};
}

std::string Collect(const Child& child) {
  std::string report;
  char buffer[512];
  for (ssize_t n; (n = read(child.report, buffer, sizeof buffer)) > 0;) {
    report.append(buffer, static_cast<size_t>(n));
  }
  close(child.report);
  int status = 0;
  if (waitpid(child.pid, &status, 0) != child.pid || !WIFEXITED(status) ||
      WEXITSTATUS(status) != 0) {
    return "the process died: " + report;
  }
  return report;
}

const std::vector<std::string> kSeeded = {"/photo/seed", "/video/seed"};

// Changes its own three folders `rounds` times; each success must stay, each failure must be
// FILEINDEX_ERR_LOCK with nothing changed.
std::string Writer(int w, int rounds) {
  const std::vector<std::string> paths = {"/photo/w" + std::to_string(w) + "a",
                                          "/video/w" + std::to_string(w) + "b",
                                          "/photo/w" + std::to_string(w) + "c"};
  std::map<std::string, std::string> mine;
  int done = 0;
  int busy = 0;
  for (int r = 0; r < rounds; ++r) {
    const std::string& path = paths[static_cast<size_t>(r) % paths.size()];
    const bool add = r / 3 % 2 == 0;
    Json::Value request(Json::arrayValue);
    if (add) {
      request[0]["path"] = path;
      request[0]["name"] = "r" + std::to_string(r);
    } else {
      request.append(path);
    }
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    if (add ? IndexMgr::Upsert(request) : IndexMgr::Delete(request)) {
      ++done;
      if (add) {
        mine[path] = "r" + std::to_string(r);
      } else {
        mine.erase(path);
      }
    } else if (ErrorHandler::GetError() == FILEINDEX_ERR_LOCK) {
      ++busy;
    } else {
      return "round " + std::to_string(r) + " on " + path + " failed with code " +
             std::to_string(ErrorHandler::GetError());
    }
  }
  std::vector<Folder> list;
  if (!IndexMgr::List(list)) {
    return "the final list does not load";
  }
  std::map<std::string, std::string> found;
  for (const Folder& folder : list) {
    if (std::find(paths.begin(), paths.end(), folder.GetPath()) != paths.end()) {
      found[folder.GetPath()] = folder.GetName();
    }
  }
  if (found != mine) {
    return "the final list lost a change of writer " + std::to_string(w);
  }
  return "ok " + std::to_string(done) + " " + std::to_string(busy);
}

// Asks `rounds` times about the folders nobody touches and a path nobody adds.
std::string Reader(int rounds) {
  int busy = 0;
  for (int r = 0; r < rounds; ++r) {
    for (const std::string& seed : kSeeded) {
      if (!IndexMgr::IsPathIndexed(seed + "/x")) {
        return "round " + std::to_string(r) + ": " + seed + " answered not indexed";
      }
    }
    if (IndexMgr::IsPathIndexed("/photo/never")) {
      return "round " + std::to_string(r) + ": a path never added answered indexed";
    }
    std::vector<Folder> list;
    if (!IndexMgr::List(list) || list.size() < kSeeded.size()) {
      return "round " + std::to_string(r) + ": the list does not load";
    }
    Json::Value folder;
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    if (IndexMgr::Get(folder, kSeeded[0])) {
      if (folder["name"] != "keep") {
        return "round " + std::to_string(r) + ": Get answered " + JsonToString(folder);
      }
    } else if (ErrorHandler::GetError() == FILEINDEX_ERR_LOCK) {
      ++busy;
    } else {
      return "round " + std::to_string(r) + ": Get failed with code " +
             std::to_string(ErrorHandler::GetError());
    }
  }
  return "ok " + std::to_string(rounds) + " " + std::to_string(busy);
}

TEST_F(StressTest, ConcurrentWritersKeepEveryDoneChangeAndReadersSeeUntouchedFolders) {
  constexpr int kWriters = 3;
  constexpr int kReaders = 2;
  const int rounds = CountFromEnv("FILEINDEX_STRESS_ROUNDS", 30);
  Json::Value seeds(Json::arrayValue);
  for (const std::string& seed : kSeeded) {
    Json::Value folder(Json::objectValue);
    folder["path"] = seed;
    folder["name"] = "keep";
    seeds.append(folder);
  }
  ASSERT_TRUE(IndexMgr::Upsert(seeds));

  std::vector<Child> children;
  children.reserve(kWriters + kReaders);
  for (int w = 0; w < kWriters; ++w) {
    children.push_back(Spawn([w, rounds] { return Writer(w, rounds); }));
  }
  for (int r = 0; r < kReaders; ++r) {
    children.push_back(Spawn([rounds] { return Reader(rounds * 4); }));
  }
  int counts[2][2] = {};  // [writers, readers][done, busy]
  for (size_t i = 0; i < children.size(); ++i) {
    ASSERT_GE(children[i].pid, 0);
    const std::string report = Collect(children[i]);
    std::istringstream fields(report);
    std::string ok;
    int done = 0;
    int busy = 0;
    fields >> ok >> done >> busy;
    EXPECT_TRUE(ok == "ok" && !fields.fail()) << report;
    counts[i < kWriters ? 0 : 1][0] += done;
    counts[i < kWriters ? 0 : 1][1] += busy;
  }
  std::printf(
      "[ figures  ] %d writers x %d rounds: %d done, %d busy; %d readers: %d rounds, "
      "%d Get busy\n",
      kWriters, rounds, counts[0][0], counts[0][1], kReaders, counts[1][0], counts[1][1]);
  for (const std::string& seed : kSeeded) {
    EXPECT_TRUE(IndexMgr::IsPathIndexed(seed));
  }
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
