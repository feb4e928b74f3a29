#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/indexing.h"
#include "cli/output.h"
#include "cli/shares.h"
#include "cli/system.h"
#include "common/json.h"
#include "common/sdk/share.h"
#include "fileindex/index_mgr.h"

namespace quarry::cli {
namespace {

// Takes no lock: it changes no folder, and takes its time.
void Suggest(const std::vector<std::string>& shares, bool json) {
  RequireRunningSystem();
  std::vector<std::string> ids;
  for (const std::string& share : shares) {
    RequireIndexed(share);
    ids.push_back(sdk::SDKShare(share).GetDBName());
  }
  if (shares.empty()) ids = IndexedShares();
  fileindex::UpdateTermSuggestion(ids);
  Json::Value result;
  result["indexes"] = Vec2JsonArr<std::string>(ids);
  PrintDone(json,
            "Refreshed the words to suggest (" + std::to_string(ids.size()) +
                (ids.size() == 1 ? " share)." : " shares)."),
            result);
}

}  // namespace

void AddSuggestCommand(CLI::App& app) {
  CLI::App* suggest =
      app.add_subcommand("suggest", "Refresh the words that searches suggest from what is indexed");
  auto shares = std::make_shared<std::vector<std::string>>();
  suggest->add_option("SHARE", *shares, "Only of these shares");
  const bool& json = JsonOption(*suggest);
  Examples(*suggest, "  quarry suggest\n  quarry suggest Music Docs");
  suggest->callback([shares, &json] { Suggest(*shares, json); });
}

}  // namespace quarry::cli
