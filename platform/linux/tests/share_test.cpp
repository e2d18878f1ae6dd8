#include <unistd.h>
#include <wezo/platform.h>

#include <chrono>
#include <tuple>

#include "internal.h"
#include "sandbox.h"

namespace {

using ShareTest = SandboxTest;

// Samba's rules: comments, continuations, names without case or spaces, the last of a parameter's
// names winning, a repeated section, special sections and one without a path.
const char* const kConf =
    "; comment\n# [commented]\n[global]\n   read only = no\n"
    "[photo]\n   path = /volume1/photo/\n   READ ONLY = yes\n   writable = yes\n"
    "[docs]\n   Path = /volume1/\\\ndocs\n   ReadOnly = yes\n"
    "[music]\n   path = /volume1/old\n   ; read only = no\n   write ok = no\n"
    "[ MUSIC ]\n   path = /volume1/music\r\n"
    "[photo2019]\n   directory = /volume1/photo/2019\n[photos]\n   path = /volume1/photos\n"
    "[homes]\n   path = /home\n[printers]\n   path = /var/spool\n[nopath]\n   comment = x\n";

TEST_F(ShareTest, ReadsSharesAndFindsTheDeepestHoldingAPath) {
  Write("etc/samba/smb.conf", kConf);
  for (const char* absent : {"PHOTO", "global", "homes", "nopath", "commented"}) {
    PWEZOSHARE share = nullptr;
    EXPECT_LT(WEZOShareGet(absent, &share), 0) << absent;
    EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrNotFound) << absent;
  }
  for (const auto& [name, path, readOnly] : {std::tuple{"photo", "/volume1/photo", 0},
                                             {"docs", "/volume1/docs", 1},
                                             {"music", "/volume1/music", 1}}) {
    PWEZOSHARE share = nullptr;
    int flag = -1;
    ASSERT_EQ(WEZOShareGet(name, &share), 0) << name;
    EXPECT_STREQ(share->szPath, path);
    EXPECT_LT(WLIBShareIsReadOnlyGet(share, nullptr), 0);
    EXPECT_EQ(WLIBShareIsReadOnlyGet(share, &flag), 0);
    EXPECT_EQ(flag, readOnly) << name;
    WEZOShareFree(share);
  }
  // The deepest share holding a path ("": none), and its recycle bin and snapshot folders.
  const std::tuple<const char*, const char*, int, int> kWhere[] = {
      {"/volume1/photo/2019/x", "photo2019", 0, 0},
      {"/volume1/photo/20190", "photo", 0, 0},
      {"/volume1/pho", "", 0, 0},
      {"/volume1/photo/#recycle", "photo", 1, 0},
      {"/volume1/photo/#recycle/a", "photo", 1, 0},
      {"/volume1/photo/#snapshot/x", "photo", 0, 1},
      {"/volume1/photo/#recycle-x", "photo", 0, 0},
      {"/volume1/photo/a/#recycle", "photo", 0, 0},
      {"/elsewhere/#snapshot", "", 0, 0}};
  for (const auto& [full, share, recycle, inSnapshot] : kWhere) {
    SCOPED_TRACE(full);
    char name[WEZO_SHARE_NAME_MAX] = "";
    char path[WEZO_SHARE_PATH_MAX] = "";
    EXPECT_EQ(WEZOShareNamePathGet(full, name, sizeof name, path, sizeof path) == 0,
              *share != '\0');
    EXPECT_STREQ(name, share);
    EXPECT_EQ(WEZOShareIsShareRecycle(full), recycle);
    int snapshot = -1;
    EXPECT_EQ(WLIBFhsPathInSnapshot(full, &snapshot), 0);
    EXPECT_EQ(snapshot, inSnapshot);
  }
  char name[4];
  char path[9];
  EXPECT_EQ(WEZOShareNamePathGet("/volume1/photo/x", name, sizeof name, path, sizeof path), 0);
  EXPECT_EQ(std::string(name) + path, "pho/volume1");  // cut to the buffers
  EXPECT_LT(WEZOShareNamePathGet("/volume1/photo", name, 0, path, sizeof path), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
}

TEST_F(ShareTest, FailuresAndUnencryptedFoldersAreTold) {
  PWEZOSHARE share = nullptr;
  int flag = -1;
  EXPECT_LT(WEZOShareGet("photo", &share), 0);  // no configuration
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrNotFound);
  EXPECT_LT(WLIBFhsPathInSnapshot("/volume1/photo/#snapshot", &flag), 0);
  EXPECT_EQ(flag, -1);
  Write("etc/samba/smb.conf", "[photo]\n path = /volume1/photo\n read only = maybe\n");
  EXPECT_LT(WEZOShareGet("photo", &share), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrBadConfig);
  EXPECT_STREQ(WLIBCErrorGetFile(), "smb_conf.cpp");

