#include "cli/search.h"

#include <editline/readline.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <iostream>
#include <memory>

#include "cli/output.h"
#include "cli/problem.h"
#include "cli/shares.h"
#include "cli/system.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/client.h"

namespace quarry::cli {
namespace {

constexpr const char* kBold = "\033[1m";
constexpr const char* kMatch = "\033[1;33m";
constexpr const char* kFaint = "\033[2m";
constexpr const char* kPlain = "\033[0m";

// The snippet on one line, with the matches marked. "highlights" are [start, length] in bytes.
std::string Marked(const Json::Value& snippet, bool colours) {
  const std::string text = snippet["text"].asString();
  if (!colours) return Printable(text);
  std::string result;
  std::size_t done = 0;
  for (const Json::Value& range : snippet["highlights"]) {
    const auto start = static_cast<std::size_t>(range[0U].asUInt64());
    const auto length = static_cast<std::size_t>(range[1U].asUInt64());
    if (start < done || start > text.size() || length > text.size() - start) continue;
    result += Printable(text.substr(done, start - done)) + kMatch +
              Printable(text.substr(start, length)) + kPlain;
    done = start + length;
  }
  return result + Printable(text.substr(done));
}

void PrintHit(std::ostream& out, const Json::Value& hit, unsigned int number, bool colours) {
  const std::string path = hit["path"].asString();
  const std::string name = Basename(path);
  out << number << ". " << Printable(path.substr(0, path.size() - name.size()))
      << (colours ? kBold : "") << Printable(name) << (colours ? kPlain : "");
  if (!hit["is_dir"].asBool()) {
    out << "  " << (colours ? kFaint : "") << HumanSize(hit["size"].asUInt64()) << ", "
        << HumanTime(hit["mtime"].asInt64()) << (colours ? kPlain : "");
  }
  out << '\n';
  const std::string snippet = Marked(hit["snippet"], colours);
  if (!snippet.empty()) out << "   " << snippet << '\n';
}

void SearchOnce(const SearchRequest& request) {
  try {
    PrintHits(std::cout, Search(request), request.offset, OutputIsTerminal());
  } catch (const Problem& problem) {
    std::cout << problem.what() << '\n';
  } catch (const Error& error) {
    std::cout << Explain(error) << '\n';
  }
}

struct Free {
  void operator()(char* text) const { std::free(text); }
};

}  // namespace

std::string QueryOf(const std::vector<std::string>& words) {
  if (words.size() == 1) return words.front();
  std::string query;
  for (const std::string& word : words) {
    const bool phrase = word.find(' ') != std::string::npos && word.find('"') == std::string::npos;
    query += (query.empty() ? "" : " ") + (phrase ? "\"" + word + "\"" : word);
  }
  return query;
}

Json::Value Search(const SearchRequest& request) {
  Json::Value data;
  data["ids"] = Vec2JsonArr<std::string>(IndexedShares());
  data["query"] = request.query;
  if (!request.inside.empty()) data["inside"] = request.inside;
  data["offset"] = request.offset;
  data["limit"] = request.limit;
  return AskEngine("search", data);
}

std::vector<std::string> Completions(const std::string& prefix) {
  daemon::ClientOptions options;
  options.connect_timeout = options.timeout = std::chrono::seconds(1);
  Json::Value request;
  request["command"] = "complete";
  request["data"]["prefix"] = prefix;
  std::vector<std::string> words;
  try {
    const Json::Value reply = daemon::Request("tarnelasticd", EngineSocket(), request, options);
    for (const Json::Value& word : reply["data"]["words"]) words.push_back(word["word"].asString());
  } catch (const Error&) {
    words.clear();
  } catch (const Json::Exception&) {
    words.clear();
  }
  return words;
}

void CollectWords(const std::string& id) {
  Json::Value data;
  data["db_name"] = id;
  data["doc_id_field"] = "TARNMDPath";
  AskEngine("update_term_suggestion", data);
  Json::Value index;
  index["id"] = id;
  AskEngine("commit", index);
}

void PrintHits(std::ostream& out, const Json::Value& found, unsigned int offset, bool colours) {
  try {
    const Json::Value& hits = found["hits"];
    unsigned int number = offset;
    for (const Json::Value& hit : hits) PrintHit(out, hit, ++number, colours);
    const auto total = found["total"].asUInt64();
    if (total == 0) {
      out << "Nothing found.\n";
    } else if (hits.size() < total) {
      out << hits.size() << " of " << total << " shown.\n";
    }
    if (found.isMember("suggestion")) {
      out << "Did you mean \"" << Printable(found["suggestion"].asString()) << "\"?\n";
    }
    for (const Json::Value& index : found["skipped"]) {
      out << "The index " << Printable(index["id"].asString())
          << " could not be searched: " << Printable(index["msg"].asString()) << '\n';
    }
  } catch (const Json::Exception& failure) {
    throw Problem(std::string("The search engine's answer cannot be read: ") + failure.what());
  }
}

void SearchPrompt(const std::string& inside) {
  const bool terminal = isatty(STDIN_FILENO) == 1;
  if (terminal) std::cout << "Words to search, or Ctrl-D to end.\n";
  std::string line;
  for (;;) {
    if (terminal) {
      const std::unique_ptr<char, Free> typed(readline("search> "));
      if (!typed) break;
      line = typed.get();
      if (!line.empty()) add_history(line.c_str());
    } else if (!std::getline(std::cin, line)) {
      break;
    }
    if (line.find_first_not_of(" \t") != std::string::npos) SearchOnce({line, inside});
    std::cout.flush();
  }
  if (terminal) std::cout << '\n';
}

}  // namespace quarry::cli
