// Lines per second from a queue file into a tree of pending operations, and out of it again. In the
// same run the JSON library, one reader for all lines, merely parses the same lines: how many times
// as fast the tree is stands beside its figures, and so does the memory that it takes for a path.

#include <benchmark/benchmark.h>
#include <json/json.h>
#include <malloc.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>
#include <unordered_set>
#include <vector>

#include "common/error.h"
#include "fileindex/queue/event.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/pool.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {
namespace {

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
std::string MixedLine(int i, int) {
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

std::string DirectoryLine(int i, int) {
  return Line(EVENT_MODIFY, Nth("/volume1/share/directory/file-", i) + ".txt");
}

std::string FileOfATree(int i) {
  const unsigned int random = static_cast<unsigned int>(i) * 2654435761U >> 8;
  return "/volume1/share/" + Nth("project-", static_cast<int>(random % 40)) +
         Nth("/part-", static_cast<int>(random % 1000)) + Nth("/document-", i) + ".txt";
}

unsigned int KindOf(int i) {
  static const unsigned int kKinds[] = {EVENT_CREATE, EVENT_MODIFY, EVENT_ATTR, EVENT_MODIFY,
                                        EVENT_DELETE};
  return kKinds[i % 5];
}

// No path comes twice.
std::string DistinctLine(int i, int) {
  return Line(KindOf(i), FileOfATree(i));
}

// Each path five times, one after the other.
std::string FiveInTurnLine(int i, int) {
  return Line(KindOf(i), FileOfATree(i / 5));
}

// Each path about five times, in no order.
std::string FiveScatteredLine(int i, int lines) {
  const std::uint64_t random = (static_cast<std::uint64_t>(i) * 0x9e3779b97f4a7c15U) >> 32;
  return Line(KindOf(i), FileOfATree(static_cast<int>(random % static_cast<unsigned>(lines / 5))));
}

// Files that are written under one name and moved to another, as programs save them.
std::string RenameLine(int i, int) {
  const std::string file = Nth("/volume1/share/directory/", i / 2000) + Nth("/file-", i / 2);
  return i % 2 == 0 ? Line(EVENT_CREATE, file + ".tmp") : Line(EVENT_RENAME, file, file + ".tmp");
}

// The i-th of so many lines.
using LineOf = std::string (*)(int i, int lines);

// A queue of so many lines, removed with the object.
class Queue {
 public:
  Queue(LineOf line_of, int lines) {
    const int fd = mkstemp(path_.data());
    if (fd < 0) throw std::runtime_error("no temporary file");
    close(fd);
    std::ofstream stream(path_);
    for (int i = 0; i < lines; ++i) stream << line_of(i, lines);
  }
  ~Queue() { unlink(path_.c_str()); }
  Queue(const Queue&) = delete;
  Queue& operator=(const Queue&) = delete;

  const std::string& path() const { return path_; }

 private:
  std::string path_ = "/tmp/optree_bench.XXXXXX";
};

// Processor time, for other programs may be running.
double Seconds() {
  timespec now{};
  clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) / 1e9;
}

double BytesInUse() {
  const struct mallinfo2 info = mallinfo2();
  return static_cast<double>(info.uordblks + info.hblkhd + Pool::BytesInUse());
}

double SecondsToParse(const std::string& queue) {
  const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
  const double begin = Seconds();
  QueueReader input(queue);
  std::string_view line;
  Json::Value value;
  while (input.Next(line)) {
    benchmark::DoNotOptimize(
        reader->parse(line.data(), line.data() + line.size(), &value, nullptr));
  }
  return Seconds() - begin;
}

struct Built {
  double seconds;         // to build the tree, hand its records out and take it apart
  double bytes_per_path;  // what stays allocated, for each path that has a record
};

Built BuildTree(const std::string& queue) {
  const double before = BytesInUse();
  const double begin = Seconds();
  auto tree = std::make_unique<OPTree>(queue);
  benchmark::DoNotOptimize(tree->ProcessOP([](std::shared_ptr<OP>) {}));
  double seconds = Seconds() - begin;
  const double bytes = BytesInUse() - before;
  std::unordered_set<const OPNode*> paths;
  for (const auto& rec : tree->ops) {
    if (rec->op != OP_NONE) paths.insert(rec->node.get());
  }
  const double end = Seconds();
  tree.reset();
  seconds += Seconds() - end;
  return {seconds, bytes / static_cast<double>(paths.size())};
}

void BM_Tree(benchmark::State& state, LineOf line_of) {
  const int lines = static_cast<int>(state.range(0));
  const Queue queue(line_of, lines);
  log_level = 6;
  double parsing = 0;
  double building = 0;
  Built built{};
  for (auto _ : state) {
    parsing += SecondsToParse(queue.path());
    built = BuildTree(queue.path());
    building += built.seconds;
    state.SetIterationTime(built.seconds);
  }
  state.SetItemsProcessed(state.iterations() * lines);
  state.counters["parsing_alone"] = static_cast<double>(state.iterations()) * lines / parsing;
  state.counters["times_as_fast"] = parsing / building;
  state.counters["bytes_per_path"] = built.bytes_per_path;
}

// Without the file and the parsing: what folding alone costs.
void BM_Fold(benchmark::State& state, LineOf line_of) {
  const int lines = static_cast<int>(state.range(0));
  std::vector<std::shared_ptr<Event>> events;
  for (int i = 0; i < lines; ++i) events.push_back(std::make_shared<Event>(line_of(i, lines)));
  const Queue empty([](int, int) { return std::string(); }, 0);
  for (auto _ : state) {
    OPTree tree(empty.path());
    for (const auto& event : events) tree.InsertEvent(event);
    benchmark::DoNotOptimize(tree.ops.size());
  }
  state.SetItemsProcessed(state.iterations() * lines);
}

void Few(benchmark::internal::Benchmark* benchmark) {
  benchmark->Arg(1'000'000)->Unit(benchmark::kMillisecond)->UseManualTime();
}

void Many(benchmark::internal::Benchmark* benchmark) {
  benchmark->Arg(1'000'000)->Arg(10'000'000)->Unit(benchmark::kMillisecond)->UseManualTime();
}

BENCHMARK_CAPTURE(BM_Tree, distinct, DistinctLine)->Apply(Many);
BENCHMARK_CAPTURE(BM_Tree, one_directory, DirectoryLine)->Apply(Many);
BENCHMARK_CAPTURE(BM_Tree, five_in_turn, FiveInTurnLine)->Apply(Many);
BENCHMARK_CAPTURE(BM_Tree, five_scattered, FiveScatteredLine)->Apply(Many);
BENCHMARK_CAPTURE(BM_Tree, mixed, MixedLine)->Apply(Few);
BENCHMARK_CAPTURE(BM_Tree, renames, RenameLine)->Apply(Few);
BENCHMARK_CAPTURE(BM_Fold, distinct, DistinctLine)->Arg(1'000'000)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, mixed, MixedLine)->Arg(1'000'000)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(BM_Fold, renames, RenameLine)->Arg(1'000'000)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quarry::fileindex
