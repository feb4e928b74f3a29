#include "cli/state_check.h"

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>

#include "common/error.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {
namespace {

struct StateFile {
  const char* what;
  const std::string& path;
  std::function<void()> load;
};

void LoadStatus() {
  const fileindex::StatusMgr status;
  status.GetPauseInfo();
  status.GetShareStatus("");
}

std::string Trouble(const StateFile& file) {
  try {
    file.load();
    return "";
  } catch (const Error& error) {
    if (access(file.path.c_str(), R_OK) != 0 && errno == EACCES) {
      return "You may not read " + file.path +
             "; run as the user who started the system, or as root";
    }
    return std::string("The ") + file.what + " (" + file.path +
           ") is damaged; mend it with \"quarry doctor\": " + error.reason();
  }
}

}  // namespace

std::string UnreadableState() {
  const StateFile files[] = {
      {"list of shares", platform::ShareFilePath(), [] { platform::ReadShares(); }},
      {"list of folders", fileindex::kFileIndexFoldersCfgPath, [] { fileindex::FolderMgr(); }},
      {"status", fileindex::kFileIndexStatusCfgPath, LoadStatus}};
  for (const StateFile& file : files) {
    std::string trouble = Trouble(file);
    if (!trouble.empty()) return trouble;
  }
  return "";
}

std::vector<std::string> VanishedShares() {
  std::vector<std::string> vanished;
  try {
    const auto known = platform::ReadShares();
    for (const std::string& name : fileindex::FolderMgr().GetIndexedShares()) {
      const bool found =
          std::any_of(known.begin(), known.end(), [&](const platform::ShareRecord& share) {
            return share.name == name ||
                   share.moved_from.substr(share.moved_from.rfind('/') + 1) == name;
          });
      if (!found) vanished.push_back(name);
    }
  } catch (const Error&) {
    vanished.clear();
  }
  return vanished;
}

std::string HowToRegain(const std::vector<std::string>& shares) {
  const bool one = shares.size() == 1;
  std::string names;
  for (const std::string& share : shares) names += (names.empty() ? "\"" : ", \"") + share + "\"";
  return (one ? "The share " : "The shares ") + names + ", of which folders are indexed, " +
         (one ? "is" : "are") + " not known any more; add " + (one ? "it" : "them") +
         " again (quarry share add DIRECTORY), or drop " + (one ? "it" : "them") +
         " from the index (quarry share clear NAME /FULL/PATH)";
}

}  // namespace quarry::cli
