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

TEST_F(RootPrefixTest, EveryFixedPathIsTheAppliancesUnderTheRoot) {
  for (const std::string root : {"", "/srv/sandbox"}) {
    ASSERT_TRUE(SetRootPrefix(root));
    EXPECT_EQ(GetRootPrefix(), root);
    EXPECT_EQ(FolderConfPath(), root + "/usr/wezo/etc/fileindex/folder.conf");
    EXPECT_EQ(StatusConfPath(), root + "/usr/wezo/etc/fileindex/status.conf");
    EXPECT_EQ(FolderLockPath(), root + "/tmp/fileidx_cfg_folder.lock");
    EXPECT_EQ(StatusLockPath(), root + "/tmp/fileidx_cfg_status.lock");
    EXPECT_EQ(DaemonSocketPath(), root + "/var/run/fileindexd.sock");
    EXPECT_EQ(NotifyToolPath(), root + "/usr/wezo/bin/wezohxonotify");
  }
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
