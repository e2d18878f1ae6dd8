#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <filesystem>
#include <functional>

#include "fake_platform.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class EligibilityTest : public testsupport::LibraryTest {
 protected:
  EligibilityTest() {
    std::filesystem::create_directories(volume + "/photo/2019");
    std::filesystem::create_directories(volume + "/photo/#recycle-notes");
    std::filesystem::create_directories(volume + "/photo/#snapshot");
    std::filesystem::create_directories(volume + "/surveillance/cam");
    std::filesystem::create_directories(volume + "/Surveillance/cam");
    std::filesystem::create_symlink(volume + "/photo/2019", volume + "/photo/link");
    fake::Get().AddShare("surveillance", volume + "/surveillance");
    fake::Get().AddShare("Surveillance", volume + "/Surveillance");
  }
};

// Every rule of the folder check, the call that decides it (which shows the order in which the
// rules are tried) and the line it logs.
TEST_F(EligibilityTest, FolderRulesRefuseInOrder) {
  struct Case {
    const char* name;
    const char* folder;  // under the volume
    std::function<void(fake::Platform&, const std::string&)> setup;
    bool accepted;
    const char* decidingCall;
    const char* logLine;  // after "utils:N ", with %s for the full path
  };
  const auto none = [](fake::Platform&, const std::string&) {};
  const Case cases[] = {
      {"plain folder", "/photo/2019", none, true, "WEZOFSDirIsMntPoint", nullptr},
      {"recycle bin", "/photo/#recycle-notes",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].recycle = true; }, false,
       "WEZOShareIsShareRecycle", nullptr},
      {"#recycle in the name only", "/photo/#recycle-notes", none, true, "WEZOFSDirIsMntPoint",
       nullptr},
      {"snapshot", "/photo/#snapshot",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].snapshot = true; }, false,
       "WLIBFhsPathInSnapshot", nullptr},
      {"snapshot query fails", "/photo/#snapshot",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].snapshot = true;
         fake::Get().snapshot_query_fails = true;
       },
       true, "WEZOFSDirIsMntPoint", nullptr},
      {"unknown file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = WEZO_FSTYPE_UNKNOWN; },
       false, "WEZOGetFSType", nullptr},
      {"remote file system before an excluded share", "/surveillance/cam",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = fake::kRemoteFs; },
       false, "WEZOFSIsRemoteFS", nullptr},
      {"image file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = fake::kImageFs; }, false,
       "WEZOFSIsImageFS", nullptr},
      {"never-indexed file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].fsType = WEZO_FSTYPE_NEVER_INDEXED;
       },
       false, "WEZOFSIsImageFS", nullptr},
      {"share lookup by path fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().share_name_path_get_fails = true; },
       false, "WEZOShareNamePathGet", "GetShareNamePathByFullPath failed, path=%s"},
      {"share record lookup fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().share_get_fails = true; }, false,
       "WEZOShareGet", "WEZOShareGet failed, share=photo"},
      {"excluded share", "/surveillance/cam", none, false, "WEZOShareGet", nullptr},
      {"excluded names are case-sensitive", "/Surveillance/cam", none, true, "WEZOFSDirIsMntPoint",
       nullptr},
      {"encrypted share", "/photo/2019",
       [](fake::Platform& pf, const std::string&) { pf.shares["photo"].encrypted = true; }, false,
       "WLIBShareIsReadOnlyGet", nullptr},
      {"encryption query fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().encrypted_query_fails = true; }, false,
       "WLIBShareIsEncryptedGet", nullptr},
      {"read-only share", "/photo/2019",
       [](fake::Platform& pf, const std::string&) { pf.shares["photo"].readOnly = true; }, false,
       "WLIBShareIsReadOnlyGet", nullptr},
      {"read-only query fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().read_only_query_fails = true; }, false,
       "WLIBShareIsReadOnlyGet", nullptr},
      {"mount point", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].mountPoint = 1; }, false,
       "WLIBShareIsEncryptionGet", "Mount point[%s] is not allowed to be indexed"},
      {"mount point of a share set up for encryption", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].mountPoint = 1;
         pf.shares["photo"].encryption = true;
       },
       true, "WLIBShareIsEncryptionGet", nullptr},
      {"mount point, encryption setting unknown", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].mountPoint = 1;
         fake::Get().encryption_query_fails = true;
       },
       true, "WLIBShareIsEncryptionGet", nullptr},
      {"trailing slash", "/photo/2019/", none, false, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"doubled slash", "/photo//2019", none, false, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"dot component", "/photo/./2019", none, false, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"symbolic link", "/photo/link", none, false, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"missing folder", "/photo/2020", none, false, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    fake::Reset();
    fake::Get().AddShare("photo", volume + "/photo");
    fake::Get().AddShare("surveillance", volume + "/surveillance");
    fake::Get().AddShare("Surveillance", volume + "/Surveillance");
    log.Clear();
    const std::string fullPath = volume + c.folder;
    c.setup(fake::Get(), fullPath);

    EXPECT_EQ(CanFullPathBeIndexed(fullPath), c.accepted);
    ASSERT_FALSE(fake::Get().calls.empty());
    // Calls after the deciding one are bookkeeping (releasing the share record).
    std::vector<std::string> ops = fake::Get().OpNames();
    while (!ops.empty() && ops.back() == "WLIBCErrGet") {
      ops.pop_back();
    }
    EXPECT_EQ(ops.back(), c.decidingCall);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(ErrorHandler::GetError(),
              c.logLine != nullptr && std::string(c.logLine).rfind("GetShare", 0) == 0
                  ? FILEINDEX_ERR_PATH
                  : FILEINDEX_ERR_NONE);
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    if (c.logLine == nullptr) {
      EXPECT_THAT(log.Lines(), IsEmpty());
    } else {
      char expected[512];
      (void)snprintf(expected, sizeof expected, c.logLine, fullPath.c_str());
      EXPECT_EQ(log.Lines().back(), std::string("utils:N ") + expected);
    }
  }
}

