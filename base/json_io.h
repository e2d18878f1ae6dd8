// The four whole-document JSON operations of the library, on jsoncpp's reader and writer.
//
// None of them logs; the caller decides what a failure means. The parser takes strict JSON (no
// comments, trailing commas, duplicate keys or text after the value) and keeps one reader per
// thread, so parsing many short texts, such
// as the lines of an event queue, costs no allocation of a reader per call.
#ifndef FILEINDEX_BASE_JSON_IO_H_
#define FILEINDEX_BASE_JSON_IO_H_

#include <json/value.h>
#include <sys/types.h>

#include <cstddef>
#include <string>

#include "file_io.h"

namespace WEZO {
namespace FILEINDEX {

// Parses the whole file at `path` into `value`. Returns false, leaving `value` as it was, when the
// file cannot be read or does not parse. Follows symbolic links; callers that must not, test
// first.
bool JsonFromFile(Json::Value& value, const std::string& path);

// kReplaced, kReplacedModeNotSet or kFailed, as ReplaceFile (file_io.h) says.
using JsonSaveResult = ReplaceResult;

// Replaces the file at `path` with `value` rendered as an indented document: writes a temporary
// file in the same directory, flushes it to disk, gives it `mode` and renames it over `path`, so
// a reader sees the old file or the new one and never a part of either. The temporary file is
// removed on every failure. The directory must exist.
JsonSaveResult JsonToFile(const Json::Value& value, const std::string& path, mode_t mode);

// Parses `text` (the `size` bytes at `text`) into `value`. Returns false, leaving `value` as it
// was, when it is not exactly one JSON value, optionally surrounded by white space, or nests
// deeper than 1000 levels. Never throws.
bool JsonFromString(Json::Value& value, const char* text, size_t size);
inline bool JsonFromString(Json::Value& value, const std::string& text) {
  return JsonFromString(value, text.data(), text.size());
}

// Renders `value` as compact JSON on one line: no newline, no indentation, non-ASCII text as
// UTF-8, control characters, '"' and '\\' escaped.
std::string JsonToString(const Json::Value& value);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_JSON_IO_H_
