#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/folders.h"
#include "json_io.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using testsupport::ParseJson;

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
    testsupport::WriteFile(FolderConfPath(), text);
    ASSERT_TRUE(folders.Load());
  }
};

TEST_F(FoldersTest, AdditionalValuesKeepGoingPastAnUnknownNameButNotPastANonString) {
  std::filesystem::create_directories(volume + "/photo/2019");
  Folder folder;
  ASSERT_TRUE(folder.SetPath("/photo/2019"));
  Json::Value obj = folder.asJson(ParseJson(R"(["bogus","is_valid"])"));
  EXPECT_EQ(obj["additional"], ParseJson(R"({"bogus":null,"is_valid":true})"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
  EXPECT_THAT(log.Lines(), ElementsAre("folder:N Unknown additional: bogus",
                                       "folder:N Failed to get additional: bogus"));
  const struct {
    const char* names;
    const char* additional;
    const char* badParam;
  } cases[] = {{R"("is_valid")", "{}", R"("is_valid")"},
               {R"(["is_valid",1,"bogus"])", R"({"is_valid":true})", "1"}};
  for (const auto& c : cases) {
    log.Clear();
    obj = folder.asJson(ParseJson(c.names));
    EXPECT_EQ(obj["additional"], ParseJson(c.additional)) << c.names;
    EXPECT_EQ(obj["path"], "/photo/2019");
    EXPECT_THAT(log.Lines(), ElementsAre(std::string("folder:N Bad param: ") + c.badParam,
                                         "folder:N GetAdditional failed"));
  }
}

// A folder takes the members of the right type; one whose share is gone is kept as it is.
TEST_F(FoldersTest, FileRoundTripWritesKeyOrderAndIgnoresTheStoredPath) {
  Folders folders;
  LoadText(folders, R"({"/video/b":{"path":"/elsewhere","name":"B","video":true},
                        "/gone/a":{"name":"A"}, "/photo":7,
                        "/photo/2019":{"name":"2019","photo":true,"audio":"true","video":1}})");
  std::vector<Folder> all;
  folders.List(all);
  EXPECT_THAT(PathsOf(all), ElementsAre("/gone/a", "/photo", "/photo/2019", "/video/b"));
  EXPECT_EQ(all[0].GetFullPath(), "");
  EXPECT_THAT(log.Lines(), ElementsAre("folder:N Failed to get full path from /gone/a"));
  EXPECT_EQ(all[2].GetFullPath(), volume + "/photo/2019");
  Json::Value get;
  ASSERT_TRUE(folders.Get(get, "/photo/2019"));
  EXPECT_EQ(get, ParseJson(R"({"path":"/photo/2019","name":"2019","document":false,
                           "audio":false,"video":false,"photo":true})"));
  log.Clear();
  Json::Value out = "untouched";
  EXPECT_FALSE(folders.Get(out, "/photo/"));
  EXPECT_EQ(out, "untouched");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NO_SUCH_FOLDER);
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N No such folder: /photo/"));

  ASSERT_TRUE(folders.Save());
  const std::string text = testsupport::ReadFile(FolderConfPath());
  EXPECT_LT(text.find("\"/gone/a\""), text.find("\"/photo\""));
  EXPECT_LT(text.find("\"/photo\""), text.find("\"/photo/2019\""));
  EXPECT_LT(text.find("\"/photo/2019\""), text.find("\"/video/b\""));
  const Json::Value saved = ParseJson(text);
  EXPECT_EQ(saved["/video/b"]["path"], "/video/b");
  EXPECT_EQ(saved["/gone/a"], ParseJson(R"({"path":"/gone/a","name":"A","document":false,
                                        "audio":false,"video":false,"photo":false})"));
  EXPECT_EQ(saved["/photo"]["name"], "");
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);
}

TEST_F(FoldersTest, OnlyAnObjectIsAFolderList) {
  const struct {
    const char* text;  // nullptr: no file
    _tag_fileindex_err_ code;
    std::string line;
  } cases[] = {
      {nullptr, FILEINDEX_ERR_NONE, ""},
      {"{}", FILEINDEX_ERR_NONE, ""},
      {"[1, 2]", FILEINDEX_ERR_MALFORMED_FOLDERS, "folders:N Malformed folders: [1,2]"},
      {"{", FILEINDEX_ERR_LOAD_JSON, "config:N Failed to load json from " + FolderConfPath()}};
  for (const auto& c : cases) {
    std::filesystem::remove(FolderConfPath());
    if (c.text != nullptr) testsupport::WriteFile(FolderConfPath(), c.text);
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    Folders folders;
    EXPECT_EQ(folders.Load(), c.code == FILEINDEX_ERR_NONE) << c.line;
    EXPECT_EQ(ErrorHandler::GetError(), c.code);
    EXPECT_EQ(log.Lines(), c.line.empty() ? std::vector<std::string>{} : std::vector{c.line});
    std::vector<Folder> all;
    folders.List(all);
    EXPECT_THAT(all, IsEmpty());
  }
}

