#include <unistd.h>
#include <wezo/platform.h>

#include <string>

#include "internal.h"
#include "sandbox.h"

namespace {

using ExecTest = SandboxTest;

TEST_F(ExecTest, OnlyAProgramThatExitsWithZeroSucceeds) {
  Write("exit3", "#!/bin/sh\nexit 3\n", 0755);
  Write("killed", "#!/bin/sh\nkill -TERM $$\n", 0755);
  Write("plain", "#!/bin/sh\nexit 0\n", 0644);
  const struct {
    std::string program;
    bool succeeds;
  } cases[] = {{"/bin/true", true},   {"/bin/false", false}, {At("exit3"), false},
               {At("killed"), false}, {At("plain"), false},  {At("missing"), false}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.program);
    const char* const argv[] = {c.program.c_str(), nullptr};
    EXPECT_EQ(WLIBCExec(c.program.c_str(), nullptr, nullptr, nullptr, nullptr) == 0, c.succeeds);
    EXPECT_EQ(WLIBCExecv(c.program.c_str(), argv, 1) == 0, c.succeeds);
    EXPECT_EQ(WLIBCErrGet() != 0, !c.succeeds);
    WLIBCErrSetEx(0, "", 0);
  }
}

TEST_F(ExecTest, PassesArgumentsVerbatimWithoutAShell) {
  Write("record", "#!/bin/sh\nout=$1\nshift\nprintf '%s\\n' \"$@\" > \"$out\"\n", 0755);
  const std::string program = At("record");
  const std::string out = At("args");
  const char* const argv[] = {"x", out.c_str(), "a b", "$HOME", "*", "; touch x", "", nullptr};
  ASSERT_EQ(WLIBCExecv(program.c_str(), argv, 1), 0);
  EXPECT_EQ(Read("args"), "a b\n$HOME\n*\n; touch x\n\n");
  ASSERT_EQ(WLIBCExec(program.c_str(), out.c_str(), "a", "b", "c"), 0);
  EXPECT_EQ(Read("args"), "a\nb\nc\n");
  // The first null argument ends the list.
  ASSERT_EQ(WLIBCExec(program.c_str(), out.c_str(), "`id`", nullptr, "ignored"), 0);
  EXPECT_EQ(Read("args"), "`id`\n");
}

TEST_F(ExecTest, ControlsServicesThroughSystemctl) {
  // Stands in for systemctl: records its arguments, exits with the status in "status".
  Write("usr/bin/systemctl",
        "#!/bin/sh\nd=$(dirname \"$0\")\necho \"$@\" >> \"$d/calls\"\n"
        "exit $(cat \"$d/status\" 2>/dev/null || echo 0)\n",
        0755);
  EXPECT_EQ(WLIBServiceStart("fileindexd", 1), 0);
  EXPECT_EQ(WLIBServiceStop("samba", 1), 0);
  EXPECT_EQ(WLIBServiceRestart("samba"), 0);
  EXPECT_EQ(WLIBServiceRestart("fileindexd"), 0);
  EXPECT_LT(WLIBServiceStart("nfs", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
  EXPECT_LT(WLIBServiceRestart(nullptr), 0);
  EXPECT_EQ(Read("usr/bin/calls"),
            "start fileindexd.service\nstop smbd.service\nreload-or-restart smbd.service\n"
            "restart fileindexd.service\n");

  Write("usr/bin/status", "1\n");
  EXPECT_LT(WLIBServiceStart("fileindexd", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrProgram);
  EXPECT_STREQ(WLIBCErrorGetFile(), "exec.cpp");
  EXPECT_GT(WLIBCErrorGetLine(), 0);
  ASSERT_EQ(unlink(At("usr/bin/systemctl").c_str()), 0);
  EXPECT_LT(WLIBServiceStop("samba", 1), 0);
}

}  // namespace
