#include <cerrno>

#include "test_support.h"
#include "utils/log.h"

#define FILEINDEX_LOG_UNIT "utils"

namespace WEZO::FILEINDEX {
namespace {

class UtilsTest : public testsupport::LibraryTest {};

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
  EXPECT_STREQ(ErrorHandler::Describe(10), "unknown error");
}

TEST_F(UtilsTest, SmallHelpersAnswerOnTheirBoundaries) {
  // File tests do not follow symbolic links.
  ASSERT_EQ(mkdir(At("/d").c_str(), 0755) | mkfifo(At("/fifo").c_str(), 0644) |
                symlink("d", At("/ld").c_str()),
            0);
  EXPECT_EQ(IsDirExist(At("/d")) + 2 * IsDirExist(At("/ld")) + 4 * IsFileExist(At("/fifo")) +
                8 * IsDirExist(""),
            1);
  // Compared as C strings: bytes after an embedded NUL do not count.
  EXPECT_TRUE(StringStartWith(std::string("/a\0x", 4), std::string("/a\0y", 4)));
  EXPECT_FALSE(StringStartWith("/vol", "/volume1") || StringStartWith("/Volume1", "/volume1"));
}

TEST_F(UtilsTest, FullPathsComeFromTheShareDatabaseAndErrorsOutliveSuccesses) {
  fake::Get().AddShare("flat", "flatshare");
  // The path, its full path ("": refused), the error code left and the lines logged.
  const std::tuple<const char*, std::string, _tag_fileindex_err_, Lines> kCases[] = {
      {"/photo/a//b/../c", volume + "/photo/a//b/../c", FILEINDEX_ERR_NONE, {}},
      {"/flat/x", "flatshare/flat/x", FILEINDEX_ERR_NONE, {}},
      {"/music/a", "", FILEINDEX_ERR_PATH, {}},
      {"", "", FILEINDEX_ERR_NONE, {"utils:N GetShareNameByPath failed, path="}}};
  for (const auto& [path, expected, code, lines] : kCases) {
    SCOPED_TRACE(path);
    fake::Get().calls.clear();
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    std::string full = "old";
    EXPECT_EQ(GetFullPath(full, path), !expected.empty());
    EXPECT_EQ(full, expected.empty() ? "old" : expected);
    EXPECT_EQ(ErrorHandler::GetError(), code);
    EXPECT_EQ(log.Lines(), lines);
    EXPECT_EQ(fake::Get().openShareRecords, 0);
    EXPECT_EQ(fake::Get().CallsTo("WEZOShareGet").empty(), *path == '\0');
  }
  log.Clear();
  std::string name = "n", path = "p";
  EXPECT_FALSE(GetShareNamePathByFullPath(name, path, volume + "/videos/a.mp4"));
  EXPECT_EQ(name + path, "np");
  EXPECT_EQ(log.Lines(),
            Lines{"utils:N WEZOShareNamePathGet failed, path=" + volume + "/videos/a.mp4"});
  ASSERT_TRUE(GetShareNamePathByFullPath(name, path, volume + "/video/clips/a.mp4"));
  EXPECT_EQ(name + " " + path, "video " + volume + "/video");
  EXPECT_TRUE(GetFullPath(name, "/photo/x"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_PATH);  // the failure is still told
  EXPECT_STREQ(ErrorHandler::Describe(ErrorHandler::GetError()),
               "path or share could not be resolved");
}

}  // namespace
}  // namespace WEZO::FILEINDEX
