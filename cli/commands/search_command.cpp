#include <iostream>
#include <memory>
#include <vector>

#include "cli/commands/commands.h"
#include "cli/output.h"
#include "cli/search.h"
#include "common/json.h"

namespace quarry::cli {
namespace {

void PrintCompletions(const std::vector<std::string>& words, bool json) {
  if (json) {
    Json::Value result;
    result["words"] = Vec2JsonArr<std::string>(words);
    PrintJson(std::cout, result);
    return;
  }
  for (const std::string& word : words) std::cout << Printable(word) << '\n';
}

}  // namespace

void AddSearchCommand(CLI::App& app) {
  CLI::App* search = app.add_subcommand("search", "Find files by name and content");
  auto words = std::make_shared<std::vector<std::string>>();
  auto request = std::make_shared<SearchRequest>();
  auto prefix = std::make_shared<std::string>();
  CLI::Option* to_find = search->add_option("WORDS", *words, "What to find");
  search->add_option("--offset", request->offset, "Leave out so many of the best hits");
  search->add_option("--limit", request->limit, "Show so many hits")->check(CLI::Range(1, 1000));
  CLI::Option* complete =
      search
          ->add_option(
              "--complete", *prefix,
              "Print the words of the indexes that begin so instead, the most frequent first")
          ->excludes(to_find);
  const bool& json = JsonOption(*search);
  Examples(
      *search,
      "  quarry search budget 2019              both words, in the name or the content\n"
      "  quarry search '\"annual report\"'        the phrase\n"
      "  quarry search 'invoic* -draft'         words that begin so, without those with draft\n"
      "  quarry search 'cat OR dog type:photo'  either word; type: document, audio, video, photo\n"
      "  quarry search 'ext:pdf in:/srv/Docs name:plan'\n"
      "  quarry search --complete inv           words that begin so");
  search->callback([=, &json] {
    if (complete->count() > 0) {
      PrintCompletions(Completions(*prefix), json);
      return;
    }
    if (to_find->count() == 0) throw CLI::RequiredError("WORDS");
    request->query = QueryOf(*words);
    const Json::Value found = Search(*request);
    if (json) {
      PrintJson(std::cout, found);
    } else {
      PrintHits(std::cout, found, request->offset, OutputIsTerminal());
    }
  });
}

}  // namespace quarry::cli
