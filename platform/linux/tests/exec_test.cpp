#include <wezo/platform.h>

#include <string>

#include "internal.h"
#include "sandbox.h"

namespace {

using ExecTest = SandboxTest;

// Writes each argument it gets on a line of its own to the file named by its first argument.
const char* const kRecorder = "#!/bin/sh\nout=$1\nshift\nprintf '%s\\n' \"$@\" > \"$out\"\n";

TEST_F(ExecTest, OnlyAProgramThatExitsWithZeroSucceeds) {
  Write("bin/exit3", "#!/bin/sh\nexit 3\n", 0755);
  Write("bin/killed", "#!/bin/sh\nkill -TERM $$\n", 0755);
  Write("bin/plain", "#!/bin/sh\nexit 0\n", 0644);
  const struct {
    std::string program;
    bool succeeds;
  } cases[] = {
      {"/bin/true", true},          {"/bin/false", false},       {At("bin/exit3"), false},
      {At("bin/killed"), false},    {At("bin/plain"), false},    {At("bin/missing"), false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.program);
    const char* const argv[] = {c.program.c_str(), nullptr};
    EXPECT_EQ(WLIBCExec(c.program.c_str(), nullptr, nullptr, nullptr, nullptr) == 0, c.succeeds);
    EXPECT_EQ(WLIBCExecv(c.program.c_str(), argv, 1) == 0, c.succeeds);
    if (!c.succeeds) {
      EXPECT_NE(WLIBCErrGet(), 0);
    }
  }
}

TEST_F(ExecTest, PassesArgumentsVerbatimWithoutAShell) {
  Write("bin/record", kRecorder, 0755);
  const std::string program = At("bin/record");
  const std::string out = At("args");
  const char* const argv[] = {program.c_str(), out.c_str(), "a b", "$HOME", "*", "; touch x",
                              "", nullptr};
  ASSERT_EQ(WLIBCExecv(program.c_str(), argv, 1), 0);
  EXPECT_EQ(Read("args"), "a b\n$HOME\n*\n; touch x\n\n");

  // The first null argument ends the list.
  ASSERT_EQ(WLIBCExec(program.c_str(), out.c_str(), "`id`", nullptr, "ignored"), 0);
  EXPECT_EQ(Read("args"), "`id`\n");
}

class ServiceTest : public SandboxTest {
 protected:
  void SetUp() override {
    SandboxTest::SetUp();
    // Stands in for systemctl: records its arguments, exits with the status in "status".
    Write("usr/bin/systemctl",
          "#!/bin/sh\nd=$(dirname \"$0\")\necho \"$@\" >> \"$d/calls\"\n"
          "exit $(cat \"$d/status\" 2>/dev/null || echo 0)\n",
          0755);
  }
};

TEST_F(ServiceTest, MapsServicesToSystemdUnits) {
  const struct {
    int (*op)(const char*);
    const char* service;
    const char* call;
  } cases[] = {
      {[](const char* s) { return WLIBServiceStart(s, 1); }, "fileindexd",
       "start fileindexd.service\n"},
      {[](const char* s) { return WLIBServiceStop(s, 1); }, "samba", "stop smbd.service\n"},
      {WLIBServiceRestart, "samba", "restart smbd.service\n"},
  };
  std::string calls;
  for (const auto& c : cases) {
    EXPECT_EQ(c.op(c.service), 0);
    calls += c.call;
    EXPECT_EQ(Read("usr/bin/calls"), calls);
  }
  EXPECT_LT(WLIBServiceStart("nfs", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
  EXPECT_LT(WLIBServiceRestart(nullptr), 0);
  EXPECT_EQ(Read("usr/bin/calls"), calls);
}

TEST_F(ServiceTest, AFailingSystemctlIsAFailureWithItsSource) {
  Write("usr/bin/status", "1\n");
  WLIBCErrSetEx(0, "", 0);
  EXPECT_LT(WLIBServiceStart("fileindexd", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrProgram);
  EXPECT_STREQ(WLIBCErrorGetFile(), "exec.cpp");
  EXPECT_GT(WLIBCErrorGetLine(), 0);

  ASSERT_EQ(unlink(At("usr/bin/systemctl").c_str()), 0);
  EXPECT_LT(WLIBServiceStop("samba", 1), 0);
}

}  // namespace
