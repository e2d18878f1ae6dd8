#include <unistd.h>
#include <wezo/platform.h>

#include <set>
#include <thread>
#include <tuple>

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
  Write("ok", "#!/bin/sh\nexit 0\n", 0755);
  const char* const alone[] = {"ok", nullptr};  // no argument past the program's name
  EXPECT_EQ(WLIBCExecv(At("ok").c_str(), alone, 1), 0);
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

TEST_F(ExecTest, ControlsServicesThroughSystemctlAndKeepsTheLastErrorPerThread) {
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
  std::thread([] {  // each thread has its own last error
    EXPECT_EQ(WLIBCErrGet(), 0);
    WLIBCErrSetEx(1, nullptr, 1);
    EXPECT_STREQ(WLIBCErrorGetFile(), "");
  })
      .join();
  EXPECT_EQ(WLIBCErrGet(), WEZO::PLATFORM::kErrProgram);
  EXPECT_STREQ(WLIBCErrorGetFile(), "exec.cpp");
  EXPECT_GT(WLIBCErrorGetLine(), 0);
  ASSERT_EQ(unlink(At("usr/bin/systemctl").c_str()), 0);
  EXPECT_LT(WLIBServiceStop("samba", 1), 0);
}

int Cmp(const std::string& a, const std::string& b) {
  const int v = WLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str());
  return (v > 0) - (v < 0);
}

TEST(TextTest, ComparesUtf8WithUnicodeCaseFoldingInAStrictWeakOrderOfAnyBytes) {
  const std::tuple<const char*, const char*, int> kCases[] = {
      {"\xC3\x89t\xC3\xA9", "\xC3\xA9T\xC3\x89", 0},  // Été, éTÉ
      {"Stra\xC3\x9F\x65", "STRASSE", 0},             // Straße: full folding
      {"\xCE\xA3\xCE\xA3", "\xCF\x83\xCF\x82", 0},    // ΣΣ, σς
      {"\xEF\xBC\xA1", "\xF0\x9F\x98\x80", -1},       // code point order: U+FF21 before U+1F600
      {"Z\xFF", "a", 1},         // a stray byte stands for itself, folding goes on
      {"\xC3", "\xC3\xA9", -1},  // truncated sequence
      {"\xC0\xAF", "/", 1},      // overlong "/" is not "/"
  };
  // Hex escapes end where a letter follows: "\x62" is 'b'.
  std::set<std::string> texts = {"", "ab", "\x80", "a\x80\x62", "A\x80\x42", "\xE2\x82\xAC\xFF"};
  for (const auto& [a, b, sign] : kCases) {
    EXPECT_EQ(Cmp(a, b), sign) << a << " vs " << b;
    texts.insert({a, b});
  }
  for (const std::string& a : texts) {  // antisymmetric and transitive over any bytes
    for (const std::string& b : texts) {
      ASSERT_EQ(Cmp(a, b), -Cmp(b, a)) << a << " vs " << b;
      for (const std::string& c : texts) {
        const int ab = Cmp(a, b);
        const int bc = Cmp(b, c);
        ASSERT_TRUE(ab > 0 || bc > 0 || Cmp(a, c) <= (ab + bc < 0 ? -1 : 0)) << a << b << c;
      }
    }
  }
}

}  // namespace
