// Databases with a full-text table "body", looked at and compared word by word.

#ifndef QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FULL_TEXT_H_
#define QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FULL_TEXT_H_

#include <cstddef>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "daemons/tarnelasticd/database.h"

namespace quarry::engine {

// Each row's first column.
std::vector<std::string> Rows(Database* db, const std::string& sql);

// The first column of the first row, which there must be.
std::int64_t Number(Database* db, const std::string& sql);

// Lets what follows ask a database for the places of its words.
void CreatePlaces(Database* db);

// Expects that every place of every word, lengths and totals are the same in both, and that FTS5
// finds nothing wrong with `tested`.
void ExpectSameWords(Database* tested, Database* model);

// `words` words, the first ones of the vocabulary much more often than the others.
std::string RandomWords(std::mt19937_64* random, std::size_t words, std::size_t vocabulary);

}  // namespace quarry::engine

#endif  // QUARRY_TESTS_DAEMONS_TARNELASTICD_SUPPORT_FULL_TEXT_H_
