#include "daemons/tarnelasticd/ranking.h"

#include <cmath>

#include "daemons/tarnelasticd/database.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/text_tokenizer.h"

namespace quarry::engine {
namespace {

// The usual parameters of BM25: how fast further occurrences stop to count, and how much a long
// text counts against a document.
constexpr double kSaturation = 1.2;
constexpr double kLengthShare = 0.75;

double Frequency(const Fts5ExtensionApi* api, Fts5Context* fts,
                 const std::vector<double>& column_weights) {
  double frequency = 0;
  Fts5PhraseIter iterator;
  int column = 0;
  int offset = 0;
  if (api->xPhraseFirst(fts, 0, &iterator, &column, &offset) != SQLITE_OK) return 0;
  for (; column >= 0; api->xPhraseNext(fts, &iterator, &column, &offset)) {
    const auto index = static_cast<std::size_t>(column);
    frequency += index < column_weights.size() ? column_weights[index] : 1;
  }
  return frequency;
}

// Exceptions must not cross SQLite's frames.
template <typename Action>
void Guarded(sqlite3_context* result, Action action) {
  try {
    action();
  } catch (const Error&) {
    sqlite3_result_error_code(result, SQLITE_CORRUPT);
  } catch (...) {
    sqlite3_result_error_nomem(result);
  }
}

void Count(const Fts5ExtensionApi* api, Fts5Context* fts, sqlite3_context* result,
           int /*argument_count*/, sqlite3_value** /*arguments*/) {
  CountContext* context = *static_cast<CountContext**>(api->xUserData(fts));
  if (context == nullptr) return;
  const sqlite3_int64 id = api->xRowid(fts);
  Guarded(result, [&] {
    context->frequencies->Add(id, static_cast<float>(Frequency(api, fts, context->column_weights)));
  });
}

void Add(sqlite3_context* result, int /*argument_count*/, sqlite3_value** arguments) {
  CountContext* context = *static_cast<CountContext**>(sqlite3_user_data(result));
  if (context == nullptr) return;
  Guarded(result, [&] { context->documents->Add(sqlite3_value_int64(arguments[0])); });
}

}  // namespace

double WordWeight(std::size_t documents_with, std::size_t documents) {
  const auto with = static_cast<double>(documents_with);
  const auto without = static_cast<double>(documents) - with;
  return std::log(1 + (without + 0.5) / (with + 0.5));
}

double LengthNorm(std::size_t length, double average_length) {
  return 1 - kLengthShare + kLengthShare * static_cast<double>(length) / average_length;
}

double WordScore(double frequency, double length_norm) {
  return frequency * (kSaturation + 1) / (frequency + kSaturation * length_norm);
}

void RegisterCounting(sqlite3* db, CountContext** slot) {
  static_assert(kMostOfWord == kSaturation + 1);
  fts5_api* api = Fts5Api(db);
  int result = api->xCreateFunction(api, "quarry_count", static_cast<void*>(slot), &Count, nullptr);
  if (result == SQLITE_OK) {
    result = sqlite3_create_function_v2(db, "quarry_add", 1, SQLITE_UTF8, static_cast<void*>(slot),
                                        &Add, nullptr, nullptr, nullptr);
  }
  if (result != SQLITE_OK) ThrowSqlite(db, result, "Cannot register the ranking");
}

}  // namespace quarry::engine
