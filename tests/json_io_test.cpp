#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <ctime>
#include <filesystem>
#include <string>

#include "file_io.h"
#include "json_io.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

class JsonIoTest : public testsupport::LibraryTest {
 protected:
  std::string Dir() const { return sandbox.Path("/usr/wezo/etc/fileindex"); }
  std::vector<std::string> DirEntries() const {
    std::vector<std::string> names;
    for (const auto& e : std::filesystem::directory_iterator(Dir()))
      names.push_back(e.path().filename());
    return names;
  }
};

TEST_F(JsonIoTest, TextIsOneLineAndOnlyOneWholeValueIsRead) {
  Json::Value v(Json::objectValue);
  v["path"] = "/v/line\nbreak\t\"q\"\\";
  v["name"] = "\xC3\xA9t\xC3\xA9";  // UTF-8 stays UTF-8
  v["list"].append(Json::Value());
  const std::string text = JsonToString(v);
  EXPECT_EQ(text, R"({"list":[null],"name":")"
                  "\xC3\xA9t\xC3\xA9"
                  R"(","path":"/v/line\nbreak\t\"q\"\\"})");
  for (const std::string& refused :
       {std::string(), std::string("{"), std::string("{} x"), std::string("{}{}"),
        std::string("[1,]"), std::string(R"({"a":1,"a":2})"), std::string("{} // note"),
        // deeper than the reader's nesting limit, which makes it throw
        std::string(5000, '[') + std::string(5000, ']')}) {
    Json::Value back("untouched");
    EXPECT_FALSE(JsonFromString(back, refused)) << refused;
    EXPECT_EQ(back, Json::Value("untouched")) << refused;
  }
  Json::Value back;
  ASSERT_TRUE(JsonFromString(back, " " + text + "\n"));
  EXPECT_EQ(back, v);
}

// A symbolic link in the file's place is replaced, not written through; a failed save leaves
// the old file and no temporary file.
TEST_F(JsonIoTest, SaveReplacesTheFileWholeOrNotAtAll) {
  const std::string target = sandbox.Path("/target");
  testsupport::WriteFile(target, "keep");
  const std::string path = Dir() + "/x.conf";
  ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0);
  EXPECT_EQ(JsonToFile(Json::Value(Json::objectValue), path, 0644), JsonSaveResult::kReplaced);
  EXPECT_EQ(testsupport::ReadFile(target) + testsupport::ReadFile(path), "keep{}\n");
  // A directory in the file's place makes the final rename fail after the data is written.
  ASSERT_EQ(unlink(path.c_str()) | mkdir(path.c_str(), 0755), 0);
  EXPECT_EQ(JsonToFile(Json::Value(Json::objectValue), path, 0644), JsonSaveResult::kFailed);
  EXPECT_EQ(DirEntries(), std::vector<std::string>{"x.conf"});
  EXPECT_EQ(JsonToFile(Json::Value(1), sandbox.Path("/no/dir/x.conf"), 0644),
            JsonSaveResult::kFailed);
}

TEST_F(JsonIoTest, RemovesOnlyOldRegularTemporariesOfTheFile) {
  const struct Case {
    const char* name;
    char kind;          // 'f'ile, 'l'ink, 'd'irectory
    bool old, removed;  // a new one's writer may still be saving
  } kCases[] = {{"folder.conf.a1B2c3", 'f', true, true},  {"folder.conf.Z9z9Z9", 'f', false, false},
                {"folder.conf.a1B2c", 'f', true, false},  {"folder.conf.a1B2c3d", 'f', true, false},
                {"folder.conf.a1-2c3", 'f', true, false}, {"folder.confXa1B2c3", 'f', true, false},
                {"folder.conf.L1nk00", 'l', true, false}, {"folder.conf.D1r000", 'd', true, false}};
  const std::string target = sandbox.Path("/target");
  testsupport::WriteFile(target, "keep");
  const timespec twoHoursAgo[2] = {{time(nullptr) - 7200, 0}, {time(nullptr) - 7200, 0}};
  for (const Case& c : kCases) {
    const std::string path = Dir() + "/" + c.name;
    if (c.kind == 'f') testsupport::WriteFile(path, "{");
    ASSERT_EQ(c.kind == 'l' ? symlink(target.c_str(), path.c_str())
                            : (c.kind == 'd' ? mkdir(path.c_str(), 0755) : 0),
              0);
    ASSERT_EQ(c.old ? utimensat(AT_FDCWD, path.c_str(), twoHoursAgo, AT_SYMLINK_NOFOLLOW) : 0, 0);
  }
  RemoveStaleTemporaries(Dir() + "/folder.conf", 3600);
  for (const Case& c : kCases) {
    struct stat st {};
    EXPECT_EQ(lstat((Dir() + "/" + c.name).c_str(), &st) != 0, c.removed) << c.name;
  }
  EXPECT_EQ(testsupport::ReadFile(target), "keep");
}

}  // namespace
}  // namespace WEZO::FILEINDEX
