#include "utils/storage.h"
#include "test_support.h"
#include "utils/queue_reader.h"

namespace WEZO::FILEINDEX {
namespace {

using Getter = int (*)(const char*, char*, int);

class StorageTest : public testsupport::LibraryTest {
 protected:
  const std::string metadata = volume + "/photo/@eaDir";
  const std::string queue = metadata + "/WEZO@file_index_queue";
  const std::string db = metadata + "/WEZO@.fileindexdb";
  const std::string out = At("out");  // where links in the metadata directory point
  char buffer[4096];
};

// Arguments are checked before any lookup; a result that does not fit is cut as snprintf cuts.
TEST_F(StorageTest, RefusesBadArgumentsAndWritesTheLocations) {
  const std::string bad = "utils:N Invaild Argument (";
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, sizeof buffer), static_cast<int>(queue.size()));
  EXPECT_EQ(buffer, queue);
  EXPECT_TRUE(std::filesystem::is_directory(metadata));
  EXPECT_FALSE(std::filesystem::exists(queue));
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, 10), 9);
  EXPECT_EQ(std::string(buffer), volume.substr(0, 9));
  ASSERT_EQ(FILEIDXQueuePathGet("photo", buffer, 1), 0);
  EXPECT_EQ(fake::Get().openShareRecords, 0);
  // The getter, its arguments, the line it logs and the platform's last error afterwards.
  const std::tuple<Getter, const char*, char*, int, std::string, int> cases[] = {
      {FILEIDXQueuePathGet, nullptr, nullptr, 0, bad + "__null != szName)=[0]\n", 0xD00},
      {FILEIDXDBPathGet, "photo", nullptr, 0, bad + "__null != szOutDBPath)=[0]\n", 0xD00},
      {FILEIDXQueuePathGet, "photo", buffer, 0, bad + "cbOutLen > 0)=[0]\n", 0xD00},
      {FILEIDXDBPathGet, "nosuch", buffer, 64,
       "utils:N WEZOShareGet failed, name=nosuch, code=3585", fake::kInjectedError}};
  for (const auto& [getter, name, out, size, line, code] : cases) {
    fake::Reset();
    log.Clear();
    EXPECT_EQ(getter(name, out, size), -1) << line;
    EXPECT_THAT(log.Lines(), ElementsAre(line));
    EXPECT_EQ(fake::Get().errCode, code);
    EXPECT_EQ(fake::Get().calls.empty(), code == 0xD00) << "nothing is looked up";
  }
}

// Made when missing, else only its group and world write bits go; a failure is logged.
TEST_F(StorageTest, TheDatabaseDirectoryIsWritableByItsOwnerOnlyWhateverTheUmask) {
  // Umask, then the mode of a directory already there (0: none), then the mode expected.
  for (const auto& [mask, existing, mode] :
       {std::tuple{077, 0, 0755}, {0, 0777, 0755}, {0, 0700, 0700}}) {
    std::filesystem::remove_all(db);
    if (existing != 0) std::filesystem::create_directories(db), chmod(db.c_str(), existing);
    const mode_t oldMask = umask(mask);
    EXPECT_EQ(FILEIDXDBPathGet("photo", buffer, sizeof buffer), static_cast<int>(db.size()));
    umask(oldMask);
    EXPECT_EQ(testsupport::ModeOf(db), mode) << std::oct << mask << " " << existing;
  }
  EXPECT_THAT(log.Lines(), IsEmpty());
  fake::Get().ea_mkdir_fails = true;
  std::filesystem::remove_all(metadata);
  EXPECT_EQ(FILEIDXDBPathGet("photo", buffer, sizeof buffer), static_cast<int>(db.size()));
  EXPECT_EQ(buffer, db);
  EXPECT_THAT(
      log.Lines(),
      ElementsAre("utils:N WEZOEAMKDir failed, path=" + volume + "/photo/@eaDir, code=3585",
                  "utils:N mkdir failed, path=" + db + ", reason=No such file or directory"));
}

// Each file below `dir` with its content, "<dir>" or "<link>" (links not followed).
std::map<std::string, std::string> Tree(const std::string& dir) {
  std::map<std::string, std::string> tree;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(dir)) {
    const std::string path = entry.path().string().substr(dir.size());
    tree[path] = entry.is_symlink()     ? "<link>"
                 : entry.is_directory() ? "<dir>"
                                        : ReadFile(entry.path().string());
  }
  return tree;
}

TEST_F(StorageTest, NothingBelowTheShareIsReachedThroughALinkInTheMetadataDirectory) {
  const std::string linked = ", reason=Too many levels of symbolic links";
  const std::tuple<std::function<bool()>, bool, std::string> cases[] = {
      {[&] { return FILEIDXDBPathGet("photo", buffer, sizeof buffer) > 0; }, true,
       "utils:N mkdir failed, path=" + db + linked},
      {[&] { return IsReindexQueued(volume + "/photo/a", queue); }, false,
       "utils:N Failed to open queue=" + queue + linked},
      {[&] { return QueueHasFolderEvent("/photo/a", queue); }, false,
       "status_mgr:N Failed to open queue=" + queue + linked},
      {[&] { return IndexMgr::CleanShareIndexData("photo"); }, false,
       "index_mgr:N Failed to remove " + db + linked}};
  for (const auto& [run, result, lastLine] : cases) {
    SCOPED_TRACE(lastLine);
    std::filesystem::remove_all(metadata);
    std::filesystem::remove_all(out);
    Write("out/WEZO@file_index_queue", R"({"event":65536,"path":")" + volume + "/photo/a\"}\n");
    Write("out/WEZO@file_index_queue.tmp", "tmp");
    std::filesystem::create_symlink(out, metadata);
    const auto before = Tree(out);
    log.Clear();
    EXPECT_EQ(run(), result);
    EXPECT_EQ(Tree(out), before);
    EXPECT_EQ(log.Lines().empty() ? "" : log.Lines().back(), lastLine);
  }
}

TEST_F(StorageTest, RemovingIndexDataTakesWholeTreesAndLinksButNeverWhatALinkPointsTo) {
  std::filesystem::create_directories(db + "/a");
  Write("out/file", "keep");
  WriteFile(queue, "q");
  std::filesystem::create_symlink(out + "/file", queue + ".tmp");
  std::filesystem::create_directory_symlink(out, db + "/a/out");
  std::string deepest = db;
  for (int depth = 0; depth < kMaxRemovalDepth; ++depth) deepest += "/d";
  std::filesystem::create_directories(deepest);

  // One level too deep: that tree stays, the other locations go all the same.
  EXPECT_FALSE(IndexMgr::CleanShareIndexData("photo"));
  EXPECT_THAT(log.Lines(),
              ElementsAre("index_mgr:N Failed to remove " + db + ", reason=File name too long"));
  EXPECT_EQ(Tree(metadata).count("/WEZO@file_index_queue.tmp") +
                Tree(metadata).count("/WEZO@file_index_queue"),
            0U);

  std::filesystem::remove(deepest);
  log.Clear();
  EXPECT_TRUE(IndexMgr::CleanShareIndexData("photo"));
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_THAT(Tree(metadata), IsEmpty());
  EXPECT_EQ(Tree(out), (std::map<std::string, std::string>{{"/file", "keep"}}));
  EXPECT_TRUE(IndexMgr::CleanShareIndexData("photo")) << "nothing left to remove";
}

}  // namespace
}  // namespace WEZO::FILEINDEX