TEST_F(EligibilityTest, SharePathThatCannotBeResolvedSetsThePathCode) {
  EXPECT_FALSE(CanPathBeIndexed("/nosuch/2019"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N GetFullPath failed, path=/nosuch/2019"));
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
  EXPECT_FALSE(CanShareBeIndexed(nullptr));
}

TEST_F(EligibilityTest, CrawledItemsAreSkippedByNameLocationAndFileSystem) {
  struct Case {
    const char* path;
    fake::PathFacts facts;
    bool skipped;
  };
  const fake::PathFacts local{};
  const Case cases[] = {
      {"no-slash", local, true},
      {"/volume1/photo/.DS_Store", local, true},
      {"/volume1/photo/x.DS_Store", local, false},
      {"/volume1/photo/.ds_store", local, false},
      {"/volume1/photo/@eaDir", local, true},
      {"/volume1/photo/WEZO@file_index_queue", local, true},
      {"/volume1/photo/WEZO@.fileindexdb", local, true},
      {"/volume1/photo/.TemporaryItems", local, true},
      {"/volume1/photo/.WEZOPPSDB", local, true},
      {"/volume1/photo/#recycle/a", {fake::kLocalFs, 0, true, false}, true},
      {"/volume1/photo/#recycle-notes/a", local, false},
      {"/volume1/photo/#snapshot/a", {fake::kLocalFs, 0, false, true}, true},
      {"/volume1/photo/a", {WEZO_FSTYPE_UNKNOWN, 0, false, false}, false},
      {"/volume1/photo/a", {fake::kRemoteFs, 0, false, false}, true},
      {"/volume1/photo/a", {fake::kImageFs, 0, false, false}, true},
      {"/volume1/photo/a", {WEZO_FSTYPE_NEVER_INDEXED, 0, false, false}, true},
  };
  for (const Case& c : cases) {
    fake::Reset();
    fake::Get().defaultFacts = c.facts;
    EXPECT_EQ(IsSkipIndex(c.path), c.skipped) << c.path << " type " << c.facts.fsType;
    // The file-system type is asked before anything else, whatever decides.
    EXPECT_EQ(fake::Get().OpNames().front(), "WEZOGetFSType") << c.path;
  }
}

TEST_F(EligibilityTest, OnlyADefiniteOutOfSpaceAnswerMeansNoRoom) {
  struct Case {
    bool enough;
    int error;
    bool expected;
  };
  const Case cases[] = {{true, 0, true},
                        {false, WLIBC_ERR_NO_SPACE, false},
                        {false, WLIBC_ERR_OVER_QUOTA, false},
                        {false, WLIBC_ERR_BAD_PARAMETERS, true},
                        {false, 0, true}};
  for (const Case& c : cases) {
    fake::Get().quotaEnough = c.enough;
    fake::Get().quotaError = c.error;
    fake::Get().calls.clear();
    EXPECT_EQ(IsShareSpaceEnough("photo"), c.expected) << std::hex << c.error;
    const auto quota = fake::Get().CallsTo("WEZOQuotaIsEnough");
    ASSERT_EQ(quota.size(), 1U);
    EXPECT_THAT(quota[0].args, ElementsAre("0", volume + "/photo", "10485760"));
    EXPECT_EQ(fake::Get().openShareRecords, 0);
  }
  EXPECT_FALSE(IsShareSpaceEnough("nosuch"));
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N WEZOShareGet failed, share=nosuch"));
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
