// The storage locations of a share's index data, for the library's own callers.
#ifndef FILEINDEX_SRC_STORAGE_H_
#define FILEINDEX_SRC_STORAGE_H_

#include <string>

namespace WEZO {
namespace FILEINDEX {

// Stores in `out` the full path of the event queue of the share `share` (FILEIDXQueuePathGet,
// which logs its own failures). Returns false, `out` untouched, when the share is unknown; the
// caller writes the line that says what the failure meant to it.
bool ShareQueuePath(const std::string& share, std::string& out);

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_SRC_STORAGE_H_
