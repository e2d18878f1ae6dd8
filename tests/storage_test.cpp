#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <string>

#include "fake_platform.h"
#include "fileindex/fileindex_c.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

using Getter = int (*)(const char*, char*, int);

class StorageTest : public testsupport::LibraryTest {
 protected:
  StorageTest() { std::filesystem::create_directories(volume + "/photo"); }
};

TEST_F(StorageTest, RefusesBadArgumentsInOrderWithThePlatformError) {
  char buffer[64];
  struct Case {
    Getter getter;
    const char* name;
    char* out;
    int size;
    const char* line;
  } cases[] = {
      {FILEIDXQueuePathGet, nullptr, nullptr, 0,
       "utils:N Invaild Argument (__null != szName)=[0]\n"},
      {FILEIDXQueuePathGet, "photo", nullptr, 0,
       "utils:N Invaild Argument (__null != szOutQueuePath)=[0]\n"},
      {FILEIDXDBPathGet, "photo", nullptr, 64,
       "utils:N Invaild Argument (__null != szOutDBPath)=[0]\n"},
      {FILEIDXQueuePathGet, "photo", buffer, 0, "utils:N Invaild Argument (cbOutLen > 0)=[0]\n"},
      {FILEIDXDBPathGet, "photo", buffer, -5, "utils:N Invaild Argument (cbOutLen > 0)=[0]\n"},
  };
  for (const Case& c : cases) {
    fake::Reset();
    log.Clear();
    EXPECT_EQ(c.getter(c.name, c.out, c.size), -1) << c.line;
    EXPECT_THAT(log.Lines(), ElementsAre(c.line));
    EXPECT_EQ(fake::Get().errCode, 0xD00);
    EXPECT_THAT(fake::Get().calls, IsEmpty()) << "nothing is looked up";
  }
}

TEST_F(StorageTest, UnknownShareFailsWithoutSettingAPlatformError) {
  char buffer[256];
  EXPECT_EQ(FILEIDXDBPathGet("nosuch", buffer, sizeof buffer), -1);
  EXPECT_EQ(fake::Get().errCode, fake::kInjectedError) << "left by the lookup, not replaced";
  EXPECT_THAT(log.Lines(), ElementsAre("utils:N WEZOShareGet failed, name=nosuch, code=3585"));
  EXPECT_EQ(fake::Get().openShareRecords, 0);
}

TEST_F(StorageTest, WritesTheLocationsAndCreatesOnlyTheirDirectories) {
  char buffer[4096];
  const std::string queue = volume + "/photo/@eaDir/WEZO@file_index_queue";
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, sizeof buffer), static_cast<int>(queue.size()));
  EXPECT_EQ(buffer, queue);
  EXPECT_TRUE(std::filesystem::is_directory(volume + "/photo/@eaDir"));
  EXPECT_FALSE(std::filesystem::exists(queue));

  const mode_t oldMask = umask(022);
  const std::string db = volume + "/photo/@eaDir/WEZO@.fileindexdb";
  EXPECT_EQ(FILEIDXDBPathGet("photo", buffer, sizeof buffer), static_cast<int>(db.size()));
  EXPECT_EQ(FILEIDXDBPathGet("photo", buffer, sizeof buffer), static_cast<int>(db.size()));
  umask(oldMask);
  EXPECT_EQ(buffer, db);
  EXPECT_EQ(testsupport::ModeOf(db), 0755) << "0777 less the umask";
  EXPECT_THAT(log.Lines(), IsEmpty()) << "an existing directory is not an error";
  EXPECT_EQ(fake::Get().openShareRecords, 0);
}

TEST_F(StorageTest, CutsTheOutputAsSnprintfDoesAndStillSucceeds) {
  char buffer[16];
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, 10), 9);
  EXPECT_EQ(std::string(buffer), (volume + "/photo").substr(0, 9));
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, 1), 0);
  EXPECT_EQ(buffer[0], '\0');
}

TEST_F(StorageTest, DirectoriesThatCannotBeCreatedAreLoggedAndThePathStillReturned) {
  fake::Get().ea_mkdir_fails = true;
  char buffer[4096];
  const std::string db = volume + "/photo/@eaDir/WEZO@.fileindexdb";
  EXPECT_EQ(FILEIDXDBPathGet("photo", buffer, sizeof buffer), static_cast<int>(db.size()));
  EXPECT_THAT(
      log.Lines(),
      ElementsAre("utils:N WEZOEAMKDir failed, path=" + volume + "/photo/@eaDir, code=3585",
                  "utils:N mkdir failed, path=" + db + ", reason=No such file or directory"));
}

}  // namespace
}  // namespace FILEINDEX
}  // namespace WEZO
