// How long searches take: percentiles for each kind of query and for a mix of them, over a corpus
// that is made at the first run and kept in the directory for temporary files.
//
//   search_bench [--documents=300000] [--queries=40] [--only=KIND] [--stream] [--keep-to=DIR]
//                [--clean]
//
// With --stream documents are stored all the while, with a commit each second or so.

#include <json/json.h>
#include <sys/resource.h>
#include <unistd.h>

#include <ctime>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "bench/search_corpus.h"
#include "common/json.h"
#include "daemons/tarnelasticd/engine.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::bench {
namespace {

using Clock = std::chrono::steady_clock;

const char* const kMappings =
#include "comm/index_mappings.inc"
    ;

struct Options {
  std::size_t documents = 300000;
  std::size_t queries = 40;  // of each kind
  std::string only;          // the name of a kind
  bool stream = false;
  bool clean = false;
  std::string directory;
};

double Milliseconds(Clock::duration time) {
  return std::chrono::duration<double, std::milli>(time).count();
}

Json::Value Request(const std::string& command) {
  Json::Value request;
  request["command"] = command;
  request["data"]["id"] = "bench";
  return request;
}

class Corpus {
 public:
  explicit Corpus(const Options& options) : options_(options) {
    engine::EngineOptions engine_options;
    engine_options.registry_path = options.directory + "/indexes.json";
    const bool is_made = std::filesystem::exists(Made());
    if (!is_made) std::filesystem::remove_all(options.directory);
    std::filesystem::create_directories(options.directory);
    engine_ = std::make_unique<engine::Engine>(engine_options);
    if (!is_made) Fill();
  }

  Json::Value Run(const Json::Value& request) {
    Json::Value response = engine_->Handle(request);
    if (!response["success"].asBool()) {
      std::fprintf(stderr, "%s\n", toString(response).c_str());
      std::abort();
    }
    return response;
  }

  void Store(std::size_t number) {
    Json::Value request = Request("document_upsert_by_id");
    request["data"]["data"] = DocumentMaker(number).Make();
    request["data"]["doc_id"] = request["data"]["data"]["TARNMDPath"];
    Run(request);
  }

 private:
  std::string Made() const { return options_.directory + "/made"; }

  void Fill() {
    const auto start = Clock::now();
    Json::Value create = Request("index_create");
    create["data"]["path"] = options_.directory + "/index";
    if (!fromString(create["data"]["mappings"], kMappings)) std::abort();
    Run(create);
    for (std::size_t i = 0; i < options_.documents; ++i) Store(i);
    Json::Value terms = Request("update_term_suggestion");
    terms["data"]["db_name"] = "bench";
    terms["data"]["doc_id_field"] = "TARNMDPath";
    Run(terms);
    Run(Request("commit"));
    std::ofstream(Made()) << "\n";
    std::printf("made in %.0f s\n", Milliseconds(Clock::now() - start) / 1000);
  }

  const Options& options_;
  std::unique_ptr<engine::Engine> engine_;
};

Json::Value SearchRequest(const QueryClass& kind, std::mt19937_64* random, std::size_t documents) {
  Json::Value request;
  request["command"] = "search";
  Json::Value& data = request["data"];
  data["query"] = kind.make(random, documents);
  if (kind.sort != nullptr) data["sort"] = kind.sort;
  if (kind.offset > 0) data["offset"] = kind.offset;
  if (kind.in_folder) {
    const std::string folder = DocumentMaker::Folder((*random)() % documents);
    data["inside"] = folder.substr(0, folder.rfind('/'));
  }
  return request;
}

// A time, and how much it counts.
using Sample = std::pair<double, double>;

// What a search took by the clock and of this thread's processor time: on a machine that is busy
// with other things only the latter says something.
struct Times {
  std::vector<Sample> wall;
  std::vector<Sample> processor;
};

double ProcessorMilliseconds() {
  timespec time{};
  clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
  return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_nsec) / 1e6;
}

double Percentile(std::vector<Sample> samples, double share) {
  std::sort(samples.begin(), samples.end());
  double all = 0;
  for (const Sample& sample : samples) all += sample.second;
  double passed = 0;
  for (const Sample& sample : samples) {
    passed += sample.second;
    if (passed >= all * share) return sample.first;
  }
  return samples.empty() ? 0 : samples.back().first;
}

void PrintRow(const char* name, double share, const Times& times, double hits) {
  std::printf("%-18s %5.0f %% |", name, share);
  for (const auto* samples : {&times.wall, &times.processor}) {
    for (const double part : {0.5, 0.95, 0.99}) {
      std::printf(" %8.2f", Percentile(*samples, part));
    }
    std::printf(" |");
  }
  std::printf(" %10.0f\n", hits);
}

