#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>

#include "fileindex/config.h"
#include "fileindex/error.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

// A configuration file at the folder list's locations, with its document in the open.
class TestConfig : public Config {
 public:
  bool Load() override { return LoadJson(); }
  bool Save() override { return SaveJson(); }
  std::string GetLockPath() const override { return FolderLockPath(); }
  std::string GetPath() const override { return FolderConfPath(); }
  Json::Value& Doc() { return m_jsRoot; }
};

class ConfigTest : public testsupport::LibraryTest {};

TEST_F(ConfigTest, MissingFileLoadsAsAnEmptyObjectAndSaveCreatesItWhateverTheUmask) {
  TestConfig cfg;
  ASSERT_TRUE(cfg.LoadJson());
  EXPECT_EQ(cfg.Doc(), Json::Value(Json::objectValue));
  const mode_t old = umask(0077);
  cfg.Doc()["/photo"]["name"] = "Photo";
  EXPECT_TRUE(cfg.SaveJson());
  umask(old);
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);
  TestConfig again;
  ASSERT_TRUE(again.LoadJson());
  EXPECT_EQ(again.Doc(), cfg.Doc());
  EXPECT_THAT(log.Lines(), IsEmpty());

  // A symbolic link in the file's place counts as no file.
  ASSERT_EQ(rename(FolderConfPath().c_str(), sandbox.Path("/real.conf").c_str()), 0);
  ASSERT_EQ(symlink(sandbox.Path("/real.conf").c_str(), FolderConfPath().c_str()), 0);
  TestConfig linked;
  EXPECT_TRUE(linked.LoadJson());
  EXPECT_EQ(linked.Doc(), Json::Value(Json::objectValue));
}

TEST_F(ConfigTest, FilesThatCannotBeReadOrWrittenFailWithTheirCodes) {
  for (const char* text : {"{} trailing", ""}) {
    testsupport::WriteFile(FolderConfPath(), text);
    TestConfig cfg;
    log.Clear();
    EXPECT_FALSE(cfg.LoadJson()) << text;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOAD_JSON);
    EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to load json from " + FolderConfPath()));
  }
  log.Clear();
  std::filesystem::remove_all(sandbox.Path("/usr/wezo/etc/fileindex"));
  TestConfig cfg;
  EXPECT_FALSE(cfg.SaveJson());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_SAVE_JSON);
  EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to save json to " + FolderConfPath()));
}

TEST_F(ConfigTest, SaveUnderTheLockRemovesTemporariesOfKilledWriters) {
  const std::string stale = FolderConfPath() + ".a1B2c3";
  for (const bool locked : {false, true}) {
    testsupport::WriteFile(stale, "{\"half");
    TestConfig cfg;
    ASSERT_TRUE(!locked || cfg.Lock(true));
    EXPECT_TRUE(cfg.SaveJson());
    cfg.Unlock();
    // Without the lock it may be the temporary file of a writer that is saving right now.
    EXPECT_EQ(testsupport::ModeOf(stale) < 0, locked) << locked;
  }
}

TEST_F(ConfigTest, LockOfAnotherProcessAdmitsOnlySharedBesideShared) {
  const int fdsBefore = testsupport::OpenDescriptorCount();
  for (const bool held : {true, false}) {
    testsupport::LockHolder other(FolderLockPath(), /*exclusive=*/held);
    ASSERT_TRUE(other.Holding());
    for (const bool exclusive : {true, false}) {
      TestConfig cfg;
      log.Clear();
      ErrorHandler::SetError(FILEINDEX_ERR_NONE);
      const bool admitted = !held && !exclusive;
      EXPECT_EQ(cfg.Lock(exclusive), admitted) << held << exclusive;
      EXPECT_EQ(ErrorHandler::GetError(), admitted ? FILEINDEX_ERR_NONE : FILEINDEX_ERR_LOCK);
      EXPECT_EQ(log.Lines(), admitted ? std::vector<std::string>{}
                                      : std::vector<std::string>{"config:N Failed to lock folder"});
      cfg.Unlock();
    }
  }
  // No attempt leaves its descriptor behind.
  EXPECT_EQ(testsupport::OpenDescriptorCount(), fdsBefore);
}

