#include <wezo/platform.h>

#include <algorithm>

#include "test_support.h"
#include "utils/eligibility_pass.h"

namespace WEZO::FILEINDEX {
namespace {

class EligibilityTest : public testsupport::LibraryTest {
 protected:
  EligibilityTest() {
    for (const char* dir : {"/photo/2019", "/photo/#recycle-notes", "/photo/#snapshot",
                            "/surveillance/cam", "/Surveillance/cam"}) {
      std::filesystem::create_directories(volume + dir);
    }
    std::filesystem::create_symlink(volume + "/photo/2019", volume + "/photo/link");
  }
};

// Sets up what `words` name: a fact of the path, a share setting, or a failing query ("?").
void Arrange(const std::string& words, fake::PathFacts& facts) {
  fake::Platform& pf = fake::Get();
  fake::Share& photo = pf.shares["photo"];
  std::istringstream in(words);
  for (std::string w; in >> w;) {
    if (w == "recycle") facts.recycle = true;
    if (w == "snapshot") facts.snapshot = true;
    if (w == "mount") facts.mountPoint = 1;
    if (w == "unknown-fs") facts.fsType = WEZO_FSTYPE_UNKNOWN;
    if (w == "remote-fs") facts.fsType = fake::kRemoteFs;
    if (w == "image-fs") facts.fsType = fake::kImageFs;
    if (w == "never-fs") facts.fsType = WEZO_FSTYPE_NEVER_INDEXED;
    if (w == "encrypted") photo.encrypted = true;
    if (w == "read-only") photo.readOnly = true;
    if (w == "encryption") photo.encryption = true;
    if (w == "snapshot?") pf.snapshot_query_fails = true;
    if (w == "share-by-path?") pf.share_name_path_get_fails = true;
    if (w == "share?") pf.share_get_fails = true;
    if (w == "encrypted?") pf.encrypted_query_fails = true;
    if (w == "read-only?") pf.read_only_query_fails = true;
    if (w == "encryption?") pf.encryption_query_fails = true;
  }
}

// Each rule of the folder check, the call that decides it (the rules' order) and its log line.
TEST_F(EligibilityTest, FolderRulesRefuseInOrder) {
  using R = IndexRule;
  const char* realpath = "check realpath failed, path=%s";
  // folder under the volume ("": /photo/2019), setup, rule, call, line after "utils:N " (%s).
  const std::tuple<const char*, const char*, IndexRule, const char*, const char*> cases[] = {
      {"", "", R::kIndexable, "WEZOFSDirIsMntPoint", ""},
      {"/photo/#recycle-notes", "recycle", R::kRecycleBin, "WEZOShareIsShareRecycle", ""},
      {"/photo/#snapshot", "snapshot", R::kSnapshot, "WLIBFhsPathInSnapshot", ""},
      {"/photo/#snapshot", "snapshot snapshot?", R::kIndexable, "WEZOFSDirIsMntPoint", ""},
      {"/photo/#snapshot", "", R::kIndexable, "WEZOFSDirIsMntPoint", ""},
      {"", "unknown-fs", R::kUnknownFileSystem, "WEZOGetFSType", ""},
      // A remote file system is refused before the share is looked at.
      {"/surveillance/cam", "remote-fs", R::kRemoteFileSystem, "WEZOFSIsRemoteFS", ""},
      {"", "image-fs", R::kImageFileSystem, "WEZOFSIsImageFS", ""},
      {"", "never-fs", R::kNeverIndexedFileSystem, "WEZOFSIsImageFS", ""},
      {"", "share-by-path?", R::kNoShare, "WEZOShareNamePathGet",
       "GetShareNamePathByFullPath failed, path=%s"},
      {"", "share?", R::kShareUnreadable, "WEZOShareGet", "WEZOShareGet failed, share=photo"},
      {"/surveillance/cam", "", R::kExcludedShare, "WEZOShareGet", ""},
      // Excluded share names are case-sensitive.
      {"/Surveillance/cam", "", R::kIndexable, "WEZOFSDirIsMntPoint", ""},
      {"", "encrypted", R::kEncryptedShare, "WLIBShareIsReadOnlyGet", ""},
      {"", "encrypted?", R::kShareStateUnknown, "WLIBShareIsEncryptedGet", ""},
      {"", "read-only", R::kReadOnlyShare, "WLIBShareIsReadOnlyGet", ""},
      {"", "encrypted read-only", R::kEncryptedShare, "WLIBShareIsReadOnlyGet", ""},
      {"", "read-only?", R::kShareStateUnknown, "WLIBShareIsReadOnlyGet", ""},
      {"", "mount", R::kMountPoint, "WLIBShareIsEncryptionGet",
       "Mount point[%s] is not allowed to be indexed"},
      {"", "mount encryption", R::kIndexable, "WLIBShareIsEncryptionGet", ""},
      {"", "mount encryption?", R::kIndexable, "WLIBShareIsEncryptionGet", ""},
      {"/photo/2019/", "", R::kResolvesElsewhere, "WEZOFSDirIsMntPoint", realpath},
      {"/photo/link", "", R::kResolvesElsewhere, "WEZOFSDirIsMntPoint", realpath},
      {"/photo/2020", "", R::kResolvesElsewhere, "WEZOFSDirIsMntPoint", realpath}};
  for (const auto& [folder, setup, rule, decidingCall, logLine] : cases) {
    SCOPED_TRACE(std::string(folder) + " " + setup);
    fake::Reset();
    for (const char* share : {"photo", "surveillance", "Surveillance"}) {
      fake::Get().AddShare(share, volume + "/" + share);
    }
    log.Clear();
    const std::string fullPath = volume + (*folder != '\0' ? folder : "/photo/2019");
    Arrange(setup, fake::Get().facts[fullPath]);
    EXPECT_EQ(FullPathIndexRule(fullPath), rule);
    EXPECT_EQ(fake::Get().calls.back().op, decidingCall);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(ErrorHandler::GetError(),
              rule == R::kNoShare ? FILEINDEX_ERR_PATH : FILEINDEX_ERR_NONE);
    std::string line = *logLine ? std::string("utils:N ") + logLine : "";
    if (line.find("%s") != std::string::npos) line.replace(line.find("%s"), 2, fullPath);
    EXPECT_EQ(log.Lines().empty() ? "" : log.Lines().back(), line);
    // A pass over the one folder answers alike.
    log.Clear();
    EXPECT_EQ(EligibilityPass().FullPathRule(fullPath), rule);
    EXPECT_EQ(log.Lines().empty() ? "" : log.Lines().back(), line);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
  }
}

// A pass asks once per share and resolves each directory once, answering as folder by folder.
TEST_F(EligibilityTest, APassAnswersEachFolderAsTheFolderByFolderCheck) {
  std::filesystem::create_directories(volume + "/photo/2019/sub/deep");
  std::filesystem::create_directories(volume + "/video/clips");
  std::filesystem::create_symlink(volume + "/photo/2019/sub", volume + "/photo/2019/lsub");
  fake::Get().facts[volume + "/video/clips"].fsType = fake::kRemoteFs;
  fake::Get().facts[volume + "/photo/2019/sub/deep"].mountPoint = 1;
  const std::vector<std::string> folders = {
      "/photo/link/sub",  "/photo/link/sub/deep",  "/photo/2019/sub",
      "/photo/2019/lsub", "/photo/2019/lsub/deep", "/photo/2019/sub/deep",
      "/photo/2019/gone", "/photo/2019/./sub",     "/photo/2019//sub",
      "/photo/2019/sub/", "/photo/2019/..",        "/video/clips",
      "/video",           "/video/gone/x"};
  std::vector<IndexRule> expected;
  for (const std::string& folder : folders) expected.push_back(FullPathIndexRule(volume + folder));
  fake::Get().calls.clear();
  {
    EligibilityPass pass;
    for (size_t i = 0; i < folders.size(); ++i) {
      EXPECT_EQ(pass.FullPathRule(volume + folders[i]), expected[i]) << folders[i];
    }
  }
  EXPECT_EQ(fake::Get().CallsTo("WEZOShareGet").size(), 2U);
  EXPECT_EQ(fake::Get().CallsTo("WLIBShareIsEncryptionGet").size(), 1U);
  // A share gone between passes is gone for the second; an unreadable share is logged per pass.
  fake::Get().shares.erase("video");
  for (int i = 0; i < 2; ++i) {
    EligibilityPass later;
    EXPECT_EQ(later.FullPathRule(volume + "/video"), IndexRule::kNoShare);
    log.Clear();
    fake::Get().share_get_fails_after = 1;  // GetFullPath's lookup, then the rules' lookup fails
    EXPECT_FALSE(later.CanPathBeIndexed("/photo/2019") || later.CanPathBeIndexed("/photo/x"));
    EXPECT_THAT(log.Lines(), ElementsAre("utils:N WEZOShareGet failed, share=photo"));
    fake::Get().share_get_fails_after = -1;
  }
}

// '+' skipped or '-' not, a name in /volume1/photo, the setup; the file-system type comes first.
TEST_F(EligibilityTest, CrawledItemsAreSkippedByNameLocationAndFileSystem) {
  for (const std::string row :
       {"+no-slash", "+.DS_Store", "-x.DS_Store", "-.ds_store", "+@eaDir", "+WEZO@file_index_queue",
        "+WEZO@.fileindexdb", "+.TemporaryItems", "+.WEZOPPSDB", "+#recycle/a recycle",
        "-#recycle-notes/a", "+#snapshot/a snapshot", "-a unknown-fs", "+a remote-fs",
        "+a image-fs", "+a never-fs"}) {
    const size_t space = std::min(row.find(' '), row.size());
    const std::string name = row.substr(1, space - 1);
    fake::Reset();
    Arrange(row.substr(space), fake::Get().defaultFacts);
    EXPECT_EQ(IsSkipIndex(name == "no-slash" ? name : "/volume1/photo/" + name), row[0] == '+')
        << row;
    EXPECT_EQ(fake::Get().calls.front().op, "WEZOGetFSType") << row;
  }
}

TEST_F(EligibilityTest, OnlyADefiniteOutOfSpaceAnswerMeansNoRoomAndAnUnknownShareNoPath) {
  const std::tuple<bool, int, bool> cases[] = {{true, 0, true},
                                               {false, WLIBC_ERR_NO_SPACE, false},
                                               {false, WLIBC_ERR_OVER_QUOTA, false},
                                               {false, WLIBC_ERR_BAD_PARAMETERS, true},
                                               {false, 0, true}};
  for (const auto& [enough, error, expected] : cases) {
    fake::Get().quotaEnough = enough;
    fake::Get().quotaError = error;
    fake::Get().calls.clear();
    EXPECT_EQ(IsShareSpaceEnough("photo"), expected) << std::hex << error;
    const auto quota = fake::Get().CallsTo("WEZOQuotaIsEnough");
    ASSERT_EQ(quota.size(), 1U);
    EXPECT_THAT(quota[0].args, ElementsAre("0", volume + "/photo", "10485760"));
    EXPECT_EQ(fake::Get().openShareRecords, 0);
  }
  EXPECT_FALSE(IsShareSpaceEnough("nosuch"));
  // A share path that cannot be resolved sets the path code.
  EXPECT_FALSE(CanPathBeIndexed("/nosuch/2019") || CanShareBeIndexed(nullptr));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N WEZOShareGet failed, share=nosuch",
                                       "utils:N GetFullPath failed, path=/nosuch/2019"));
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
}

}  // namespace
}  // namespace WEZO::FILEINDEX