  Write("data/file", "");
  Write("etc/samba/smb.conf", "[data]\npath = " + At("data") + "\n[gone]\npath = " + At("x"));
  for (const auto& [name, expected] : {std::pair{"data", 0}, {"gone", -1}}) {
    ASSERT_EQ(WEZOShareGet(name, &share), 0);
    int encrypted = -1, encryption = -1;
    EXPECT_EQ(WLIBShareIsEncryptedGet(share, &encrypted) < 0 ? -1 : encrypted, expected);
    EXPECT_EQ(WLIBShareIsEncryptionGet(share, &encryption) < 0 ? -1 : encryption, expected);
    WEZOShareFree(share);
  }
}

// A configuration that has settled is parsed once and kept; a new file in its place, or one of
// another size or time, is read again even when it carries the same modification second.
TEST_F(ShareTest, AKeptConfigurationFollowsEveryChangeOfTheFile) {
  const auto settled = std::chrono::floor<std::chrono::seconds>(
      std::filesystem::file_time_type::clock::now() - std::chrono::hours(1));
  // Moved over smb.conf in one second: a new file of the same size, the same file rewritten in
  // place, and again at the same size a nanosecond later.
  const char* before = "none";
  int tick = 0;
  for (const auto& [file, name] : {std::pair{"etc/samba/smb.conf", "aaaa"},
                                   {"etc/samba/next", "bbbb"},
                                   {"etc/samba/smb.conf", "cc"},
                                   {"etc/samba/smb.conf", "dd"}}) {
    Write(file, std::string("[") + name + "]\npath = /v/x\n");
    std::filesystem::last_write_time(At(file), settled + std::chrono::nanoseconds(++tick / 4));
    std::filesystem::rename(At(file), At("etc/samba/smb.conf"));
    for (const auto& [asked, found] : {std::pair{name, true}, {before, false}}) {
      PWEZOSHARE share = nullptr;
      EXPECT_EQ(WEZOShareGet(asked, &share) == 0, found) << asked;
      WEZOShareFree(share);
    }
    before = name;
  }
}

using SpotlightTest = SandboxTest;

TEST_F(SpotlightTest, RewritesOnlyTheGlobalSpotlightValue) {
  const std::tuple<const char*, int, const char*> kCases[] = {
      {"# keep ; me\r\n[ Global ]\r\n  Spot Light=off  \r\n\tworkgroup = W\r\n", 1,
       "# keep ; me\r\n[ Global ]\r\n  Spot Light= yes\r\n\tworkgroup = W\r\n"},
      {"[global]\nspotlight = \\\n  yes\n# tail", 0, "[global]\nspotlight = no\n# tail"},
      {"[global]\nspotlight = no\n[s]\npath = /x\n[global]\nspotlight = no\n", 1,
       "[global]\nspotlight = no\n[s]\npath = /x\n[global]\nspotlight = yes\n"},
      {"# c\n[global]\n\tworkgroup = W\n[s]\n\tspotlight = yes\n", 1,
       "# c\n[global]\n\tspotlight = yes\n\tworkgroup = W\n[s]\n\tspotlight = yes\n"},
      {"[global]", 1, "[global]\n\tspotlight = yes\n"},
      {"[s]\n\tpath = /x", 0, "[s]\n\tpath = /x\n[global]\n\tspotlight = no\n"}};
  const std::string conf = At("etc/samba/smb.conf");
  const bool haveTestparm = access("/usr/bin/testparm", X_OK) == 0;
  for (const auto& [before, enable, after] : kCases) {
    SCOPED_TRACE(before);
    Write("etc/samba/smb.conf", before, 0640);
    EXPECT_EQ(WEZOSMBSetSpotlight(enable), 0);
    EXPECT_EQ(Read("etc/samba/smb.conf"), after);
    EXPECT_EQ(WEZOSMBIsEnableSpotlight(), enable);
    struct stat st {};
    EXPECT_EQ(stat(conf.c_str(), &st) == 0 ? st.st_mode & 07777 : 0, 0640U);
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(At("etc/samba")), {}), 1)
        << "a temporary file was left behind";
    // Samba's own checker accepts the result, where Samba is installed.
    const char* const argv[] = {"testparm", "-s", "--suppress-prompt", conf.c_str(), nullptr};
    EXPECT_TRUE(!haveTestparm || WLIBCExecv("/usr/bin/testparm", argv, 1) == 0);
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
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrNotFound);
  EXPECT_NE(access(At("etc/samba/smb.conf").c_str(), F_OK), 0);
}

}  // namespace
