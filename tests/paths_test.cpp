#include <gtest/gtest.h>

#include "fileindex/root.h"
#include "paths.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

class RootPrefixTest : public ::testing::Test {
 protected:
  ~RootPrefixTest() override { SetRootPrefix(""); }
};

TEST_F(RootPrefixTest, ProductionRootIsEmptyAndPathsAreTheAppliances) {
  EXPECT_EQ(GetRootPrefix(), "");
  EXPECT_EQ(FolderConfPath(), "/usr/wezo/etc/fileindex/folder.conf");
  EXPECT_EQ(StatusConfPath(), "/usr/wezo/etc/fileindex/status.conf");
  EXPECT_EQ(FolderLockPath(), "/tmp/fileidx_cfg_folder.lock");
  EXPECT_EQ(StatusLockPath(), "/tmp/fileidx_cfg_status.lock");
  EXPECT_EQ(DaemonSocketPath(), "/var/run/fileindexd.sock");
  EXPECT_EQ(NotifyToolPath(), "/usr/wezo/bin/wezohxonotify");
}

TEST_F(RootPrefixTest, EveryFixedPathMovesUnderTheRoot) {
  ASSERT_TRUE(SetRootPrefix("/srv/sandbox"));
  EXPECT_EQ(FolderConfPath(), "/srv/sandbox/usr/wezo/etc/fileindex/folder.conf");
  EXPECT_EQ(StatusConfPath(), "/srv/sandbox/usr/wezo/etc/fileindex/status.conf");
  EXPECT_EQ(FolderLockPath(), "/srv/sandbox/tmp/fileidx_cfg_folder.lock");
  EXPECT_EQ(StatusLockPath(), "/srv/sandbox/tmp/fileidx_cfg_status.lock");
  EXPECT_EQ(DaemonSocketPath(), "/srv/sandbox/var/run/fileindexd.sock");
  EXPECT_EQ(NotifyToolPath(), "/srv/sandbox/usr/wezo/bin/wezohxonotify");
}

TEST_F(RootPrefixTest, AcceptsAbsoluteRootsAndRefusesOthers) {
  struct Case {
    std::string given;
    bool accepted;
    std::string root;  // the prefix afterwards
  } cases[] = {
      {"/srv/a", true, "/srv/a"},
      {"/srv/a//", true, "/srv/a"},
      {"/", true, ""},
      {"", true, ""},
      {"relative/dir", false, "/kept"},
      {"./x", false, "/kept"},
      {std::string("/a\0b", 4), false, "/kept"},
  };
  for (const Case& c : cases) {
    ASSERT_TRUE(SetRootPrefix("/kept"));
    EXPECT_EQ(SetRootPrefix(c.given), c.accepted) << c.given;
    EXPECT_EQ(GetRootPrefix(), c.root) << c.given;
  }
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
