#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "fake_platform.h"
#include "fileindex/error.h"
#include "fileindex/folder.h"
#include "fileindex/folders.h"
#include "json_io.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

using testsupport::ParseJson;

std::vector<std::string> PathsOf(const std::vector<Folder>& folders) {
  std::vector<std::string> paths;
  paths.reserve(folders.size());
  for (const Folder& folder : folders) {
    paths.push_back(folder.GetPath());
  }
  return paths;
}

std::vector<std::string> PathsOf(const Json::Value& page) {
  std::vector<std::string> paths;
  for (const Json::Value& folder : page["folder"]) {
    paths.push_back(folder["path"].asString());
  }
  return paths;
}

Json::Value Report(bool document, bool audio, bool video, bool photo) {
  Json::Value report;
  report["document"] = document;
  report["audio"] = audio;
  report["video"] = video;
  report["photo"] = photo;
  return report;
}

class FoldersTest : public testsupport::LibraryTest {
 protected:
  // Writes `text` as the folder list and loads it into `folders`.
  static void LoadText(Folders& folders, const std::string& text) {
    testsupport::WriteFile(FolderConfPath(), text);
    ASSERT_TRUE(folders.Load());
  }
};

TEST_F(FoldersTest, FolderKeepsWhatTheObjectLacksAndStillReadsFieldsOfAnUnknownShare) {
  Folder folder;
  ASSERT_TRUE(
      folder.Load("/photo/2019", ParseJson(R"({"name":"2019","audio":true,"photo":true})")));
  ASSERT_TRUE(
      folder.Load("/photo/2019", ParseJson(R"({"audio":"false","video":1,"document":true})")));
  EXPECT_EQ(folder.asJson(), ParseJson(R"({"path":"/photo/2019","name":"2019","document":true,
                                       "audio":true,"video":false,"photo":true})"));
  EXPECT_EQ(folder.GetFullPath(), volume + "/photo/2019");

  ASSERT_TRUE(folder.Reload("/photo/2019", ParseJson(R"({"video":true})")));
  EXPECT_EQ(folder.asJson(), ParseJson(R"({"path":"/photo/2019","name":"","document":false,
                                       "audio":false,"video":true,"photo":false})"));

  Folder gone;
  EXPECT_FALSE(gone.Load("/gone/a", ParseJson(R"({"name":"A"})")));
  EXPECT_EQ(gone.GetName(), "A");
  EXPECT_EQ(gone.GetFullPath(), "");
  EXPECT_THAT(log.Lines(), ElementsAre("folder:N Failed to get full path from /gone/a"));

  Json::Value array(Json::arrayValue);
  EXPECT_FALSE(gone.AddToJson(array));
  EXPECT_EQ(array, Json::Value(Json::arrayValue));
}

TEST_F(FoldersTest, AdditionalValuesKeepGoingPastAnUnknownNameButNotPastANonString) {
  std::filesystem::create_directories(volume + "/photo/2019");
  Folder folder;
  ASSERT_TRUE(folder.SetPath("/photo/2019"));

  Json::Value obj = folder.asJson(ParseJson(R"(["bogus","is_valid"])"));
  EXPECT_EQ(obj["additional"], ParseJson(R"({"bogus":null,"is_valid":true})"));
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_BAD_PARAM);
  EXPECT_THAT(log.Lines(), ElementsAre("folder:N Unknown additional: bogus",
                                       "folder:N Failed to get additional: bogus"));

  struct Case {
    const char* names;
    const char* additional;
    const char* badParam;
  };
  const Case cases[] = {{R"("is_valid")", "{}", R"("is_valid")"},
                        {R"(["is_valid",1,"bogus"])", R"({"is_valid":true})", "1"}};
  for (const Case& c : cases) {
    log.Clear();
    obj = folder.asJson(ParseJson(c.names));
    EXPECT_EQ(obj["additional"], ParseJson(c.additional)) << c.names;
    EXPECT_EQ(obj["path"], "/photo/2019");
    EXPECT_THAT(log.Lines(), ElementsAre(std::string("folder:N Bad param: ") + c.badParam,
                                         "folder:N GetAdditional failed"));
  }
}

