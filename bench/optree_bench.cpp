// Lines per second from a queue file into a tree of pending operations, beside the mere parsing of
// the same lines by the JSON library.

#include <benchmark/benchmark.h>
#include <json/json.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {
namespace {

constexpr int kLines = 1'000'000;

std::string Line(unsigned int event, const std::string& path, const std::string& path_old = "",
                 bool is_dir = false) {
  std::string line = "{\"event\":" + std::to_string(event) +
                     ",\"is_dir\":" + (is_dir ? "true" : "false") + ",\"path\":\"" + path + "\"";
  if (!path_old.empty()) line += ",\"path_old\":\"" + path_old + "\"";
  return line + "}\n";
}

std::string Nth(const std::string& prefix, int i) {
  return prefix + std::to_string(i);
}

// What a busy share does: files that are made, written, changed and deleted in many directories,
// now and then a rename, and rarely a directory.
std::string MixedLine(int i) {
  const unsigned int random = static_cast<unsigned int>(i) * 2654435761U >> 8;
  const std::string dir = "/volume1/share/" + Nth("project-", static_cast<int>(random % 97)) +
                          Nth("/part-", static_cast<int>(random % 1009));
  const std::string file = dir + Nth("/document-", i / 4) + ".txt";
  switch (random % 20) {
    case 0:
      return Line(EVENT_RENAME, file + ".old", file);
    case 1:
      return i % 50 == 0 ? Line(EVENT_CREATE, dir + Nth("/new-", i), "", true)
                         : Line(EVENT_DELETE, file);
    default:
      break;
  }
  static const unsigned int kKinds[] = {EVENT_CREATE, EVENT_MODIFY, EVENT_ATTR, EVENT_MODIFY};
  return Line(kKinds[i % 4], file);
}

std::string DirectoryLine(int i) {
  return Line(EVENT_MODIFY, Nth("/volume1/share/directory/file-", i) + ".txt");
}

// Files that are written under one name and moved to another, as programs save them.
std::string RenameLine(int i) {
  const std::string file = Nth("/volume1/share/directory/", i / 2000) + Nth("/file-", i / 2);
  return i % 2 == 0 ? Line(EVENT_CREATE, file + ".tmp") : Line(EVENT_RENAME, file, file + ".tmp");
}

using LineOf = std::string (*)(int);

// A queue of kLines lines, removed with the object.
class Queue {
 public:
  explicit Queue(LineOf line_of) {
    const int fd = mkstemp(path_.data());
    if (fd < 0) throw std::runtime_error("no temporary file");
    close(fd);
    std::ofstream stream(path_);
    for (int i = 0; i < kLines; ++i) stream << line_of(i);
  }
  ~Queue() { unlink(path_.c_str()); }
  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

  const std::string& path() const { return path_; }

 private:
  std::string path_ = "/tmp/optree_bench.XXXXXX";
};

void BM_Build(benchmark::State& state, LineOf line_of) {
  const Queue queue(line_of);
  log_level = 6;
  for (auto _ : state) {
    OPTree tree(queue.path());
    benchmark::DoNotOptimize(tree.ProcessOP([](std::shared_ptr<OP>) {}));
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}

// Without the file and the parsing: what folding alone costs.
void BM_Fold(benchmark::State& state, LineOf line_of) {
  std::vector<std::shared_ptr<Event>> events;
  for (int i = 0; i < kLines; ++i) events.push_back(std::make_shared<Event>(line_of(i)));
  const Queue empty([](int) { return std::string(); });
  for (auto _ : state) {
    OPTree tree(empty.path());
    for (const auto& event : events) tree.InsertEvent(event);
    benchmark::DoNotOptimize(tree.ops.size());
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}

void BM_ParseOnly(benchmark::State& state, LineOf line_of) {
  const Queue queue(line_of);
  const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
  for (auto _ : state) {
    QueueReader input(queue.path());
    std::string line;
    Json::Value value;
    while (input.Next(line)) {
      benchmark::DoNotOptimize(
          reader->parse(line.data(), line.data() + line.size(), &value, nullptr));
    }
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}

BENCHMARK_CAPTURE(BM_Build, mixed, MixedLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Build, one_directory, DirectoryLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Build, renames, RenameLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, mixed, MixedLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, one_directory, DirectoryLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, renames, RenameLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_ParseOnly, mixed, MixedLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_ParseOnly, one_directory, DirectoryLine)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_ParseOnly, renames, RenameLine)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quarry::fileindex
