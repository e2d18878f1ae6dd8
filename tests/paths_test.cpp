#include <gtest/gtest.h>

#include "fileindex/root.h"
#include "paths.h"

namespace WEZO::FILEINDEX {
namespace {

class RootPrefixTest : public ::testing::Test {
 protected:
  ~RootPrefixTest() override { SetRootPrefix(""); }
};

TEST_F(RootPrefixTest, EveryFixedPathIsTheAppliancesUnderAnAbsoluteRoot) {
  const struct {
    std::string given;
    bool accepted;
    std::string root;  // the prefix afterwards
  } cases[] = {{"/srv/a", true, "/srv/a"},
               {"/srv/a//", true, "/srv/a"},
               {"/", true, ""},
               {"", true, ""},
               {"relative/dir", false, "/kept"},
               {"./x", false, "/kept"},
               {std::string("/a\0b", 4), false, "/kept"}};
  for (const auto& c : cases) {
    ASSERT_TRUE(SetRootPrefix("/kept"));
    EXPECT_EQ(SetRootPrefix(c.given), c.accepted) << c.given;
    EXPECT_EQ(GetRootPrefix(), c.root) << c.given;
    const std::string& root = c.root;
    EXPECT_EQ(FolderConfPath(), root + "/usr/wezo/etc/fileindex/folder.conf");
    EXPECT_EQ(StatusConfPath(), root + "/usr/wezo/etc/fileindex/status.conf");
    EXPECT_EQ(FolderLockPath(), root + "/tmp/fileidx_cfg_folder.lock");
    EXPECT_EQ(StatusLockPath(), root + "/tmp/fileidx_cfg_status.lock");
    EXPECT_EQ(DaemonSocketPath(), root + "/var/run/fileindexd.sock");
    EXPECT_EQ(NotifyToolPath(), root + "/usr/wezo/bin/wezohxonotify");
  }
}

}  // namespace
}  // namespace WEZO::FILEINDEX
