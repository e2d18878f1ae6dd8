// Where each share keeps its index data: the event queue and the index database, both in the
// share's hidden metadata directory.
#define FILEINDEX_LOG_UNIT "utils"

#include <sys/stat.h>
#include <wezo/platform.h>
#include <cerrno>

#include <cstdio>
#include <cstring>

#include "fileindex/fileindex_c.h"
#include "log.h"
#include "share_record.h"
#include "storage.h"

namespace WEZO {
namespace FILEINDEX {
namespace {

constexpr char kMetadataDir[] = "@eaDir";
constexpr char kQueueName[] = "WEZO@file_index_queue";
constexpr char kDatabaseName[] = "WEZO@.fileindexdb";

enum class Item { kQueue, kDatabase };

// Argument checks log the failed condition's text; the value printed is always 0, which readers
// of the system log have long matched on.
int RefuseArgument(const char* condition, int line) {
  detail::WriteLog(false, FILEINDEX_LOG_UNIT, line, "Invaild Argument (%s)=[%d]\n", condition, 0);
  WLIBCErrSetEx(WLIBC_ERR_BAD_PARAMETERS, FILEINDEX_LOG_UNIT, line);
  return -1;
}

int StoragePathGet(Item item, const char* name, char* out, int outLen) {
  if (name == nullptr) {
    return RefuseArgument("__null != szName", __LINE__);
  }
  if (out == nullptr) {
    return RefuseArgument(
        item == Item::kQueue ? "__null != szOutQueuePath" : "__null != szOutDBPath", __LINE__);
  }
  if (outLen <= 0) {
    return RefuseArgument("cbOutLen > 0", __LINE__);
  }

  ShareRecord share;
  if (LookUpShare(name, share) < 0) {
    FILEINDEX_LOG("WEZOShareGet failed, name=%s, code=%d", name, WLIBCErrGet());
    return -1;
  }
  const std::string sharePath = SharePathOf(*share);

  char metadataDir[4096];
  (void)std::snprintf(metadataDir, sizeof metadataDir, "%s/%s", sharePath.c_str(), kMetadataDir);
  if (WEZOEAMKDir(0, metadataDir) < 0) {
    // The caller still gets the location: the daemon or a later call may yet create it.
    FILEINDEX_LOG("WEZOEAMKDir failed, path=%s, code=%d", metadataDir, WLIBCErrGet());
  }

  (void)std::snprintf(out, static_cast<size_t>(outLen), "%s/%s/%s", sharePath.c_str(), kMetadataDir,
                      item == Item::kQueue ? kQueueName : kDatabaseName);
  if (item == Item::kDatabase && mkdir(out, 0777) != 0 && errno != EEXIST) {
    FILEINDEX_LOG("mkdir failed, path=%s, reason=%s", out, detail::ErrnoText().c_str());
  }
  return static_cast<int>(std::strlen(out));
}

}  // namespace

bool ShareQueuePath(const std::string& share, std::string& out) {
  char buffer[4096];
  if (StoragePathGet(Item::kQueue, share.c_str(), buffer, sizeof buffer) < 0) {
    return false;
  }
  out = buffer;
  return true;
}

}  // namespace FILEINDEX
}  // namespace WEZO

extern "C" {

int FILEIDXQueuePathGet(const char* szName, char* szOutQueuePath, int cbOutLen) {
  return WEZO::FILEINDEX::StoragePathGet(WEZO::FILEINDEX::Item::kQueue, szName, szOutQueuePath,
                                         cbOutLen);
}

int FILEIDXDBPathGet(const char* szName, char* szOutDBPath, int cbOutLen) {
  return WEZO::FILEINDEX::StoragePathGet(WEZO::FILEINDEX::Item::kDatabase, szName, szOutDBPath,
                                         cbOutLen);
}

}  // extern "C"
