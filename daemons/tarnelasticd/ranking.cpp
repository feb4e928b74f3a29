#include "daemons/tarnelasticd/ranking.h"

#include <cmath>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {
namespace {

// The usual parameters of BM25: how fast further occurrences stop to count, and how much a long
// text counts against a document.
constexpr double kSaturation = 1.2;
constexpr double kLengthShare = 0.75;

double AverageLength(const Fts5ExtensionApi* api, Fts5Context* fts) {
  sqlite3_int64 rows = 0;
  sqlite3_int64 words = 0;
  if (api->xRowCount(fts, &rows) != SQLITE_OK || rows == 0) return 1;
  if (api->xColumnTotalSize(fts, -1, &words) != SQLITE_OK || words == 0) return 1;
  return static_cast<double>(words) / static_cast<double>(rows);
}

double Frequency(const Fts5ExtensionApi* api, Fts5Context* fts, int phrase,
                 const std::vector<double>& column_weights) {
  double frequency = 0;
  Fts5PhraseIter iterator;
  int column = 0;
  int offset = 0;
  if (api->xPhraseFirst(fts, phrase, &iterator, &column, &offset) != SQLITE_OK) return 0;
  for (; column >= 0; api->xPhraseNext(fts, &iterator, &column, &offset)) {
    const auto index = static_cast<std::size_t>(column);
    frequency += index < column_weights.size() ? column_weights[index] : 1;
  }
  return frequency;
}

void Score(const Fts5ExtensionApi* api, Fts5Context* fts, sqlite3_context* /*result*/,
           int /*argument_count*/, sqlite3_value** /*arguments*/) {
  RankContext* context = *static_cast<RankContext**>(api->xUserData(fts));
  const sqlite3_int64 id = api->xRowid(fts);
  if (context == nullptr || !context->candidates->Contains(id)) return;
  if (context->average_length <= 0) context->average_length = AverageLength(api, fts);
  int length = 0;
  api->xColumnSize(fts, -1, &length);
  const double share = length / context->average_length;
  const double norm = kSaturation * (1 - kLengthShare + kLengthShare * share);
  double score = 0;
  for (std::size_t phrase = 0; phrase < context->word_weights.size(); ++phrase) {
    const double frequency = Frequency(api, fts, static_cast<int>(phrase), context->column_weights);
    score += context->word_weights[phrase] * frequency * (kSaturation + 1) / (frequency + norm);
  }
  (*context->scores)[static_cast<std::size_t>(id)] += static_cast<float>(score);
}

}  // namespace

double WordWeight(std::size_t documents_with, std::size_t documents) {
  const auto with = static_cast<double>(documents_with);
  const auto without = static_cast<double>(documents) - with;
  return std::log(1 + (without + 0.5) / (with + 0.5));
}

void RegisterRanking(sqlite3* db, RankContext** slot) {
  fts5_api* api = Fts5Api(db);
  const int result =
      api->xCreateFunction(api, "quarry_score", static_cast<void*>(slot), &Score, nullptr);
  if (result != SQLITE_OK) ThrowSqlite(db, result, "Cannot register the ranking");
}

}  // namespace quarry::engine
