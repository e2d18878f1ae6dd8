#include "fuzz_support.h"

#include <fcntl.h>
#include <ftw.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <thread>

#include "fake_platform.h"
#include "fileindex/root.h"
#include "utils/log.h"
#include "paths.h"

namespace fuzzsupport {
namespace {

size_t g_malformed = 0;

// Counts what a target asks about and drops the rest, which would otherwise fill the system log.
void CountingSink(int /*priority*/, const char* line) {
  // "status_mgr:<line> Malformed command: ...", and not another line that quotes such text.
  const char* rest = line;
  if (std::strncmp(rest, "status_mgr:", 11) != 0) {
    return;
  }
  rest += 11;
  while (*rest >= '0' && *rest <= '9') {
    ++rest;
  }
  if (std::strncmp(rest, " Malformed command: ", 20) == 0) {
    ++g_malformed;
  }
}

int RemoveEntry(const char* path, const struct stat* /*st*/, int /*flag*/, struct FTW* /*ftw*/) {
  (void)remove(path);
  return 0;
}

void RemoveSandbox() {
  WEZO::FILEINDEX::SetRootPrefix("");
  nftw(Root().c_str(), RemoveEntry, 16, FTW_DEPTH | FTW_PHYS);
}

void MakeDirs(const std::string& path) {
  for (size_t pos = 1; pos != std::string::npos;) {
    pos = path.find('/', pos + 1);
    mkdir(path.substr(0, pos).c_str(), 0755);
  }
}

std::string MakeSandbox() {
  const char* tmp = std::getenv("TMPDIR");
  std::string base = tmp != nullptr && *tmp != '\0' ? tmp : "/tmp";
  if (tmp == nullptr && access("/dev/shm", W_OK) == 0) {
    base = "/dev/shm";
  }
  std::string root = base + "/fileindex-fuzz.XXXXXX";
  if (mkdtemp(root.data()) == nullptr) {
    Fail("mkdtemp failed under " + base);
  }
  for (const char* dir : {"/tmp", "/var/run", "/usr/wezo/etc/fileindex", "/usr/wezo/bin",
                          "/volume1/photo", "/volume1/video"}) {
    MakeDirs(root + dir);
  }
  if (!WEZO::FILEINDEX::SetRootPrefix(root)) {
    Fail("SetRootPrefix refused " + root);
  }
  WEZO::FILEINDEX::detail::SetLogSink(CountingSink);
  return root;
}

void ServeDaemon(int listener) {
  for (;;) {
    const int fd = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) {
      continue;
    }
    char buffer[65536];
    while (read(fd, buffer, sizeof buffer) > 0) {
    }
    close(fd);
  }
}

}  // namespace

const std::string& Root() {
  static const std::string root = MakeSandbox();
  static const bool cleanup = [] { return std::atexit(RemoveSandbox) == 0; }();
  (void)cleanup;
  return root;
}

void ResetPlatform(const std::string& volume) {
  fake::Reset();
  fake::Get().AddShare("photo", volume + "/photo");
  fake::Get().AddShare("video", volume + "/video");
}

void WriteBytes(const std::string& path, const uint8_t* data, size_t size) {
  FILE* file = std::fopen(path.c_str(), "wb");
  if (file == nullptr || (size > 0 && std::fwrite(data, 1, size, file) != size) ||
      std::fclose(file) != 0) {
    Fail("cannot write " + path);
  }
}

std::string ReadBytes(const std::string& path) {
  std::string out;
  FILE* file = std::fopen(path.c_str(), "rb");
  if (file == nullptr) {
    return "<missing>";
  }
  char buffer[65536];
  for (size_t n; (n = std::fread(buffer, 1, sizeof buffer, file)) > 0;) {
    out.append(buffer, n);
  }
  (void)std::fclose(file);
  return out;
}

size_t TakeMalformedLineCount() {
  const size_t count = g_malformed;
  g_malformed = 0;
  return count;
}

void StartDaemon() {
  static const bool started = [] {
    const std::string path = WEZO::FILEINDEX::DaemonSocketPath();
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    (void)std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
    const int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (listener < 0 || path.size() >= sizeof address.sun_path ||
        bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        listen(listener, SOMAXCONN) != 0) {
      Fail("cannot listen on " + path);
    }
    std::thread(ServeDaemon, listener).detach();
    return true;
  }();
  (void)started;
}

void Fail(const std::string& what) {
  (void)std::fprintf(stderr, "property broken: %s\n", what.c_str());
  std::abort();
}

}  // namespace fuzzsupport