TEST_F(FoldersTest, FileRoundTripWritesKeyOrderAndIgnoresTheStoredPath) {
  Folders folders;
  LoadText(folders, R"({"/video/b":{"path":"/elsewhere","name":"B","video":true},
                        "/gone/a":{"name":"A"},
                        "/photo":7,
                        "/photo/2019":{"name":"2019","photo":true,"document":false,
                                       "audio":false,"video":false}})");
  std::vector<Folder> all;
  folders.List(all);
  EXPECT_THAT(PathsOf(all), ElementsAre("/gone/a", "/photo", "/photo/2019", "/video/b"));
  Json::Value b;
  ASSERT_TRUE(folders.Get(b, "/video/b"));
  EXPECT_EQ(b["path"], "/video/b");
  Json::Value photo;
  ASSERT_TRUE(folders.Get(photo, "/photo"));
  EXPECT_EQ(photo, ParseJson(R"({"path":"/photo","name":"","document":false,"audio":false,
                             "video":false,"photo":false})"));

  ASSERT_TRUE(folders.Save());
  const std::string text = testsupport::ReadFile(FolderConfPath());
  EXPECT_LT(text.find("\"/gone/a\""), text.find("\"/photo\""));
  EXPECT_LT(text.find("\"/photo\""), text.find("\"/photo/2019\""));
  EXPECT_LT(text.find("\"/photo/2019\""), text.find("\"/video/b\""));
  const Json::Value saved = ParseJson(text);
  EXPECT_EQ(saved["/video/b"], b);
  EXPECT_EQ(saved["/gone/a"]["path"], "/gone/a");
  EXPECT_EQ(testsupport::ModeOf(FolderConfPath()), 0644);
}

TEST_F(FoldersTest, OnlyAnObjectIsAFolderList) {
  struct Case {
    const char* text;  // nullptr: no file
    bool loads;
    _tag_fileindex_err_ code;
  };
  const Case cases[] = {{nullptr, true, FILEINDEX_ERR_NONE},
                        {"{}", true, FILEINDEX_ERR_NONE},
                        {"[1,2]", false, FILEINDEX_ERR_MALFORMED_FOLDERS},
                        {"\"x\"", false, FILEINDEX_ERR_MALFORMED_FOLDERS},
                        {"{", false, FILEINDEX_ERR_LOAD_JSON}};
  for (const Case& c : cases) {
    std::filesystem::remove(FolderConfPath());
    if (c.text != nullptr) {
      testsupport::WriteFile(FolderConfPath(), c.text);
    }
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
    Folders folders;
    EXPECT_EQ(folders.Load(), c.loads) << c.text;
    EXPECT_EQ(ErrorHandler::GetError(), c.code);
    std::vector<Folder> all;
    folders.List(all);
    EXPECT_THAT(all, IsEmpty());
  }
  EXPECT_THAT(log.Lines(), ElementsAre("config:N Failed to load json from " + FolderConfPath()));
}

TEST_F(FoldersTest, MalformedListIsLoggedWhole) {
  testsupport::WriteFile(FolderConfPath(), "[1, 2]");
  Folders folders;
  EXPECT_FALSE(folders.Load());
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N Malformed folders: [1,2]"));
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
  LoadText(folders, R"({"/photo/a":{"name":"delta","photo":true},
                        "/photo/B":{"name":"Charlie"},
                        "/photo/c":{"name":"bravo","photo":true},
                        "/video/d":{"name":"Alpha"}})");
  struct Case {
    unsigned long offset;
    unsigned long limit;
    const char* sortBy;
    const char* direction;
    std::vector<std::string> paths;
  };
  const Case cases[] = {
      {0, 10, "", "ASC", {"/photo/a", "/photo/B", "/photo/c", "/video/d"}},
      {1, 2, "path", "", {"/photo/B", "/photo/c"}},
      {0, 10, "name", "ASC", {"/video/d", "/photo/c", "/photo/B", "/photo/a"}},
      {0, 10, "Name", "ASC", {"/photo/a", "/photo/B", "/photo/c", "/video/d"}},
      {3, 10, "name", "asc", {"/photo/a"}},
      {0, 0, "name", "ASC", {}},
      {4, 10, "name", "ASC", {}},
      {9, 10, "name", "ASC", {}},
      // Descending pages come from the start of the ascending order, whatever the offset.
      {0, 2, "name", "DESC", {"/photo/c", "/video/d"}},
      {2, 10, "name", "DESC", {"/photo/c", "/video/d"}},
      {9, 10, "name", "DESC", {}},
      {0, 10, "name", "desc", {"/video/d", "/photo/c", "/photo/B", "/photo/a"}},
  };
  for (const Case& c : cases) {
    Json::Value page;
    ASSERT_TRUE(folders.List(page, c.offset, c.limit, c.sortBy, c.direction,
                             Json::Value(Json::arrayValue)));
    EXPECT_EQ(page["total"], 4U);
    EXPECT_EQ(page["offset"].asUInt64(), c.offset);
    EXPECT_TRUE(page["folder"].isArray());
    EXPECT_EQ(PathsOf(page), c.paths)
        << c.offset << " " << c.limit << " " << c.sortBy << " " << c.direction;
  }

  // Sorting by a kind puts the folders without it first.
  Json::Value page;
  folders.List(page, 0, 10, "photo", "ASC", Json::Value(Json::arrayValue));
  ASSERT_EQ(page["folder"].size(), 4U);
  EXPECT_FALSE(page["folder"][0]["photo"].asBool());
  EXPECT_FALSE(page["folder"][1]["photo"].asBool());
  EXPECT_TRUE(page["folder"][2]["photo"].asBool());
  EXPECT_EQ(page["folder"][0]["additional"], Json::Value(Json::objectValue));
}

