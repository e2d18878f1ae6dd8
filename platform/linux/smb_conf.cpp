#include "smb_conf.h"

#include <sys/stat.h>

#include <cerrno>
#include <ctime>
#include <memory>
#include <mutex>
#include <optional>
#include <utility>

#include "file_io.h"
#include "internal.h"

namespace WEZO {
namespace PLATFORM {
namespace {

// A parsed configuration file and the file's state when it was read.
struct CachedConf {
  std::string path;
  dev_t dev;
  ino_t ino;
  off_t size;
  struct timespec mtime;
  std::shared_ptr<const SmbConf> conf;  // shared with the callers, never changed

  bool Describes(const std::string& filePath, const struct stat& st) const {
    return path == filePath && dev == st.st_dev && ino == st.st_ino && size == st.st_size &&
           mtime.tv_sec == st.st_mtim.tv_sec && mtime.tv_nsec == st.st_mtim.tv_nsec;
  }
};

bool ChangedRecently(const struct stat& st) {
  constexpr time_t kSettleSeconds = 2;
  struct timespec now {};
  return clock_gettime(CLOCK_REALTIME, &now) != 0 ||
         now.tv_sec - st.st_mtim.tv_sec < kSettleSeconds;
}

// Samba's white space: isspace() without the newline, which ends a line.
bool IsBlank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\v' || c == '\f'; }

char Lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

// Parameter and section names match without regard to case and white space.
std::string Key(const std::string& name) {
  std::string key;
  for (const char c : name) {
    if (!IsBlank(c)) {
      key += Lower(c);
    }
  }
  return key;
}

std::string Trim(const std::string& s) {
  size_t begin = 0;
  size_t end = s.size();
  while (begin < end && IsBlank(s[begin])) {
    ++begin;
  }
  while (end > begin && IsBlank(s[end - 1])) {
    --end;
  }
  return s.substr(begin, end - begin);
}

// A section's name as Samba shows it: trimmed, each run of white space one space.
std::string SectionName(const std::string& raw) {
  std::string name;
  bool blank = false;
  for (const char c : Trim(raw)) {
    if (IsBlank(c)) {
      blank = true;
      continue;
    }
    if (blank) {
      name += ' ';
      blank = false;
    }
    name += c;
  }
  return name;
}

std::optional<bool> ParseBool(const std::string& value) {
  const std::string key = Key(value);
  if (key == "yes" || key == "true" || key == "on" || key == "1") {
    return true;
  }
  if (key == "no" || key == "false" || key == "off" || key == "0") {
    return false;
  }
  return std::nullopt;
}

struct Section {
  std::string name;
  std::string key;
  std::optional<std::string> path;
  std::optional<bool> readOnly;
};

// Applies one parameter to a section's settings; false when its value is not valid.
bool Apply(Section& section, const std::string& key, const std::string& value) {
  if (key == "path" || key == "directory") {
    section.path = value;
  } else if (key == "readonly" || key == "writeable" || key == "writable" || key == "writeok") {
    const std::optional<bool> flag = ParseBool(value);
    if (!flag) {
      return false;
    }
    section.readOnly = key == "readonly" ? *flag : !*flag;
  }
  return true;
}

std::string TrimSlashes(std::string path) {
  while (path.size() > 1 && path.back() == '/') {
    path.pop_back();
  }
  return path;
}

}  // namespace

bool ParseSmbConf(const std::string& text, SmbConf& conf) {
  SmbConf out;
  std::vector<Section> sections;
  Section global{"global", "global", std::nullopt, std::nullopt};
  Section* current = &global;  // parameters before the first header are global
  std::optional<bool> spotlight;

  size_t pos = 0;
  while (pos < text.size()) {
    size_t lineEnd = text.find('\n', pos);
    lineEnd = lineEnd == std::string::npos ? text.size() : lineEnd;
    size_t first = pos;
    while (first < lineEnd && IsBlank(text[first])) {
      ++first;
    }
    if (first == lineEnd || text[first] == ';' || text[first] == '#') {
      pos = lineEnd + 1;
      continue;
    }
    // Join the continuation lines of a header or parameter line.
    std::string logical;
    size_t segment = first;
    for (;;) {
      size_t end = lineEnd;
      while (end > segment && IsBlank(text[end - 1])) {
        --end;
      }
      if (end > segment && text[end - 1] == '\\' && lineEnd < text.size()) {
        logical.append(text, segment, end - 1 - segment);
        segment = lineEnd + 1;
        lineEnd = text.find('\n', segment);
        lineEnd = lineEnd == std::string::npos ? text.size() : lineEnd;
        continue;
      }
      logical.append(text, segment, lineEnd - segment);
      break;
    }
    const size_t next = lineEnd < text.size() ? lineEnd + 1 : text.size();

    if (logical.empty()) {
      pos = next;
      continue;
    }
    if (logical[0] == '[') {
      const size_t close = logical.find(']');
      const std::string name = SectionName(
          logical.substr(1, close == std::string::npos ? std::string::npos : close - 1));
      const std::string key = Key(name);
      if (key == "global") {
        current = &global;
        if (out.globalBodyBegin == std::string::npos) {
          out.globalBodyBegin = next;
        }
      } else {
        current = nullptr;
        for (Section& s : sections) {
          if (s.key == key) {
            current = &s;
          }
        }
        if (current == nullptr) {
          sections.push_back(Section{name, key, std::nullopt, std::nullopt});
          current = &sections.back();
        }
      }
    } else if (const size_t eq = logical.find('='); eq != std::string::npos) {
      const std::string key = Key(logical.substr(0, eq));
      std::string value;
      for (const char c : Trim(logical.substr(eq + 1))) {
        if (c != '\r') {
          value += c;
        }
      }
      if (!Apply(*current, key, value)) {
        return false;
      }
      if (current == &global && key == "spotlight") {
        spotlight = ParseBool(value);
        if (!spotlight) {
          return false;
        }
        out.hasSpotlightLine = true;
        out.spotlightValueBegin = text.find('=', first) + 1;
        out.spotlightValueEnd = lineEnd > 0 && text[lineEnd - 1] == '\r' ? lineEnd - 1 : lineEnd;
      }
    }
    pos = next;
  }

  out.spotlight = spotlight.value_or(false);
  const bool defaultReadOnly = global.readOnly.value_or(true);
  for (const Section& s : sections) {
    if (s.key == "homes" || s.key == "printers" || !s.path || s.path->empty()) {
      continue;
    }
    out.shares.push_back(
        SmbShare{s.name, TrimSlashes(*s.path), s.readOnly.value_or(defaultReadOnly)});
  }
  conf = std::move(out);
  return true;
}

std::string WithSpotlight(const std::string& text, const SmbConf& conf, bool enable) {
  const char* value = enable ? "yes" : "no";
  if (conf.hasSpotlightLine) {
    return text.substr(0, conf.spotlightValueBegin) + " " + value +
           text.substr(conf.spotlightValueEnd);
  }
  const std::string separator = !text.empty() && text.back() != '\n' ? "\n" : "";
  const std::string line = std::string("\tspotlight = ") + value + "\n";
  if (conf.globalBodyBegin == std::string::npos) {
    return text + separator + "[global]\n" + line;
  }
  if (conf.globalBodyBegin == text.size()) {
    return text + separator + line;
  }
  return text.substr(0, conf.globalBodyBegin) + line + text.substr(conf.globalBodyBegin);
}

std::string SmbConfPath() { return Rooted("/etc/samba/smb.conf"); }

std::shared_ptr<const SmbConf> LoadSmbConf() {
  // Every share lookup reads the configuration, and loading a full folder list looks up a share
  // per folder, so the parsed file is kept while the file stays the same one with the same size
  // and modification time.
  static std::mutex mutex;
  static std::optional<CachedConf> cache;

  const std::string path = SmbConfPath();
  struct stat st {};
  if (stat(path.c_str(), &st) != 0) {
    PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
    return nullptr;
  }
  {
    const std::lock_guard<std::mutex> hold(mutex);
    if (cache && cache->Describes(path, st)) {
      return cache->conf;
    }
  }

  std::string text;
  if (!FILEINDEX::ReadWholeFile(path, text)) {
    PLATFORM_FAIL(errno == ENOENT ? kErrNotFound : kErrSystem);
    return nullptr;
  }
  auto parsed = std::make_shared<SmbConf>();
  if (!ParseSmbConf(text, *parsed)) {
    PLATFORM_FAIL(kErrBadConfig);
    return nullptr;
  }
  // The file's state was taken before reading it, so a change made meanwhile shows as a newer
  // time on the next call. A change made within the same clock tick as the one before does not:
  // a file changed in the last seconds is therefore read again every time.
  if (!ChangedRecently(st)) {
    const std::lock_guard<std::mutex> hold(mutex);
    cache = CachedConf{path, st.st_dev, st.st_ino, st.st_size, st.st_mtim, parsed};
  }
  return parsed;
}

}  // namespace PLATFORM
}  // namespace WEZO
