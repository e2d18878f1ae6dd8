// status.conf as anything a disk, the daemon or a careless hand may leave: every reader answers
// without failing the process, and flagging a share for a reindex works on any loadable content
// and, on an object, changes no other answer.
#include <json/value.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "fileindex/error.h"
#include "fileindex/status.h"
#include "fileindex/status_mgr.h"
#include "fuzz_support.h"
#include "json_io.h"
#include "paths.h"

namespace {

using WEZO::FILEINDEX::Status;
using WEZO::FILEINDEX::StatusMgr;

struct Answers {
  bool loaded = false;
  bool updated = false;
  bool noSpace = false;
  bool paused = false;
  long long resumeTime = -2;
  bool operator!=(const Answers& o) const {
    return updated != o.updated || noSpace != o.noSpace || paused != o.paused ||
           resumeTime != o.resumeTime;
  }
};

Answers Ask() {
  Answers answers;
  Status status;
  answers.loaded = status.Load();
  answers.updated = status.IsUpdated("hxo60_beta2");
  answers.noSpace = status.ShareIsNoSpace("photo");
  answers.paused = status.GetPauseInfo(answers.resumeTime);
  return answers;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string& root = fuzzsupport::Root();
  fuzzsupport::ResetPlatform(root + "/volume1");
  fuzzsupport::WriteBytes(WEZO::FILEINDEX::StatusConfPath(), data, size);

  WEZO::FILEINDEX::ErrorHandler::SetError(WEZO::FILEINDEX::FILEINDEX_ERR_NONE);
  const Answers before = Ask();
  const int loadCode = WEZO::FILEINDEX::ErrorHandler::GetError();
  (void)StatusMgr::ShareIsNeedReindex("photo");
  (void)StatusMgr::GetFolderStatus("/photo/a");
  std::string overall;
  (void)StatusMgr::GetStatus(overall);
  if (!before.loaded) {
    if (loadCode != WEZO::FILEINDEX::FILEINDEX_ERR_LOAD_JSON) {
      fuzzsupport::Fail("a failed load set another code");
    }
    return 0;
  }

  if (!StatusMgr::ShareSetNeedReindex("photo", true) || !StatusMgr::ShareIsNeedReindex("photo")) {
    fuzzsupport::Fail("flagging a share for a reindex did not stay");
  }
  // A document that is not an object reads as empty and the change replaces it with an object;
  // only an object keeps every other member.
  Json::Value document;
  const bool object =
      WEZO::FILEINDEX::JsonFromString(document, reinterpret_cast<const char*>(data), size) &&
      document.isObject();
  const Answers after = Ask();
  if (!after.loaded || (object && after != before)) {
    fuzzsupport::Fail("flagging a share for a reindex changed another answer: " +
                      fuzzsupport::ReadBytes(WEZO::FILEINDEX::StatusConfPath()));
  }
  return 0;
}
