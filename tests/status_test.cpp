#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include <string>

#include "fake_platform.h"
#include "fileindex/status.h"
#include "fileindex/utils.h"
#include "paths.h"
#include "test_support.h"

namespace WEZO::FILEINDEX {
namespace {

using ::testing::ElementsAre;
using Lines = std::vector<std::string>;

class StatusTest : public testsupport::LibraryTest {
 protected:
  // A status object loaded from a status file holding `text`.
  void LoadText(Status& status, const std::string& text) {
    testsupport::WriteFile(StatusConfPath(), text);
    ASSERT_TRUE(status.Load());
  }
};

TEST_F(StatusTest, ValuesReadWithoutThrowingAndRefuseWhatIsNotTheirType) {
  const std::pair<const char*, long long> kPause[] = {
      // 42: refused
      {"{}", -1},
      {R"({"resume_time":4102444800})", 4102444800LL},
      {"[1]", 42},
      {R"({"resume_time":"abc"})", 42},
      {R"({"resume_time":1e30})", 42}};
  for (const auto& [file, expected] : kPause) {
    SCOPED_TRACE(file);
    Status status;
    LoadText(status, file);
    log.Clear();
    long long resumeTime = 42;
    EXPECT_EQ(status.GetPauseInfo(resumeTime), expected != 42);
    EXPECT_EQ(resumeTime, expected);
    EXPECT_EQ(log.Lines(), expected != 42 ? Lines{} : Lines{"status:N json exception"});
  }
  Status status;
  LoadText(status, R"({"t":true,"one":1,"zero":0,"text":"yes","obj":{},"null":null})");
  for (const char* key : {"t", "one", "zero", "text", "obj", "null", "absent"}) {
    EXPECT_EQ(status.IsUpdated(key), key == std::string("t") || key == std::string("one")) << key;
  }
  // A status file that is not an object holds nothing; the first change starts a new one.
  LoadText(status, "[true]");
  EXPECT_FALSE(status.IsUpdated("0") || status.ShareIsNoSpace("photo"));
  status.SetUpdated("x");
  ASSERT_TRUE(status.Save());
  EXPECT_EQ(StatusFile(), testsupport::ParseJson(R"({"x":true})"));
}

TEST_F(StatusTest, ShareFlagsAreAddedAndRemovedByPresence) {
  Status status;
  LoadText(status, R"({"need_reindex":{"video":false},"no_space":"corrupt","marker":true})");
  EXPECT_TRUE(status.ShareIsNeedReindex("video"));
  EXPECT_FALSE(status.ShareIsNoSpace("corrupt"));
  status.ShareSetNeedReindex("video", false);
  status.ShareSetNeedReindex("photo", false);
  status.ShareSetNoSpace("photo", true);
  ASSERT_TRUE(status.Save());
  EXPECT_EQ(StatusFile(), testsupport::ParseJson(R"({"need_reindex":{},"no_space":{"photo":true},
                                                    "marker":true})"));
  status.ShareSetNeedReindex("photo", true);
  EXPECT_FALSE(status.ShareIsNeedReindex("Photo"));
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
