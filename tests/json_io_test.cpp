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

TEST_F(JsonIoTest, ToStringKeepsEveryValueOnOneLine) {
  Json::Value v(Json::objectValue);
  v["path"] = "/volume1/photo/line\nbreak\t\"quoted\"\\";
  v["name"] = "Fotos \xC3\xA9t\xC3\xA9";  // UTF-8 stays UTF-8
  v["nested"]["list"].append(1);
  v["nested"]["list"].append(Json::Value());
  const std::string text = JsonToString(v);
  EXPECT_EQ(text.find('\n'), std::string::npos);
  EXPECT_EQ(text,
            R"({"name":"Fotos )"
            "\xC3\xA9t\xC3\xA9"
            R"(","nested":{"list":[1,null]},"path":"/volume1/photo/line\nbreak\t\"quoted\"\\"})");
  Json::Value back;
  ASSERT_TRUE(JsonFromString(back, text));
  EXPECT_EQ(back, v);
}

TEST_F(JsonIoTest, FromStringRefusesAnythingButOneWholeValue) {
  const std::string refused[] = {"", "{", R"({"event":65536,"path":"/v)", "{} x", "{}{}", "nul",
                                 "[1,]", R"({"a":1,"a":2})", "{} // note",
                                 // deeper than the reader's nesting limit, which makes it throw
                                 std::string(5000, '[') + std::string(5000, ']')};
  for (const std::string& text : refused) {
    Json::Value v("untouched");
    EXPECT_FALSE(JsonFromString(v, text)) << text;
    EXPECT_EQ(v, Json::Value("untouched")) << text;
  }
  Json::Value v;
  EXPECT_TRUE(JsonFromString(v, "  {\"a\": [1, 2]}\n"));
  EXPECT_EQ(v["a"][1].asInt(), 2);
}

// A symbolic link in the file's place is replaced, not written through; a failed save leaves
// the old file and no temporary file.
TEST_F(JsonIoTest, SaveReplacesTheFileWholeOrNotAtAll) {
  const std::string target = sandbox.Path("/target");
  testsupport::WriteFile(target, "keep");
  const std::string path = Dir() + "/x.conf";
  ASSERT_EQ(symlink(target.c_str(), path.c_str()), 0);
  EXPECT_EQ(JsonToFile(Json::Value(Json::objectValue), path, 0644), JsonSaveResult::kReplaced);
  EXPECT_EQ(testsupport::ReadFile(target), "keep");
  EXPECT_EQ(testsupport::ReadFile(path), "{}\n");
  EXPECT_EQ(DirEntries(), std::vector<std::string>{"x.conf"});

  // A directory in the file's place makes the final rename fail after the data is written.
  ASSERT_EQ(unlink(path.c_str()) | mkdir(path.c_str(), 0755), 0);
  EXPECT_EQ(JsonToFile(Json::Value(Json::objectValue), path, 0644), JsonSaveResult::kFailed);
  EXPECT_EQ(DirEntries(), std::vector<std::string>{"x.conf"});
  EXPECT_EQ(JsonToFile(Json::Value(1), sandbox.Path("/no/such/dir/x.conf"), 0644),
            JsonSaveResult::kFailed);
}

TEST_F(JsonIoTest, RemovesOnlyOldRegularTemporariesOfTheFile) {
  // A new one's writer may still be saving.
  const struct {
    const char* name;
    char kind;  // 'f'ile, 'l'ink, 'd'irectory
    bool old, removed;
  } cases[] = {{"folder.conf.a1B2c3", 'f', true, true},  {"folder.conf.Z9z9Z9", 'f', false, false},
               {"folder.conf.a1B2c", 'f', true, false},  {"folder.conf.a1B2c3d", 'f', true, false},
               {"folder.conf.a1-2c3", 'f', true, false}, {"folder.confXa1B2c3", 'f', true, false},
               {"status.conf.a1B2c3", 'f', true, false}, {"folder.conf.L1nk00", 'l', true, false},
               {"folder.conf.D1r000", 'd', true, false}};
  const std::string target = sandbox.Path("/target");
  testsupport::WriteFile(target, "keep");
  for (const auto& c : cases) {
    const std::string path = Dir() + "/" + c.name;
    if (c.kind == 'f') testsupport::WriteFile(path, "{");
    const int made = c.kind == 'l'   ? symlink(target.c_str(), path.c_str())
                     : c.kind == 'd' ? mkdir(path.c_str(), 0755)
                                     : 0;
    ASSERT_EQ(made, 0) << c.name;
    const timespec twoHoursAgo[2] = {{time(nullptr) - 7200, 0}, {time(nullptr) - 7200, 0}};
    ASSERT_EQ(c.old ? utimensat(AT_FDCWD, path.c_str(), twoHoursAgo, AT_SYMLINK_NOFOLLOW) : 0, 0);
  }
  RemoveStaleTemporaries(Dir() + "/folder.conf", 3600);
  for (const auto& c : cases) {
    struct stat st {};
    EXPECT_EQ(lstat((Dir() + "/" + c.name).c_str(), &st) != 0, c.removed) << c.name;
  }
  EXPECT_EQ(testsupport::ReadFile(target), "keep");
}

}  // namespace
}  // namespace WEZO::FILEINDEX
