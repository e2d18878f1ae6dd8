#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "utils/log.h"
#include "test_support.h"

#define FILEINDEX_LOG_UNIT "utils"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class UtilsTest : public testsupport::LibraryTest {};

TEST_F(UtilsTest, ErrorCodeSurvivesLaterSuccesses) {
  std::string full;
  ASSERT_FALSE(GetFullPath(full, "/nosuchshare/x"));
  ASSERT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  ASSERT_TRUE(GetFullPath(full, "/photo/x"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_STREQ(ErrorHandler::Describe(ErrorHandler::GetError()),
               "path or share could not be resolved");
  EXPECT_STREQ(ErrorHandler::Describe(10), "unknown error");
}

TEST_F(UtilsTest, ErrorLinesAppearAtEveryLevelAndDebugLinesOnlyAtSeven) {
  for (int level : {3, 0, 7}) {
    LOG_LEVEL = level;
    FILEINDEX_LOG("error line %d", level);
    FILEINDEX_LOG_DEBUG("debug line %d", level);
  }
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N error line 3", "utils:N error line 0",
                                       "utils:N error line 7", "utils:N debug line 7"));
}

TEST_F(UtilsTest, LogLineCarriesTheLineNumberAndReasonAndKeepsErrno) {
  const int line = __LINE__ + 2;
  errno = ENOENT;
  FILEINDEX_LOG("open failed, reason=%s", detail::ErrnoText().c_str());
  EXPECT_EQ(errno, ENOENT);
  EXPECT_THAT(log.RawLines(), ElementsAre("utils:" + std::to_string(line) +
                                          " open failed, reason=No such file or directory"));
}

TEST_F(UtilsTest, LongLogLinesAreWrittenWhole) {
  const std::string big(10000, 'x');
  FILEINDEX_LOG("Bad param: %s", big.c_str());
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N Bad param: " + big));
}