TEST_F(FoldersTest, PagedListingNeedsNoConsistentOrderFromThePlatform) {
  // More folders than a sort puts in order by insertion, with names equal but for case.
  Json::Value list(Json::objectValue);
  std::vector<std::string> byteOrder;
  for (int i = 0; i < 40; ++i) {
    const std::string path = "/photo/" + std::to_string(i);
    list[path]["name"] = i % 2 == 0 ? "Trip" : "TRIP";
    byteOrder.push_back(path);
  }
  std::sort(byteOrder.begin(), byteOrder.end());
  Folders folders;
  LoadText(folders, JsonToString(list));
  const struct {
    int (*compare)(const char*, const char*);
    bool tiesInByteOrder;  // else: only each folder once
  } cases[] = {
      {nullptr, true},
      // Each string before every other: std::sort given this walks off the vector's end.
      {[](const char*, const char*) { return -1; }, false},
  };
  for (const auto& c : cases) {
    fake::Get().strCaseCmp = c.compare;
    Json::Value page;
    ASSERT_TRUE(folders.List(page, 0, 100, "name", "ASC", Json::Value(Json::arrayValue)));
    std::vector<std::string> paths = PathsOf(page);
    if (!c.tiesInByteOrder) {
      std::sort(paths.begin(), paths.end());
    }
    EXPECT_EQ(paths, byteOrder) << c.tiesInByteOrder;
  }
}

TEST_F(FoldersTest, GetOfAnUnknownPathFailsWithCodeFour) {
  Folders folders;
  LoadText(folders, R"({"/photo":{}})");
  Json::Value out = "untouched";
  EXPECT_FALSE(folders.Get(out, "/photo/"));
  EXPECT_EQ(out, "untouched");
  EXPECT_EQ(ErrorHandler::GetError(), FILEINDEX_ERR_NO_SUCH_FOLDER);
  EXPECT_THAT(log.Lines(), ElementsAre("folders:N No such folder: /photo/"));
}

TEST_F(FoldersTest, ChangeReportsCompareWithTheSettingThatApplied) {
  struct Case {
    const char* list;
    const char* request;  // upsert; nullptr with `deleted` set
    const char* deleted;
    Json::Value report;
  };
  const char* photoFolder = R"({"/photo":{"photo":true,"name":"P"}})";
  const Case cases[] = {
      {"{}", R"({"path":"/photo","photo":true})", nullptr, Report(true, true, true, true)},
      {photoFolder, R"({"path":"/photo/2019","photo":true})", nullptr,
       Report(false, false, false, false)},
      {photoFolder, R"({"path":"/photo/2019","photo":true,"audio":true})", nullptr,
       Report(false, true, false, false)},
      {photoFolder, R"({"path":"/video/x","photo":true})", nullptr, Report(true, true, true, true)},
      {photoFolder, R"({"path":"/photo","photo":false})", nullptr,
       Report(false, false, false, true)},
      {R"({"/photo":{"photo":true},"/photo/2019":{"photo":true}})", nullptr, "/photo/2019",
       Report(false, false, false, false)},
      {R"({"/photo":{"photo":true},"/photo/2019":{"photo":true}})", nullptr, "/photo",
       Report(true, true, true, true)},
      {photoFolder, nullptr, "/photo", Report(true, true, true, true)},
  };
  for (const Case& c : cases) {
    Folders folders;
    LoadText(folders, c.list);
    Json::Value result = "untouched";
    if (c.request != nullptr) {
      ASSERT_TRUE(folders.Upsert(result, ParseJson(c.request)));
      EXPECT_EQ(result, c.report) << c.list << " + " << c.request;
    } else {
      ASSERT_TRUE(folders.Delete(result, c.deleted));
      Json::Value expected;
      expected[c.deleted] = c.report;
      EXPECT_EQ(result, expected) << c.list << " - " << c.deleted;
    }
  }

  // A changed folder takes only what the request carries; the rest goes back to empty.
  Folders folders;
  LoadText(folders, photoFolder);
  Json::Value result;
  ASSERT_TRUE(folders.Upsert(result, ParseJson(R"({"path":"/photo","audio":true})")));
  Json::Value photo;
  folders.Get(photo, "/photo");
  EXPECT_EQ(photo, ParseJson(R"({"path":"/photo","name":"","document":false,"audio":true,
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
  const char* requests[] = {
      R"({})", R"({"path":5})", R"({"path":"/nosuch/a"})", R"({"path":""})", R"({"path":"/"})",
  };
  for (const char* request : requests) {
    Folders folders;
    LoadText(folders, R"({"/photo":{"photo":true}})");
    ErrorHandler::SetError(FILEINDEX_ERR_NONE);
    log.Clear();
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
  for (int i = 0; i < 999; ++i) {
    list["/photo/" + std::to_string(i)]["photo"] = true;
  }
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
  EXPECT_EQ(result, Report(false, true, false, true));
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
}  // namespace FILEINDEX
}  // namespace WEZO
