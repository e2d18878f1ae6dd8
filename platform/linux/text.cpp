// Case-insensitive comparison of UTF-8 text through ICU's full case folding.
//
// Each string is turned into a sort key of its own and the keys are compared byte by byte, so the
// comparison is a strict weak ordering over all byte strings, well-formed UTF-8 or not: sorting
// needs that, and comparing a pair one way when both are well-formed and another way otherwise
// made cycles ("Z\xFF" < "a" < "B" < "Z\xFF").
#include <unicode/stringoptions.h>
#include <unicode/ustring.h>
#include <unicode/utf16.h>
#include <unicode/utf8.h>
#include <unicode/utypes.h>
#include <wezo/platform.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>

namespace {

// Appends `run` (well-formed UTF-16), case-folded, to `key` as UTF-8, and empties `run`.
// `folded` is scratch space.
void AppendFolded(std::u16string& run, std::u16string& folded, std::string& key) {
  if (run.empty()) {
    return;
  }
  // Full folding turns one unit into at most three; should that change, ICU says how many.
  folded.resize(run.size() * 3);
  int32_t length = 0;
  UErrorCode err = U_BUFFER_OVERFLOW_ERROR;
  while (err == U_BUFFER_OVERFLOW_ERROR) {
    folded.resize(std::max(folded.size(), static_cast<size_t>(length)));
    err = U_ZERO_ERROR;
    length = u_strFoldCase(folded.data(), static_cast<int32_t>(folded.size()), run.data(),
                           static_cast<int32_t>(run.size()), U_FOLD_CASE_DEFAULT, &err);
  }
  if (U_FAILURE(err)) {
    // Not for well-formed input; the unfolded text still gives every string one key.
    folded = run;
    length = static_cast<int32_t>(run.size());
  }
  const size_t start = key.size();
  key.resize(start + static_cast<size_t>(length) * 3);  // a UTF-16 unit is at most 3 bytes
  int32_t written = 0;
  err = U_ZERO_ERROR;
  u_strToUTF8(&key[start], static_cast<int32_t>(key.size() - start), &written, folded.data(),
              length, &err);
  key.resize(start + (U_SUCCESS(err) ? static_cast<size_t>(written) : 0));
  run.clear();
}

// The sort key of `text`: its well-formed UTF-8 sequences with full default case folding, still
// in UTF-8 (whose byte order is code point order), and every byte that belongs to no well-formed
// sequence kept as it is, so "A\xFF" and "a\xFF" are equal and "\xC0\xAF" is not "/".
std::string SortKey(const char* text) {
  const auto* bytes = reinterpret_cast<const uint8_t*>(text);
  const auto length = static_cast<int32_t>(std::strlen(text));
  std::string key;
  key.reserve(static_cast<size_t>(length));
  std::u16string run;
  std::u16string folded;
  int32_t i = 0;
  while (i < length) {
    const int32_t start = i;
    if (bytes[i] < 0x80) {
      // ASCII folds to itself but for A-Z, and folding never looks at a code point's neighbours.
      AppendFolded(run, folded, key);
      const char c = text[i++];
      key += c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
      continue;
    }
    UChar32 c = 0;
    U8_NEXT(bytes, i, length, c);
    if (c < 0) {
      // One byte at a time: the rest of an ill-formed sequence gets the same treatment on its own.
      AppendFolded(run, folded, key);
      key += text[start];
      i = start + 1;
    } else if (U_IS_BMP(c)) {
      run += static_cast<char16_t>(c);
    } else {
      run += static_cast<char16_t>(U16_LEAD(c));
      run += static_cast<char16_t>(U16_TRAIL(c));
    }
  }
  AppendFolded(run, folded, key);
  return key;
}

}  // namespace

extern "C" {

int WLIBCUnicodeUTF8StrCaseCmp(const char* szA, const char* szB) {
  if (szA == nullptr || szB == nullptr) {
    return (szA != nullptr ? 1 : 0) - (szB != nullptr ? 1 : 0);
  }
  const std::string a = SortKey(szA);
  const std::string b = SortKey(szB);
  const int result = std::memcmp(a.data(), b.data(), std::min(a.size(), b.size()));
  if (result != 0) {
    return result < 0 ? -1 : 1;
  }
  return (a.size() > b.size() ? 1 : 0) - (a.size() < b.size() ? 1 : 0);
}

}  // extern "C"
