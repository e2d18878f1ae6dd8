// Costs of the generic-Linux platform on the library's hot paths: a share lookup in an smb.conf
// of 30 shares, the case-insensitive comparison, and loading a full folder list (1000 folders,
// one share lookup each). Runs in a temporary root of its own.
//
//   build/bench/fileindex_platform_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <json/value.h>
#include <wezo/platform.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include "fileindex/folders.h"
#include "fileindex/root.h"
#include "json_io.h"
#include "paths.h"

namespace {

// A temporary root with an smb.conf of 30 shares and a folder list of `folders` folders.
class Root {
 public:
  explicit Root(int folders) {
    char pattern[] = "/tmp/fileindex-pbench.XXXXXX";
    m_dir = mkdtemp(pattern);
    WEZO::FILEINDEX::SetRootPrefix(m_dir);
    std::filesystem::create_directories(m_dir + "/etc/samba");
    std::filesystem::create_directories(m_dir + "/usr/wezo/etc/fileindex");
    std::ofstream conf(m_dir + "/etc/samba/smb.conf");
    conf << "[global]\n\tworkgroup = WORKGROUP\n\tspotlight = yes\n";
    for (int i = 0; i < 30; ++i) {
      conf << "[share" << i << "]\n\tpath = " << m_dir << "/volume1/share" << i
           << "\n\tread only = no\n\tcomment = share number " << i << "\n";
    }
    conf.close();
    // A configuration as it usually is: written some time ago.
    std::filesystem::last_write_time(
        m_dir + "/etc/samba/smb.conf",
        std::filesystem::last_write_time(m_dir + "/etc/samba/smb.conf") - std::chrono::hours(1));
    Json::Value list(Json::objectValue);
    for (int i = 0; i < folders; ++i) {
      list["/share" + std::to_string(i % 30) + "/" + std::to_string(i)]["photo"] = true;
    }
    WEZO::FILEINDEX::JsonToFile(list, WEZO::FILEINDEX::FolderConfPath(), 0644);
  }
  ~Root() {
    WEZO::FILEINDEX::SetRootPrefix("");
    std::filesystem::remove_all(m_dir);
  }
  Root(const Root&) = delete;
  Root& operator=(const Root&) = delete;

 private:
  std::string m_dir;
};

void BM_ShareGet(benchmark::State& state) {
  Root root(0);
  for (auto _ : state) {
    PWEZOSHARE share = nullptr;
    benchmark::DoNotOptimize(WEZOShareGet("share29", &share));
    WEZOShareFree(share);
  }
}
BENCHMARK(BM_ShareGet);

void BM_UnicodeCaseCompare(benchmark::State& state) {
  for (auto _ : state) {
    benchmark::DoNotOptimize(WLIBCUnicodeUTF8StrCaseCmp("Ferienfotos \xC3\x89t\xC3\xA9 2019",
                                                        "ferienfotos \xC3\xA9T\xC3\xA9 2020"));
  }
}
BENCHMARK(BM_UnicodeCaseCompare);

void BM_LoadFolderListOverSmbConf(benchmark::State& state) {
  Root root(1000);
  for (auto _ : state) {
    WEZO::FILEINDEX::Folders folders;
    benchmark::DoNotOptimize(folders.Load());
  }
}
BENCHMARK(BM_LoadFolderListOverSmbConf);

}  // namespace