TEST_F(ConfigTest, LockIsReleasedByUnlockAndLockFileIsKeptPrivate) {
  // Readable by others, the lock file could be opened and held by any local user.
  const mode_t old = umask(0);
  TestConfig first;
  ASSERT_TRUE(first.Lock(true));
  umask(old);
  EXPECT_EQ(testsupport::ModeOf(FolderLockPath()), 0600);
  int flagged = 0;  // the lock's descriptor does not pass to programs that the caller runs
  for (int fd = 0; fd < 1024; ++fd) {
    char target[4096];
    const std::string link = "/proc/self/fd/" + std::to_string(fd);
    const ssize_t n = readlink(link.c_str(), target, sizeof target - 1);
    if (n > 0 && std::string(target, static_cast<size_t>(n)) == FolderLockPath()) {
      EXPECT_NE(fcntl(fd, F_GETFD) & FD_CLOEXEC, 0);
      ++flagged;
    }
  }
  EXPECT_EQ(flagged, 1);
  {
    TestConfig second;
    EXPECT_FALSE(second.Lock(true));  // two objects of one process lock independently
    second.Unlock();
  }
  first.Unlock();
  ASSERT_EQ(chmod(FolderLockPath().c_str(), 0644), 0);  // as earlier versions left it
  TestConfig third;
  EXPECT_TRUE(third.Lock(true));
  third.Unlock();
  EXPECT_EQ(testsupport::ModeOf(FolderLockPath()), 0600);
}

TEST_F(ConfigTest, LockFileThatOthersCouldHoldIsRefused) {
  const std::string lock = FolderLockPath();
  const std::string other = sandbox.Path("/other");
  testsupport::WriteFile(other, "precious");
  ASSERT_EQ(chmod(other.c_str(), 0644), 0);
  const std::string refused = "config:N Lock file refused, not a regular file of uid " +
                              std::to_string(geteuid()) + " with one link, path=" + lock;
  const struct {
    const char* what;
    int (*make)(const char* other, const char* lock);
    bool refusedLine;
  } cases[] = {
      {"a FIFO", [](const char*, const char* l) { return mkfifo(l, 0600); }, true},
      {"a second name of another file", [](const char* o, const char* l) { return link(o, l); },
       true},
      {"a symbolic link", [](const char* o, const char* l) { return symlink(o, l); }, false},
      // Only root can give a file away; others skip this row.
      {"a file of another user",
       [](const char*, const char* l) {
         if (geteuid() != 0) return -2;
         return close(open(l, O_CREAT | O_WRONLY | O_CLOEXEC, 0600)) | chown(l, 65534, 65534);
       },
       true}};
  for (const auto& c : cases) {
    unlink(lock.c_str());
    const int made = c.make(other.c_str(), lock.c_str());
    if (made == -2) continue;
    ASSERT_EQ(made, 0) << c.what;
    TestConfig cfg;
    log.Clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    EXPECT_FALSE(cfg.Lock(true)) << c.what;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK) << c.what;
    std::vector<std::string> lines = {"config:N Failed to lock folder"};
    if (c.refusedLine) lines.insert(lines.begin(), refused);
    EXPECT_EQ(log.Lines(), lines) << c.what;
    cfg.Unlock();
  }
  EXPECT_EQ(testsupport::ModeOf(other), 0644);  // the linked file is not touched
  EXPECT_EQ(testsupport::ReadFile(other), "precious");
}

TEST_F(ConfigTest, UnlockTwiceNeverClosesSomeoneElsesDescriptor) {
  TestConfig never;
  never.Unlock();  // never locked: nothing happens
  TestConfig cfg;
  ASSERT_TRUE(cfg.Lock(true));
  cfg.Unlock();
  // The number the lock used is likely handed out again right away.
  const int reused = open("/dev/null", O_RDONLY | O_CLOEXEC);
  ASSERT_GE(reused, 0);
  cfg.Unlock();
  EXPECT_NE(fcntl(reused, F_GETFD), -1) << "a second Unlock closed another descriptor";
  close(reused);
}

}  // namespace
}  // namespace WEZO::FILEINDEX
