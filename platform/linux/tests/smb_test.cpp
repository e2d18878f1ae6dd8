#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <string>

#include "sandbox.h"

namespace {

using SpotlightTest = SandboxTest;

// Whether Samba's own checker accepts the file; skipped where Samba is not installed.
void ExpectSambaAccepts(const std::string& path) {
  const char* const testparm = "/usr/bin/testparm";
  if (access(testparm, X_OK) != 0) {
    return;
  }
  const char* const argv[] = {testparm, "-s", "--suppress-prompt", path.c_str(), nullptr};
  // testparm's report goes to the test's output; only its exit status matters here.
  EXPECT_EQ(WLIBCExecv(testparm, argv, 1), 0) << "testparm refuses " << path;
}

int EntriesIn(const std::string& dir) {
  int n = 0;
  DIR* d = opendir(dir.c_str());
  while (d != nullptr && readdir(d) != nullptr) {
    ++n;
  }
  if (d != nullptr) {
    closedir(d);
  }
  return n - 2;
}

TEST_F(SpotlightTest, RewritesOnlyTheGlobalSpotlightValue) {
  const struct {
    const char* before;
    int enable;
    const char* after;
  } cases[] = {
      {"[global]\n\tspotlight = no\n[s]\n\tpath = /x\n", 1,
       "[global]\n\tspotlight = yes\n[s]\n\tpath = /x\n"},
      {"# keep ; me\r\n[ Global ]\r\n  Spot Light=off  \r\n\tworkgroup = W\r\n", 1,
       "# keep ; me\r\n[ Global ]\r\n  Spot Light= yes\r\n\tworkgroup = W\r\n"},
      {"[global]\nspotlight = \\\n  yes\n# tail", 0, "[global]\nspotlight = no\n# tail"},
      {"[global]\nspotlight = no\n[s]\npath = /x\n[global]\nspotlight = no\n", 1,
       "[global]\nspotlight = no\n[s]\npath = /x\n[global]\nspotlight = yes\n"},
      {"spotlight = no\n[s]\npath = /x\n", 1, "spotlight = yes\n[s]\npath = /x\n"},
      {"# c\n[global]\n\tworkgroup = W\n[s]\n\tspotlight = yes\n", 1,
       "# c\n[global]\n\tspotlight = yes\n\tworkgroup = W\n[s]\n\tspotlight = yes\n"},
      {"[global]", 1, "[global]\n\tspotlight = yes\n"},
      {"[s]\n\tpath = /x", 0, "[s]\n\tpath = /x\n[global]\n\tspotlight = no\n"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.before);
    Write("etc/samba/smb.conf", c.before, 0640);
    EXPECT_EQ(WEZOSMBSetSpotlight(c.enable), 0);
    EXPECT_EQ(Read("etc/samba/smb.conf"), c.after);
    EXPECT_EQ(WEZOSMBIsEnableSpotlight(), c.enable);
    struct stat st {};
    ASSERT_EQ(stat(At("etc/samba/smb.conf").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 07777, 0640U);
    EXPECT_EQ(EntriesIn(At("etc/samba")), 1) << "a temporary file was left behind";
    ExpectSambaAccepts(At("etc/samba/smb.conf"));
  }
}

TEST_F(SpotlightTest, ReadsSambasDefaultAndRefusesWhatSambaRefuses) {
  const struct {
    const char* text;
    int expected;
  } cases[] = {
      {"[global]\n\tworkgroup = W\n", 0},
      {"[global]\n\tspotlight = True\n\tspotlight = 1\n", 1},
      {"[global]\n\tspotlight = on\n[s]\n\tspotlight = no\n", 1},
      {"[global]\n\tspotlight = maybe\n", -1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.text);
    WriteSmbConf(c.text);
    EXPECT_EQ(WEZOSMBIsEnableSpotlight() < 0 ? -1 : WEZOSMBIsEnableSpotlight(), c.expected);
  }
  const std::string invalid = Read("etc/samba/smb.conf");
  EXPECT_LT(WEZOSMBSetSpotlight(1), 0);
  EXPECT_EQ(Read("etc/samba/smb.conf"), invalid);
}

TEST_F(SpotlightTest, AMissingConfigurationIsNotCreated) {
  EXPECT_LT(WEZOSMBIsEnableSpotlight(), 0);
  EXPECT_LT(WEZOSMBSetSpotlight(1), 0);
  EXPECT_NE(access(At("etc/samba/smb.conf").c_str(), F_OK), 0);
}

}  // namespace
