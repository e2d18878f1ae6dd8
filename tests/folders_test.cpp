#include <json/writer.h>

#include <algorithm>
#include <iterator>

#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

std::vector<std::string> PathsOf(const std::vector<Folder>& folders) {
  std::vector<std::string> paths;
  for (const Folder& folder : folders) paths.push_back(folder.GetPath());
  return paths;
}

std::vector<std::string> PathsOf(const Json::Value& page) {
  std::vector<std::string> paths;
  for (const Json::Value& folder : page["folder"]) paths.push_back(folder["path"].asString());
  return paths;
}

// A change report from "document audio video photo" as four 0/1 digits.
Json::Value Report(const char* bits) {
  Json::Value report;
  const char* const kinds[] = {"document", "audio", "video", "photo"};
  for (int i = 0; i < 4; ++i) report[kinds[i]] = bits[i] == '1';
  return report;
}

class FoldersTest : public testsupport::LibraryTest {
 protected:
  static void LoadText(Folders& folders, const std::string& text) {
    WriteFile(FolderConfPath(), text);
    ASSERT_TRUE(folders.Load());
  }
};

// An unknown name is passed over; a name that is not a string ends the list.
TEST_F(FoldersTest, AdditionalValuesKeepGoingPastAnUnknownNameButNotPastANonString) {
  std::filesystem::create_directories(volume + "/photo/2019");
  Folder folder;
  ASSERT_TRUE(folder.SetPath("/photo/2019"));
  const struct {
    const char* names;
    const char* additional;
    std::vector<std::string> lines;
  } cases[] = {{R"(["bogus","is_valid"])",
                R"({"bogus":null,"is_valid":true})",
                {"folder:N Unknown additional: bogus", "folder:N Failed to get additional: bogus"}},
               {R"(["is_valid",1,"bogus"])",
                R"({"is_valid":true})",
                {"folder:N Bad param: 1", "folder:N GetAdditional failed"}}};
  for (const auto& c : cases) {
    log.Clear();
    EXPECT_EQ(folder.asJson(ParseJson(c.names))["additional"], ParseJson(c.additional));
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
    EXPECT_EQ(log.Lines(), c.lines) << c.names;
  }
}

// Members of the wrong type are dropped; a folder whose share is gone is kept as it is.
TEST_F(FoldersTest, FileRoundTripWritesKeyOrderAndIgnoresTheStoredPath) {
  Folders folders;
  LoadText(folders, R"({"/video/b":{"path":"/elsewhere","name":"B","video":true,"x":1},
                        "/gone/a":{"name":"A"}, "/photo":7,
                        "/photo/2019":{"name":"2019","photo":true,"audio":"true","video":1}})");
  std::vector<Folder> all;
  folders.List(all);
  EXPECT_THAT(PathsOf(all), ElementsAre("/gone/a", "/photo", "/photo/2019", "/video/b"));
  EXPECT_EQ(all[0].GetFullPath(), "");
  EXPECT_THAT(log.Lines(), ElementsAre("folder:N Failed to get full path from /gone/a"));
  Json::Value get;
  ASSERT_TRUE(folders.Get(get, "/photo/2019"));
  EXPECT_EQ(get, ParseJson(R"({"path":"/photo/2019","name":"2019","document":false,
                           "audio":false,"video":false,"photo":true})"));
  log.Clear();
  EXPECT_FALSE(folders.Get(get, "/photo/"));
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N No such folder: /photo/"));
  ASSERT_TRUE(folders.Save());
  const std::string text = ReadFile(FolderConfPath());
  EXPECT_EQ(ParseJson(text)["/gone/a"], ParseJson(R"({"path":"/gone/a","name":"A","document":false,
                                                 "audio":false,"video":false,"photo":false})"));
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);
  // The records alone in key order, byte for byte, after the load and after changes.
  const auto rendered = [&folders] {
    std::vector<Folder> records;
    folders.List(records);
    Json::Value document(Json::objectValue);
    for (const Folder& record : records) record.AddToJson(document);
    Json::StreamWriterBuilder builder;
    builder["emitUTF8"] = true;
    return Json::writeString(builder, document) + "\n";
  };
  EXPECT_EQ(text, rendered());
  Json::Value report;
  ASSERT_TRUE(folders.Upsert(report, ParseJson(R"({"path":"/photo/2019","name":"2019"})")));
  ASSERT_TRUE(folders.Upsert(report, ParseJson(R"({"path":"/video/c","video":true})")));
  ASSERT_TRUE(folders.Delete(report, "/photo"));
  ASSERT_TRUE(folders.Save());
  EXPECT_EQ(ReadFile(FolderConfPath()), rendered());
  // Only an object is a folder list.
  WriteFile(FolderConfPath(), "[1, 2]");
  log.Clear();
  Folders array;
  EXPECT_FALSE(array.Load());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_MALFORMED_FOLDERS);
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N Malformed folders: [1,2]"));
  array.List(all);
  EXPECT_THAT(all, IsEmpty());
}

