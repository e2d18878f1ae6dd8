#include <ctime>

#include "file_io.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

// A configuration file at the folder list's locations, with its document in the open.
class TestConfig : public Config {
 public:
  bool Load() override { return LoadJson(); }
  bool Save() override { return SaveJson(); }
  std::string GetLockPath() const override { return FolderLockPath(); }
  std::string GetPath() const override { return FolderConfPath(); }
  Json::Value& Doc() { return m_jsRoot; }
};

class ConfigTest : public testsupport::LibraryTest {
 protected:
  // Locks a fresh object and checks the error code and the log lines it left.
  bool TryLock(bool exclusive, Lines expected) {
    TestConfig cfg;
    log.Clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    const bool locked = cfg.Lock(exclusive);
    EXPECT_EQ(ErrorHandler::GetError(), locked ? FILEINDEX_ERR_NONE : FILEINDEX_ERR_LOCK);
    if (!locked) expected.emplace_back("config:N Failed to lock folder");
    EXPECT_EQ(log.Lines(), expected);
    cfg.Unlock();
    return locked;
  }
};

TEST_F(ConfigTest, EveryFixedPathLiesUnderAnAbsoluteRoot) {
  const std::string kept = GetRootPrefix();
  EXPECT_FALSE(SetRootPrefix("relative") || SetRootPrefix(std::string("/a\0b", 4)));
  EXPECT_EQ(GetRootPrefix(), kept);
  for (const auto& [given, prefix] : {std::pair{"/srv/a//", "/srv/a"}, {"/", ""}}) {
    ASSERT_TRUE(SetRootPrefix(given));
    const std::string root = prefix;
    EXPECT_EQ(GetRootPrefix(), root);
    EXPECT_EQ(FolderConfPath(), root + "/usr/wezo/etc/fileindex/folder.conf");
    EXPECT_EQ(StatusConfPath(), root + "/usr/wezo/etc/fileindex/status.conf");
    EXPECT_EQ(FolderLockPath(), root + "/tmp/fileidx_cfg_folder.lock");
    EXPECT_EQ(StatusLockPath(), root + "/tmp/fileidx_cfg_status.lock");
    EXPECT_EQ(DaemonSocketPath(), root + "/var/run/fileindexd.sock");
    EXPECT_EQ(NotifyToolPath(), root + "/usr/wezo/bin/wezohxonotify");
  }
  ASSERT_TRUE(SetRootPrefix(kept));
}

TEST_F(ConfigTest, SaveReplacesTheFileWholeOrNotAtAllAndLoadTellsItsFailures) {
  const std::string stale = FolderConfPath() + ".a1B2c3";
  for (const bool locked : {false, true}) {
    WriteFile(stale, "{\"half");
    TestConfig cfg;
    ASSERT_TRUE(!locked || cfg.Lock(true));
    const mode_t old = umask(0077);
    EXPECT_TRUE(cfg.SaveJson());
    umask(old);
    cfg.Unlock();
    // Without the lock it may be the temporary file of a writer that is saving right now.
    EXPECT_EQ(testsupport::ModeOf(stale) < 0, locked) << locked;
  }
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);
  // A symbolic link in the file's place counts as no file; it is replaced, not written through.
  const std::string real = At("/real.conf");
  ASSERT_EQ(rename(FolderConfPath().c_str(), real.c_str()), 0);
  ASSERT_EQ(symlink(real.c_str(), FolderConfPath().c_str()), 0);
  TestConfig cfg;
  ASSERT_TRUE(cfg.LoadJson());
  EXPECT_EQ(cfg.Doc(), Json::Value(Json::objectValue));
  cfg.Doc()["b"] = 2;
  ASSERT_TRUE(cfg.SaveJson());
  EXPECT_EQ(ReadFile(real), "{}\n");
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);  // a file of its own
  WriteFile(FolderConfPath(), "");
  EXPECT_FALSE(cfg.LoadJson());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_LOAD_JSON);
  // A directory in the file's place makes the final rename fail after the data is written.
  ASSERT_EQ(unlink(FolderConfPath().c_str()) | mkdir(FolderConfPath().c_str(), 0755), 0);
  log.Clear();
  EXPECT_FALSE(cfg.SaveJson());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_SAVE_JSON);
  EXPECT_EQ(log.Lines(), Lines{"config:N Failed to save json to " + FolderConfPath()});
  const auto entries = std::filesystem::directory_iterator(At("/usr/wezo/etc/fileindex"));
  EXPECT_EQ(std::distance(entries, {}), 1);  // no temporary file is left
}

