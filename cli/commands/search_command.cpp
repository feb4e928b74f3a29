#include <iostream>
#include <memory>
#include <vector>

#include "cli/commands/commands.h"
#include "cli/output.h"
#include "cli/search.h"

namespace quarry::cli {

void AddSearchCommand(CLI::App& app) {
  CLI::App* search = app.add_subcommand("search", "Find files by name and content");
  auto words = std::make_shared<std::vector<std::string>>();
  auto request = std::make_shared<SearchRequest>();
  search->add_option("WORDS", *words, "What to find")->required();
  search->add_option("--offset", request->offset, "Leave out so many of the best hits");
  search->add_option("--limit", request->limit, "Show so many hits")->check(CLI::Range(1, 1000));
  const bool& json = JsonOption(*search);
  Examples(
      *search,
      "  quarry search budget 2019              both words, in the name or the content\n"
      "  quarry search '\"annual report\"'        the phrase\n"
      "  quarry search 'invoic* -draft'         words that begin so, without those with draft\n"
      "  quarry search 'cat OR dog type:photo'  either word; type: document, audio, video, photo\n"
      "  quarry search 'ext:pdf in:/srv/Docs name:plan'");
  search->callback([words, request, &json] {
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