TEST_F(FoldersTest, PagedListingSortsAndPages) {
  Folders folders;
  LoadText(folders, R"({"/photo/a":{"name":"delta","photo":true}, "/photo/B":{"name":"Charlie"},
                        "/photo/c":{"name":"bravo","photo":true}, "/video/d":{"name":"Bravo"}})");
  const struct {
    unsigned long offset, limit;
    const char* sortBy;
    const char* direction;
    std::vector<std::string> paths;
  } cases[] = {{1, 2, "path", "", {"/photo/B", "/photo/c"}},
               // Names equal but for case come in their paths' byte order.
               {0, 10, "name", "ASC", {"/photo/c", "/video/d", "/photo/B", "/photo/a"}},
               {0, 10, "Name", "ASC", {"/photo/a", "/photo/B", "/photo/c", "/video/d"}},
               {3, 10, "name", "asc", {"/photo/a"}},
               {0, 0, "name", "ASC", {}},
               {4, 10, "name", "ASC", {}},
               // Descending pages come from the start of the ascending order, whatever the offset.
               {2, 10, "name", "DESC", {"/video/d", "/photo/c"}},
               {9, 10, "name", "DESC", {}},
               {0, 10, "name", "desc", {"/photo/c", "/video/d", "/photo/B", "/photo/a"}},
               // Sorting by a kind puts the folders without it first.
               {0, 10, "photo", "ASC", {"/photo/B", "/video/d", "/photo/a", "/photo/c"}}};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::to_string(c.offset) + " " + std::to_string(c.limit) + " " + c.sortBy + " " +
                 c.direction);
    Json::Value page;
    ASSERT_TRUE(folders.List(page, c.offset, c.limit, c.sortBy, c.direction,
                             Json::Value(Json::arrayValue)));
    EXPECT_EQ(page["total"], 4U);
    EXPECT_EQ(page["offset"].asUInt64(), c.offset);
    EXPECT_EQ(PathsOf(page), c.paths);
  }
  Folders shares;
  LoadText(shares, R"({"/photo":{},"/photo/2019":{},"/photos":{}})");
  std::vector<Folder> byShare;
  shares.List(byShare, "photo");  // the whole share name, case and all
  EXPECT_THAT(PathsOf(byShare), ElementsAre("/photo", "/photo/2019"));
  shares.List(byShare, "Photo");
  EXPECT_THAT(byShare, IsEmpty());
}

