// Costs of the configuration file cycle on a full folder list (1000 folders): load, save, and
// one lock-unlock cycle; then the folder list's own work on it: loading into records (one share
// lookup per folder), a sorted page, a change of one folder with its change report, and the
// questions whether a path or a share is indexed, each reading the list afresh. Runs in a
// temporary root of its own, over the fake platform.
//
//   build/bench/fileindex_bench [--benchmark_filter=...]
#include <benchmark/benchmark.h>
#include <ftw.h>
#include <sys/stat.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "fake_platform.h"
#include "fileindex/config.h"
#include "fileindex/fileindex_c.h"
#include "fileindex/folders.h"
#include "fileindex/index_mgr.h"
#include "fileindex/root.h"
#include "paths.h"

namespace {

using WEZO::FILEINDEX::Config;

class FolderFile : public Config {
 public:
  bool Load() override { return LoadJson(); }
  bool Save() override { return SaveJson(); }
  std::string GetLockPath() const override { return WEZO::FILEINDEX::FolderLockPath(); }
  std::string GetPath() const override { return WEZO::FILEINDEX::FolderConfPath(); }
  Json::Value& Doc() { return m_jsRoot; }
};

int RemoveEntry(const char* path, const struct stat* /*st*/, int /*flag*/, struct FTW* /*ftw*/) {
  return remove(path);
}

// A temporary root holding a folder list of `folders` entries, removed afterwards.
class Root {
 public:
  explicit Root(int folders) {
    char pattern[] = "/tmp/fileindex-bench.XXXXXX";
    m_dir = mkdtemp(pattern);
    for (const char* d :
         {"/tmp", "/usr", "/usr/wezo", "/usr/wezo/etc", "/usr/wezo/etc/fileindex"}) {
      mkdir((m_dir + d).c_str(), 0755);
    }
    WEZO::FILEINDEX::SetRootPrefix(m_dir);
    fake::Reset();
    fake::Get().AddShare("photo", m_dir + "/volume1/photo");
    FolderFile file;
    for (int i = 0; i < folders; ++i) {
      const std::string path = "/photo/" + std::to_string(100000 + i);
      Json::Value& f = file.Doc()[path];
      f["path"] = path;
      f["name"] = std::to_string(100000 + i);
      f["document"] = i % 2 == 0;
      f["audio"] = false;
      f["video"] = true;
      f["photo"] = true;
    }
    file.Save();
  }
  ~Root() {
    WEZO::FILEINDEX::SetRootPrefix("");
    nftw(m_dir.c_str(), RemoveEntry, 16, FTW_DEPTH | FTW_PHYS);
  }

 private:
  std::string m_dir;
};

void BM_LoadFullFolderList(benchmark::State& state) {
  Root root(1000);
  for (auto _ : state) {
    FolderFile file;
    benchmark::DoNotOptimize(file.Load());
  }
}
BENCHMARK(BM_LoadFullFolderList);

void BM_SaveFullFolderList(benchmark::State& state) {
  Root root(1000);
  FolderFile file;
  file.Load();
  for (auto _ : state) {
    benchmark::DoNotOptimize(file.Save());
  }
}
BENCHMARK(BM_SaveFullFolderList);

void BM_LockUnlock(benchmark::State& state) {
  Root root(0);
  for (auto _ : state) {
    FolderFile file;
    benchmark::DoNotOptimize(file.Lock(true));
    file.Unlock();
  }
}
BENCHMARK(BM_LockUnlock);

void BM_LoadFolderRecords(benchmark::State& state) {
  Root root(1000);
  for (auto _ : state) {
    WEZO::FILEINDEX::Folders folders;
    benchmark::DoNotOptimize(folders.Load());
  }
}
BENCHMARK(BM_LoadFolderRecords);

void BM_PageSortedByName(benchmark::State& state) {
  Root root(1000);
  WEZO::FILEINDEX::Folders folders;
  folders.Load();
  const Json::Value none(Json::arrayValue);
  for (auto _ : state) {
    Json::Value page;
    benchmark::DoNotOptimize(folders.List(page, 500, 50, "name", "ASC", none));
  }
}
BENCHMARK(BM_PageSortedByName);

void BM_UpsertIntoFullList(benchmark::State& state) {
  Root root(1000);
  WEZO::FILEINDEX::Folders folders;
  folders.Load();
  Json::Value request;
  request["path"] = "/photo/100500";
  request["photo"] = true;
  for (auto _ : state) {
    Json::Value report;
    benchmark::DoNotOptimize(folders.Upsert(report, request));
  }
}
BENCHMARK(BM_UpsertIntoFullList);

// The question file services ask most, through the C interface: the whole folder list is read
// for every call. The path lies in the last folder, so every folder is compared.
void BM_CIsPathIndexedOnFullList(benchmark::State& state) {
  Root root(1000);
  for (auto _ : state) {
    benchmark::DoNotOptimize(FILEIDXIsPathIndexed("/photo/100999/a/b.jpg"));
  }
}
BENCHMARK(BM_CIsPathIndexedOnFullList);

// A share with no indexed folder: every folder's share name is taken and compared.
void BM_IsShareIndexedOnFullList(benchmark::State& state) {
  Root root(1000);
  for (auto _ : state) {
    benchmark::DoNotOptimize(WEZO::FILEINDEX::IndexMgr::IsShareIndexed("video"));
  }
}
BENCHMARK(BM_IsShareIndexedOnFullList);

}  // namespace
