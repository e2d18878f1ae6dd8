#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <climits>

#include "sandbox.h"

namespace {

using FsTest = SandboxTest;

TEST_F(FsTest, TellsFileSystemTypes) {
  const int local = WEZOGetFSType(root_.c_str(), 0);
  EXPECT_NE(local, WEZO_FSTYPE_UNKNOWN) << "the test folder's file system is not in the table";
  EXPECT_FALSE(WEZOFSIsRemoteFS(local));
  EXPECT_FALSE(WEZOFSIsImageFS(local));
  EXPECT_EQ(WEZOGetFSType(At("missing").c_str(), 0), WEZO_FSTYPE_UNKNOWN);
  if (access("/proc/self", F_OK) == 0) {
    EXPECT_EQ(WEZOGetFSType("/proc/self", 0), WEZO_FSTYPE_NEVER_INDEXED);
  }
  EXPECT_FALSE(WEZOFSIsRemoteFS(WEZO_FSTYPE_NEVER_INDEXED));
  EXPECT_FALSE(WEZOFSIsImageFS(WEZO_FSTYPE_NEVER_INDEXED));
}

TEST_F(FsTest, FindsMountPoints) {
  Write("dir/file", "");
  ASSERT_EQ(symlink("/", At("link").c_str()), 0);
  const struct {
    std::string path;
    int expected;
  } cases[] = {
      {"/", 1},       {root_, 0},          {At("dir"), 0},
      {At("dir/file"), 0}, {At("link"), 0}, {At("missing"), -1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    EXPECT_EQ(WEZOFSDirIsMntPoint(c.path.c_str()) < 0 ? -1 : WEZOFSDirIsMntPoint(c.path.c_str()),
              c.expected);
  }
  if (access("/proc/self", F_OK) == 0) {
    EXPECT_EQ(WEZOFSDirIsMntPoint("/proc"), 1);
  }
}

TEST_F(FsTest, CreatesTheMetadataFolderButNeverThroughALink) {
  EXPECT_EQ(WEZOEAIsHiddenDir("@eaDir"), 1);
  EXPECT_EQ(WEZOEAIsHiddenDir("@eadir"), 0);
  EXPECT_EQ(WEZOEAIsHiddenDir(nullptr), 0);

  const mode_t old = umask(077);
  EXPECT_EQ(WEZOEAMKDir(0, At("@eaDir").c_str()), 0);
  umask(old);
  struct stat st {};
  ASSERT_EQ(lstat(At("@eaDir").c_str(), &st), 0);
  EXPECT_TRUE(S_ISDIR(st.st_mode));
  EXPECT_EQ(st.st_mode & 07777, 0755U);
  EXPECT_EQ(WEZOEAMKDir(0, At("@eaDir").c_str()), 0);

  Write("target/keep", "");
  Write("share/keep", "");
  ASSERT_EQ(symlink(At("target").c_str(), At("share/@eaDir").c_str()), 0);
  EXPECT_LT(WEZOEAMKDir(0, At("share/@eaDir").c_str()), 0);
  Write("file/@eaDir", "");
  EXPECT_LT(WEZOEAMKDir(0, At("file/@eaDir").c_str()), 0);
  EXPECT_LT(WEZOEAMKDir(0, At("missing/@eaDir").c_str()), 0);
}

TEST_F(FsTest, AnswersTheSpaceQuestion) {
  EXPECT_NE(WEZOQuotaIsEnough(0, root_.c_str(), 1), 0);
  EXPECT_EQ(WEZOQuotaIsEnough(0, root_.c_str(), ULLONG_MAX), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_NO_SPACE);
  EXPECT_EQ(WEZOQuotaIsEnough(0, At("missing").c_str(), 1), 0);
  EXPECT_NE(WLIBCErrGet(), WLIBC_ERR_NO_SPACE);
  EXPECT_NE(WLIBCErrGet(), WLIBC_ERR_OVER_QUOTA);
}

}  // namespace