// A changed folder takes only what the request carries; the rest goes back to empty.
TEST_F(FoldersTest, ChangeReportsCompareWithTheSettingThatApplied) {
  const char* photo = R"({"/photo":{"photo":true,"name":"P"}})";
  const char* nested = R"({"/photo":{"photo":true},"/photo/2019":{"photo":true}})";
  const struct {
    const char* list;
    const char* request;  // upsert; nullptr: delete `deleted`
    const char* deleted;
    const char* report;  // nullptr: none, the share being unknown
  } cases[] = {{"{}", R"({"path":"/photo","photo":true})", nullptr, "1111"},
               {photo, R"({"path":"/photo/2019","photo":true,"audio":true})", nullptr, "0100"},
               {photo, R"({"path":"/video/x","photo":true})", nullptr, "1111"},
               {photo, R"({"path":"/photo","audio":true})", nullptr, "0101"},
               {nested, nullptr, "/photo/2019", "0000"},
               {nested, nullptr, "/photo", "1111"},
               {photo, nullptr, "/photo", "1111"},
               {R"({"/gone/a":{}})", nullptr, "/gone/a", nullptr}};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.list) + " " + (c.request ? c.request : c.deleted));
    Folders folders;
    LoadText(folders, c.list);
    Json::Value result = "untouched";
    Json::Value expected = c.report ? Report(c.report) : Json::Value("untouched");
    if (c.request != nullptr) {
      ASSERT_TRUE(folders.Upsert(result, ParseJson(c.request)));
    } else {
      ASSERT_TRUE(folders.Delete(result, c.deleted));
      EXPECT_FALSE(folders.Get(result, c.deleted));
      if (c.report) expected = Json::Value(), expected[c.deleted] = Report(c.report);
    }
    EXPECT_EQ(result, expected);
  }
  Folders folders;
  LoadText(folders, photo);
  Json::Value result;
  ASSERT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/photo","audio":true})")));
  folders.Get(result, "/photo");
  EXPECT_EQ(result, ParseJson(R"({"path":"/photo","name":"","document":false,"audio":true,
                              "video":false,"photo":false})"));
}

TEST_F(FoldersTest, UpsertRefusesARequestWithoutAPathInAKnownShareOrPastAThousandFolders) {
  for (const char* request : {R"({"path":5})", R"({"path":"/nosuch/a"})", R"({"path":"/"})"}) {
    SCOPED_TRACE(request);
    Folders folders;
    LoadText(folders, R"({"/photo":{"photo":true}})");
    Json::Value result = "untouched";
    EXPECT_FALSE(folders.Upsert(result, ParseJson(request)));
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
    EXPECT_EQ(log.Lines().back(), "folders:N Bad param: " + JsonToString(ParseJson(request)));
    EXPECT_EQ(result, "untouched");
    std::vector<Folder> all;
    folders.List(all);
    EXPECT_THAT(PathsOf(all), ElementsAre("/photo"));
  }
  Json::Value list(Json::objectValue);
  for (int i = 0; i < 999; ++i) list["/photo/" + std::to_string(i)]["photo"] = true;
  Folders folders;
  LoadText(folders, JsonToString(list));
  log.Clear();
  Json::Value result;
  ASSERT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/video/1000"})")));
  EXPECT_FALSE(folders.Upsert(result, ParseJson(R"({"path":"/video/1001"})")));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_EXCEED_MAX_FOLDER);
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N Exceed max folder size"));
  // A full list can still change.
  EXPECT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/photo/5","audio":true})")));
  EXPECT_EQ(result, Report("0101"));
}

// The folder whose share is gone is passed over without a word.
TEST_F(FoldersTest, MostSuitableSettingIsTheLastEnclosingFolder) {
  std::vector<Folder> folders(3);
  folders[0].Load("/gone", ParseJson(R"({"name":"gone"})"));
  folders[1].Load("/photo", ParseJson(R"({"name":"outer"})"));
  folders[2].Load("/photo/2019", ParseJson(R"({"name":"inner"})"));
  log.Clear();
  for (const std::string row : {"/photo/2019/x inner", "/photo/2019 inner", "/photo/20 outer",
                                "/photos none", "/gone none"}) {
    const std::string path = row.substr(0, row.find(' '));
    EXPECT_EQ(GetMostSuitableCfg(folders, volume + path).get("name", "none"),
              row.substr(path.size() + 1));
  }
  std::swap(folders[1], folders[2]);
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photo/2019/x")["name"], "outer");
  EXPECT_THAT(log.Lines(), IsEmpty());
}

}  // namespace
}  // namespace WEZO::FILEINDEX
