// Searches over random documents, compared with a reading of the rules that is slow and obvious.

#include <map>
#include <random>
#include <set>

#include "common/file_util.h"
#include "daemons/tarnelasticd/query.h"
#include "fileindex/util/file_type.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"

namespace quarry::engine {
namespace {

// Two of these fold to the same word.
const std::vector<std::string> kWords = {"ab",  "abc", "abcd", "cab",  "b1",    "\xC3\xA9t\xC3\xA9",
                                         "ETE", "x",   "bc",   "note", "Note2", "dcab"};
const std::vector<std::string> kNames = {"ab",   "abc", "cab.note", "\xC3\x89t\xC3\xA9",
                                         "b1-x", "note"};
const std::vector<std::string> kExtensions = {"", ".txt", ".MP3", ".avi", ".jpg", ".zzz"};
const std::vector<std::string> kFolders = {"/s", "/s/a", "/s/ab", "/s/a/c"};

std::string Folded(const std::string& text) {
  std::string folded;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const bool accented = text[i] == '\xC3' && i + 1 < text.size();
    if (accented) ++i;
    folded += accented                           ? 'e'
              : text[i] >= 'A' && text[i] <= 'Z' ? static_cast<char>(text[i] - 'A' + 'a')
                                                 : text[i];
  }
  return folded;
}

std::vector<std::string> WordsOf(const std::string& text) {
  std::vector<std::string> words;
  std::string word;
  for (const char c : Folded(text) + " ") {
    const bool is_letter = (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9');
    if (is_letter) word += c;
    if (!is_letter && !word.empty()) words.push_back(std::exchange(word, ""));
  }
  return words;
}

bool HasInARow(const std::vector<std::string>& words, const std::vector<std::string>& wanted,
               bool prefix) {
  for (std::size_t i = 0; !wanted.empty() && i + wanted.size() <= words.size(); ++i) {
    bool equal = true;
    for (std::size_t j = 0; j < wanted.size(); ++j) {
      const bool is_begin = prefix && j + 1 == wanted.size();
      equal =
          equal && (is_begin ? words[i + j].rfind(wanted[j], 0) == 0 : words[i + j] == wanted[j]);
    }
    if (equal) return true;
  }
  return false;
}

bool NameHas(const std::string& name, const std::string& part) {
  const std::string folded = Folded(name);
  if (part.size() >= kMinPart) return folded.find(part) != std::string::npos;
  return folded == part || folded.rfind(part + '.', 0) == 0;
}

struct File {
  std::string path;
  bool is_dir = false;
  std::string text;
  std::string title;
  std::string name() const { return Basename(path); }
};

bool IsOfType(const File& file, const std::vector<std::string>& types) {
  static const std::map<std::string, fileindex::FileType> kinds = {
      {"document", fileindex::kDocument},
      {"audio", fileindex::kAudio},
      {"video", fileindex::kVideo},
      {"photo", fileindex::kImage}};
  if (file.is_dir) return false;
  return std::any_of(types.begin(), types.end(), [&](const std::string& type) {
    return fileindex::GetFileTypeByFullPath(file.path) == kinds.at(type);
  });
}

bool Answers(const File& file, const QueryTerm& term) {
  switch (term.kind) {
    case QueryTerm::Kind::kType:
      return IsOfType(file, term.values);
    case QueryTerm::Kind::kExtension:
      return !file.is_dir && std::count(term.values.begin(), term.values.end(),
                                        GetFileExtension(file.name(), true)) > 0;
    case QueryTerm::Kind::kInside:
      return (file.path + '/').rfind(term.text == "/" ? "/" : term.text + '/', 0) == 0;
    case QueryTerm::Kind::kName:
      return NameHas(file.name(), Folded(term.text));
    default:
      break;
  }
  const std::vector<std::string> wanted = WordsOf(term.text);
  for (const std::string& text : {file.text, file.title, file.name()}) {
    if (HasInARow(WordsOf(text), wanted, term.prefix)) return true;
  }
  return NameHas(file.name(), Folded(term.text));
}

bool Answers(const File& file, const Query& query) {
  for (const auto& group : query.groups) {
    bool any = false;
    for (const QueryTerm& term : group) any = any || Answers(file, term) != term.negated;
    if (!any) return false;
  }
  return true;
}

class SearchModelTest : public EngineTest, public testing::WithParamInterface<unsigned> {
 protected:
  SearchModelTest() : random_(GetParam()) { Create(); }

  std::size_t Number(std::size_t below) {
    return std::uniform_int_distribution<std::size_t>(0, below - 1)(random_);
  }
  bool Chance(std::size_t one_in) { return Number(one_in) == 0; }
  const std::string& OneOf(const std::vector<std::string>& all) { return all[Number(all.size())]; }

  std::string RandomText(std::size_t most) {
    std::string text;
    for (std::size_t i = Number(most + 1); i > 0; --i)
      text += OneOf(kWords) + (Chance(4) ? ", " : " ");
    return text;
  }
  File RandomFile() {
    File file;
    file.path = OneOf(kFolders) + '/' + OneOf(kNames) + OneOf(kExtensions);
    file.is_dir = Chance(6);
    if (!file.is_dir) file.text = RandomText(8);
    if (Chance(4)) file.title = RandomText(3);
    // A copy of another, as a folder has it that was copied.
    if (!file.is_dir && !files_.empty() && Chance(2)) {
      const auto other = std::next(files_.begin(), static_cast<int>(Number(files_.size())));
      file.text = other->second.text;
      file.title = other->second.title;
    }
    return file;
  }
  static Json::Value DocumentOf(const File& file) {
    Json::Value document = FileDocument(file.path, file.text);
    document["TARNMDIsDir"] = file.is_dir;
    if (!file.title.empty()) document["TARNMDTitle"] = file.title;
    return document;
  }

  // One random change, to the engine and to the model.
  void Change() {
    const File file = RandomFile();
    const std::size_t kind = Number(10);
    Json::Value data;
    data["id"] = "a";
    data["doc_id"] = file.path;
    if (kind < 6) {
      Upsert(DocumentOf(file));
      files_[file.path] = file;
    } else if (kind == 6) {
      Ask("document_del_by_id", data);
      files_.erase(file.path);
    } else if (kind == 7) {
      DeleteBelow(file.path.substr(0, file.path.rfind('/')));
    } else if (kind == 8) {
      SetTitle(data, RandomText(3));
    } else {
      Rename(data, RandomFile().path);
    }
    if (Chance(15)) Commit();
  }
  void DeleteBelow(const std::string& folder) {
    if (!Chance(5)) return;
    Json::Value data;
    data["id"] = "a";
    data["query"]["qsl"]["prefix"]["TARNMDPath"] = folder + '/';
    Ask("document_del_by_query", data);
    std::erase_if(files_, [&](const auto& item) { return item.first.rfind(folder + '/', 0) == 0; });
  }
  void SetTitle(Json::Value data, const std::string& title) {
    data["data"]["TARNMDTitle"] = title.empty() ? Json::Value() : Json::Value(title);
    const bool found = Ask("document_set_by_id", data)["found"].asBool();
    const auto file = files_.find(data["doc_id"].asString());
    ASSERT_EQ(found, file != files_.end());
    if (found) file->second.title = title;
  }
  void Rename(Json::Value data, const std::string& to) {
    data["data"] = FileDocument(to);
    data["data"].removeMember("TARNMDIsDir");
    Ask("document_set_by_id", data);
    const auto file = files_.find(data["doc_id"].asString());
    if (file == files_.end()) return;
    File moved = file->second;
    files_.erase(file);
    moved.path = to;
    files_[to] = moved;
  }

  std::string RandomTerm() {
    const std::string minus = Chance(4) ? "-" : "";
    switch (Number(9)) {
      case 0:
        return minus + '"' + OneOf(kWords) + ' ' + OneOf(kWords) + '"';
      case 1:
        return minus + OneOf({"a", "ab", "b", "b1", "e", "et", "n", "no", "x"}) + "*";
      case 2:
        return minus + "type:" + OneOf({"document", "audio", "video,photo", "photo"});
      case 3:
        return minus + "ext:" + OneOf({"txt", "mp3,.avi", "TXT", "zzz", "none"});
      case 4:
        return minus + "in:" + OneOf({"/s", "/s/a", "/s/a/", "/", "/s/ab/note", "/t"});
      case 5:
        return minus +
               "name:" + OneOf({"note", "ab", ".txt", "b1-x", "cab.n", "\xC3\x89T\xC3\xA9", "b1"});
      case 6:
        return minus + OneOf({"b1-x", "cab.note", "e.t", "ote", "te."});
      default:
        return minus + OneOf(kWords);
    }
  }
  std::string RandomQuery() {
    std::string query = RandomTerm();
    for (std::size_t i = Number(4); i > 0; --i) query += (Chance(3) ? " OR " : " ") + RandomTerm();
    return query;
  }
  void Compare(const std::string& text) {
    const Query query = ParseQuery(text);
    std::set<std::string> expected;
    for (const auto& [path, file] : files_) {
      if (Answers(file, query)) expected.insert(path);
    }
    const std::vector<std::string> paths = Paths(text);
    const std::set<std::string> found(paths.begin(), paths.end());
    ASSERT_EQ(found, expected) << text << " (seed " << GetParam() << ")";
    ASSERT_EQ(paths.size(), found.size()) << text;
    Json::Value by_path;
    by_path["sort"] = "path";
    ASSERT_EQ(Paths(text, by_path), std::vector<std::string>(found.begin(), found.end())) << text;
  }

  std::mt19937 random_;
  std::map<std::string, File> files_;
};

TEST_P(SearchModelTest, FindsWhatTheModelFinds) {
  for (int round = 0; round < 6; ++round) {
    for (int i = 0; i < 60; ++i) ASSERT_NO_FATAL_FAILURE(Change());
    Commit();
    if (Chance(3)) Restart();
    ASSERT_EQ(Below("/").size(), files_.size());
    for (int i = 0; i < 60; ++i) ASSERT_NO_FATAL_FAILURE(Compare(RandomQuery()));
  }
}

INSTANTIATE_TEST_SUITE_P(Seeds, SearchModelTest, testing::Range(1U, 9U));

}  // namespace
}  // namespace quarry::engine
