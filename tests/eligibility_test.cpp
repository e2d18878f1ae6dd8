#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <wezo/platform.h>

#include <filesystem>
#include <functional>
#include <set>

#include "fake_platform.h"
#include "fileindex/eligibility.h"
#include "fileindex/error.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

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

// Every rule of the folder check: the rule it yields, the call that decides it (which shows the
// order in which the rules are tried) and the line it logs.
TEST_F(EligibilityTest, FolderRulesRefuseInOrder) {
  using P = fake::Platform;
  const auto none = [](P&, const std::string&) {};
  const struct {
    const char* name;
    const char* folder;  // under the volume
    std::function<void(P&, const std::string&)> setup;
    IndexRule rule;
    const char* decidingCall;
    const char* logLine;  // after "utils:N ", with %s for the full path
  } cases[] = {
      {"plain folder", "/photo/2019", none, IndexRule::kIndexable, "WEZOFSDirIsMntPoint", nullptr},
      {"recycle bin", "/photo/#recycle-notes", [](P& pf, auto& p) { pf.facts[p].recycle = true; },
       IndexRule::kRecycleBin, "WEZOShareIsShareRecycle", nullptr},
      {"#recycle in the name only", "/photo/#recycle-notes", none, IndexRule::kIndexable,
       "WEZOFSDirIsMntPoint", nullptr},
      {"snapshot", "/photo/#snapshot", [](P& pf, auto& p) { pf.facts[p].snapshot = true; },
       IndexRule::kSnapshot, "WLIBFhsPathInSnapshot", nullptr},
      {"snapshot query fails", "/photo/#snapshot",
       [](P& pf, auto& p) { pf.facts[p].snapshot = pf.snapshot_query_fails = true; },
       IndexRule::kIndexable, "WEZOFSDirIsMntPoint", nullptr},
      {"unknown file system", "/photo/2019",
       [](P& pf, auto& p) { pf.facts[p].fsType = WEZO_FSTYPE_UNKNOWN; },
       IndexRule::kUnknownFileSystem, "WEZOGetFSType", nullptr},
      {"remote file system before an excluded share", "/surveillance/cam",
       [](P& pf, auto& p) { pf.facts[p].fsType = fake::kRemoteFs; }, IndexRule::kRemoteFileSystem,
       "WEZOFSIsRemoteFS", nullptr},
      {"image file system", "/photo/2019",
       [](P& pf, auto& p) { pf.facts[p].fsType = fake::kImageFs; }, IndexRule::kImageFileSystem,
       "WEZOFSIsImageFS", nullptr},
      {"never-indexed file system", "/photo/2019",
       [](P& pf, auto& p) { pf.facts[p].fsType = WEZO_FSTYPE_NEVER_INDEXED; },
       IndexRule::kNeverIndexedFileSystem, "WEZOFSIsImageFS", nullptr},
      {"share lookup by path fails", "/photo/2019",
       [](P& pf, auto&) { pf.share_name_path_get_fails = true; }, IndexRule::kNoShare,
       "WEZOShareNamePathGet", "GetShareNamePathByFullPath failed, path=%s"},
      {"share record lookup fails", "/photo/2019", [](P& pf, auto&) { pf.share_get_fails = true; },
       IndexRule::kShareUnreadable, "WEZOShareGet", "WEZOShareGet failed, share=photo"},
      {"excluded share", "/surveillance/cam", none, IndexRule::kExcludedShare, "WEZOShareGet",
       nullptr},
      {"excluded names are case-sensitive", "/Surveillance/cam", none, IndexRule::kIndexable,
       "WEZOFSDirIsMntPoint", nullptr},
      {"encrypted share", "/photo/2019", [](P& pf, auto&) { pf.shares["photo"].encrypted = true; },
       IndexRule::kEncryptedShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"encryption query fails", "/photo/2019",
       [](P& pf, auto&) { pf.encrypted_query_fails = true; }, IndexRule::kShareStateUnknown,
       "WLIBShareIsEncryptedGet", nullptr},
      {"read-only share", "/photo/2019", [](P& pf, auto&) { pf.shares["photo"].readOnly = true; },
       IndexRule::kReadOnlyShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"encrypted and read-only share", "/photo/2019",
       [](P& pf, auto&) { pf.shares["photo"].encrypted = pf.shares["photo"].readOnly = true; },
       IndexRule::kEncryptedShare, "WLIBShareIsReadOnlyGet", nullptr},
      {"read-only query fails", "/photo/2019",
       [](P& pf, auto&) { pf.read_only_query_fails = true; }, IndexRule::kShareStateUnknown,
       "WLIBShareIsReadOnlyGet", nullptr},
      {"mount point", "/photo/2019", [](P& pf, auto& p) { pf.facts[p].mountPoint = 1; },
       IndexRule::kMountPoint, "WLIBShareIsEncryptionGet",
       "Mount point[%s] is not allowed to be indexed"},
      {"mount point of a share set up for encryption", "/photo/2019",
       [](P& pf, auto& p) { pf.facts[p].mountPoint = pf.shares["photo"].encryption = 1; },
       IndexRule::kIndexable, "WLIBShareIsEncryptionGet", nullptr},
      {"mount point, encryption setting unknown", "/photo/2019",
       [](P& pf, auto& p) { pf.facts[p].mountPoint = pf.encryption_query_fails = 1; },
       IndexRule::kIndexable, "WLIBShareIsEncryptionGet", nullptr},
      {"trailing slash", "/photo/2019/", none, IndexRule::kResolvesElsewhere, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"dot component", "/photo/./2019", none, IndexRule::kResolvesElsewhere, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"symbolic link", "/photo/link", none, IndexRule::kResolvesElsewhere, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
      {"missing folder", "/photo/2020", none, IndexRule::kResolvesElsewhere, "WEZOFSDirIsMntPoint",
       "check realpath failed, path=%s"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    fake::Reset();
    for (const char* share : {"photo", "surveillance", "Surveillance"}) {
      fake::Get().AddShare(share, volume + "/" + share);
    }
    log.Clear();
    const std::string fullPath = volume + c.folder;
    c.setup(fake::Get(), fullPath);

    EXPECT_EQ(CanFullPathBeIndexed(fullPath), c.rule == IndexRule::kIndexable);
    // Calls after the deciding one are bookkeeping (releasing the share record).
    std::vector<std::string> ops = fake::Get().OpNames();
    while (!ops.empty() && ops.back() == "WLIBCErrGet") ops.pop_back();
    ASSERT_FALSE(ops.empty());
    EXPECT_EQ(ops.back(), c.decidingCall);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(ErrorHandler::GetError(),
              c.rule == IndexRule::kNoShare ? FILEINDEX_ERR_PATH : FILEINDEX_ERR_NONE);
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
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
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
  for (int value = -1; value <= kRules; ++value) {
    const auto rule = static_cast<IndexRule>(value);
    const bool inside = value >= 0 && value < kRules;
    EXPECT_THAT(IndexRuleKey(rule), ::testing::MatchesRegex(inside ? "[a-z_]+" : "unknown"))
        << value;
    ASSERT_NE(DescribeIndexRule(rule), nullptr);
    EXPECT_STRNE(DescribeIndexRule(rule), "");
    if (inside) {
      keys.insert(IndexRuleKey(rule));
      descriptions.insert(DescribeIndexRule(rule));
    }
  }
  EXPECT_EQ(keys.size(), static_cast<size_t>(kRules));
  EXPECT_EQ(keys.count("unknown"), 0U);
  EXPECT_EQ(descriptions.size(), static_cast<size_t>(kRules));
}

TEST_F(EligibilityTest, SharePathThatCannotBeResolvedSetsThePathCode) {
  EXPECT_FALSE(CanPathBeIndexed("/nosuch/2019"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N GetFullPath failed, path=/nosuch/2019"));
  EXPECT_TRUE(CanPathBeIndexed("/photo/2019"));
  EXPECT_FALSE(CanShareBeIndexed(nullptr));
}

TEST_F(EligibilityTest, CrawledItemsAreSkippedByNameLocationAndFileSystem) {
  const fake::PathFacts local{};
  const struct {
    const char* path;
    fake::PathFacts facts;
    bool skipped;
  } cases[] = {
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
  for (const auto& c : cases) {
    fake::Reset();
    fake::Get().defaultFacts = c.facts;
    EXPECT_EQ(IsSkipIndex(c.path), c.skipped) << c.path << " type " << c.facts.fsType;
    // The file-system type is asked before anything else, whatever decides.
    EXPECT_EQ(fake::Get().OpNames().front(), "WEZOGetFSType") << c.path;
  }
}

TEST_F(EligibilityTest, OnlyADefiniteOutOfSpaceAnswerMeansNoRoom) {
  const struct {
    bool enough;
    int error;
    bool expected;
  } cases[] = {{true, 0, true},
               {false, WLIBC_ERR_NO_SPACE, false},
               {false, WLIBC_ERR_OVER_QUOTA, false},
               {false, WLIBC_ERR_BAD_PARAMETERS, true},
               {false, 0, true}};
  for (const auto& c : cases) {
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
}  // namespace WEZO::FILEINDEX
