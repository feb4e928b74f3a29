// How many documents per second the engine stores, and how long searches take.

#include <benchmark/benchmark.h>
#include <json/json.h>

#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "common/json.h"
#include "daemons/tarnelasticd/engine.h"

namespace quarry::engine {
namespace {

constexpr std::size_t kVocabulary = 50000;
constexpr std::size_t kWordsPerDocument = 1000;  // some 7 KB, as documentation and notes have
constexpr std::size_t kSearchedDocuments = 20000;

const char* const kMappings =
#include "comm/index_mappings.inc"
    ;

// Words as they come in real text: the n-th most frequent about 1/n as often as the first.
class TextMaker {
 public:
  std::string Make(std::size_t words) {
    std::string text;
    for (std::size_t i = 0; i < words; ++i) {
      text += Word();
      text += i % 12 == 11 ? ".\n" : " ";
    }
    return text;
  }

  // Syllables, as the hash of the index's words is made for words that people use.
  static std::string WordNumber(std::size_t number) {
    constexpr std::string_view kFirst = "bcdfghjklmnprstvwxyz";
    constexpr std::string_view kSecond = "aeiou";
    constexpr std::string_view kLast = "nrslt";
    std::string word;
    for (std::size_t rest = number + 500; rest > 0; rest /= 500) {
      word += kFirst[rest % 20];
      word += kSecond[rest / 20 % 5];
      if (rest / 100 % 5 > 0) word += kLast[rest / 100 % 5];
    }
    return word;
  }

 private:
  std::string Word() {
    const double share = std::uniform_real_distribution<>(0, 1)(random_);
    return WordNumber(static_cast<std::size_t>(std::pow(kVocabulary, share)) - 1);
  }

