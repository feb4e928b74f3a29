// Documents and queries as people have them, made from numbers: the same for everyone.

#ifndef QUARRY_BENCH_SEARCH_CORPUS_H_
#define QUARRY_BENCH_SEARCH_CORPUS_H_

#include <json/json.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <random>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace quarry::bench {

constexpr std::size_t kVocabulary = 500000;
constexpr const char* kCorpusRoot = "/volume1/share";

// The n-th most frequent word of the language. Syllables, so that beginnings are shared as in words
// that people use.
inline std::string WordOfRank(std::size_t rank) {
  constexpr std::string_view kFirst = "bcdfghjklmnprstvwxyz";
  constexpr std::string_view kSecond = "aeiou";
  constexpr std::string_view kLast = "nrslt";
  std::string word;
  // Spread over the alphabet, so that words of all ranks begin alike.
  for (std::size_t rest = rank * 7919 % 999983 + 500; rest > 0; rest /= 500) {
    word += kFirst[rest % 20];
    word += kSecond[rest / 20 % 5];
    if (rest / 100 % 5 > 0) word += kLast[rest / 100 % 5];
  }
  return word;
}

// One document of the corpus. Words come as in real text: the n-th most frequent about 1/n as often
// as the first, but a few that the document is about far more often. Lengths are log-normal: half
// of the texts have less than 250 words, the mean is some 460.
class DocumentMaker {
 public:
  explicit DocumentMaker(std::size_t number) : number_(number), random_(number * 2654435761U + 17) {
    for (std::size_t& topic : topics_) topic = LogUniform(20, kVocabulary);
  }

  Json::Value Make() {
    const std::string extension = Extension();
    const std::string parent = Folder(number_);
    const std::string name = Name() + '.' + extension;
    Json::Value document;
    document["TARNMDPath"] = parent + "/" + name;
    document["TARNMDParent"] = parent;
    for (const char* field : {"TARNMDFSName", "TARNMDSearchFileName", "TARNMDDisplayName"}) {
      document[field] = name;
    }
    document["TARNMDExtension"] = extension;
    document["TARNMDIsDir"] = false;
    document["TARNMDFSSize"] = Json::UInt64{random_() % 1000000};
    document["TARNMDFSContentChangeDate"] = Json::UInt64{1500000000 + random_() % 200000000};
    document["QuarryAttributeStamp"] = "2049:" + std::to_string(number_) + ":7000:1600000000:1";
    if (Chance(0.3)) document["TARNMDTitle"] = Words(5);
    if (extension != "jpg" && extension != "mp3") document["TARNMDTextContent"] = Words(Length());
    return document;
  }

  // Some hundred documents to a folder, in a tree of three levels.
  static std::string Folder(std::size_t number) {
    const std::size_t folder = number / 100;
    return std::string(kCorpusRoot) + "/" + WordOfRank(folder / 400 + 1000) + "/" +
           WordOfRank(folder / 20 % 20 + 2000) + "/" + WordOfRank(folder % 20 + 3000);
  }

 private:
  double Share() { return std::uniform_real_distribution<>(0, 1)(random_); }
  bool Chance(double share) { return Share() < share; }
  std::size_t LogUniform(double first, double last) {
    return static_cast<std::size_t>(first * std::pow(last / first, Share())) - 1;
  }
  std::size_t Length() {
    const double words = std::lognormal_distribution<>(std::log(250.0), 1.1)(random_);
    return static_cast<std::size_t>(std::clamp(words, 3.0, 50000.0));
  }
  std::string Words(std::size_t count) {
    std::string text;
    for (std::size_t i = 0; i < count; ++i) {
      const bool topic = Chance(0.15);
      text += WordOfRank(topic ? topics_[random_() % topics_.size()] : LogUniform(1, kVocabulary));
      text += i % 12 == 11 ? ".\n" : " ";
    }
    return text;
  }
  std::string Extension() {
    constexpr std::array<const char*, 10> kAll = {"txt",  "txt", "html", "html", "pdf",
                                                  "docx", "md",  "jpg",  "mp3",  "cpp"};
    return kAll[random_() % kAll.size()];
  }
  std::string Name() {
    std::string name = WordOfRank(Chance(0.5) ? topics_[0] : LogUniform(20, 20000));
    if (Chance(0.6)) name += "-" + WordOfRank(LogUniform(20, 20000));
    return name + "_" + std::to_string(number_);
  }

  std::size_t number_;
  std::mt19937_64 random_;
  std::array<std::size_t, 12> topics_{};
};

// One kind of query, and how many of a hundred searches are of it.
struct QueryClass {
  const char* name;
  double share;
  std::string (*make)(std::mt19937_64* random, std::size_t documents);
  const char* sort = nullptr;
  int offset = 0;
  bool in_folder = false;
};

