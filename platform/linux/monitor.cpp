// Client of the file-change monitor: one registration file per client and queue.
//
// The monitor reads its registrations from var/lib/wezotifyd under the root prefix:
// <client>/<encoded queue path>.json holds the entry exactly as registered. Each file is
// replaced atomically, so the monitor sees the old entry or the new one and never a part.
#include <sys/stat.h>
#include <unistd.h>
#include <wezo/platform.h>
#include <wezo/wezotifyd.h>

#include <cerrno>
#include <climits>
#include <ctime>
#include <string>

#include "file_io.h"
#include "internal.h"
#include "json_io.h"

namespace {

using WEZO::PLATFORM::kErrSystem;

constexpr const char* kRegistry = "/var/lib/wezotifyd";

// Registrations are written without a lock that all their writers share, so a temporary file
// may belong to a writer that is still saving; one this old belongs to a writer that died.
constexpr time_t kAbandonedAfterSeconds = 600;

bool ValidClient(const std::string& client) {
  return !client.empty() && client != "." && client != ".." &&
         client.find_first_of(std::string("/\0", 2)) == std::string::npos;
}

// The queue path as a file name: bytes other than letters, digits, '.', '_' and '-' become
// "%XX", so no queue path can name another folder, and distinct paths give distinct names.
std::string Encode(const std::string& queuePath) {
  static const char kHex[] = "0123456789ABCDEF";
  std::string out;
  for (const char c : queuePath) {
    const auto byte = static_cast<unsigned char>(c);
    if ((byte >= 'A' && byte <= 'Z') || (byte >= 'a' && byte <= 'z') ||
        (byte >= '0' && byte <= '9') || byte == '.' || byte == '_' || byte == '-') {
      out += c;
    } else {
      out += '%';
      out += kHex[byte >> 4];
      out += kHex[byte & 0xF];
    }
  }
  return out + ".json";
}

// The registration file's path; empty, with the last error set, when the arguments are not valid.
std::string EntryPath(const std::string& queuePath, const std::string& client,
                      WEZO::WEZOTIFYD::QueueType type) {
  const std::string name = Encode(queuePath);
  if (queuePath.empty() || !ValidClient(client) || type != WEZO::WEZOTIFYD::QUEUE_TYPE_FILE ||
      name.size() > NAME_MAX - 7) {  // room for the temporary file's suffix
    PLATFORM_FAIL(WLIBC_ERR_BAD_PARAMETERS);
    return "";
  }
  return WEZO::PLATFORM::Rooted(kRegistry) + "/" + client + "/" + name;
}

// Creates the registry folders below the root prefix that do not exist yet.
bool MakeFolders(const std::string& client) {
  const std::string root = WEZO::PLATFORM::Rooted("");
  std::string path = root;
  for (const std::string& part :
       {std::string("var"), std::string("lib"), std::string("wezotifyd"), client}) {
    path += "/" + part;
    if (mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
      return false;
    }
  }
  return true;
}

}  // namespace

namespace WEZO {
namespace WEZOTIFYD {

bool MonitorQueue::Upsert(const MonitorQueue& entry, const std::string& client, QueueType type) {
  const std::string path = EntryPath(entry.QueuePath(), client, type);
  if (path.empty()) {
    return false;
  }
  if (!MakeFolders(client)) {
    PLATFORM_FAIL(kErrSystem);
    return false;
  }
  FILEINDEX::RemoveStaleTemporaries(path, kAbandonedAfterSeconds);
  if (FILEINDEX::JsonToFile(entry.Entry(), path, 0644) == FILEINDEX::JsonSaveResult::kFailed) {
    PLATFORM_FAIL(kErrSystem);
    return false;
  }
  return true;
}

bool MonitorQueue::Delete(const std::string& queuePath, const std::string& client, QueueType type) {
  const std::string path = EntryPath(queuePath, client, type);
  if (path.empty()) {
    return false;
  }
  FILEINDEX::RemoveStaleTemporaries(path, kAbandonedAfterSeconds);
  if (unlink(path.c_str()) != 0 && errno != ENOENT) {
    PLATFORM_FAIL(kErrSystem);
    return false;
  }
  return true;
}

}  // namespace WEZOTIFYD
}  // namespace WEZO