TEST_F(UtilsTest, FileTestsDoNotFollowSymbolicLinks) {
  const std::string dir = sandbox.Path("/d");
  const std::string file = sandbox.Path("/f");
  ASSERT_EQ(mkdir(dir.c_str(), 0755), 0);
  testsupport::WriteFile(file, "x");
  ASSERT_EQ(symlink(dir.c_str(), sandbox.Path("/link-d").c_str()), 0);
  ASSERT_EQ(symlink(file.c_str(), sandbox.Path("/link-f").c_str()), 0);
  ASSERT_EQ(symlink("/nonexistent", sandbox.Path("/dangling").c_str()), 0);
  ASSERT_EQ(mkfifo(sandbox.Path("/fifo").c_str(), 0644), 0);

  struct Case {
    const char* path;
    bool isDir;
    bool isFile;
  } cases[] = {
      {"/d", true, false},       {"/f", false, true},         {"/link-d", false, false},
      {"/link-f", false, false}, {"/dangling", false, false}, {"/missing", false, false},
      {"/fifo", false, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(IsDirExist(sandbox.Path(c.path)), c.isDir) << c.path;
    EXPECT_EQ(IsFileExist(sandbox.Path(c.path)), c.isFile) << c.path;
  }
  EXPECT_FALSE(IsDirExist(""));
  EXPECT_FALSE(IsFileExist(""));
}

TEST_F(UtilsTest, JsonReadersTakeOnlyMembersOfTheirOwnType) {
  Json::Value obj;
  ASSERT_TRUE(
      JsonFromString(obj, R"({"s":"text","b":true,"n":5,"z":null,"sb":"true","one":1,"e":""})"));
  Json::Value array(Json::arrayValue);
  array.append("text");

  struct Case {
    const char* key;
    const Json::Value* from;
    bool isString;
    bool isBool;
  } cases[] = {
      {"s", &obj, true, false},    {"e", &obj, true, false},       {"b", &obj, false, true},
      {"n", &obj, false, false},   {"z", &obj, false, false},      {"sb", &obj, true, false},
      {"one", &obj, false, false}, {"absent", &obj, false, false}, {"0", &array, false, false},
  };
  for (const Case& c : cases) {
    std::string s = "untouched";
    bool b = false;
    EXPECT_EQ(RetrieveStringFromJsonObj(s, c.key, *c.from), c.isString) << c.key;
    EXPECT_EQ(RetrieveBoolFromJsonObj(b, c.key, *c.from), c.isBool) << c.key;
    if (!c.isString) {
      EXPECT_EQ(s, "untouched") << c.key;
    }
  }
  std::string s;
  bool b = false;
  ASSERT_TRUE(RetrieveStringFromJsonObj(s, "s", obj));
  ASSERT_TRUE(RetrieveBoolFromJsonObj(b, "b", obj));
  EXPECT_EQ(s, "text");
  EXPECT_TRUE(b);
  EXPECT_FALSE(RetrieveStringFromJsonObj(s, "s", Json::Value("text")));
}

TEST_F(UtilsTest, StringStartWithComparesAsCStrings) {
  struct Case {
    std::string str;
    std::string prefix;
    bool expected;
  } cases[] = {
      {"/volume1", "", true},
      {"/vol", "/volume1", false},
      {"/volume1/x", "/volume1", true},
      {"/volume1", "/volume1", true},
      {"/Volume1", "/volume1", false},
      {"", "", true},
      {"", "/", false},
      // Bytes after an embedded NUL are not compared.
      {std::string("/a\0x", 4), std::string("/a\0y", 4), true},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(StringStartWith(c.str, c.prefix), c.expected) << c.str << " / " << c.prefix;
  }
}

TEST_F(UtilsTest, ShareNameIsTheFirstComponentOfASharePath) {
  struct Case {
    const char* path;
    const char* name;
  } cases[] = {
      {"/photo/2019", "photo"},
      {"/photo", "photo"},
      {"/photo/", "photo"},
      {"/", ""},
      {"/a", "a"},
      {"/a/b/c", "a"},
      {"photo/2019", "hoto"},
      {"//x", ""},
  };
  for (const Case& c : cases) {
    std::string name = "old";
    EXPECT_TRUE(GetShareNameByPath(name, c.path)) << c.path;
    EXPECT_EQ(name, c.name) << c.path;
  }
  std::string name = "old";
  EXPECT_FALSE(GetShareNameByPath(name, ""));
  EXPECT_EQ(name, "old");
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(UtilsTest, FullPathTakesTheVolumeFromWhereTheShareLies) {
  fake::Get().AddShare("flat", "flatshare");
  struct Case {
    const char* path;
    std::string full;
  } cases[] = {
      {"/photo/2019", volume + "/photo/2019"}, {"/photo", volume + "/photo"},
      {"/photo/", volume + "/photo/"},         {"/photo/a//b/../c", volume + "/photo/a//b/../c"},
      {"/flat/x", "flatshare/flat/x"},
  };
  for (const Case& c : cases) {
    std::string full = "old";
    EXPECT_TRUE(GetFullPath(full, c.path)) << c.path;
    EXPECT_EQ(full, c.full) << c.path;
  }
  EXPECT_EQ(fake::Get().openShareRecords, 0);
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE);
}

TEST_F(UtilsTest, FullPathOfAnUnknownShareFailsWithCodeTwoAndNoLogLine) {
  std::string full = "old";
  EXPECT_FALSE(GetFullPath(full, "/music/a"));
  EXPECT_EQ(full, "old");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(), IsEmpty());

  fake::Get().share_get_fails = true;
  EXPECT_FALSE(GetFullPath(full, "/photo/a"));
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(fake::Get().openShareRecords, 0);
}

TEST_F(UtilsTest, FullPathOfAnEmptyPathIsLoggedWithoutCode) {
  std::string full = "old";
  EXPECT_FALSE(GetFullPath(full, ""));
  EXPECT_EQ(full, "old");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE);
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N GetShareNameByPath failed, path="));
  EXPECT_TRUE(fake::Get().CallsTo("WEZOShareGet").empty());
}

TEST_F(UtilsTest, ShareOfAFullPathComesFromTheShareDatabase) {
  std::string name = "n";
  std::string path = "p";
  ASSERT_TRUE(GetShareNamePathByFullPath(name, path, volume + "/video/clips/a.mp4"));
  EXPECT_EQ(name, "video");
  EXPECT_EQ(path, volume + "/video");

  name = "n";
  path = "p";
  EXPECT_FALSE(GetShareNamePathByFullPath(name, path, volume + "/videos/a.mp4"));
  EXPECT_EQ(name, "n");
  EXPECT_EQ(path, "p");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(),
              ElementsAre("utils:N WEZOShareNamePathGet failed, path=" + volume + "/videos/a.mp4"));
}

TEST_F(UtilsTest, ReplaceShareNameSwapsOnlyTheFirstComponent) {
  struct Case {
    const char* path;
    const char* replaced;
  } cases[] = {
      {"", ""},       {"/a", "/b"},
      {"/a/", "/b/"}, {"/a/c/d", "/b/c/d"},
      {"/", "/b"},    {"/photo/2019", "/b/2019"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(ReplaceShareName(c.path, "b"), c.replaced) << c.path;
  }
  EXPECT_EQ(ReplaceShareName("/photo/2019", "pictures"), "/pictures/2019");
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
