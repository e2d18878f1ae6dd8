// The configuration files under SIGKILL and concurrent processes. Longer runs:
// FILEINDEX_STRESS_TRIALS (kills, default 100), FILEINDEX_STRESS_ROUNDS (changes, default 30).
#include <poll.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/wait.h>

#include <atomic>
#include <climits>
#include <csignal>
#include <random>

#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

int CountFromEnv(const char* name, int fallback) {
  const long value = std::getenv(name) != nullptr ? std::strtol(std::getenv(name), nullptr, 10) : 0;
  return value > 0 && value <= INT_MAX ? static_cast<int>(value) : fallback;
}

// {"folders": {path: name}, "reindex": {share: true}} read without a lock; null if unreadable.
Json::Value ReadState() {
  std::vector<Folder> folders;
  Json::Value status(Json::objectValue);
  Json::Value state;
  if (!IndexMgr::List(folders) ||
      (std::filesystem::exists(StatusConfPath()) &&
       (!JsonFromFile(status, StatusConfPath()) || !status.isObject()))) {
    return state;
  }
  state["folders"] = Json::objectValue;
  for (const Folder& folder : folders) state["folders"][folder.GetPath()] = folder.GetName();
  state["reindex"] = status.get("need_reindex", Json::objectValue);
  return state;
}

// The list request that adds `path` named `name`, or removes it when `name` is empty.
Json::Value Request(const std::string& path, const std::string& name) {
  return ParseJson(name.empty() ? "[\"" + path + "\"]"
                                : R"([{"path":")" + path + R"(","name":")" + name + "\"}]");
}

// Change k (from 1): two upserts and a removal in folder.conf, then a status.conf flag; each
// may run twice (a writer killed before it counted it). With `state`, made to the model.
bool Change(long k, Json::Value* state = nullptr) {
  const std::string folder = std::string(k / 4 % 2 == 0 ? "/photo" : "/video") + "/f" +
                             std::to_string((k - (k % 4 == 3 ? 2 : 0)) % 5);
  const std::string share = "s" + std::to_string(k % 5);
  const std::string name = "n" + std::to_string(k);
  if (state != nullptr) {
    if (k % 8 == 0) (*state)["reindex"][share] = true;
    if (k % 8 == 4) (*state)["reindex"].removeMember(share);
    if (k % 4 == 3) (*state)["folders"].removeMember(folder);
    if (k % 4 == 1 || k % 4 == 2) (*state)["folders"][folder] = name;
    return true;
  }
  if (k % 4 == 0) return StatusMgr::ShareSetNeedReindex(share, k % 8 == 0);
  if (k % 4 == 3) return IndexMgr::Delete(Request(folder, ""));
  return IndexMgr::Upsert(Request(folder, name));
}

class StressTest : public testsupport::LibraryTest {
 protected:
  FakeDaemon daemon;
};

using CrashTest = StressTest;