void RunMix(Corpus* corpus, const Options& options) {
  std::printf("%-18s %7s | %26s | %26s | %10s\n", "", "", "by the clock, ms", "processor time, ms",
              "mean");
  std::printf("%-18s %7s | %8s %8s %8s | %8s %8s %8s | %10s\n", "kind of query", "share", "p50",
              "p95", "p99", "p50", "p95", "p99", "total");
  Times all;
  std::mt19937_64 random(7);
  corpus->Run(SearchRequest(Mix().front(), &random, options.documents));
  std::vector<Times> times(Mix().size());
  std::vector<double> hits(Mix().size());
  // In turns, as they come: one kind's pages do not stay in the cache for the next of its kind.
  for (std::size_t i = 0; i < options.queries; ++i) {
    for (std::size_t j = 0; j < Mix().size(); ++j) {
      if (!options.only.empty() && options.only != Mix()[j].name) continue;
      const Json::Value request = SearchRequest(Mix()[j], &random, options.documents);
      const auto start = Clock::now();
      const double processor_start = ProcessorMilliseconds();
      const Json::Value found = corpus->Run(request);
      const double processor = ProcessorMilliseconds() - processor_start;
      const double wall = Milliseconds(Clock::now() - start);
      times[j].wall.emplace_back(wall, 1.0);
      times[j].processor.emplace_back(processor, 1.0);
      all.wall.emplace_back(wall, Mix()[j].share);
      all.processor.emplace_back(processor, Mix()[j].share);
      hits[j] += found["data"]["total"].asDouble() / static_cast<double>(options.queries);
    }
  }
  for (std::size_t j = 0; j < Mix().size(); ++j) {
    if (times[j].wall.empty()) continue;
    PrintRow(Mix()[j].name, Mix()[j].share, times[j], hits[j]);
  }
  PrintRow("the mix", 100, all, 0);
}

// Stores new documents and changes old ones until it goes out of scope.
class Stream {
 public:
  Stream(Corpus* corpus, std::size_t documents)
      : thread_([this, corpus, documents] { Run(corpus, documents); }) {}
  ~Stream() {
    stop_ = true;
    thread_.join();
    std::printf("%zu documents stored meanwhile\n", stored_);
  }
  Stream(const Stream&) = delete;
  Stream& operator=(const Stream&) = delete;

 private:
  void Run(Corpus* corpus, std::size_t documents) {
    std::mt19937_64 random(static_cast<std::uint64_t>(getpid()));
    auto committed = Clock::now();
    for (std::size_t next = documents; !stop_; ++stored_) {
      corpus->Store(stored_ % 4 == 0 ? random() % documents : next++);
      if (Clock::now() - committed < std::chrono::seconds(1)) continue;
      corpus->Run(Request("commit"));
      committed = Clock::now();
    }
    corpus->Run(Request("commit"));
  }

  std::atomic<bool> stop_{false};
  std::size_t stored_ = 0;
  std::thread thread_;
};

Options ParseOptions(int argc, char** argv) {
  Options options;
  for (int i = 1; i < argc; ++i) {
    const std::string_view argument(argv[i]);
    const std::string value(argument.substr(std::min(argument.find('=') + 1, argument.size())));
    if (argument.rfind("--documents=", 0) == 0) options.documents = std::stoul(value);
    if (argument.rfind("--queries=", 0) == 0) options.queries = std::stoul(value);
    if (argument.rfind("--only=", 0) == 0) options.only = value;
    if (argument.rfind("--keep-to=", 0) == 0) options.directory = value;
    options.stream = options.stream || argument == "--stream";
    options.clean = options.clean || argument == "--clean";
  }
  if (options.directory.empty()) {
    options.directory = (std::filesystem::temp_directory_path() / "quarry_search_bench_").string() +
                        std::to_string(engine::kLayoutVersion) + "_" +
                        std::to_string(options.documents);
  }
  return options;
}

}  // namespace
}  // namespace quarry::bench

int main(int argc, char** argv) {
  using namespace quarry::bench;
  const Options options = ParseOptions(argc, argv);
  if (options.clean) {
    std::filesystem::remove_all(options.directory);
    return 0;
  }
  Corpus corpus(options);
  std::unique_ptr<Stream> stream;
  if (options.stream) stream = std::make_unique<Stream>(&corpus, options.documents);
  RunMix(&corpus, options);
  stream.reset();
  rusage usage{};
  getrusage(RUSAGE_SELF, &usage);
  std::printf("peak memory %ld MB\n", usage.ru_maxrss / 1024);
  return 0;
}