TEST_F(ConfigTest, LockAdmitsOnlySharedBesideSharedAndKeepsItsFilePrivate) {
  const int fdsBefore = testsupport::OpenDescriptorCount();
  for (const bool held : {true, false}) {
    testsupport::LockHolder other(FolderLockPath(), /*exclusive=*/held);
    for (const bool exclusive : {true, false}) {
      EXPECT_EQ(TryLock(exclusive, {}), !held && !exclusive) << held << exclusive;
    }
  }
  EXPECT_EQ(testsupport::OpenDescriptorCount(), fdsBefore);  // no attempt leaves its descriptor
  ASSERT_EQ(chmod(FolderLockPath().c_str(), 0644), 0);       // as earlier versions left it
  const mode_t old = umask(0);
  TestConfig first;
  ASSERT_TRUE(first.Lock(true));
  umask(old);
  // Readable by others, the lock file could be opened and held by any local user.
  EXPECT_EQ(testsupport::ModeOf(FolderLockPath()), 0600);
  int flagged = 0;  // the lock's descriptor does not pass to programs that the caller runs
  for (const auto& fd : std::filesystem::directory_iterator("/proc/self/fd")) {
    std::error_code ec;
    if (std::filesystem::read_symlink(fd.path(), ec) != FolderLockPath()) continue;
    flagged += (fcntl(std::stoi(fd.path().filename()), F_GETFD) & FD_CLOEXEC) != 0 ? 1 : 100;
  }
  EXPECT_EQ(flagged, 1);
  EXPECT_FALSE(TryLock(true, {}));  // two objects of one process lock independently
  first.Unlock();
  // The number the lock used is likely handed out again right away.
  const int reused = open("/dev/null", O_RDONLY | O_CLOEXEC);
  first.Unlock();
  EXPECT_NE(fcntl(reused, F_GETFD), -1) << "a second Unlock closed another descriptor";
  close(reused);
}

TEST_F(ConfigTest, LockFileThatOthersCouldHoldIsRefused) {
  const std::string lock = FolderLockPath();
  const std::string other = At("/other");
  WriteFile(other, "precious");
  ASSERT_EQ(chmod(other.c_str(), 0644), 0);
  const std::string refused = "config:N Lock file refused, not a regular file of uid " +
                              std::to_string(geteuid()) + " with one link, path=" + lock;
  const struct Case {
    const char* what;
    int (*make)(const char* other, const char* lock);
    bool refusedLine;
  } kCases[] = {{"FIFO", [](const char*, const char* l) { return mkfifo(l, 0600); }, true},
                {"hard link", [](const char* o, const char* l) { return link(o, l); }, true},
                {"symlink", [](const char* o, const char* l) { return symlink(o, l); }, false}};
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.what);
    unlink(lock.c_str());
    ASSERT_EQ(c.make(other.c_str(), lock.c_str()), 0);
    EXPECT_FALSE(TryLock(true, c.refusedLine ? Lines{refused} : Lines{}));
  }
  EXPECT_EQ(testsupport::ModeOf(other), 0644);  // the linked file is not touched
  EXPECT_EQ(ReadFile(other), "precious");
}

TEST_F(ConfigTest, TextIsOneLineAndOnlyOneWholeValueIsRead) {
  Json::Value v;
  v["p"] = "/v/line\nbreak\t\"q\"\\\xC3\xA9";  // UTF-8 stays UTF-8
  v["list"].append(Json::Value());
  const std::string text = JsonToString(v);
  EXPECT_EQ(text, R"({"list":[null],"p":"/v/line\nbreak\t\"q\"\\)"
                  "\xC3\xA9\"}");
  // The last is deeper than the reader's nesting limit, which makes it throw.
  for (const std::string& refused :
       {std::string("{"), std::string("{}{}"), std::string("[1,]"), std::string(R"({"a":1,"a":2})"),
        std::string("{} // c"), std::string(5000, '[') + std::string(5000, ']')}) {
    EXPECT_FALSE(JsonFromString(v, refused)) << refused;
  }
  Json::Value back;
  ASSERT_TRUE(JsonFromString(back, " " + text + "\n"));
  EXPECT_EQ(JsonToString(back), text);
}

TEST_F(ConfigTest, RemovesOnlyOldTemporariesOfTheFile) {
  const std::string dir = At("/usr/wezo/etc/fileindex/");
  const struct Case {
    const char* name;
    bool old, removed;  // a new one's writer may still be saving
  } kCases[] = {{"folder.conf.a1B2c3", true, true},  {"folder.conf.Z9z9Z9", false, false},
                {"folder.conf.a1B2c", true, false},  {"folder.conf.a1B2c3d", true, false},
                {"folder.conf.a1-2c3", true, false}, {"folder.confXa1B2c3", true, false}};
  const timespec twoHoursAgo[2] = {{time(nullptr) - 7200, 0}, {time(nullptr) - 7200, 0}};
  for (const Case& c : kCases) {
    WriteFile(dir + c.name, "{");
    ASSERT_EQ(c.old ? utimensat(AT_FDCWD, (dir + c.name).c_str(), twoHoursAgo, 0) : 0, 0);
  }
  const std::string link = dir + "folder.conf.L1nk00";  // only regular files are temporaries
  ASSERT_EQ(symlink("folder.conf", link.c_str()) |
                utimensat(AT_FDCWD, link.c_str(), twoHoursAgo, AT_SYMLINK_NOFOLLOW),
            0);
  RemoveStaleTemporaries(dir + "folder.conf", 3600);
  for (const Case& c : kCases)
    EXPECT_EQ(testsupport::ModeOf(dir + c.name) < 0, c.removed) << c.name;
  EXPECT_GE(testsupport::ModeOf(link), 0);
}

}  // namespace
}  // namespace WEZO::FILEINDEX
