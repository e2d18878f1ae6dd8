// Case-insensitive comparison of UTF-8 text through ICU's full case folding.
#include <unicode/stringoptions.h>
#include <unicode/ustring.h>
#include <unicode/utypes.h>
#include <wezo/platform.h>

#include <cstring>
#include <string>

namespace {

// Converts well-formed UTF-8 to UTF-16; false for ill-formed input.
bool ToUtf16(const char* utf8, std::u16string& out) {
  UErrorCode err = U_ZERO_ERROR;
  int32_t length = 0;
  u_strFromUTF8(nullptr, 0, &length, utf8, -1, &err);
  if (err != U_BUFFER_OVERFLOW_ERROR && U_FAILURE(err)) {
    return false;
  }
  out.resize(static_cast<size_t>(length));
  err = U_ZERO_ERROR;
  u_strFromUTF8(out.data(), length, nullptr, utf8, -1, &err);
  return U_SUCCESS(err);
}

}  // namespace

extern "C" {

int WLIBCUnicodeUTF8StrCaseCmp(const char* szA, const char* szB) {
  if (szA == nullptr || szB == nullptr) {
    return (szA != nullptr ? 1 : 0) - (szB != nullptr ? 1 : 0);
  }
  std::u16string a;
  std::u16string b;
  if (!ToUtf16(szA, a) || !ToUtf16(szB, b)) {
    return std::strcmp(szA, szB);
  }
  // Code point order, so that text that differs beyond case sorts as its UTF-8 bytes do.
  UErrorCode err = U_ZERO_ERROR;
  const int32_t result = u_strCaseCompare(a.data(), static_cast<int32_t>(a.size()), b.data(),
                                          static_cast<int32_t>(b.size()),
                                          U_FOLD_CASE_DEFAULT | U_COMPARE_CODE_POINT_ORDER, &err);
  return U_SUCCESS(err) ? result : std::strcmp(szA, szB);
}

}  // extern "C"
