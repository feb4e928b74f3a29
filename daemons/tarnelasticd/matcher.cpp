#include "daemons/tarnelasticd/matcher.h"

#include <algorithm>
#include <utility>

#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/selection.h"
#include "daemons/tarnelasticd/word_finder.h"
#include "fileindex/util/file_type.h"

namespace quarry::engine {
namespace {

void Collect(Statement* rows, DocSet* set) {
  while (rows->Step()) set->Add(rows->Int(0));
}

// What the frequencies of one query's terms may take in memory together.
constexpr std::size_t kMaxFrequencies = std::size_t{32} << 20;

int TypeOf(const std::string& name) {
  if (name == "document") return fileindex::kDocument;
  if (name == "audio") return fileindex::kAudio;
  if (name == "video") return fileindex::kVideo;
  return fileindex::kImage;
}

bool IsAmong(int type, const std::vector<std::string>& names) {
  return std::any_of(names.begin(), names.end(),
                     [type](const std::string& name) { return TypeOf(name) == type; });
}

class Finder {
 public:
  Finder(const Schema& schema, IndexReader* reader)
      : schema_(schema), db_(&reader->db()), words_(schema, reader) {}

  // A name: filter for several parts takes them all: "name:*report*.pdf".
  DocSet ByName(const QueryTerm& term) {
    DocSet found = words_.InNames(term.values.front());
    for (std::size_t i = 1; i < term.values.size(); ++i) {
      found.Intersect(words_.InNames(term.values[i]));
    }
    return found;
  }

  DocSet ByExtension(const std::vector<std::string>& extensions) {
    DocSet found;
    const std::string column = schema_.ColumnOf(kFieldExtension);
    if (column.empty()) return found;
    for (const std::string& extension : extensions) {
      Statement rows = db_->Prepare("SELECT id FROM docs WHERE " + column + "=?1" + FilesOnly());
      rows.Bind(1, std::string_view(extension));
      Collect(&rows, &found);
    }
    return found;
  }

  // Folders have no type: all extensions of files that are there are asked for theirs.
  DocSet ByType(const std::vector<std::string>& types) {
    std::vector<std::string> extensions;
    const std::string column = schema_.ColumnOf(kFieldExtension);
    if (column.empty()) return {};
    Statement next = db_->Prepare("SELECT min(" + column + ") FROM docs WHERE " + column + ">=?1");
    std::string at;
    for (;;) {
      next.Bind(1, std::string_view(at));
      if (!next.Step() || next.IsNull(0)) break;
      const std::string extension(next.Text(0));
      next.Reset();
      if (IsAmong(fileindex::GetFileTypeByFullPath("/x." + extension), types)) {
        extensions.push_back(extension);
      }
      at = extension + '\0';
    }
    DocSet found = ByExtension(extensions);
    if (IsAmong(fileindex::GetFileTypeByFullPath("/x"), types))
      found.Unite(WithoutExtension(column));
    return found;
  }

  DocSet Inside(const std::string& path) {
    DocSet found;
    const std::string begin = path == "/" ? path : path + '/';
    const std::string end = PrefixEnd(begin);
    Statement rows = db_->Prepare("SELECT id FROM docs WHERE path=?1 OR (path>=?2 AND path<?3)");
    rows.Bind(1, std::string_view(path)).Bind(2, std::string_view(begin));
    rows.Bind(3, std::string_view(end));
    Collect(&rows, &found);
    return found;
  }

  DocSet All() {
    DocSet found;
    Statement rows = db_->Prepare("SELECT id FROM docs");
    Collect(&rows, &found);
    return found;
  }

  DocSet ByWords(const QueryTerm& term, TermMatches* matches) {
    if (!term.words.empty()) {
      Frequencies frequencies;
      matches->texts = words_.InTexts(term, &frequencies);
      KeepFrequencies(std::move(frequencies), matches);
      matches->labels = words_.InLabels(term);
    }
    matches->names = words_.InNames(term.part);
    DocSet found = matches->texts;
    found.Unite(matches->labels);
    found.Unite(matches->names);
    matches->documents = found.Count();
    matches->term = &term;
    return found;
  }

 private:
  void KeepFrequencies(Frequencies frequencies, TermMatches* matches) {
    frequencies_bytes_ += frequencies.Bytes();
    if (frequencies_bytes_ <= kMaxFrequencies) matches->frequencies = std::move(frequencies);
  }

  std::string FilesOnly() const {
    const std::string column = schema_.ColumnOf(kFieldIsDir);
    return column.empty() ? "" : " AND " + column + " IS NOT 1";
  }

  DocSet WithoutExtension(const std::string& column) {
    DocSet found;
    Statement rows = db_->Prepare("SELECT id FROM docs WHERE " + column + " IS NULL" + FilesOnly());
    Collect(&rows, &found);
    return found;
  }

  const Schema& schema_;
  Database* db_;
  WordFinder words_;
  std::size_t frequencies_bytes_ = 0;
};

DocSet FindTerm(const QueryTerm& term, Finder* finder, Matches* matches) {
  switch (term.kind) {
    case QueryTerm::Kind::kName:
      return finder->ByName(term);
    case QueryTerm::Kind::kExtension:
      return finder->ByExtension(term.values);
    case QueryTerm::Kind::kType:
      return finder->ByType(term.values);
    case QueryTerm::Kind::kInside:
      return finder->Inside(term.text);
    default:
      break;
  }
  TermMatches found;
  DocSet documents = finder->ByWords(term, &found);
  if (!term.negated) matches->terms.push_back(std::move(found));
  return documents;
}

// A group is a union; what is negated in it is the rest of all documents.
DocSet FindGroup(const std::vector<QueryTerm>& group, Finder* finder, Matches* matches) {
  DocSet found;
  for (const QueryTerm& term : group) {
    DocSet documents = FindTerm(term, finder, matches);
    if (term.negated) {
      DocSet rest = finder->All();
      rest.Subtract(documents);
      documents = std::move(rest);
    }
    found.Unite(documents);
  }
  return found;
}

bool IsPlainNegation(const std::vector<QueryTerm>& group) {
  return group.size() == 1 && group.front().negated;
}

}  // namespace

std::vector<const QueryTerm*> RankedTerms(const Query& query) {
  std::vector<const QueryTerm*> terms;
  for (const auto& group : query.groups) {
    for (const QueryTerm& term : group) {
      if (term.kind == QueryTerm::Kind::kWords && !term.negated) terms.push_back(&term);
    }
  }
  return terms;
}

Matches FindMatches(const Schema& schema, const Query& query, IndexReader* reader) {
  Finder finder(schema, reader);
  Matches matches;
  bool first = true;
  // Taking away is cheaper than building the rest of all documents, so it comes last.
  for (const auto& group : query.groups) {
    if (IsPlainNegation(group)) continue;
    DocSet found = FindGroup(group, &finder, &matches);
    if (first) {
      matches.documents = std::move(found);
    } else {
      matches.documents.Intersect(found);
    }
    first = false;
  }
  if (first) matches.documents = finder.All();
  for (const auto& group : query.groups) {
    if (!IsPlainNegation(group)) continue;
    matches.documents.Subtract(FindTerm(group.front(), &finder, &matches));
  }
  return matches;
}

}  // namespace quarry::engine
