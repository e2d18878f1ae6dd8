#include <unistd.h>
#include <wezo/platform.h>

#include <string>

#include "internal.h"
#include "sandbox.h"

namespace {

using ExecTest = SandboxTest;

TEST_F(ExecTest, OnlyAProgramThatExitsWithZeroSucceedsAndArgumentsPassVerbatim) {
  Write("exit3", "#!/bin/sh\nexit 3\n", 0755);
  Write("killed", "#!/bin/sh\nkill -TERM $$\n", 0755);
  Write("plain", "#!/bin/sh\nexit 0\n", 0644);
  for (const std::string& program : {At("exit3"), At("killed"), At("plain"), At("missing")}) {
    const char* const argv[] = {program.c_str(), nullptr};
    EXPECT_LT(WLIBCExec(program.c_str(), nullptr, nullptr, nullptr, nullptr), 0) << program;
    EXPECT_LT(WLIBCExecv(program.c_str(), argv, 1), 0) << program;
    EXPECT_NE(WLIBCErrGet(), 0) << program;
  }
  // No shell: every argument arrives as it was given.
  Write("record", "#!/bin/sh\nout=$1\nshift\nprintf '%s\\n' \"$@\" > \"$out\"\n", 0755);
  const std::string program = At("record");
  const std::string out = At("args");
  const char* const argv[] = {"x", out.c_str(), "a b", "$HOME", "*", "; touch x", "", nullptr};
  ASSERT_EQ(WLIBCExecv(program.c_str(), argv, 1), 0);
  EXPECT_EQ(Read("args"), "a b\n$HOME\n*\n; touch x\n\n");
  ASSERT_EQ(WLIBCExec(program.c_str(), out.c_str(), "a", "b", "c"), 0);
  EXPECT_EQ(Read("args"), "a\nb\nc\n");
  ASSERT_EQ(WLIBCExec(program.c_str(), out.c_str(), "`id`", nullptr, "ignored"), 0);
  EXPECT_EQ(Read("args"), "`id`\n");  // the first null argument ends the list
}

TEST_F(ExecTest, ControlsServicesThroughSystemctl) {
  // Stands in for systemctl: records its arguments, exits with the status in "status".
  Write("usr/bin/systemctl",
        "#!/bin/sh\nd=$(dirname \"$0\")\necho \"$@\" >> \"$d/calls\"\n"
        "exit $(cat \"$d/status\" 2>/dev/null || echo 0)\n",
        0755);
  EXPECT_EQ(WLIBServiceStart("fileindexd", 1) | WLIBServiceStop("samba", 1) |
                WLIBServiceRestart("samba") | WLIBServiceRestart("fileindexd"),
            0);
  EXPECT_LT(WLIBServiceRestart(nullptr), 0);
  EXPECT_LT(WLIBServiceStart("nfs", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WLIBC_ERR_BAD_PARAMETERS);
  EXPECT_EQ(Read("usr/bin/calls"),
            "start fileindexd.service\nstop smbd.service\nreload-or-restart smbd.service\n"
            "restart fileindexd.service\n");
  Write("usr/bin/status", "1\n");
  EXPECT_LT(WLIBServiceStart("fileindexd", 1), 0);
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrProgram);
  EXPECT_STREQ(WLIBCErrorGetFile(), "exec.cpp");
  ASSERT_EQ(unlink(At("usr/bin/systemctl").c_str()), 0);
  EXPECT_LT(WLIBServiceStop("samba", 1), 0);
}

}  // namespace
