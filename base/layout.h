// Where a share keeps its index data, below the share's full path S, and the names of the
// services the library starts and stops. These names are built here and nowhere else:
//   S/@eaDir                                 the platform's metadata directory
//   S/@eaDir/WEZO@file_index_queue           the event queue
//   S/@eaDir/WEZO@file_index_queue.tmp       its companion, made and removed by others
//   S/@eaDir/WEZO@.fileindexdb               the index database directory
// Pure string work: nothing is looked up or opened. Reentrant.
#ifndef FILEINDEX_BASE_LAYOUT_H_
#define FILEINDEX_BASE_LAYOUT_H_

#include <string>

namespace WEZO {
namespace FILEINDEX {

inline constexpr char kMetadataDirName[] = "@eaDir";
inline constexpr char kQueueName[] = "WEZO@file_index_queue";
inline constexpr char kQueueTmpSuffix[] = ".tmp";
inline constexpr char kDatabaseName[] = "WEZO@.fileindexdb";

// The indexing daemon's service and the SMB service, as the platform's service calls name them.
inline constexpr char kIndexService[] = "fileindexd";
inline constexpr char kSmbService[] = "samba";

// The library's client name with the file-change monitor, and the event classes it asks the
// monitor to watch per folder: all except three that indexing has no use for (0x0001, 0x0010 and
// 0x0020).
inline constexpr char kMonitorClient[] = "fileindex";
inline constexpr int kMonitorMask = 0xFFCE;

// The metadata directory of the share whose full path is `shareFullPath`.
inline std::string MetadataDirOf(const std::string& shareFullPath) {
  return shareFullPath + "/" + kMetadataDirName;
}

// The event queue of the share whose full path is `shareFullPath`.
inline std::string QueueOf(const std::string& shareFullPath) {
  return MetadataDirOf(shareFullPath) + "/" + kQueueName;
}

// The companion of the event queue `queue`, made and removed outside the library; pending work
// may sit in either file.
inline std::string QueueTmpOf(const std::string& queue) { return queue + kQueueTmpSuffix; }

// The index database directory of the share whose full path is `shareFullPath`.
inline std::string DatabaseOf(const std::string& shareFullPath) {
  return MetadataDirOf(shareFullPath) + "/" + kDatabaseName;
}

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_BASE_LAYOUT_H_
