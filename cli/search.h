// Asking the engine, and showing what it found.

#ifndef QUARRY_CLI_SEARCH_H_
#define QUARRY_CLI_SEARCH_H_

#include <json/json.h>

#include <iosfwd>
#include <string>
#include <vector>

namespace quarry::cli {

struct SearchRequest {
  std::string query;
  std::string inside;  // only at and below this full path; everywhere when it is empty
  unsigned int offset = 0;
  unsigned int limit = 10;
};

// The query that the words of a command line mean: a single one is a query as it stands; of several
// those with blanks were quoted for the shell and are phrases.
std::string QueryOf(const std::vector<std::string>& words);

// The engine's answer: {"total", "hits": [...]}, over all indexed shares, and "suggestion", another
// spelling of the query, where that finds more. Throws Problem or Error.
Json::Value Search(const SearchRequest& request);

// Words of the indexes that begin with `prefix`, the most frequent first. None where no engine
// answers at once: a shell that completes a line must neither wait nor be told why. Never throws.
std::vector<std::string> Completions(const std::string& prefix);

// Has the words of the index `id` collected, from which the engine suggests. Blocks until that is
// done. Throws Problem or Error.
void CollectWords(const std::string& id);

// The hits for a person, numbered from `offset` + 1, how many there are, what may have been meant
// instead, and which indexes could not be searched; matches are marked where `colours` says so.
void PrintHits(std::ostream& out, const Json::Value& found, unsigned int offset, bool colours);

// Asks for words and shows hits at and below the full path `inside` until the end of the input. A
// search that fails is reported and the next one asked for.
void SearchPrompt(const std::string& inside);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SEARCH_H_
