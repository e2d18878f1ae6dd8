#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <filesystem>
#include <string>

#include "sandbox.h"

namespace {

using SpotlightTest = SandboxTest;

TEST_F(SpotlightTest, RewritesOnlyTheGlobalSpotlightValue) {
  const struct Case {
    const char* before;
    int enable;
    const char* after;
  } kCases[] = {{"[global]\n\tspotlight = no\n[s]\n\tpath = /x\n", 1,
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
                {"[s]\n\tpath = /x", 0, "[s]\n\tpath = /x\n[global]\n\tspotlight = no\n"}};
  const std::string conf = At("etc/samba/smb.conf");
  const bool haveTestparm = access("/usr/bin/testparm", X_OK) == 0;
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.before);
    Write("etc/samba/smb.conf", c.before, 0640);
    EXPECT_EQ(WEZOSMBSetSpotlight(c.enable), 0);
    EXPECT_EQ(Read("etc/samba/smb.conf"), c.after);
    EXPECT_EQ(WEZOSMBIsEnableSpotlight(), c.enable);
    struct stat st {};
    EXPECT_EQ(stat(conf.c_str(), &st) == 0 ? st.st_mode & 07777 : 0, 0640U);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(At("etc/samba")), {}), 1)
        << "a temporary file was left behind";
    // Samba's own checker accepts the result, where Samba is installed.
    if (haveTestparm) {
      const char* const argv[] = {"testparm", "-s", "--suppress-prompt", conf.c_str(), nullptr};
      EXPECT_EQ(WLIBCExecv("/usr/bin/testparm", argv, 1), 0);
    }
  }
  if (!haveTestparm) {
    GTEST_SKIP() << "testparm (samba-common-bin) is not installed: Samba's acceptance of the "
                    "rewritten files was not checked";
  }
}

TEST_F(SpotlightTest, ReadsSambasDefaultAndRefusesWhatSambaRefuses) {
  const std::pair<const char*, int> kCases[] = {
      {"[global]\n\tworkgroup = W\n", 0},
      {"[global]\n\tspotlight = True\n\tspotlight = 1\n", 1},
      {"[global]\n\tspotlight = on\n[s]\n\tspotlight = no\n", 1},
      {"[global]\n\tspotlight = maybe\n", -1}};
  for (const auto& [text, expected] : kCases) {
    Write("etc/samba/smb.conf", text);
    EXPECT_EQ(std::max(WEZOSMBIsEnableSpotlight(), -1), expected) << text;
  }
  EXPECT_LT(WEZOSMBSetSpotlight(1), 0);
  EXPECT_EQ(Read("etc/samba/smb.conf"), kCases[3].first);
  ASSERT_EQ(unlink(At("etc/samba/smb.conf").c_str()), 0);
  EXPECT_LT(WEZOSMBIsEnableSpotlight(), 0);
  EXPECT_LT(WEZOSMBSetSpotlight(1), 0);
  EXPECT_NE(access(At("etc/samba/smb.conf").c_str(), F_OK), 0);
}

}  // namespace
