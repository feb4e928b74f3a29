#include "daemons/tarnelasticd/search.h"

#include <algorithm>
#include <optional>
#include <set>
#include <utility>

#include "common/error.h"
#include "common/file_util.h"
#include "daemons/tarnelasticd/attributes.h"
#include "daemons/tarnelasticd/document.h"
#include "daemons/tarnelasticd/field_names.h"
#include "daemons/tarnelasticd/page.h"
#include "daemons/tarnelasticd/ranking.h"
#include "daemons/tarnelasticd/request.h"
#include "daemons/tarnelasticd/snippet.h"
#include "daemons/tarnelasticd/suggestion.h"
#include "daemons/tarnelasticd/text_sharing.h"
#include "daemons/tarnelasticd/text_store.h"

namespace quarry::engine {
namespace {

SortOrder ParseSort(const Json::Value& data) {
  if (!data.isMember("sort")) return SortOrder::kDefault;
  const std::string sort = StringProperty(data, "sort");
  if (sort == "score") return SortOrder::kScore;
  if (sort == "path") return SortOrder::kPath;
  if (sort == "time") return SortOrder::kTime;
  FailMalformed("sort must be score, path or time");
}

// The query, ready to be asked.
Query MakeQuery(const std::string& text, const std::string& inside,
                const std::vector<SearchedIndex>& indexes) {
  Query query = ParseQuery(text);
  if (!indexes.empty()) Resolve(indexes.front().reader->tokenizer(), &query);
  if (!inside.empty()) query.groups.push_back({InsideTerm(inside)});
  return query;
}

std::vector<Matches> FindAll(const Query& query, const std::vector<SearchedIndex>& indexes) {
  std::vector<Matches> matches;
  for (const SearchedIndex& index : indexes) {
    matches.push_back(FindMatches(*index.schema, query, index.reader));
  }
  return matches;
}

std::size_t CountAll(const std::vector<Matches>& matches) {
  std::size_t total = 0;
  for (const Matches& found : matches) total += found.documents.Count();
  return total;
}

// The corrected query, if it finds more than the `total` documents of the query as it is. Whatever
// keeps a correction from being found, it must not keep the hits from whoever asked.
std::optional<std::string> SuggestQuery(const SearchRequest& request, const Query& query,
                                        std::size_t total,
                                        const std::vector<SearchedIndex>& indexes) {
  try {
    std::optional<std::string> better = CorrectQuery(request.query, query, indexes);
    if (!better) return std::nullopt;
    const Query corrected = MakeQuery(*better, request.inside, indexes);
    return CountAll(FindAll(corrected, indexes)) > total ? better : std::nullopt;
  } catch (const Error&) {
    return std::nullopt;
  }
}

// The weight of each word over all indexes.
std::vector<double> WeighWords(const std::vector<Matches>& matches,
                               const std::vector<SearchedIndex>& indexes) {
  std::size_t documents = 0;
  for (const SearchedIndex& index : indexes) {
    Statement count = index.reader->db().Prepare("SELECT value FROM meta WHERE key='documents'");
    if (count.Step())
      documents += static_cast<std::size_t>(std::max<std::int64_t>(count.Int(0), 0));
  }
  std::vector<double> weights;
  const std::size_t terms = matches.empty() ? 0 : matches.front().terms.size();
  for (std::size_t i = 0; i < terms; ++i) {
    std::size_t with = 0;
    for (const Matches& found : matches) with += found.terms[i].documents;
    weights.push_back(WordWeight(with, std::max(documents, with)));
  }
  return weights;
}

// The text to show: the content, unless only another text has the words.
Snippet ChooseSnippet(const SearchedIndex& index, std::string_view packed,
                      const std::vector<const QueryTerm*>& terms, std::size_t length) {
  const std::vector<std::string_view> texts = UnpackTexts(*index.schema, packed);
  const TextTokenizer& tokenizer = index.reader->tokenizer();
  const Field* content = index.schema->Find(kFieldContent);
  Snippet first;
  if (content != nullptr && content->storage == Storage::kText) {
    first = MakeSnippet(tokenizer, texts[content->column], terms, length);
    if (!first.highlights.empty()) return first;
  }
  for (const std::string_view text : texts) {
    if (text.empty()) continue;
    Snippet snippet = MakeSnippet(tokenizer, text, terms, length);
    if (!snippet.highlights.empty() || first.text.empty()) first = std::move(snippet);
    if (!first.highlights.empty()) break;
  }
  return first;
}

Json::Value SnippetJson(const Snippet& snippet) {
  Json::Value json;
  json["text"] = snippet.text;
  json["highlights"] = Json::Value(Json::arrayValue);
  for (const auto& [start, length] : snippet.highlights) {
    Json::Value range(Json::arrayValue);
    range.append(Json::UInt64{start});
    range.append(Json::UInt64{length});
    json["highlights"].append(std::move(range));
  }
  return json;
}

Json::Value AttributesJson(const SearchedIndex& index, const Ranked& ranked) {
  static const std::set<std::string> fields = {kFieldName, kFieldIsDir, kFieldSize, kFieldChanged};
  Database* db = &index.reader->db();
  Statement row = db->Prepare("SELECT " + DocsColumns(*index.schema) + " FROM docs WHERE id=?1");
  row.Bind(1, ranked.id);
  Json::Value hit(Json::objectValue);
  if (!row.Step()) return hit;
  const std::string path(row.Text(1));
  const std::string attributes = ReadText(db, kAttributes, ranked.id);
  const DocumentRow unpacked = UnpackRow(*index.schema, row, attributes);
  const Json::Value document = ReadRow(*index.schema, unpacked, &fields);
  const Json::Value& name = document[kFieldName];
  hit["index"] = index.id;
  hit["path"] = path;
  hit["name"] = name.isString() ? name : Json::Value(Basename(path));
  hit["is_dir"] = document[kFieldIsDir].isBool() && document[kFieldIsDir].asBool();
  hit["size"] = document[kFieldSize].isInt64() ? document[kFieldSize] : Json::Value(0);
  hit["mtime"] = document[kFieldChanged].isInt64() ? document[kFieldChanged] : Json::Value(0);
  hit["score"] = ranked.score;
  return hit;
}

Json::Value HitJson(const SearchedIndex& index, const Ranked& ranked,
                    const std::vector<const QueryTerm*>& terms, std::size_t snippet_length) {
  Json::Value hit = AttributesJson(index, ranked);
  if (snippet_length == 0) return hit;
  Database* db = &index.reader->db();
  const std::string packed = ReadText(db, kTexts, TextOf(db, ranked.id));
  if (packed.empty()) return hit;
  hit["snippet"] = SnippetJson(ChooseSnippet(index, packed, terms, snippet_length));
  return hit;
}

// The page over all indexes: the first of each are enough to know the first of all.
std::vector<Ranked> MakePage(const SearchRequest& request, const Query& query,
                             const std::vector<SearchedIndex>& indexes,
                             const std::vector<Matches>& matches, SortOrder order) {
  const std::vector<double> weights = WeighWords(matches, indexes);
  const std::size_t wanted = request.offset + request.limit;
  std::vector<Ranked> page;
  for (std::size_t i = 0; i < indexes.size(); ++i) {
    for (Ranked& ranked : FirstOf(indexes[i], query, matches[i], weights, order, wanted)) {
      ranked.index = i;
      page.push_back(std::move(ranked));
    }
  }
  std::sort(page.begin(), page.end(),
            [order](const Ranked& a, const Ranked& b) { return ComesBefore(a, b, order); });
  if (page.size() > wanted) page.resize(wanted);
  page.erase(page.begin(),
             page.begin() + static_cast<std::ptrdiff_t>(std::min(request.offset, page.size())));
  return page;
}

}  // namespace

SearchRequest ParseSearchRequest(const Json::Value& data) {
  SearchRequest request;
  request.query = StringProperty(data, "query");
  if (data.isMember("inside")) {
    request.inside = NameProperty(data, "inside");
    if (request.inside.front() != '/') FailMalformed("Not a full path: inside");
  }
  request.offset =
      static_cast<std::size_t>(OptionalNumber(data, "offset", 0, kMaxSearchOffset).value_or(0));
  request.limit =
      static_cast<std::size_t>(OptionalNumber(data, "limit", 0, kMaxSearchLimit).value_or(10));
  request.sort = ParseSort(data);
  if (data.isMember("highlight")) {
    const Json::Value& highlight = ObjectProperty(data, "highlight");
    request.snippet_length = static_cast<std::size_t>(
        OptionalNumber(highlight, "length", 0, kMaxSnippetLength).value_or(200));
  }
  return request;
}

Json::Value Search(const SearchRequest& request, const std::vector<SearchedIndex>& indexes) {
  const Query query = MakeQuery(request.query, request.inside, indexes);
  const std::vector<const QueryTerm*> terms = RankedTerms(query);
  const std::vector<Matches> matches = FindAll(query, indexes);
  const std::size_t total = CountAll(matches);
  SortOrder order = request.sort;
  if (order == SortOrder::kDefault) order = terms.empty() ? SortOrder::kPath : SortOrder::kScore;
  Json::Value found;
  found["total"] = Json::UInt64{total};
  found["hits"] = Json::Value(Json::arrayValue);
  for (const Ranked& ranked : MakePage(request, query, indexes, matches, order)) {
    indexes[ranked.index].reader->CheckDeadline();
    found["hits"].append(HitJson(indexes[ranked.index], ranked, terms, request.snippet_length));
  }
  if (total < kFewDocuments) {
    if (auto better = SuggestQuery(request, query, total, indexes)) {
      found["suggestion"] = *std::move(better);
    }
  }
  return found;
}

}  // namespace quarry::engine
