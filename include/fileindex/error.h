/// \file
/// The library's last-error slot and its codes, and the log threshold.
///
/// Every failing operation stores one code here and returns false; a successful operation never
/// clears it, so a caller reads it right after a false result. The slot is one plain process-wide
/// variable: with several threads inside the library at once, one thread's failure may overwrite
/// another's code before it is read.
#ifndef FILEINDEX_ERROR_H_
#define FILEINDEX_ERROR_H_

#include "fileindex/export.h"

namespace WEZO {
namespace FILEINDEX {

/// The codes are part of the exported interface; their numbers never change.
// NOLINTNEXTLINE(bugprone-reserved-identifier,cert-dcl37-c,cert-dcl51-cpp)
enum _tag_fileindex_err_ {
  FILEINDEX_ERR_NONE = 0,               ///< no error recorded (initial value only)
  FILEINDEX_ERR_BAD_PARAM = 1,          ///< an argument is malformed, of the wrong type or unknown
  FILEINDEX_ERR_PATH = 2,               ///< a path, share name or share path could not be resolved
  FILEINDEX_ERR_RESERVED = 3,           ///< set by no operation; keeps the later numbers
  FILEINDEX_ERR_NO_SUCH_FOLDER = 4,     ///< the named folder is not in the folder list
  FILEINDEX_ERR_EXCEED_MAX_FOLDER = 5,  ///< the folder list is full
  FILEINDEX_ERR_LOAD_JSON = 6,          ///< a configuration file exists but is not readable JSON
  FILEINDEX_ERR_SAVE_JSON = 7,          ///< a configuration file could not be written
  FILEINDEX_ERR_MALFORMED_FOLDERS = 8,  ///< the folder list's content is invalid
  FILEINDEX_ERR_LOCK = 9,               ///< the configuration lock could not be obtained
};

/// The process-wide last-error slot; static members only.
class FILEINDEX_EXPORT ErrorHandler {
 public:
  /// Returns the code of the last failure recorded in this process, FILEINDEX_ERR_NONE if none.
  static _tag_fileindex_err_ GetError();

  /// Stores `code` as the last failure. Neither logs nor checks the value.
  static void SetError(_tag_fileindex_err_ code);

  /// Returns a short English description of `code` ("folder list is full"); "unknown error" for a
  /// number outside the enumeration. Never null.
  static const char* Describe(int code);

  /// The slot that GetError() reads and SetError() writes; zero-initialised, never reset by the
  /// library. Callers read it through GetError().
  static _tag_fileindex_err_ g_error_code;  // NOLINT(readability-identifier-naming)
};

/// Log threshold. Every line of the library is written at LOG_ERR whatever this holds; only the
/// value 7 adds three debugging lines of the event-queue writer. The library never writes it.
FILEINDEX_EXPORT extern int LOG_LEVEL;  // NOLINT(readability-identifier-naming)

}  // namespace FILEINDEX
}  // namespace WEZO

#endif  // FILEINDEX_ERROR_H_
