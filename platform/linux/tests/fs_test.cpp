#include <sys/mount.h>
#include <unistd.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <algorithm>
#include <climits>

#include "internal.h"
#include "json_io.h"
#include "sandbox.h"

namespace {

using FsTest = SandboxTest;

TEST_F(FsTest, TellsFileSystemTypesAndMountPoints) {
  const int local = WEZOGetFSType(root_.c_str(), 0);
  EXPECT_NE(local, WEZO_FSTYPE_UNKNOWN) << "the test folder's file system is not in the table";
  EXPECT_FALSE(WEZOFSIsRemoteFS(local) || WEZOFSIsImageFS(local));
  EXPECT_EQ(WEZOGetFSType(At("missing").c_str(), 0), WEZO_FSTYPE_UNKNOWN);
  Write("dir/file", "");
  ASSERT_EQ(symlink("/", At("link").c_str()) | mkdir(At("dst").c_str(), 0755), 0);
  for (const auto& [path, mountPoint] :
       {std::pair{root_, 0}, {At("dir/file"), 0}, {At("link"), 0}, {At("missing"), -1}}) {
    EXPECT_EQ(std::max(WEZOFSDirIsMntPoint(path.c_str()), -1), mountPoint) << path;
  }
  // Without CAP_SYS_ADMIN no bind mount is made and the folders stay plain ones.
  const bool bound = mount(At("dir").c_str(), At("dst").c_str(), nullptr, MS_BIND, nullptr) == 0;
  EXPECT_EQ(WEZOFSDirIsMntPoint(At("dst").c_str()), bound ? 1 : 0);
  EXPECT_EQ(WEZOFSDirIsMntPoint(At("dir").c_str()), 0);
  EXPECT_TRUE(!bound || umount(At("dst").c_str()) == 0);
  // In a chroot, such as a package build's, "/" is an ordinary folder of some mount.
  std::ifstream table("/proc/self/mountinfo");
  for (std::string id, parent, device, root, point, rest;
       table >> id >> parent >> device >> root >> point && std::getline(table, rest);) {
    if (point != "/") continue;
    EXPECT_EQ(WEZOFSDirIsMntPoint("/"), 1);
    EXPECT_EQ(WEZOGetFSType("/proc/self", 0), WEZO_FSTYPE_NEVER_INDEXED);
    EXPECT_EQ(WEZOFSDirIsMntPoint("/proc"), 1);
  }
}

TEST_F(FsTest, CreatesTheMetadataFolderButNeverThroughALink) {
  EXPECT_EQ(WEZOEAIsHiddenDir("@eaDir") * 2 + WEZOEAIsHiddenDir("@eadir"), 2);
  const mode_t old = umask(077);
  EXPECT_EQ(WEZOEAMKDir(0, At("@eaDir").c_str()), 0);
  umask(old);
  struct stat st {};
  ASSERT_EQ(lstat(At("@eaDir").c_str(), &st), 0);
  EXPECT_EQ(st.st_mode & (S_IFMT | 07777), S_IFDIR | 0755U);
  EXPECT_EQ(WEZOEAMKDir(0, At("@eaDir").c_str()), 0);
  Write("file/@eaDir", "");
  ASSERT_EQ(mkdir(At("share").c_str(), 0755) | mkdir(At("dir").c_str(), 0755), 0);
  ASSERT_EQ(symlink(At("dir").c_str(), At("share/@eaDir").c_str()), 0);
  for (const char* refused : {"share/@eaDir", "file/@eaDir", "missing/@eaDir"}) {
    EXPECT_LT(WEZOEAMKDir(0, At(refused).c_str()), 0) << refused;
  }
}

TEST_F(FsTest, AnswersTheSpaceQuestion) {
  EXPECT_NE(WEZOQuotaIsEnough(0, root_.c_str(), 1), 0);
  EXPECT_EQ(WEZOQuotaIsEnough(0, root_.c_str(), ULLONG_MAX), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_NO_SPACE);
  EXPECT_EQ(WEZOQuotaIsEnough(0, At("missing").c_str(), 1), 0);
  EXPECT_TRUE(WLIBCErrGet() != WLIBC_ERR_NO_SPACE && WLIBCErrGet() != WLIBC_ERR_OVER_QUOTA);
}

using WEZO::WEZOTIFYD::MonitorQueue;
using WEZO::WEZOTIFYD::QUEUE_TYPE_FILE;
using MonitorTest = SandboxTest;

MonitorQueue Entry(const std::string& queue, const std::string& dir) {
  Json::Value value;
  EXPECT_TRUE(
      WEZO::FILEINDEX::JsonFromString(value, R"({"queue":")" + queue + R"(","config":[{"path":")" +
                                                 dir + R"(","mask":65486,"ignore":["@eaDir"]}]})"));
  return MonitorQueue(value);
}

TEST_F(MonitorTest, KeepsOneFilePerClientAndQueueAndRefusesOtherNames) {
  const std::string queue = "/volume1/photo/@eaDir/q";
  const std::string file = At("var/lib/wezotifyd/fx/%2Fvolume1%2Fphoto%2F%40eaDir%2Fq.json");
  const std::string stale = file + ".a1B2c3";  // a killed writer's temporary file
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/a"), "fx", QUEUE_TYPE_FILE));
  Write(stale.substr(root_.size()), "{");
  std::filesystem::last_write_time(
      stale, std::filesystem::file_time_type::clock::now() - std::chrono::hours(1));
  ASSERT_TRUE(MonitorQueue::Upsert(Entry(queue, "/volume1/photo/b"), "fx", QUEUE_TYPE_FILE));
  EXPECT_FALSE(std::filesystem::exists(stale));
  Json::Value stored;
  ASSERT_TRUE(WEZO::FILEINDEX::JsonFromFile(stored, file));
  EXPECT_EQ(stored, Entry(queue, "/volume1/photo/b").Entry());
  // A queue path cannot name a file outside the client's folder.
  ASSERT_TRUE(MonitorQueue::Upsert(Entry("../../x", "/d"), "fx", QUEUE_TYPE_FILE));
  EXPECT_EQ(access(At("var/lib/wezotifyd/fx/..%2F..%2Fx.json").c_str(), F_OK), 0);
  EXPECT_TRUE(MonitorQueue::Delete(queue, "fx", QUEUE_TYPE_FILE));
  EXPECT_NE(access(file.c_str(), F_OK), 0);
  EXPECT_TRUE(MonitorQueue::Delete(queue, "fx", QUEUE_TYPE_FILE) &&
              MonitorQueue::Delete(queue, "nobody", QUEUE_TYPE_FILE));
  for (const std::string& client :
       {std::string(), std::string("a/b"), std::string(".."), std::string("a\0b", 3)}) {
    EXPECT_FALSE(MonitorQueue::Upsert(Entry("/q", "/d"), client, QUEUE_TYPE_FILE));
    EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS) << client;
    EXPECT_FALSE(MonitorQueue::Delete("/q", client, QUEUE_TYPE_FILE));
  }
  const std::string tooLong(100, '/');  // its file name would pass the file system's limit
  EXPECT_FALSE(MonitorQueue::Upsert(Entry(tooLong, "/d"), "c", QUEUE_TYPE_FILE) ||
               MonitorQueue::Delete(tooLong, "c", QUEUE_TYPE_FILE));
  std::filesystem::remove_all(At("var/lib/wezotifyd"));
  Write("var/lib/wezotifyd", "not a folder");
  EXPECT_FALSE(MonitorQueue::Upsert(Entry("/q", "/d"), "fx", QUEUE_TYPE_FILE));
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrSystem);
}

}  // namespace