TEST_F(FoldersTest, ListingByShareMatchesTheWholeShareName) {
  Folders folders;
  LoadText(folders, R"({"":{},"/photo":{},"/photo/2019":{},"/photos":{},"/video":{}})");
  std::vector<Folder> photo;
  folders.List(photo, "photo");
  EXPECT_THAT(PathsOf(photo), ElementsAre("/photo", "/photo/2019"));
  folders.List(photo, "Photo");
  EXPECT_THAT(photo, IsEmpty());
  folders.List(photo, "");
  EXPECT_EQ(photo.size(), 5U);
}

TEST_F(FoldersTest, PagedListingSortsAndPages) {
  Folders folders;
  LoadText(folders, R"({"/photo/a":{"name":"delta","photo":true}, "/photo/B":{"name":"Charlie"},
                        "/photo/c":{"name":"bravo","photo":true}, "/video/d":{"name":"Alpha"}})");
  const struct {
    unsigned long offset, limit;
    const char* sortBy;
    const char* direction;
    std::vector<std::string> paths;
  } cases[] = {{0, 10, "", "ASC", {"/photo/a", "/photo/B", "/photo/c", "/video/d"}},
               {1, 2, "path", "", {"/photo/B", "/photo/c"}},
               {0, 10, "name", "ASC", {"/video/d", "/photo/c", "/photo/B", "/photo/a"}},
               {0, 10, "Name", "ASC", {"/photo/a", "/photo/B", "/photo/c", "/video/d"}},
               {3, 10, "name", "asc", {"/photo/a"}},
               {0, 0, "name", "ASC", {}},
               {4, 10, "name", "ASC", {}},
               // Descending pages come from the start of the ascending order, whatever the offset.
               {0, 2, "name", "DESC", {"/photo/c", "/video/d"}},
               {2, 10, "name", "DESC", {"/photo/c", "/video/d"}},
               {9, 10, "name", "DESC", {}},
               {0, 10, "name", "desc", {"/video/d", "/photo/c", "/photo/B", "/photo/a"}},
               // Sorting by a kind puts the folders without it first.
               {0, 10, "photo", "ASC", {"/photo/B", "/video/d", "/photo/a", "/photo/c"}}};
  for (const auto& c : cases) {
    Json::Value page;
    ASSERT_TRUE(folders.List(page, c.offset, c.limit, c.sortBy, c.direction,
                             Json::Value(Json::arrayValue)));
    EXPECT_EQ(page["total"], 4U);
    EXPECT_EQ(page["offset"].asUInt64(), c.offset);
    EXPECT_EQ(PathsOf(page), c.paths)
        << c.offset << " " << c.limit << " " << c.sortBy << " " << c.direction;
    if (!c.paths.empty()) {
      EXPECT_EQ(page["folder"][0]["additional"], Json::Value(Json::objectValue));
    }
  }
}

TEST_F(FoldersTest, PagedListingNeedsNoConsistentOrderFromThePlatform) {
  // More folders than a sort puts in order by insertion, with names equal but for case.
  Json::Value list(Json::objectValue);
  std::vector<std::string> byteOrder;
  for (int i = 0; i < 40; ++i) {
    byteOrder.push_back("/photo/" + std::to_string(i));
    list[byteOrder.back()]["name"] = i % 2 == 0 ? "Trip" : "TRIP";
  }
  std::sort(byteOrder.begin(), byteOrder.end());
  Folders folders;
  LoadText(folders, JsonToString(list));
  // Each string before every other: std::sort given this walks off the vector's end.
  for (const auto compare : {static_cast<int (*)(const char*, const char*)>(nullptr),
                             +[](const char*, const char*) { return -1; }}) {
    fake::Get().strCaseCmp = compare;
    Json::Value page;
    ASSERT_TRUE(folders.List(page, 0, 100, "name", "ASC", Json::Value(Json::arrayValue)));
    std::vector<std::string> paths = PathsOf(page);
    // Ties come in byte order; with the broken comparison only each folder once.
    if (compare != nullptr) std::sort(paths.begin(), paths.end());
    EXPECT_EQ(paths, byteOrder);
  }
}

