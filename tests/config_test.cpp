#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "fileindex/config.h"
#include "fileindex/error.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
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

TEST_F(ConfigTest, MissingFileLoadsAsAnEmptyObjectAndSaveCreatesIt) {
  TestConfig cfg;
  ASSERT_TRUE(cfg.LoadJson());
  EXPECT_EQ(cfg.Doc(), Json::Value(Json::objectValue));
  EXPECT_FALSE(testsupport::ModeOf(FolderConfPath()) >= 0);

  const mode_t old = umask(0077);
  cfg.Doc()["/photo"]["name"] = "Photo";
  EXPECT_TRUE(cfg.SaveJson());
  umask(old);
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);

  TestConfig again;
  ASSERT_TRUE(again.LoadJson());
  EXPECT_EQ(again.Doc(), cfg.Doc());
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(ConfigTest, UnreadableFileFailsWithCodeSix) {
  for (const char* text : {"{\"a\":", "not json", "{} trailing", ""}) {
    testsupport::WriteFile(FolderConfPath(), text);
    TestConfig cfg;
    log.Clear();
    EXPECT_FALSE(cfg.LoadJson()) << text;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOAD_JSON);
    EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to load json from " + FolderConfPath()));
  }
}

TEST_F(ConfigTest, SymbolicLinkInPlaceOfTheFileCountsAsMissing) {
  const std::string real = sandbox.Path("/real.conf");
  testsupport::WriteFile(real, R"({"/photo":{"name":"x"}})");
  ASSERT_EQ(symlink(real.c_str(), FolderConfPath().c_str()), 0);
  TestConfig cfg;
  EXPECT_TRUE(cfg.LoadJson());
  EXPECT_EQ(cfg.Doc(), Json::Value(Json::objectValue));
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

TEST_F(ConfigTest, SaveIntoAMissingDirectoryFailsWithCodeSeven) {
  ASSERT_EQ(rmdir(sandbox.Path("/usr/wezo/etc/fileindex").c_str()), 0);
  TestConfig cfg;
  EXPECT_FALSE(cfg.SaveJson());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_SAVE_JSON);
  EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to save json to " + FolderConfPath()));
}

TEST_F(ConfigTest, ExclusiveLockHeldByAnotherProcessFailsAfterThreeAttempts) {
  testsupport::LockHolder other(FolderLockPath(), /*exclusive=*/true);
  ASSERT_TRUE(other.Holding());
  const int fdsBefore = testsupport::OpenDescriptorCount();
  for (bool exclusive : {true, false}) {
    TestConfig cfg;
    log.Clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    EXPECT_FALSE(cfg.Lock(exclusive));
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK);
    EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to lock folder"));
    cfg.Unlock();
  }
  // No attempt leaves its descriptor behind.
  EXPECT_EQ(testsupport::OpenDescriptorCount(), fdsBefore);
}

TEST_F(ConfigTest, SharedLockOfAnotherProcessAdmitsSharedButNotExclusive) {
  testsupport::LockHolder other(FolderLockPath(), /*exclusive=*/false);
  ASSERT_TRUE(other.Holding());
  TestConfig shared;
  EXPECT_TRUE(shared.Lock(false));
  shared.Unlock();
  TestConfig exclusive;
  EXPECT_FALSE(exclusive.Lock(true));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK);
  exclusive.Unlock();
}

TEST_F(ConfigTest, LockIsReleasedByUnlockAndLockFileIsKeptPrivate) {
  // Readable by others, the lock file could be opened and held by any local user.
  const mode_t old = umask(0);
  TestConfig first;
  ASSERT_TRUE(first.Lock(true));
  umask(old);
  EXPECT_EQ(testsupport::ModeOf(FolderLockPath()), 0600);
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
  const struct {
    const char* what;
    bool needsRoot;
  } cases[] = {{"a FIFO", false},
               {"a second name of another file", false},
               {"a file of another user", true}};
  for (const auto& c : cases) {
    if (c.needsRoot && geteuid() != 0) {
      continue;  // only root can give a file away
    }
    unlink(lock.c_str());
    const std::string what = c.what;
    if (what == "a FIFO") {
      ASSERT_EQ(mkfifo(lock.c_str(), 0600), 0);
    } else if (what == "a second name of another file") {
      testsupport::WriteFile(other, "");
      ASSERT_EQ(chmod(other.c_str(), 0644), 0);
      ASSERT_EQ(link(other.c_str(), lock.c_str()), 0);
    } else {
      testsupport::WriteFile(lock, "");
      ASSERT_EQ(chown(lock.c_str(), 65534, 65534), 0);
    }
    TestConfig cfg;
    log.Clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    EXPECT_FALSE(cfg.Lock(true)) << what;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK) << what;
    EXPECT_THAT(log.Lines(),
                ElementsAre("config:N Lock file refused, not a regular file of uid " +
                                std::to_string(geteuid()) + " with one link, path=" + lock,
                            "config:N Failed to lock folder"))
        << what;
    cfg.Unlock();
  }
  EXPECT_EQ(testsupport::ModeOf(other), 0644);  // the linked file's mode is not touched
}

TEST_F(ConfigTest, LockDescriptorIsCloseOnExec) {
  TestConfig cfg;
  ASSERT_TRUE(cfg.Lock(true));
  int flagged = 0;
  for (int fd = 0; fd < 1024; ++fd) {
    char link[64];
    char target[4096];
    (void)snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
    const ssize_t n = readlink(link, target, sizeof target - 1);
    if (n > 0 && std::string(target, static_cast<size_t>(n)) == FolderLockPath()) {
      EXPECT_NE(fcntl(fd, F_GETFD) & FD_CLOEXEC, 0);
      ++flagged;
    }
  }
  EXPECT_EQ(flagged, 1);
  cfg.Unlock();
}

TEST_F(ConfigTest, SymbolicLinkAsLockFileIsRefusedAndItsTargetUntouched) {
  const std::string target = sandbox.Path("/victim");
  testsupport::WriteFile(target, "precious");
  ASSERT_EQ(symlink(target.c_str(), FolderLockPath().c_str()), 0);
  TestConfig cfg;
  EXPECT_FALSE(cfg.Lock(true));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOCK);
  EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to lock folder"));
  EXPECT_EQ(testsupport::ReadFile(target), "precious");
  cfg.Unlock();
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
}  // namespace FILEINDEX
}  // namespace WEZO
