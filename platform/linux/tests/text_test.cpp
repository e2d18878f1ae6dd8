#include <gtest/gtest.h>
#include <wezo/platform.h>

#include <set>
#include <string>
#include <thread>

namespace {

int Sign(int v) { return (v > 0) - (v < 0); }

TEST(TextTest, ComparesUtf8WithUnicodeCaseFoldingInAStrictWeakOrderOfAnyBytes) {
  const struct {
    const char* a;
    const char* b;
    int sign;
  } cases[] = {
      {"abc", "ABC", 0},
      {"\xC3\x89t\xC3\xA9", "\xC3\xA9T\xC3\x89", 0},  // Été, éTÉ
      {"Stra\xC3\x9F\x65", "STRASSE", 0},             // Straße: full folding
      {"\xCE\xA3\xCE\xA3", "\xCF\x83\xCF\x82", 0},    // ΣΣ, σς
      {"a", "B", -1},
      {"ab", "A", 1},
      {"z", "\xC3\xA9", -1},                     // code point order
      {"\xEF\xBC\xA1", "\xF0\x9F\x98\x80", -1},  // U+FF21 before U+1F600
      {"A\xFF", "a\xFF", 0},                     // a stray byte stands for itself
      {"Z\xFF", "a", 1},                         // ... and folding goes on around it
      {"\xC3", "\xC3\xA9", -1},                  // truncated sequence
      {"\xED\xA0\x80", "\xED\xA0\x80", 0},       // encoded surrogate
      {"\xC0\xAF", "/", 1},                      // overlong "/" is not "/"
  };
  // Hex escapes end where a letter follows: "\x62" is 'b'.
  std::set<std::string> texts = {"",          "b",           "\xFF",
                                 "\x80",      "0",           "e",
                                 "a\x80\x62", "A\x80\x42",   "\xE2\x82\xAC\xFF",
                                 "\xE2\x82",  "\xE2\x82\xAC"};
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.a) + " vs " + c.b);
    EXPECT_EQ(Sign(WLIBCUnicodeUTF8StrCaseCmp(c.a, c.b)), c.sign);
    EXPECT_EQ(Sign(WLIBCUnicodeUTF8StrCaseCmp(c.b, c.a)), -c.sign);
    texts.insert({c.a, c.b});
  }
  for (const std::string& a : texts) {
    for (const std::string& b : texts) {
      const int ab = Sign(WLIBCUnicodeUTF8StrCaseCmp(a.c_str(), b.c_str()));
      ASSERT_EQ(ab, -Sign(WLIBCUnicodeUTF8StrCaseCmp(b.c_str(), a.c_str()))) << a << " vs " << b;
      for (const std::string& c : texts) {
        const int bc = Sign(WLIBCUnicodeUTF8StrCaseCmp(b.c_str(), c.c_str()));
        if (ab <= 0 && bc <= 0) {
          ASSERT_LE(Sign(WLIBCUnicodeUTF8StrCaseCmp(a.c_str(), c.c_str())), ab + bc < 0 ? -1 : 0)
              << a << " <= " << b << " <= " << c;
        }
      }
    }
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
