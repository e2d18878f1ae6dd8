#include "json_io.h"

#include <fcntl.h>
#include <json/reader.h>
#include <json/writer.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <memory>
#include <sstream>

#include "unique_fd.h"

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

bool ReadWholeFile(const std::string& path, std::string& out) {
  UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!fd) {
    return false;
  }
  std::string data;
  char buffer[65536];
  for (;;) {
    const ssize_t n = read(fd.get(), buffer, sizeof buffer);
    if (n < 0) {
      if (errno == EINTR) {
        continue;
      }
      return false;
    }
    if (n == 0) {
      break;
    }
    data.append(buffer, static_cast<size_t>(n));
  }
  out.swap(data);
  return true;
}

bool WriteAll(int fd, const std::string& data) {
  size_t done = 0;
  while (done < data.size()) {
    const ssize_t n = write(fd, data.data() + done, data.size() - done);
    if (n < 0) {
      if (errno == EINTR) {
        continue;
      }
      return false;
    }
    done += static_cast<size_t>(n);
  }
  return true;
}

std::string DirectoryOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos) {
    return ".";
  }
  return slash == 0 ? "/" : path.substr(0, slash);
}

}  // namespace

bool JsonFromFile(Json::Value& value, const std::string& path) {
  std::string text;
  return ReadWholeFile(path, text) && JsonFromString(value, text);
}

JsonSaveResult JsonToFile(const Json::Value& value, const std::string& path, mode_t mode) {
  Json::StreamWriterBuilder builder;
  builder["emitUTF8"] = true;
  const std::string text = Json::writeString(builder, value) + "\n";

  std::string tmpPath = path + ".XXXXXX";
  UniqueFd fd(mkostemp(tmpPath.data(), O_CLOEXEC));
  if (!fd) {
    return JsonSaveResult::kFailed;
  }
  const bool modeSet = fchmod(fd.get(), mode) == 0;
  if (!WriteAll(fd.get(), text) || fsync(fd.get()) != 0 || fd.Close() != 0 ||
      rename(tmpPath.c_str(), path.c_str()) != 0) {
    unlink(tmpPath.c_str());
    return JsonSaveResult::kFailed;
  }
  // The rename is durable only once the directory entry is on disk too.
  UniqueFd dir(open(DirectoryOf(path).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (dir) {
    fsync(dir.get());
  }
  return modeSet ? JsonSaveResult::kSaved : JsonSaveResult::kSavedModeNotSet;
}

bool JsonFromString(Json::Value& value, const char* text, size_t size) {
  Json::Value parsed;
  if (!Reader().parse(text, text + size, &parsed, nullptr)) {
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