TEST_F(FoldersTest, ChangeReportsCompareWithTheSettingThatApplied) {
  const char* photo = R"({"/photo":{"photo":true,"name":"P"}})";
  const char* nested = R"({"/photo":{"photo":true},"/photo/2019":{"photo":true}})";
  const struct {
    const char* list;
    const char* request;  // upsert; nullptr: delete `deleted`
    const char* deleted;
    const char* report;
  } cases[] = {{"{}", R"({"path":"/photo","photo":true})", nullptr, "1111"},
               {photo, R"({"path":"/photo/2019","photo":true})", nullptr, "0000"},
               {photo, R"({"path":"/photo/2019","photo":true,"audio":true})", nullptr, "0100"},
               {photo, R"({"path":"/video/x","photo":true})", nullptr, "1111"},
               {photo, R"({"path":"/photo","photo":false})", nullptr, "0001"},
               {nested, nullptr, "/photo/2019", "0000"},
               {nested, nullptr, "/photo", "1111"},
               {photo, nullptr, "/photo", "1111"}};
  for (const auto& c : cases) {
    Folders folders;
    LoadText(folders, c.list);
    Json::Value result = "untouched";
    Json::Value expected = Report(c.report);
    if (c.request != nullptr) {
      ASSERT_TRUE(folders.Upsert(result, ParseJson(c.request)));
    } else {
      ASSERT_TRUE(folders.Delete(result, c.deleted));
      expected = Json::Value();
      expected[c.deleted] = Report(c.report);
    }
    EXPECT_EQ(result, expected) << c.list << " " << (c.request ? c.request : c.deleted);
  }

  // A changed folder takes only what the request carries; the rest goes back to empty.
  Folders folders;
  LoadText(folders, photo);
  Json::Value result;
  ASSERT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/photo","audio":true})")));
  Json::Value changed;
  folders.Get(changed, "/photo");
  EXPECT_EQ(changed, ParseJson(R"({"path":"/photo","name":"","document":false,"audio":true,
                               "video":false,"photo":false})"));

  // Deleting where the share is unknown still removes the folder.
  Folders gone;
  LoadText(gone, R"({"/gone/a":{}})");
  result = "untouched";
  EXPECT_TRUE(gone.Delete(result, "/gone/a"));
  EXPECT_EQ(result, "untouched");
  std::vector<Folder> all;
  gone.List(all);
  EXPECT_THAT(all, IsEmpty());
}

TEST_F(FoldersTest, UpsertRefusesARequestWithoutAPathInAKnownShare) {
  for (const char* request :
       {R"({})", R"({"path":5})", R"({"path":"/nosuch/a"})", R"({"path":""})", R"({"path":"/"})"}) {
    Folders folders;
    LoadText(folders, R"({"/photo":{"photo":true}})");
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    Json::Value result = "untouched";
    EXPECT_FALSE(folders.Upsert(result, ParseJson(request))) << request;
    EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM) << request;
    EXPECT_EQ(log.Lines().back(), "folders:N Bad param: " + JsonToString(ParseJson(request)));
    EXPECT_EQ(result, "untouched");
    std::vector<Folder> all;
    folders.List(all);
    EXPECT_THAT(PathsOf(all), ElementsAre("/photo")) << request;
  }
}

TEST_F(FoldersTest, ListHoldsAtMostAThousandFoldersButAFullListCanStillChange) {
  Json::Value list(Json::objectValue);
  for (int i = 0; i < 999; ++i) list["/photo/" + std::to_string(i)]["photo"] = true;
  Folders folders;
  LoadText(folders, JsonToString(list));
  Json::Value result;
  ASSERT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/video/1000"})")));
  ASSERT_TRUE(folders.Save());
  EXPECT_FALSE(folders.Upsert(result, ParseJson(R"({"path":"/video/1001"})")));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_EXCEED_MAX_FOLDER);
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N Exceed max folder size"));

  Folders full;
  ASSERT_TRUE(full.Load());
  EXPECT_TRUE(full.Upsert(result, ParseJson(R"({"path":"/photo/5","audio":true})")));
  EXPECT_EQ(result, Report("0101"));
}

TEST_F(FoldersTest, MostSuitableSettingIsTheLastEnclosingFolder) {
  EXPECT_EQ(GetMostSuitableCfg({}, volume + "/photo"), Json::Value(Json::objectValue));
  std::vector<Folder> folders(3);
  folders[0].Load("/gone", ParseJson(R"({"name":"gone"})"));
  folders[1].Load("/photo", ParseJson(R"({"name":"outer"})"));
  folders[2].Load("/photo/2019", ParseJson(R"({"name":"inner"})"));
  log.Clear();
  ErrorHandler::SetError(FILEINDEX_ERR_NONE);
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photo/2019/x")["name"], "inner");
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photo/2019")["name"], "inner");
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photo/20")["name"], "outer");
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photos"), Json::Value(Json::objectValue));
  std::swap(folders[1], folders[2]);
  EXPECT_EQ(GetMostSuitableCfg(folders, volume + "/photo/2019/x")["name"], "outer");
  // The folder whose share is gone is passed over without a word.
  EXPECT_THAT(log.Lines(), IsEmpty());
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NONE);
}

}  // namespace
}  // namespace WEZO::FILEINDEX
