// The order of hits, compared with a reading of the ranking's rules that scores every document.

#include <algorithm>
#include <cmath>
#include <map>
#include <random>
#include <set>

#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

struct File {
  std::vector<std::string> title;
  std::vector<std::string> text;
  std::string name;
};

std::string Join(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) text += word + ' ';
  return text;
}

// Words that are no parts of each other, so that file names hold a word or do not.
const std::vector<std::string> kWords = {"the", "kernel", "quite", "rare", "lock", "zebra"};

class SearchRankingTest : public EngineTest, public testing::WithParamInterface<unsigned> {
 protected:
  SearchRankingTest() { Create(); }

  std::size_t Number(std::size_t below) {
    return std::uniform_int_distribution<std::size_t>(0, below - 1)(random_);
  }
  std::ptrdiff_t Jump(std::size_t below) { return static_cast<std::ptrdiff_t>(Number(below)); }
  // The first words are the most frequent.
  std::string Word() { return kWords[Number(1 + Number(1 + Number(kWords.size())))]; }
  std::vector<std::string> Words(std::size_t most) {
    std::vector<std::string> words;
    for (std::size_t left = Number(most + 1); left > 0; --left) words.push_back(Word());
    return words;
  }
  void Store(std::size_t number) {
    File file;
    file.name = (Number(8) == 0 ? Word() : "file") + "-" + std::to_string(number) + ".txt";
    const std::string path = "/s/" + file.name;
    file.text = Words(Number(20) == 0 ? 500 : 30);
    if (Number(4) == 0) file.title = Words(4);
    // Some have the texts of another.
    if (!files_.empty() && Number(3) == 0) {
      const File& other = std::next(files_.begin(), Jump(files_.size()))->second;
      file.text = other.text;
      file.title = other.title;
    }
    Json::Value document = FileDocument(path, Join(file.text));
    if (!file.title.empty()) document["TARNMDTitle"] = Join(file.title);
    Upsert(document);
    files_[path] = file;
  }
  void Remove(const std::string& path) {
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = path;
    Ask("document_del_by_id", data);
    files_.erase(path);
  }

  static std::size_t Count(const std::vector<std::string>& words, const std::string& word) {
    return static_cast<std::size_t>(std::count(words.begin(), words.end(), word));
  }
  static bool NameHas(const File& file, const std::string& word) {
    return file.name.find(word) != std::string::npos;
  }
  static bool Has(const File& file, const std::string& word) {
    return NameHas(file, word) || Count(file.text, word) > 0 || Count(file.title, word) > 0;
  }
  double AverageLength() const {
    double words = 0;
    double texts = 0;
    for (const auto& [path, file] : files_) {
      const std::size_t length = file.text.size() + file.title.size();
      words += static_cast<double>(length);
      texts += length > 0 ? 1 : 0;
    }
    return words / texts;
  }
  double Weight(const std::string& word) const {
    const auto with = static_cast<double>(std::count_if(
        files_.begin(), files_.end(), [&](const auto& item) { return Has(item.second, word); }));
    const double without = static_cast<double>(files_.size()) - with;
    return std::log(1 + (without + 0.5) / (with + 0.5));
  }
  // What scores have in common.
  struct Rules {
    double average_length;
    std::map<std::string, double> weights;  // of the query's words
  };
  Rules MakeRules(const std::vector<std::string>& query) const {
    Rules rules{AverageLength(), {}};
    for (const std::string& word : query) rules.weights[word] = Weight(word);
    return rules;
  }
  static double Score(const File& file, const Rules& rules) {
    double score = 0;
    const auto length = static_cast<double>(file.text.size() + file.title.size());
    const double norm = 1.2 * (0.25 + 0.75 * length / rules.average_length);
    for (const auto& [word, weight] : rules.weights) {
      const double frequency = static_cast<double>(Count(file.text, word)) +
                               6 * static_cast<double>(Count(file.title, word));
      double sum = frequency > 0 ? frequency * 2.2 / (frequency + norm) : 0;
      if (NameHas(file, word)) sum += 2.5 + 1.5;
      score += weight * sum;
    }
    return score;
  }

  void Compare(const std::vector<std::string>& query, std::size_t offset) {
    const Rules rules = MakeRules(query);
    std::vector<double> expected;
    for (const auto& [path, file] : files_) {
      const bool has_all = std::all_of(query.begin(), query.end(),
                                       [&found = file](auto& word) { return Has(found, word); });
      if (has_all) expected.push_back(Score(file, rules));
    }
    std::sort(expected.rbegin(), expected.rend());
    Json::Value more;
    more["offset"] = Json::UInt64{offset};
    const Json::Value found = Search(Join(query), more);
    ASSERT_EQ(found["total"].asUInt64(), expected.size()) << Join(query);
    const Json::Value& hits = found["hits"];
    ASSERT_EQ(hits.size(),
              std::min<std::size_t>(10, expected.size() - std::min(offset, expected.size())));
    for (Json::ArrayIndex i = 0; i < hits.size(); ++i) {
      const double score = hits[i]["score"].asDouble();
      ASSERT_NEAR(score, expected[offset + i], 1e-4) << Join(query) << i;
      ASSERT_NEAR(score, Score(files_.at(hits[i]["path"].asString()), rules), 1e-4);
    }
  }

  std::mt19937 random_{GetParam()};
  std::map<std::string, File> files_;
};

TEST_P(SearchRankingTest, HitsAreTheBestOfAll) {
  for (int round = 0; round < 5; ++round) {
    for (std::size_t i = 0; i < 80; ++i) Store(Number(300));
    for (std::size_t i = Number(10); i > 0 && !files_.empty(); --i) Remove(files_.begin()->first);
    Commit();
    for (std::size_t i = 0; i < 20; ++i) {
      std::set<std::string> words;
      for (std::size_t left = 1 + Number(3); left > 0; --left) words.insert(Word());
      const std::vector<std::string> query(words.begin(), words.end());
      ASSERT_NO_FATAL_FAILURE(Compare(query, Number(3) * 7));
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, SearchRankingTest, testing::Range(1U, 7U));

}  // namespace
}  // namespace quarry::engine
