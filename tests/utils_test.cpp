#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/utils.h"
#include "json_io.h"
#include "test_support.h"
#include "utils/log.h"

#define FILEINDEX_LOG_UNIT "utils"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class UtilsTest : public testsupport::LibraryTest {};

TEST_F(UtilsTest, ErrorCodeSurvivesLaterSuccesses) {
  std::string full;
  ASSERT_FALSE(GetFullPath(full, "/nosuchshare/x"));
  ASSERT_TRUE(GetFullPath(full, "/photo/x"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_STREQ(ErrorHandler::Describe(ErrorHandler::GetError()),
               "path or share could not be resolved");
  EXPECT_STREQ(ErrorHandler::Describe(10), "unknown error");
}

TEST_F(UtilsTest, LogLinesCarryUnitLineAndLevelAndKeepErrno) {
  for (int level : {3, 0, 7}) {
    LOG_LEVEL = level;
    FILEINDEX_LOG("error line %d", level);
    FILEINDEX_LOG_DEBUG("debug line %d", level);
  }
  const std::string big(10000, 'x');
  FILEINDEX_LOG("Bad param: %s", big.c_str());
  EXPECT_THAT(log.Lines(),
              ElementsAre("utils:N error line 3", "utils:N error line 0", "utils:N error line 7",
                          "utils:N debug line 7", "utils:N Bad param: " + big));
  log.Clear();
  const int line = __LINE__ + 2;
  errno = ENOENT;
  FILEINDEX_LOG("open failed, reason=%s", detail::ErrnoText().c_str());
  EXPECT_EQ(errno, ENOENT);
  EXPECT_THAT(log.RawLines(), ElementsAre("utils:" + std::to_string(line) +
                                          " open failed, reason=No such file or directory"));
}

TEST_F(UtilsTest, FileTestsDoNotFollowSymbolicLinks) {
  ASSERT_EQ(mkdir(sandbox.Path("/d").c_str(), 0755), 0);
  testsupport::WriteFile(sandbox.Path("/f"), "x");
  ASSERT_EQ(symlink(sandbox.Path("/d").c_str(), sandbox.Path("/link-d").c_str()), 0);
  ASSERT_EQ(symlink(sandbox.Path("/f").c_str(), sandbox.Path("/link-f").c_str()), 0);
  ASSERT_EQ(mkfifo(sandbox.Path("/fifo").c_str(), 0644), 0);
  const struct {
    const char* path;  // in the sandbox; "": the empty path
    bool isDir, isFile;
  } cases[] = {{"/d", true, false},       {"/f", false, true},        {"/link-d", false, false},
               {"/link-f", false, false}, {"/missing", false, false}, {"/fifo", false, false},
               {"", false, false}};
  for (const auto& c : cases) {
    const std::string path = *c.path != '\0' ? sandbox.Path(c.path) : "";
    EXPECT_EQ(IsDirExist(path), c.isDir) << path;
    EXPECT_EQ(IsFileExist(path), c.isFile) << path;
  }
}

TEST_F(UtilsTest, JsonReadersTakeOnlyMembersOfTheirOwnType) {
  Json::Value obj;
  ASSERT_TRUE(
      JsonFromString(obj, R"({"s":"text","b":true,"n":5,"z":null,"sb":"true","one":1,"e":""})"));
  Json::Value array(Json::arrayValue);
  array.append("text");
  const Json::Value text("text");
  const struct {
    const char* key;
    const Json::Value* from;
    const char* string;  // what the string reader gives, or nullptr
    int boolean;         // what the bool reader gives, or -1
  } cases[] = {{"s", &obj, "text", -1},    {"e", &obj, "", -1},
               {"b", &obj, nullptr, 1},    {"n", &obj, nullptr, -1},
               {"z", &obj, nullptr, -1},   {"sb", &obj, "true", -1},
               {"one", &obj, nullptr, -1}, {"absent", &obj, nullptr, -1},
               {"0", &array, nullptr, -1}, {"s", &text, nullptr, -1}};
  for (const auto& c : cases) {
    std::string s = "untouched";
    bool b = false;
    EXPECT_EQ(RetrieveStringFromJsonObj(s, c.key, *c.from), c.string != nullptr) << c.key;
    EXPECT_EQ(s, c.string != nullptr ? c.string : "untouched") << c.key;
    EXPECT_EQ(RetrieveBoolFromJsonObj(b, c.key, *c.from), c.boolean >= 0) << c.key;
    EXPECT_EQ(b, c.boolean == 1) << c.key;
  }
}

TEST_F(UtilsTest, StringStartWithComparesAsCStrings) {
  const struct {
    std::string str, prefix;
    bool expected;
  } cases[] = {{"/volume1", "", true},
               {"/vol", "/volume1", false},
               {"/volume1/x", "/volume1", true},
               {"/volume1", "/volume1", true},
               {"/Volume1", "/volume1", false},
               {"", "/", false},
               // Bytes after an embedded NUL are not compared.
               {std::string("/a\0x", 4), std::string("/a\0y", 4), true}};
  for (const auto& c : cases) {
    EXPECT_EQ(StringStartWith(c.str, c.prefix), c.expected) << c.str << " / " << c.prefix;
  }
}

TEST_F(UtilsTest, SharePathsSplitAtTheFirstComponent) {
  const struct {
    const char* path;
    const char* name;      // nullptr: refused
    const char* replaced;  // ReplaceShareName(path, "b")
  } cases[] = {{"/photo/2019", "photo", "/b/2019"},
               {"/photo", "photo", "/b"},
               {"/photo/", "photo", "/b/"},
               {"/", "", "/b"},
               {"/a/b/c", "a", "/b/b/c"},
               {"photo/2019", "hoto", nullptr},
               {"//x", "", nullptr},
               {"", nullptr, ""}};
  for (const auto& c : cases) {
    std::string name = "old";
    EXPECT_EQ(GetShareNameByPath(name, c.path), c.name != nullptr) << c.path;
    EXPECT_EQ(name, c.name != nullptr ? c.name : "old") << c.path;
    if (c.replaced != nullptr) {
      EXPECT_EQ(ReplaceShareName(c.path, "b"), c.replaced) << c.path;
    }
  }
  EXPECT_EQ(ReplaceShareName("/photo/2019", "pictures"), "/pictures/2019");
  EXPECT_THAT(log.Lines(), IsEmpty());
}

TEST_F(UtilsTest, FullPathTakesTheVolumeFromWhereTheShareLies) {
  fake::Get().AddShare("flat", "flatshare");
  const struct {
    const char* path;
    std::string full;  // empty: refused
    bool shareGetFails;
    _tag_fileindex_err_ code;
    std::vector<std::string> lines;
  } cases[] = {{"/photo/2019", volume + "/photo/2019", false, FILEINDEX_ERR_NONE, {}},
               {"/photo/", volume + "/photo/", false, FILEINDEX_ERR_NONE, {}},
               {"/photo/a//b/../c", volume + "/photo/a//b/../c", false, FILEINDEX_ERR_NONE, {}},
               {"/flat/x", "flatshare/flat/x", false, FILEINDEX_ERR_NONE, {}},
               {"/music/a", "", false, FILEINDEX_ERR_PATH, {}},
               {"/photo/a", "", true, FILEINDEX_ERR_PATH, {}},
               {"", "", false, FILEINDEX_ERR_NONE, {"utils:N GetShareNameByPath failed, path="}}};
  for (const auto& c : cases) {
    fake::Get().share_get_fails = c.shareGetFails;
    fake::Get().calls.clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    std::string full = "old";
    EXPECT_EQ(GetFullPath(full, c.path), !c.full.empty()) << c.path;
    EXPECT_EQ(full, c.full.empty() ? "old" : c.full) << c.path;
    EXPECT_EQ(ErrorHandler::GetError(), c.code) << c.path;
    EXPECT_EQ(log.Lines(), c.lines) << c.path;
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(fake::Get().CallsTo("WEZOShareGet").empty(), *c.path == '\0');
  }
}

TEST_F(UtilsTest, ShareOfAFullPathComesFromTheShareDatabase) {
  std::string name = "n";
  std::string path = "p";
  EXPECT_FALSE(GetShareNamePathByFullPath(name, path, volume + "/videos/a.mp4"));
  EXPECT_EQ(name + path, "np");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);
  EXPECT_THAT(log.Lines(),
              ElementsAre("utils:N WEZOShareNamePathGet failed, path=" + volume + "/videos/a.mp4"));
  ASSERT_TRUE(GetShareNamePathByFullPath(name, path, volume + "/video/clips/a.mp4"));
  EXPECT_EQ(name, "video");
  EXPECT_EQ(path, volume + "/video");
}

}  // namespace
}  // namespace WEZO::FILEINDEX