  std::mt19937_64 random_{42};
};

Json::Value Document(std::size_t number, const std::string& text) {
  const std::string parent = "/volume1/share/folder" + std::to_string(number / 100);
  const std::string name = "file" + std::to_string(number) + ".txt";
  Json::Value document;
  document["TARNMDPath"] = parent + "/" + name;
  document["TARNMDParent"] = parent;
  for (const char* field : {"TARNMDFSName", "TARNMDSearchFileName", "TARNMDDisplayName"}) {
    document[field] = name;
  }
  document["TARNMDExtension"] = "txt";
  document["TARNMDIsDir"] = false;
  document["TARNMDFSSize"] = static_cast<Json::UInt64>(text.size());
  document["TARNMDFSContentChangeDate"] = static_cast<Json::UInt64>(1600000000 + number);
  document["QuarryAttributeStamp"] = "2049:" + std::to_string(number) + ":7000:1600000000:1";
  document["TARNMDTextContent"] = text;
  return document;
}

Json::Value Request(const std::string& command) {
  Json::Value request;
  request["command"] = command;
  request["data"]["id"] = "bench";
  return request;
}

Json::Value Upsert(const Json::Value& document) {
  Json::Value request = Request("document_upsert_by_id");
  request["data"]["doc_id"] = document["TARNMDPath"];
  request["data"]["data"] = document;
  return request;
}

// An engine in a directory of its own, with one empty index.
class Place {
 public:
  Place() {
    std::string pattern = (std::filesystem::temp_directory_path() / "quarry_XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) std::abort();
    dir_ = pattern;
    EngineOptions options;
    options.registry_path = dir_ + "/indexes.json";
    engine_ = std::make_unique<Engine>(options);
    Json::Value create = Request("index_create");
    create["data"]["path"] = dir_ + "/index";
    if (!fromString(create["data"]["mappings"], kMappings)) std::abort();
    Run(create);
  }
  ~Place() {
    engine_.reset();
    std::filesystem::remove_all(dir_);
  }
  Place(const Place&) = delete;
  Place& operator=(const Place&) = delete;

  Json::Value Run(const Json::Value& request) {
    Json::Value response = engine_->Handle(request);
    if (!response["success"].asBool()) std::abort();
    return response;
  }
  Engine& engine() { return *engine_; }
  std::uintmax_t Bytes() const {
    std::uintmax_t bytes = 0;
    for (const auto& file : std::filesystem::recursive_directory_iterator(dir_)) {
      if (file.is_regular_file()) bytes += file.file_size();
    }
    return bytes;
  }

 private:
  std::string dir_;
  std::unique_ptr<Engine> engine_;
};

std::vector<std::string> UpsertTexts(std::size_t count) {
  TextMaker maker;
  std::vector<std::string> requests;
  for (std::size_t i = 0; i < count; ++i) {
    requests.push_back(toString(Upsert(Document(i, maker.Make(kWordsPerDocument)))));
  }
  return requests;
}

// New documents, as request texts, with a commit at the end.
void BM_Insert(benchmark::State& state) {
  const auto requests = UpsertTexts(static_cast<std::size_t>(state.range(0)));
  std::size_t text_bytes = 0;
  for (const std::string& request : requests) text_bytes += request.size();
  for (auto _ : state) {
    state.PauseTiming();
    auto place = std::make_unique<Place>();
    state.ResumeTiming();
    for (const std::string& request : requests) place->engine().HandleText(request);
    place->Run(Request("commit"));
    state.PauseTiming();
    state.counters["disk/text"] =
        static_cast<double>(place->Bytes()) / static_cast<double>(text_bytes);
    place.reset();
    state.ResumeTiming();
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text_bytes));
}
BENCHMARK(BM_Insert)->Arg(2000)->Arg(10000)->Unit(benchmark::kMillisecond)->UseRealTime();

// The same documents again with other texts, in an order that is not that of their numbers.
void BM_Replace(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  Place place;
  TextMaker maker;
  for (std::size_t i = 0; i < count; ++i) {
    place.Run(Upsert(Document(i, maker.Make(kWordsPerDocument))));
  }
  place.Run(Request("commit"));
  for (auto _ : state) {
    state.PauseTiming();
    std::vector<Json::Value> requests;
    for (std::size_t i = 0; i < count; ++i) {
      requests.push_back(Upsert(Document(i * 7919 % count, maker.Make(kWordsPerDocument))));
    }
    state.ResumeTiming();
    for (const Json::Value& request : requests) place.Run(request);
    place.Run(Request("commit"));
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Replace)->Arg(2000)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(3);

// Moving documents to another folder, as a batch.
void BM_Rename(benchmark::State& state) {
  const auto count = static_cast<std::size_t>(state.range(0));
  Place place;
  TextMaker maker;
  for (std::size_t i = 0; i < count; ++i) place.Run(Upsert(Document(i, maker.Make(200))));
  place.Run(Request("commit"));
  std::string prefix = "/volume1/share/";
  for (auto _ : state) {
    state.PauseTiming();
    const std::string next = prefix + "x/";
    Json::Value batch;
    for (std::size_t i = 0; i < count; ++i) {
      const std::string rest =
          "folder" + std::to_string(i / 100) + "/file" + std::to_string(i) + ".txt";
      Json::Value request = Request("document_set_by_id");
      request["data"]["doc_id"] = prefix + rest;
      request["data"]["data"]["TARNMDPath"] = next + rest;
      batch["compound"].append(request);
    }
    prefix = next;
    state.ResumeTiming();
    place.Run(batch);
    place.Run(Request("commit"));
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(BM_Rename)->Arg(5000)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(5);

Place& SearchedPlace() {
  static Place place;
  static const bool filled = [] {
    TextMaker maker;
    for (std::size_t i = 0; i < kSearchedDocuments; ++i) {
      place.Run(Upsert(Document(i, maker.Make(kWordsPerDocument))));
    }
    place.Run(Request("commit"));
    return true;
  }();
  benchmark::DoNotOptimize(filled);
  return place;
}

void Search(benchmark::State& state, const std::string& query) {
  Place& place = SearchedPlace();
  Json::Value request;
  request["command"] = "search";
  request["data"]["query"] = query;
  Json::UInt64 total = 0;
  for (auto _ : state) total = place.Run(request)["data"]["total"].asUInt64();
  state.counters["total"] = static_cast<double>(total);
}

const std::string kCommon = TextMaker::WordNumber(0);
const std::string kMedium = TextMaker::WordNumber(500);
const std::string kRare = TextMaker::WordNumber(40000);
BENCHMARK_CAPTURE(Search, rare, kRare)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, medium, kMedium)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, commonest, kCommon)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, two_words, kMedium + " " + kRare)->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, phrase, '"' + kCommon + " " + kMedium + '"')
    ->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, prefix, kMedium.substr(0, 2) + "*")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, part_of_name, "name:le1234")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Search, filter_alone, "type:document in:/volume1/share/folder7")
    ->Unit(benchmark::kMillisecond);