inline std::string WordBetween(std::mt19937_64* random, double first, double last) {
  const double share = std::uniform_real_distribution<>(0, 1)(*random);
  return WordOfRank(static_cast<std::size_t>(first * std::pow(last / first, share)) - 1);
}
inline std::string RareWord(std::mt19937_64* random) {
  return WordBetween(random, 20000, 400000);
}
inline std::string MediumWord(std::mt19937_64* random) {
  return WordBetween(random, 500, 20000);
}
inline std::string CommonWord(std::mt19937_64* random) {
  return WordBetween(random, 20, 500);
}
inline std::string CommonestWord(std::mt19937_64* random) {
  return WordBetween(random, 1, 20);
}

// `count` words in a row from some document's text.
inline std::string Phrase(std::mt19937_64* random, std::size_t documents, std::size_t count) {
  std::string text;
  while (text.size() < 100) {
    text = DocumentMaker((*random)() % documents).Make()["TARNMDTextContent"].asString();
  }
  std::vector<std::string> words;
  std::string word;
  for (const char c : text) {
    if (c != ' ' && c != '.' && c != '\n') word += c;
    if (c == ' ' && !word.empty()) words.push_back(std::exchange(word, ""));
  }
  const std::size_t first = (*random)() % (words.size() - std::min(count, words.size() - 1));
  std::string phrase = "\"";
  for (std::size_t i = first; i < std::min(first + count, words.size()); ++i) {
    phrase += (i > first ? " " : "") + words[i];
  }
  return phrase + '"';
}

inline std::string Misspelt(std::mt19937_64* random) {
  std::string word = MediumWord(random);
  std::swap(word.at(1), word.at(2));
  return word;
}

// The mix: what is typed into the search field of a file server, as far as is known: mostly one or
// two words, often a name; the field searches while one types.
inline const std::vector<QueryClass>& Mix() {
  using Random = std::mt19937_64;
  static const std::vector<QueryClass> mix = {
      {"rare word", 12, [](Random* r, std::size_t) { return RareWord(r); }},
      {"medium word", 14, [](Random* r, std::size_t) { return MediumWord(r); }},
      {"common word", 8, [](Random* r, std::size_t) { return CommonWord(r); }},
      {"commonest word", 4, [](Random* r, std::size_t) { return CommonestWord(r); }},
      {"two words", 10, [](Random* r, std::size_t) { return MediumWord(r) + " " + CommonWord(r); }},
      {"two common words", 5,
       [](Random* r, std::size_t) { return CommonWord(r) + " " + CommonestWord(r); }},
      {"three words", 6,
       [](Random* r, std::size_t) {
         return CommonestWord(r) + " " + MediumWord(r) + " " + CommonWord(r);
       }},
      {"three commonest", 1,
       [](Random* r, std::size_t) {
         return CommonestWord(r) + " " + CommonestWord(r) + " " + CommonestWord(r);
       }},
      {"one OR other", 1,
       [](Random* r, std::size_t) { return CommonWord(r) + " OR " + MediumWord(r); }},
      {"word -word", 1,
       [](Random* r, std::size_t) { return CommonWord(r) + " -" + CommonestWord(r); }},
      {"phrase", 5, [](Random* r, std::size_t n) { return Phrase(r, n, 3); }},
      {"common phrase", 1,
       [](Random* r, std::size_t) {
         return '"' + CommonestWord(r) + " " + CommonestWord(r) + '"';
       }},
      {"prefix of 4", 5, [](Random* r, std::size_t) { return CommonWord(r).substr(0, 4) + "*"; }},
      {"prefix of 3", 3, [](Random* r, std::size_t) { return CommonWord(r).substr(0, 3) + "*"; }},
      {"prefix of 2", 2, [](Random* r, std::size_t) { return CommonWord(r).substr(0, 2) + "*"; }},
      {"prefix of 1", 1, [](Random* r, std::size_t) { return CommonWord(r).substr(0, 1) + "*"; }},
      {"word in folder", 4, [](Random* r, std::size_t) { return CommonWord(r); }, nullptr, 0, true},
      {"word in share", 1,
       [](Random* r, std::size_t) { return MediumWord(r) + " in:" + kCorpusRoot; }},
      {"word and type", 3, [](Random* r, std::size_t) { return MediumWord(r) + " type:document"; }},
      {"common and type", 1,
       [](Random* r, std::size_t) { return CommonestWord(r) + " type:document"; }},
      {"by time", 2, [](Random* r, std::size_t) { return MediumWord(r); }, "time"},
      {"common by time", 1, [](Random* r, std::size_t) { return CommonestWord(r); }, "time"},
      {"second page", 2, [](Random* r, std::size_t) { return CommonWord(r); }, nullptr, 10},
      {"name", 2, [](Random* r, std::size_t) { return "name:" + CommonWord(r); }},
      {"part of all names", 1, [](Random*, std::size_t) { return std::string("html"); }},
      {"misspelt", 2, [](Random* r, std::size_t) { return Misspelt(r); }},
      {"not there", 2,
       [](Random* r, std::size_t) { return "qq" + RareWord(r).substr(0, 4) + "ww"; }},
  };
  return mix;
}

}  // namespace quarry::bench

#endif  // QUARRY_BENCH_SEARCH_CORPUS_H_
