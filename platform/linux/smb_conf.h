// The Samba configuration as this platform reads and changes it.
//
// The share database is the set of file shares in etc/samba/smb.conf under the library's root
// prefix, and the Spotlight-over-SMB switch is the "spotlight" parameter of its [global] section.
// The reader follows Samba's own rules for the file: lines starting with ';' or '#' are comments,
// a section header or parameter line ending in '\' continues on the next line, parameter names
// are compared without regard to case or white space, and the last value of a parameter wins.
// Pure functions over the file's text plus one loader; all may be called from any thread.
#ifndef WEZO_PLATFORM_LINUX_SMB_CONF_H_
#define WEZO_PLATFORM_LINUX_SMB_CONF_H_

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

namespace WEZO {
namespace PLATFORM {

struct SmbShare {
  std::string name;  // the section's name, white space runs shown as one space
  std::string path;  // its "path" without trailing slashes ("/" stays "/")
  bool readOnly;     // "read only", or the inverse of "writeable", "writable", "write ok"
};

struct SmbConf {
  std::vector<SmbShare> shares;  // file shares in file order; sections merged by name
  bool spotlight = false;        // [global] "spotlight"; Samba's default is off
  // Where the switch goes: the bytes of the last [global] "spotlight" value, or, when there is
  // none, the offset just after the first [global] header line (npos when there is no header).
  bool hasSpotlightLine = false;
  size_t spotlightValueBegin = 0;
  size_t spotlightValueEnd = 0;
  size_t globalBodyBegin = std::string::npos;
};

// Parses the text of an smb.conf file. Returns false when a parameter that this platform reads
// holds a value Samba would refuse (a boolean that is not yes/no, true/false, on/off or 1/0).
bool ParseSmbConf(const std::string& text, SmbConf& conf);

// The text with the [global] "spotlight" value set to "yes" or "no"; every other byte is kept.
std::string WithSpotlight(const std::string& text, const SmbConf& conf, bool enable);

// The path of the configuration file under the root prefix.
std::string SmbConfPath();

// The parsed configuration file; null, with the last error set, when the file cannot be read or
// does not parse. The parse is shared and kept while the file is unchanged; it is never changed.
std::shared_ptr<const SmbConf> LoadSmbConf();

}  // namespace PLATFORM
}  // namespace WEZO

#endif  // WEZO_PLATFORM_LINUX_SMB_CONF_H_
