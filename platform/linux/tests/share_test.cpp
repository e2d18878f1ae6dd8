#include <wezo/platform.h>

#include <string>

#include "internal.h"
#include "sandbox.h"

namespace {

using ShareTest = SandboxTest;

// One file that exercises Samba's rules: comments, continuation lines, names compared without
// case or spaces, the last value winning, read-only synonyms, repeated and special sections.
const char* const kConf =
    "; comment\n"
    "# [commented]\n"
    "[global]\n"
    "   read only = no\n"
    "[photo]\n"
    "   path = /volume1/photo/\n"
    "   READ ONLY = yes\n"
    "   writable = yes\n"
    "[docs]\n"
    "   Path = /volume1/\\\n"
    "docs\n"
    "   ReadOnly = yes\n"
    "[music]\n"
    "   path = /volume1/old\n"
    "   ; read only = no\n"
    "   write ok = no\n"
    "[ MUSIC ]\n"
    "   path = /volume1/music\r\n"
    "[photo2019]\n"
    "   directory = /volume1/photo/2019\n"
    "[photos]\n"
    "   path = /volume1/photos\n"
    "[homes]\n"
    "   path = /home\n"
    "[printers]\n"
    "   path = /var/spool\n"
    "[nopath]\n"
    "   comment = no folder\n";

TEST_F(ShareTest, ReadsSharesFromTheSambaConfiguration) {
  WriteSmbConf(kConf);
  struct Case {
    const char* name;
    const char* path;  // null: no such share
    int readOnly;
  };
  const Case cases[] = {
      {"photo", "/volume1/photo", 0},  {"docs", "/volume1/docs", 1},
      {"music", "/volume1/music", 1},  {"photo2019", "/volume1/photo/2019", 0},
      {"photos", "/volume1/photos", 0}, {"PHOTO", nullptr, 0},
      {"global", nullptr, 0},          {"homes", nullptr, 0},
      {"printers", nullptr, 0},        {"nopath", nullptr, 0},
      {"commented", nullptr, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    PWEZOSHARE share = nullptr;
    if (c.path == nullptr) {
      EXPECT_LT(WEZOShareGet(c.name, &share), 0);
      EXPECT_EQ(share, nullptr);
      EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrNotFound);
      continue;
    }
    ASSERT_EQ(WEZOShareGet(c.name, &share), 0);
    EXPECT_STREQ(share->szName, c.name);
    EXPECT_STREQ(share->szPath, c.path);
    int readOnly = -1;
    EXPECT_EQ(WLIBShareIsReadOnlyGet(share, &readOnly), 0);
    EXPECT_EQ(readOnly, c.readOnly);
    WEZOShareFree(share);
  }
}

TEST_F(ShareTest, FindsTheDeepestShareHoldingAPathAtASlash) {
  WriteSmbConf(kConf);
  const struct {
    const char* full;
    const char* share;  // null: no share holds it
  } cases[] = {
      {"/volume1/photo", "photo"},           {"/volume1/photo/a/b", "photo"},
      {"/volume1/photo/2019", "photo2019"}, {"/volume1/photo/2019/x", "photo2019"},
      {"/volume1/photo/20190", "photo"},     {"/volume1/photos/x", "photos"},
      {"/volume1/pho", nullptr},             {"/volume1", nullptr},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.full);
    char name[WEZO_SHARE_NAME_MAX] = "";
    char path[WEZO_SHARE_PATH_MAX] = "";
    const int rc = WEZOShareNamePathGet(c.full, name, sizeof name, path, sizeof path);
    if (c.share == nullptr) {
      EXPECT_LT(rc, 0);
    } else {
      EXPECT_EQ(rc, 0);
      EXPECT_STREQ(name, c.share);
    }
  }
  char name[4];
  char path[9];
  EXPECT_EQ(WEZOShareNamePathGet("/volume1/photo/x", name, sizeof name, path, sizeof path), 0);
  EXPECT_STREQ(name, "pho");
  EXPECT_STREQ(path, "/volume1");
  EXPECT_LT(WEZOShareNamePathGet("/volume1/photo", name, 0, path, sizeof path), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
}

TEST_F(ShareTest, RecycleBinAndSnapshotsAreFoldersAtAShareRoot) {
  WriteSmbConf(kConf);
  const struct {
    const char* full;
    int recycle;
    int snapshot;
  } cases[] = {
      {"/volume1/photo/#recycle", 1, 0},         {"/volume1/photo/#recycle/a/b", 1, 0},
      {"/volume1/photo/#snapshot", 0, 1},        {"/volume1/photo/#snapshot/x", 0, 1},
      {"/volume1/photo/#recycle-notes", 0, 0},   {"/volume1/photo/a/#recycle", 0, 0},
      {"/volume1/photo/2019/#recycle", 1, 0},    {"/elsewhere/#recycle", 0, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.full);
    EXPECT_EQ(WEZOShareIsShareRecycle(c.full), c.recycle);
    int snapshot = -1;
    EXPECT_EQ(WLIBFhsPathInSnapshot(c.full, &snapshot), 0);
    EXPECT_EQ(snapshot, c.snapshot);
  }
}

TEST_F(ShareTest, AnUnreadableOrInvalidConfigurationIsAFailure) {
  PWEZOSHARE share = nullptr;
  int flag = -1;
  EXPECT_LT(WEZOShareGet("photo", &share), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrNotFound);
  EXPECT_LT(WLIBFhsPathInSnapshot("/volume1/photo/#snapshot", &flag), 0);
  EXPECT_EQ(flag, -1);

  WriteSmbConf("[photo]\n path = /volume1/photo\n read only = maybe\n");
  EXPECT_LT(WEZOShareGet("photo", &share), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrBadConfig);
  EXPECT_STREQ(WLIBCErrorGetFile(), "smb_conf.cpp");
  EXPECT_GT(WLIBCErrorGetLine(), 0);
}

TEST_F(ShareTest, AShareOnAPlainFolderIsNotEncrypted) {
  WriteSmbConf("[data]\n path = " + At("data") + "\n[gone]\n path = " + At("gone") + "\n");
  Write("data/file", "");
  PWEZOSHARE share = nullptr;
  ASSERT_EQ(WEZOShareGet("data", &share), 0);
  int encrypted = -1;
  int encryption = -1;
  EXPECT_EQ(WLIBShareIsEncryptedGet(share, &encrypted), 0);
  EXPECT_EQ(WLIBShareIsEncryptionGet(share, &encryption), 0);
  EXPECT_EQ(encrypted, 0);
  EXPECT_EQ(encryption, 0);
  WEZOShareFree(share);

  ASSERT_EQ(WEZOShareGet("gone", &share), 0);
  encrypted = -1;
  EXPECT_LT(WLIBShareIsEncryptedGet(share, &encrypted), 0);
  EXPECT_EQ(encrypted, -1);
  WEZOShareFree(share);
}

}  // namespace
