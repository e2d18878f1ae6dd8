#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

class StatusTest : public testsupport::LibraryTest {
 protected:
  void LoadText(Status& status, const std::string& text) {
    WriteFile(StatusConfPath(), text);
    ASSERT_TRUE(status.Load());
  }
};

TEST_F(StatusTest, ValuesReadWithoutThrowingAndFlagsAreKeptByPresence) {
  const std::pair<const char*, long long> kPause[] = {
      // 42: refused
      {"{}", -1},
      {R"({"resume_time":4102444800})", 4102444800LL},
      {"[1]", 42},
      {R"({"resume_time":"abc"})", 42},
      {R"({"resume_time":1e30})", 42}};
  Status status;
  for (const auto& [file, expected] : kPause) {
    LoadText(status, file);
    log.Clear();
    long long resumeTime = 42;
    EXPECT_EQ(status.GetPauseInfo(resumeTime), expected != 42) << file;
    EXPECT_EQ(resumeTime, expected) << file;
    EXPECT_EQ(log.Lines(), expected != 42 ? Lines{} : Lines{"status:N json exception"}) << file;
  }
  LoadText(status, R"({"one":1,"zero":0,"text":"yes","null":null,"need_reindex":{"video":false},
                      "no_space":"corrupt"})");
  for (const char* key : {"zero", "text", "null", "absent"}) EXPECT_FALSE(status.IsUpdated(key));
  EXPECT_TRUE(status.IsUpdated("one") && status.ShareIsNeedReindex("video"));
  EXPECT_FALSE(status.ShareIsNoSpace("corrupt"));
  status.ShareSetNeedReindex("video", false);
  status.ShareSetNeedReindex("photo", false);
  status.ShareSetNoSpace("photo", true);
  ASSERT_TRUE(status.Save());
  EXPECT_EQ(StatusFile()["need_reindex"], Json::Value(Json::objectValue));
  EXPECT_EQ(StatusFile()["no_space"], ParseJson(R"({"photo":true})"));
  // A status file that is not an object holds nothing; the first change starts a new one.
  LoadText(status, "[true]");
  EXPECT_FALSE(status.IsUpdated("0") || status.ShareIsNoSpace("photo"));
  status.SetUpdated("x");
  ASSERT_TRUE(status.Save());
  EXPECT_EQ(StatusFile(), ParseJson(R"({"x":true})"));
}

TEST_F(StatusTest, NoSpaceNotifiesTheAdministratorsWithTheExactCommandLine) {
  Status status;
  status.ShareSetNoSpace("photo", true);
  auto runs = fake::Get().CallsTo("WLIBCExecv");
  ASSERT_EQ(runs.size(), 1U);
  const std::string tool = NotifyToolPath();
  EXPECT_THAT(runs[0].args, ElementsAre(tool, tool, "-e", "false", "-c",
                                        "WEZO.RKS.AdminCenter.Application", "@administrators",
                                        "fileindex:fileindex_title", "fileindex:notify_no_space",
                                        "<a data-wezo-app=\"WEZO.RKS.AdminCenter.Application\" "
                                        "data-wezo-fn=\"WEZO.RKS.AdminCenter.MediaIndex.Main\" "
                                        "data-wezo-tab=\"fileIndex\">",
                                        "</a>", "1"));
  // A notice that fails does not keep the flag from being set.
  status.ShareSetNoSpace("photo", false);
  fake::Get().execResult = 1;
  EXPECT_TRUE(status.ShareSetNoSpace("photo", true));
  EXPECT_TRUE(status.ShareIsNoSpace("photo"));
  EXPECT_EQ(log.Lines(), Lines{"status:N NotifyNoSpace failed"});
}

}  // namespace
}  // namespace WEZO::FILEINDEX
