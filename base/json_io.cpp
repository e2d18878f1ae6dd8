#include "json_io.h"

#include <json/reader.h>
#include <json/value.h>
#include <json/writer.h>

#include <memory>
#include <sstream>

#include "file_io.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

Json::CharReader& Reader() {
  thread_local std::unique_ptr<Json::CharReader> reader = [] {
    Json::CharReaderBuilder builder;
    // Strict JSON: no comments, trailing commas, duplicate keys or text after the value. A
    // scalar is still a document, so that its caller can say what it expected instead.
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["strictRoot"] = false;
    return std::unique_ptr<Json::CharReader>(builder.newCharReader());
  }();
  return *reader;  // NOLINT(clang-analyzer-cplusplus.NewDelete): lives until the thread ends
}

Json::StreamWriter& CompactWriter() {
  thread_local std::unique_ptr<Json::StreamWriter> writer = [] {
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    builder["emitUTF8"] = true;
    return std::unique_ptr<Json::StreamWriter>(builder.newStreamWriter());
  }();
  return *writer;  // NOLINT(clang-analyzer-cplusplus.NewDelete): lives until the thread ends
}

}  // namespace

bool JsonFromFile(Json::Value& value, const std::string& path) {
  std::string text;
  return ReadWholeFile(path, text) && JsonFromString(value, text);
}

JsonSaveResult JsonToFile(const Json::Value& value, const std::string& path, mode_t mode) {
  Json::StreamWriterBuilder builder;
  builder["emitUTF8"] = true;
  return ReplaceFile(path, Json::writeString(builder, value) + "\n", mode);
}

bool JsonFromString(Json::Value& value, const char* text, size_t size) {
  Json::Value parsed;
  try {
    if (!Reader().parse(text, text + size, &parsed, nullptr)) {
      return false;
    }
  } catch (const Json::Exception&) {
    // Nesting deeper than the reader's limit throws instead of failing the parse.
    return false;
  }
  value.swap(parsed);
  return true;
}

std::string JsonToString(const Json::Value& value) {
  std::ostringstream out;
  CompactWriter().write(value, &out);
  return out.str();
}

}  // namespace FILEINDEX
}  // namespace WEZO
