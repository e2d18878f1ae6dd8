#include "fileindex/error.h"

namespace WEZO {
namespace FILEINDEX {

_tag_fileindex_err_ ErrorHandler::g_error_code = FILEINDEX_ERR_NONE;

int LOG_LEVEL = 3;  // NOLINT(cppcoreguidelines-avoid-non-const-global-variables)

_tag_fileindex_err_ ErrorHandler::GetError() { return g_error_code; }

void ErrorHandler::SetError(_tag_fileindex_err_ code) { g_error_code = code; }

const char* ErrorHandler::Describe(int code) {
  switch (code) {
    case FILEINDEX_ERR_NONE:
      return "no error";
    case FILEINDEX_ERR_BAD_PARAM:
      return "bad parameter";
    case FILEINDEX_ERR_PATH:
      return "path or share could not be resolved";
    case FILEINDEX_ERR_RESERVED:
      return "reserved";
    case FILEINDEX_ERR_NO_SUCH_FOLDER:
      return "no such indexed folder";
    case FILEINDEX_ERR_EXCEED_MAX_FOLDER:
      return "folder list is full";
    case FILEINDEX_ERR_LOAD_JSON:
      return "configuration file could not be read";
    case FILEINDEX_ERR_SAVE_JSON:
      return "configuration file could not be written";
    case FILEINDEX_ERR_MALFORMED_FOLDERS:
      return "folder list is malformed";
    case FILEINDEX_ERR_LOCK:
      return "configuration lock could not be obtained";
    default:
      return "unknown error";
  }
}

}  // namespace FILEINDEX
}  // namespace WEZO
