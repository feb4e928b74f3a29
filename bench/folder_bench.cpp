// How long it takes to find the folder that governs a file, with as many folders as there may be:
// the index daemon asks once per file.

#include <benchmark/benchmark.h>

#include <memory>
#include <string>
#include <vector>

#include "bench/private_root.h"
#include "common/json.h"
#include "daemons/fileindexd/folder_rules.h"
#include "fileindex/config/folder_mgr.h"

namespace quarry::fileindex {
namespace {

std::string volume;

std::string FolderPath(std::size_t number) {
  return "/share/department " + std::to_string(number % 40) + "/project " + std::to_string(number);
}

// A system with one share and a saved list of `count` folders in it.
void Prepare(const bench::PrivateRoot& root, std::size_t count) {
  volume = root.path() + "/volume1";
  root.Write("volume1/share/file", "");
  root.Write("etc/quarry/shares.json",
             R"({"shares":[{"name":"share","path":")" + volume + "/share\"}]}");
  Json::Value list(Json::arrayValue);
  for (std::size_t i = 0; i < count; ++i) {
    list.append(Folder(FolderPath(i), "name", true, true, true, true, false, false).GetData());
  }
  root.Write("var/packages/Quarry/etc/fileindex.folders", toString(list));
}

// One file in each folder, and as many that no folder governs.
std::vector<std::string> Files() {
  std::vector<std::string> files;
  for (std::size_t i = 0; i < kFileIndexFoldersMax; ++i) {
    files.push_back(volume + FolderPath(i) + "/some/way/down/file.txt");
    files.push_back(volume + "/share/elsewhere " + std::to_string(i) + "/file.txt");
  }
  return files;
}

void BM_GetMostSuitableCfg(benchmark::State& state) {
  const FolderMgr folders;
  const std::vector<std::string> files = Files();
  std::size_t next = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(folders.GetMostSuitableCfg(files[next]));
    next = (next + 1) % files.size();
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_GetMostSuitableCfg);

void BM_IsFullPathNeedMeta(benchmark::State& state) {
  const FolderMgr folders;
  const std::vector<std::string> files = Files();
  std::size_t next = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(folders.IsFullPathNeedMeta(files[next]));
    next = (next + 1) % files.size();
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_IsFullPathNeedMeta);

// What the index daemon asks of each file it meets, several times.
void BM_Governing(benchmark::State& state) {
  std::vector<fileindexd::FolderRule> rules(kFileIndexFoldersMax);
  for (std::size_t i = 0; i < rules.size(); ++i) rules[i].full_path = volume + FolderPath(i);
  const fileindexd::FolderRules folders(rules);
  const std::vector<std::string> files = Files();
  std::size_t next = 0;
  for (auto _ : state) {
    benchmark::DoNotOptimize(folders.Governing(files[next]));
    next = (next + 1) % files.size();
  }
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_Governing);

// From the file to the first answer: each folder asks the platform where its share is.
void BM_LoadAndAskOnce(benchmark::State& state) {
  const std::string file = volume + FolderPath(7) + "/file.txt";
  for (auto _ : state) benchmark::DoNotOptimize(FolderMgr().GetMostSuitableCfg(file));
}
BENCHMARK(BM_LoadAndAskOnce)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quarry::fileindex

int main(int argc, char** argv) {
  const quarry::bench::PrivateRoot root(argv);
  quarry::fileindex::Prepare(root, quarry::fileindex::kFileIndexFoldersMax);
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  benchmark::RunSpecifiedBenchmarks();
  return 0;
}
