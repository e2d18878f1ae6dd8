#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>
#include <wezo/platform.h>

#include <filesystem>
#include <functional>
#include <set>

#include "fake_platform.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;

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

// Every rule of the folder check: the rule it yields, the call that decides it (which shows the
// order in which the rules are tried) and the line it logs.
TEST_F(EligibilityTest, FolderRulesRefuseInOrder) {
  struct Case {
    const char* name;
    const char* folder;  // under the volume
    std::function<void(fake::Platform&, const std::string&)> setup;
    bool accepted;
    IndexRule rule;
    const char* decidingCall;
    const char* logLine;  // after "utils:N ", with %s for the full path
  };
  const auto none = [](fake::Platform&, const std::string&) {};
  const Case cases[] = {
      {"plain folder", "/photo/2019", none, true, IndexRule::kIndexable, "WEZOFSDirIsMntPoint",
       nullptr},
      {"recycle bin", "/photo/#recycle-notes",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].recycle = true; }, false,
       IndexRule::kRecycleBin, "WEZOShareIsShareRecycle", nullptr},
      {"#recycle in the name only", "/photo/#recycle-notes", none, true, IndexRule::kIndexable,
       "WEZOFSDirIsMntPoint", nullptr},
      {"snapshot", "/photo/#snapshot",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].snapshot = true; }, false,
       IndexRule::kSnapshot, "WLIBFhsPathInSnapshot", nullptr},
      {"snapshot query fails", "/photo/#snapshot",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].snapshot = true;
         fake::Get().snapshot_query_fails = true;
       },
       true, IndexRule::kIndexable, "WEZOFSDirIsMntPoint", nullptr},
      {"unknown file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = WEZO_FSTYPE_UNKNOWN; },
       false, IndexRule::kUnknownFileSystem, "WEZOGetFSType", nullptr},
      {"remote file system before an excluded share", "/surveillance/cam",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = fake::kRemoteFs; },
       false, IndexRule::kRemoteFileSystem, "WEZOFSIsRemoteFS", nullptr},
      {"image file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].fsType = fake::kImageFs; }, false,
       IndexRule::kImageFileSystem, "WEZOFSIsImageFS", nullptr},
      {"never-indexed file system", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].fsType = WEZO_FSTYPE_NEVER_INDEXED;
       },
       false, IndexRule::kNeverIndexedFileSystem, "WEZOFSIsImageFS", nullptr},
      {"share lookup by path fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().share_name_path_get_fails = true; },
       false, IndexRule::kNoShare, "WEZOShareNamePathGet",
       "GetShareNamePathByFullPath failed, path=%s"},
      {"share record lookup fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().share_get_fails = true; }, false,
       IndexRule::kShareUnreadable, "WEZOShareGet", "WEZOShareGet failed, share=photo"},
      {"excluded share", "/surveillance/cam", none, false, IndexRule::kExcludedShare,
       "WEZOShareGet", nullptr},
      {"excluded names are case-sensitive", "/Surveillance/cam", none, true, IndexRule::kIndexable,
       "WEZOFSDirIsMntPoint", nullptr},
      {"encrypted share", "/photo/2019",
       [](fake::Platform& pf, const std::string&) { pf.shares["photo"].encrypted = true; }, false,
       IndexRule::kEncryptedShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"encryption query fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().encrypted_query_fails = true; }, false,
       IndexRule::kShareStateUnknown, "WLIBShareIsEncryptedGet", nullptr},
      {"read-only share", "/photo/2019",
       [](fake::Platform& pf, const std::string&) { pf.shares["photo"].readOnly = true; }, false,
       IndexRule::kReadOnlyShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"encrypted and read-only share", "/photo/2019",
       [](fake::Platform& pf, const std::string&) {
         pf.shares["photo"].encrypted = true;
         pf.shares["photo"].readOnly = true;
       },
       false, IndexRule::kEncryptedShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"read-only query fails", "/photo/2019",
       [](fake::Platform&, const std::string&) { fake::Get().read_only_query_fails = true; }, false,
       IndexRule::kShareStateUnknown, "WLIBShareIsReadOnlyGet", nullptr},
      {"mount point", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) { pf.facts[p].mountPoint = 1; }, false,
       IndexRule::kMountPoint, "WLIBShareIsEncryptionGet",
       "Mount point[%s] is not allowed to be indexed"},
      {"mount point of a share set up for encryption", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].mountPoint = 1;
         pf.shares["photo"].encryption = true;
       },
       true, IndexRule::kIndexable, "WLIBShareIsEncryptionGet", nullptr},
      {"mount point, encryption setting unknown", "/photo/2019",
       [](fake::Platform& pf, const std::string& p) {
         pf.facts[p].mountPoint = 1;
         fake::Get().encryption_query_fails = true;
       },
       true, IndexRule::kIndexable, "WLIBShareIsEncryptionGet", nullptr},
      {"trailing slash", "/photo/2019/", none, false, IndexRule::kResolvesElsewhere,
       "WEZOFSDirIsMntPoint", "check realpath failed, path=%s"},
      {"doubled slash", "/photo//2019", none, false, IndexRule::kResolvesElsewhere,
       "WEZOFSDirIsMntPoint", "check realpath failed, path=%s"},
      {"dot component", "/photo/./2019", none, false, IndexRule::kResolvesElsewhere,
       "WEZOFSDirIsMntPoint", "check realpath failed, path=%s"},
      {"symbolic link", "/photo/link", none, false, IndexRule::kResolvesElsewhere,
       "WEZOFSDirIsMntPoint", "check realpath failed, path=%s"},
      {"missing folder", "/photo/2020", none, false, IndexRule::kResolvesElsewhere,
       "WEZOFSDirIsMntPoint", "check realpath failed, path=%s"},
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

    // The rule that decides comes out of the very same questions and lines.
    const std::vector<std::string> asked = fake::Get().OpNames();
    const std::vector<std::string> logged = log.Lines();
    fake::Get().calls.clear();
    log.Clear();
    const IndexRule rule = FullPathIndexRule(fullPath);
    EXPECT_EQ(rule, c.rule) << IndexRuleKey(rule);
    EXPECT_EQ(fake::Get().OpNames(), asked);
    EXPECT_EQ(log.Lines(), logged);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(ErrorHandler::GetError(),
              rule == IndexRule::kNoShare ? FILEINDEX_ERR_PATH : FILEINDEX_ERR_NONE);
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
  }
}

TEST_F(EligibilityTest, EveryRuleHasItsOwnKeyAndDescription) {
  std::set<std::string> keys;
  std::set<std::string> descriptions;
  constexpr int kRules = static_cast<int>(IndexRule::kResolvesElsewhere) + 1;
  for (int value = 0; value < kRules; ++value) {
    const auto rule = static_cast<IndexRule>(value);
    const std::string key = IndexRuleKey(rule);
    EXPECT_THAT(key, MatchesRegex("[a-z_]+")) << value;
    EXPECT_NE(key, "unknown") << value;
    keys.insert(key);
    descriptions.insert(DescribeIndexRule(rule));
  }
  EXPECT_EQ(keys.size(), static_cast<size_t>(kRules));
  EXPECT_EQ(descriptions.size(), static_cast<size_t>(kRules));
  EXPECT_EQ(descriptions.count(""), 0U);
  for (const int outside : {-1, kRules}) {
    EXPECT_STREQ(IndexRuleKey(static_cast<IndexRule>(outside)), "unknown");
    ASSERT_NE(DescribeIndexRule(static_cast<IndexRule>(outside)), nullptr);
    EXPECT_STRNE(DescribeIndexRule(static_cast<IndexRule>(outside)), "");
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
