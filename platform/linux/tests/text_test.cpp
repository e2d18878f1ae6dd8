#include <gtest/gtest.h>
#include <wezo/platform.h>

#include <string>
#include <thread>

namespace {

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(TextTest, ComparesUtf8WithUnicodeCaseFolding) {
  const struct {
    const char* a;
    const char* b;
    int sign;
  } cases[] = {
      {"abc", "ABC", 0},
      {"\xC3\x89t\xC3\xA9", "\xC3\xA9T\xC3\x89", 0},  // Été, éTÉ
      {"Stra\xC3\x9F"
       "e",
       "STRASSE", 0},                               // Straße: full folding
      {"\xCE\xA3\xCE\xA3", "\xCF\x83\xCF\x82", 0},  // ΣΣ, σς
      {"a", "B", -1},
      {"ab", "A", 1},
      {"z", "\xC3\xA9", -1},                     // code point order
      {"\xEF\xBC\xA1", "\xF0\x9F\x98\x80", -1},  // U+FF21 before U+1F600
      {"A\xFF", "a\xFF", -1},                    // invalid: bytes, 'A' < 'a'
      {"\xC3", "\xC3\xA9", -1},                  // truncated sequence
      {"\xED\xA0\x80", "\xED\xA0\x80", 0},       // encoded surrogate
      {"\xC0\xAF", "/", 1},                      // overlong "/" is not "/"
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.a) + " vs " + c.b);
    EXPECT_EQ(Sign(WLIBCUnicodeUTF8StrCaseCmp(c.a, c.b)), c.sign);
    EXPECT_EQ(Sign(WLIBCUnicodeUTF8StrCaseCmp(c.b, c.a)), -c.sign);
  }
}

TEST(LastErrorTest, EachThreadHasItsOwn) {
  WLIBCErrSetEx(0x2900, "here", 7);
  std::thread([] {
    EXPECT_EQ(WLIBCErrGet(), 0);
    WLIBCErrSetEx(1, nullptr, 1);
    EXPECT_STREQ(WLIBCErrorGetFile(), "");
  }).join();
  EXPECT_EQ(WLIBCErrGet(), 0x2900);
  EXPECT_STREQ(WLIBCErrorGetFile(), "here");
  EXPECT_EQ(WLIBCErrorGetLine(), 7);
}

}  // namespace
