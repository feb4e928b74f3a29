// Indexes that are damaged, missing, or marked as to be made anew.

#include <algorithm>
#include <set>

#include "cli/doctor/checks.h"
#include "cli/indexing.h"
#include "cli/problem.h"
#include "cli/system.h"
#include "common/error.h"
#include "common/sdk/share.h"
#include "daemons/common/client.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"

namespace quarry::cli {
namespace {

constexpr const char* kRemedy =
    "deleted and made anew; its files are read again, see: quarry status";

Json::Value IdOf(const std::string& share) {
  Json::Value data;
  data["id"] = sdk::SDKShare(share).GetDBName();
  return data;
}

bool IsPaused(const std::string& share) {
  const fileindex::FolderMgr list;
  const auto& folders = list.GetFolders();
  return std::all_of(folders.begin(), folders.end(), [&](const auto& folder) {
    return folder->GetShare() != share || folder->IsPaused();
  });
}

// The marks come first: who is killed in the middle leaves a share that says what it needs.
std::string Rebuild(const std::string& share) {
  fileindex::StatusMgr().SetShareStatus(
      share, fileindex::kShareNeedReindex | fileindex::kShareNeedRebuild);
  ReindexFolders({"/" + share});
  if (IsPaused(share)) AskEngine("index_pause", IdOf(share));
  return "";
}

// Why the index is to be made anew, "" when it is not. Throws the engine's Error when it cannot
// tell.
std::string Damage(const std::string& share) {
  if ((fileindex::StatusMgr().GetShareStatus(share) & fileindex::kShareNeedRebuild) != 0) {
    return "is marked as to be made anew";
  }
  try {
    AskEngine("index_check", IdOf(share));
    return "";
  } catch (const Error& error) {
    if (engine::HasCode(error, engine::kUnknownIndex)) return "is missing";
    if (!engine::HasCode(error, engine::kDamagedIndex)) throw;
    return "is damaged (" + error.reason() + ")";
  }
}

void CheckIndex(Examination& examination, const std::string& share) {
  try {
    const std::string damage = Damage(share);
    if (damage.empty()) return;
    examination.Mend("The index of the share " + share + " " + damage, kRemedy,
                     [&] { return Rebuild(share); });
  } catch (const Error& error) {
    if (engine::HasCode(error, engine::kSearchTooLong)) {
      examination.Note("The index of the share " + share + " is too large to be read in one go",
                       "Damage is noticed when it is met");
    } else {
      examination.Leave("The index of the share " + share + " cannot be used", Explain(error));
    }
  }
}

bool IsKnown(const std::string& share) {
  const std::vector<std::string> known = sdk::SDKShare::Enum();
  return std::find(known.begin(), known.end(), share) != known.end();
}

}  // namespace

void CheckIndexes(Examination& examination) {
  const std::set<std::string> shares = fileindex::FolderMgr().GetIndexedShares();
  if (shares.empty()) return;
  if (!daemon::IsListening(EngineSocket())) {
    examination.Leave("The indexes were not looked at: the search engine does not run",
                      "Start it, and then: quarry doctor");
    return;
  }
  for (const std::string& share : shares) {
    if (IsKnown(share)) {
      examination.Part("the index of " + share,
                       [&](Examination& part) { CheckIndex(part, share); });
    }
  }
}

}  // namespace quarry::cli