constexpr std::size_t kManyTerms = 1000000;
constexpr std::size_t kTermsPerDocument = 1000;

// Each word in two documents, so that all are there to be suggested.
Place& PlaceOfManyTerms() {
  static Place place;
  static const bool filled = [] {
    for (std::size_t i = 0; i < 2 * kManyTerms / kTermsPerDocument; ++i) {
      std::string text;
      for (std::size_t j = 0; j < kTermsPerDocument; ++j) {
        text += TextMaker::WordNumber((i * kTermsPerDocument + j) % kManyTerms) + " ";
      }
      place.Run(Upsert(Document(i, text)));
    }
    place.Run(Request("commit"));
    return true;
  }();
  benchmark::DoNotOptimize(filled);
  return place;
}

void BM_CollectTerms(benchmark::State& state) {
  Place& place = PlaceOfManyTerms();
  Json::Value request = Request("update_term_suggestion");
  request["data"]["db_name"] = "bench";
  request["data"]["doc_id_field"] = "TARNMDPath";
  std::size_t round = 0;
  for (auto _ : state) {
    state.PauseTiming();  // they are not collected where nothing has changed
    place.Run(Upsert(Document(2 * kManyTerms, "round" + std::to_string(round++))));
    place.Run(Request("commit"));
    state.ResumeTiming();
    place.Run(request);
    place.Run(Request("commit"));
  }
}
BENCHMARK(BM_CollectTerms)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(3);

// A search that finds nothing, with another spelling of each word; needs the words of
// BM_CollectTerms.
void Suggest(benchmark::State& state, const std::string& query) {
  Place& place = PlaceOfManyTerms();
  Json::Value request;
  request["command"] = "search";
  request["data"]["query"] = query;
  bool suggested = false;
  for (auto _ : state) suggested = place.Run(request)["data"].isMember("suggestion");
  state.counters["suggested"] = suggested ? 1 : 0;
}

// A word with its third and fourth letters swapped.
std::string Swapped(std::size_t number) {
  std::string word = TextMaker::WordNumber(number);
  std::swap(word.at(2), word.at(3));
  return word;
}
BENCHMARK_CAPTURE(Suggest, one_word, Swapped(400500))->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Suggest, word_like_none, "qqqqwwww")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Suggest, two_words, Swapped(400500) + " OR " + Swapped(500700))
    ->Unit(benchmark::kMillisecond);

void Complete(benchmark::State& state, const std::string& prefix) {
  Place& place = PlaceOfManyTerms();
  Json::Value request;
  request["command"] = "complete";
  request["data"]["prefix"] = prefix;
  for (auto _ : state) place.Run(request);
}
BENCHMARK_CAPTURE(Complete, one_letter, "b")->Unit(benchmark::kMillisecond);
BENCHMARK_CAPTURE(Complete, three_letters, "bac")->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace quarry::engine
