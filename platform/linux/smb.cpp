// The Spotlight-over-SMB switch: the "spotlight" parameter of Samba's [global] section.
#include <sys/stat.h>
#include <wezo/platform.h>

#include <cerrno>
#include <string>

#include "file_io.h"
#include "internal.h"
#include "smb_conf.h"

using WEZO::PLATFORM::kErrBadConfig;
using WEZO::PLATFORM::kErrNotFound;
using WEZO::PLATFORM::kErrSystem;

extern "C" {

int WEZOSMBIsEnableSpotlight(void) {
  const auto conf = WEZO::PLATFORM::LoadSmbConf();
  if (!conf) {
    return -1;
  }
  return conf->spotlight ? 1 : 0;
}

int WEZOSMBSetSpotlight(int fEnable) {
  const std::string path = WEZO::PLATFORM::SmbConfPath();
  std::string text;
  struct stat st {};
  if (!WEZO::FILEINDEX::ReadWholeFile(path, text) || stat(path.c_str(), &st) != 0) {
    return PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
  }
  WEZO::PLATFORM::SmbConf conf;
  if (!WEZO::PLATFORM::ParseSmbConf(text, conf)) {
    return PLATFORM_FAIL(kErrBadConfig);
  }
  const std::string changed = WEZO::PLATFORM::WithSpotlight(text, conf, fEnable != 0);
  if (changed == text) {
    return 0;
  }
  // Content in place with another mode still is a switched setting; only a failed replace is not.
  if (WEZO::FILEINDEX::ReplaceFile(path, changed, st.st_mode & 07777) ==
      WEZO::FILEINDEX::ReplaceResult::kFailed) {
    return PLATFORM_FAIL(kErrSystem);
  }
  return 0;
}

}  // extern "C"
