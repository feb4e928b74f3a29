// The state files that the library, the platform and the engine refuse when they are damaged.

#include <sys/stat.h>

#include <ctime>
#include <map>
#include <set>

#include "cli/doctor/checks.h"
#include "cli/doctor/known_places.h"
#include "cli/doctor/state_text.h"
#include "cli/folder_lock.h"
#include "cli/folder_status.h"
#include "cli/problem.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/paths.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/util/util.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {
namespace {

using platform::ShareFilePath;
using platform::ShareRecord;

// Why the file cannot be used, "" when it can. `load` is what its users do with it.
std::string DamageOf(const std::string& path, const std::function<void()>& load) {
  const StateText state = ReadStateText(path);
  if (!state.exists) return "";
  if (!state.is_file) return "it is no file";
  if (state.text.empty()) return "it is empty";
  Json::Value json;
  if (!fromString(json, state.text)) return "it is cut off, or has something else in it than JSON";
  try {
    load();
    return "";
  } catch (const Error& error) {
    return error.reason().substr(0, error.reason().find(", data="));
  }
}

std::string Joined(const std::vector<std::string>& words) {
  std::string text;
  for (const std::string& word : words) text += (text.empty() ? "" : ", ") + word;
  return text;
}

std::string SetAsideAs(const std::string& aside) {
  return "set aside as " + aside;
}

// A damaged file: what is wrong with it, and how it is replaced.
struct Damage {
  const char* what;
  std::string path;
  std::function<std::string()> find;     // as DamageOf
  const char* remedy;                    // what follows "set aside"
  std::function<std::string()> replace;  // under the file's lock; returns what was done
};

void CheckFile(Examination& examination, const Damage& damage) {
  const std::string why = damage.find();
  if (why.empty()) return;
  examination.Mend(std::string("The ") + damage.what + " (" + damage.path + ") is damaged: " + why,
                   std::string("set aside") + damage.remedy, damage.replace);
}

// ---- shares

bool IsFlag(const Json::Value& value) {
  return value.isNull() || value.isBool();
}

bool IsShare(const Json::Value& json) {
  if (!json["name"].isString() || !json["path"].isString()) return false;
  if (json.isMember("moved_from") && !json["moved_from"].isString()) return false;
  for (const char* flag :
       {"encrypted", "encryption", "read_only", "hide_unreadable", "recycle_bin"}) {
    if (!IsFlag(json[flag])) return false;
  }
  ShareRecord record;
  record.name = json["name"].asString();
  record.path = json["path"].asString();
  try {
    platform::ValidateShare(record);
    return true;
  } catch (const Error&) {
    return false;
  }
}

Json::Value ReadableShares(std::set<std::string>* names) {
  Json::Value shares(Json::arrayValue);
  for (const Json::Value& json : WholeObjects(ReadStateText(ShareFilePath()).text)) {
    if (IsShare(json) && names->insert(json["name"].asString()).second) shares.append(json);
  }
  return shares;
}

// Shares that only the engine remembers. Returns their names.
std::vector<std::string> AddIndexedShares(const std::set<std::string>& known) {
  std::vector<std::string> added;
  for (const auto& [name, path] : SharesWithIndex()) {
    if (known.count(name) > 0) continue;
    ShareRecord share;
    share.name = name;
    share.path = path;
    try {
      platform::AddShare(share);
      added.push_back(name);
    } catch (const Error&) {
      // Its folders tell that it is missing.
    }
  }
  return added;
}

std::string ReplaceShareFile() {
  std::set<std::string> names;
  std::string aside;
  {
    const LockFile lock(ShareFilePath() + ".lock", true);
    Json::Value root;
    root["shares"] = ReadableShares(&names);
    aside = ReplaceDamaged(ShareFilePath(), root);
  }
  std::string done = SetAsideAs(aside) + "; " + std::to_string(names.size()) +
                     " shares could still be read from it";
  const std::vector<std::string> added = AddIndexedShares(names);
  if (!added.empty()) {
    done += "; known again because they have an index, but without their flags: " + Joined(added);
  }
  return done;
}

// ---- engine

// As the engine wants it.
bool IsIndex(const Json::Value& json) {
  return json["id"].isString() && json["path"].isString() && json["paused"].isBool() &&
         (json["moving_from"].isNull() || json["moving_from"].isString());
}

void RequireIndexes() {
  Json::Value root;
  fromString(root, ReadStateText(EngineListPath()).text);
  if (!root.isObject() || !root["version"].isInt() || !root["indexes"].isArray()) {
    throw Error(kErrorLoadFile, "it is no list of indexes");
  }
  for (const Json::Value& index : root["indexes"]) {
    if (!index.isObject() || !IsIndex(index)) {
      throw Error(kErrorLoadFile, "it has an index without id, path or pause");
    }
  }
}

std::string ReplaceEngineList() {
  Json::Value root;
  root["version"] = 1;
  root["indexes"] = Json::Value(Json::arrayValue);
  for (const Json::Value& json : WholeObjects(ReadStateText(EngineListPath()).text)) {
    if (IsIndex(json)) root["indexes"].append(json);
  }
  return SetAsideAs(ReplaceDamaged(EngineListPath(), root)) + "; " +
         std::to_string(root["indexes"].size()) +
         " indexes could still be read from it, others are found again by the index daemon";
}

// ---- folders

using Folder = fileindex::Folder;

void RequireFolders() {
  const fileindex::FolderMgr list;
  for (const auto& folder : list.GetFolders()) {
    if (folder->GetShare().empty()) throw Error(kErrorBadParameter, "it has a folder of no share");
  }
}

bool IsFolder(const Json::Value& json) {
  try {
    return !Folder(json).GetShare().empty();
  } catch (const Error&) {
    return false;
  }
}

Json::Value ReadableFolders(std::set<std::string>* paths) {
  Json::Value folders(Json::arrayValue);
  for (const Json::Value& json :
       WholeObjects(ReadStateText(fileindex::kFileIndexFoldersCfgPath).text)) {
    if (IsFolder(json) && paths->insert(json["path"].asString()).second) {
      folders.append(Folder(json).GetData());
    }
  }
  return folders;
}

// The share path of a full path, "" when no share holds it.
std::string SharePathOf(const std::string& full_path) {
  try {
    std::string name;
    std::string share;
    fileindex::GetShareNamePathByFullPath(name, share, full_path);
    return "/" + name + full_path.substr(share.size());
  } catch (const Error&) {
    return "";
  }
}

// Folders that only the change monitor remembers: their places, but not what was wanted of them.
std::vector<std::string> AddWatchedFolders(const std::set<std::string>& known,
                                           Json::Value* folders) {
  std::vector<std::string> added;
  for (const Registration& registration : Registrations()) {
    for (const std::string& place : registration.places) {
      const std::string path = SharePathOf(place);
      if (path.empty() || known.count(path) > 0) continue;
      const Folder folder(path, Basename(path), true, true, true, true, false, false);
      folders->append(folder.GetData());
      added.push_back(path);
    }
  }
  return added;
}

std::string ReplaceFolderList() {
  const FolderLock lock;
  std::set<std::string> paths;
  Json::Value folders = ReadableFolders(&paths);
  const std::vector<std::string> added = AddWatchedFolders(paths, &folders);
  std::string done = SetAsideAs(ReplaceDamaged(fileindex::kFileIndexFoldersCfgPath, folders)) +
                     "; " + std::to_string(paths.size()) + " folders could still be read from it";
  if (!added.empty()) {
    done +=
        "; indexed again with all kinds of content, because they were watched: " + Joined(added) +
        " (to change that: quarry folder set)";
  }
  return done;
}

// Shares that have an index, but no folder in the list that was mended: nothing tells which.
void LeaveLostFolders(Examination& examination) {
  const std::set<std::string> indexed = fileindex::FolderMgr().GetIndexedShares();
  for (const auto& [name, path] : SharesWithIndex()) {
    if (indexed.count(name) > 0) continue;
    examination.Leave("The folders of the share " + name + ", which has an index, are lost",
                      "Add them again; nothing that has not changed is read twice: "
                      "quarry folder add /" +
                          name + "/...");
  }
}

// ---- status

// The end of the pause as the text before the damage says it, or what the index daemon goes by.
Json::Int64 PauseEnd(const std::string& text) {
  static const std::string key = "\"resume_time\":";
  const std::size_t begin = text.find(key);
  if (begin != std::string::npos) {
    const std::size_t end = text.find_first_of(",}", begin);
    Json::Value number;
    const std::size_t value = begin + key.size();
    if (end != std::string::npos && fromString(number, text.substr(value, end - value)) &&
        number.isInt64()) {
      return number.asInt64();
    }
  }
  const Json::Value report = IndexDaemonReport();
  return report["resume_time"].isInt64() ? report["resume_time"].asInt64() : -1;
}

bool IsPause(Json::Int64 end) {
  return end == 0 || end > std::time(nullptr);
}

// Which shares were marked is lost, so all are: comparing one that is sound takes seconds.
std::string ReplaceStatusFile() {
  const std::string& path = fileindex::kFileIndexStatusCfgPath;
  const LockFile lock(RootedPath("/tmp/quarry_cfg_fi_status.lock"), true);
  Json::Value status;
  const Json::Int64 end = PauseEnd(ReadStateText(path).text);
  status["resume_time"] = end;
  for (const std::string& share : fileindex::FolderMgr().GetIndexedShares()) {
    status["share"][share] = fileindex::kShareNeedReindex;
  }
  return SetAsideAs(ReplaceDamaged(path, status)) + "; all shares are compared with their files" +
         (IsPause(end) ? ", when the pause is over" : "; indexing is not paused");
}

void RequireStatus() {
  const fileindex::StatusMgr status;
  status.GetPauseInfo();
  status.GetShareStatus("");
}

}  // namespace