// Writers go on from the last change counted in shared memory and are killed at random, or
// while saving; each file is then as the last counted change or the next left it.
TEST_F(CrashTest, AKilledWriterLeavesEachFileBeforeOrAfterItsChange) {
  void* shared = mmap(nullptr, sizeof(std::atomic<long>), PROT_READ | PROT_WRITE,
                      MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(shared, MAP_FAILED);
  auto* counted = new (shared) std::atomic<long>(0);
  Json::Value model = ReadState();
  long modelAt = 0;
  int changeMicros = 2000;  // how long the last change took, to spread the random kills over it
  std::mt19937 rng{std::random_device{}()};
  const int trials = CountFromEnv("FILEINDEX_STRESS_TRIALS", 100);
  for (int n = 1; n <= trials && !HasFatalFailure(); ++n) {
    const int watch = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
    ASSERT_GE(inotify_add_watch(
                  watch, std::filesystem::path(FolderConfPath()).parent_path().c_str(), IN_CREATE),
              0);
    const pid_t writer = fork();
    ASSERT_GE(writer, 0);
    if (writer == 0) {
      for (long k = counted->load() + 1; Change(k); ++k) counted->store(k);
      _exit(1);
    }
    pollfd created{watch, POLLIN, 0};
    const bool inASave = n % 2 == 1;
    ASSERT_TRUE(!inASave || poll(&created, 1, 5000) == 1) << "no temporary file within 5 s";
    std::this_thread::sleep_for(std::chrono::microseconds(
        rng() % (inASave ? 1500U : static_cast<unsigned>(3 * changeMicros + 1))));
    kill(writer, SIGKILL);
    int status = 0;
    ASSERT_EQ(waitpid(writer, &status, 0), writer);
    close(watch);
    ASSERT_TRUE(WIFSIGNALED(status)) << "a change of the writer failed before the kill";

    for (; modelAt < counted->load(); Change(++modelAt, &model)) {
    }
    Json::Value next = model;
    Change(modelAt + 1, &next);
    const Json::Value actual = ReadState();
    ASSERT_FALSE(actual.isNull()) << "a file does not load after kill " << n;
    if (actual == next && actual != model) {  // killed after its save, before it counted it
      Change(++modelAt, &model);
    }
    ASSERT_EQ(actual, model) << "after kill " << n << ", change " << modelAt;
    const auto start = std::chrono::steady_clock::now();
    ASSERT_TRUE(Change(modelAt + 1)) << "the change after kill " << n;
    changeMicros = static_cast<int>(std::chrono::duration_cast<std::chrono::microseconds>(
                                        std::chrono::steady_clock::now() - start)
                                        .count());
    Change(++modelAt, &model);
    counted->store(modelAt);
    ASSERT_EQ(ReadState(), model) << "after the change that followed kill " << n;
  }
  munmap(shared, sizeof(std::atomic<long>));
}

// Runs `body` in a child once `go` is closed; the function returned waits for its exit code.
std::function<int()> Spawn(const int go[2], const std::function<int()>& body) {
  const pid_t pid = fork();
  if (pid == 0) {
    char byte;
    close(go[1]);
    _exit(read(go[0], &byte, 1) == 0 ? body() : 1);
  }
  return [pid] {
    int status = 0;
    return waitpid(pid, &status, 0) == pid && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  };
}

// 0, or 1 when a change or Get failed otherwise than with FILEINDEX_ERR_LOCK.
int Unexpected(bool done) { return done || ErrorHandler::GetError() == FILEINDEX_ERR_LOCK ? 0 : 1; }

// Adds and removes its own folder, then finds its last change (2 when it is lost).
int Writer(int w, int rounds) {
  const std::string path = (w % 2 == 0 ? "/photo/w" : "/video/w") + std::to_string(w);
  std::string mine;  // the folder's name, "" while it is not in the list
  for (int r = 0; r < rounds; ++r) {
    const std::string name = r % 3 != 2 ? "r" + std::to_string(r) : "";
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    const bool done = name.empty() ? IndexMgr::Delete(Request(path, name))
                                   : IndexMgr::Upsert(Request(path, name));
    mine = done ? name : mine;
    if (Unexpected(done) != 0) return 1;
  }
  return ReadState()["folders"].get(path, "").asString() == mine ? 0 : 2;
}

// Asks about folders nobody touches and a path nobody adds (3 on a wrong answer).
int Reader(int rounds) {
  for (int r = 0; r < rounds; ++r) {
    Json::Value folder;
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    const bool got = IndexMgr::Get(folder, "/photo/seed");
    if (!IndexMgr::IsPathIndexed("/photo/seed/x") || !IndexMgr::IsPathIndexed("/video/seed") ||
        IndexMgr::IsPathIndexed("/photo/never") || ReadState().isNull() ||
        (got && folder["name"] != "keep")) {
      return 3;
    }
    if (Unexpected(got) != 0) return 1;
  }
  return 0;
}

TEST_F(StressTest, ConcurrentWritersKeepEveryDoneChangeAndReadersSeeUntouchedFolders) {
  const int rounds = CountFromEnv("FILEINDEX_STRESS_ROUNDS", 30);
  ASSERT_TRUE(IndexMgr::Upsert(
      ParseJson(R"([{"path":"/photo/seed","name":"keep"},{"path":"/video/seed","name":"keep"}])")));
  // Exit codes: 1 an unexpected failure, 2 a writer's lost change, 3 a reader's wrong answer.
  daemon.Connections(1);  // the seed's command served
  // All children are forked before any starts: a fork while the daemon's thread serves a child
  // could copy a lock that thread holds into the next child, which would then wait forever.
  int go[2];
  ASSERT_EQ(pipe(go), 0);
  std::vector<std::function<int()>> children;
  for (int w = 0; w < 3; ++w) {
    children.push_back(Spawn(go, [w, rounds] { return Writer(w, rounds); }));
  }
  for (int r = 0; r < 2; ++r) {
    children.push_back(Spawn(go, [rounds] { return Reader(rounds * 4); }));
  }
  close(go[1]);
  close(go[0]);
  for (const auto& wait : children) EXPECT_EQ(wait(), 0);
  EXPECT_TRUE(IndexMgr::IsPathIndexed("/photo/seed") && IndexMgr::IsPathIndexed("/video/seed"));
}

}  // namespace
}  // namespace WEZO::FILEINDEX