void CheckShareFile(Examination& examination) {
  CheckFile(examination, {"list of shares", ShareFilePath(),
                          [] { return DamageOf(ShareFilePath(), [] { platform::ReadShares(); }); },
                          "; shares that can still be read, or that have an index, stay known",
                          ReplaceShareFile});
}

void CheckEngineList(Examination& examination) {
  CheckFile(examination, {"engine's list of indexes", EngineListPath(),
                          [] { return DamageOf(EngineListPath(), RequireIndexes); },
                          "; no index is lost", ReplaceEngineList});
}

void CheckFolderList(Examination& examination) {
  const std::string& path = fileindex::kFileIndexFoldersCfgPath;
  const std::size_t before = examination.findings().size();
  CheckFile(examination, {"list of folders", path, [&] { return DamageOf(path, RequireFolders); },
                          "; folders that can still be read, or that are watched, stay indexed",
                          ReplaceFolderList});
  const bool mended = examination.findings().size() > before &&
                      examination.findings().back().outcome == Outcome::kMended;
  if (mended) LeaveLostFolders(examination);
}

void CheckStatusFile(Examination& examination) {
  const std::string& path = fileindex::kFileIndexStatusCfgPath;
  CheckFile(examination, {"status", path, [&] { return DamageOf(path, RequireStatus); },
                          "; all shares are compared with their files", ReplaceStatusFile});
}

}  // namespace quarry::cli
