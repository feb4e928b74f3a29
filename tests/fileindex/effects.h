// What an index management operation does to the world outside, in the order in which it does it.

#ifndef QUARRY_TESTS_FILEINDEX_EFFECTS_H_
#define QUARRY_TESTS_FILEINDEX_EFFECTS_H_

#include <json/json.h>
#include <sys/stat.h>

#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "common/json.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/support/files.h"

namespace quarry::test {

// Records from its construction on, each effect as one text:
//   "call F(...)"      a call of the platform that changes something, as fake::Calls() writes it
//   "engine C ID"      a command to the engine and the index that it is for
//   "daemon TEXT"      a command to the index daemon (to be fed by OnDaemonCommand)
//   "NAME = TEXT"      a watched file's new content
// Watched files are looked at before anything else is recorded, so a change stands where it was
// made. At most one Effects at a time.
class Effects {
 public:
  Effects() {
    fake::OnCall([this](const std::string& function) { OnCall(function); });
    fake::OnRequest([this](const Json::Value& request) { return OnRequest(request); });
  }
  ~Effects() {
    fake::OnCall(nullptr);
    fake::OnRequest(nullptr);
  }
  Effects(const Effects&) = delete;
  Effects& operator=(const Effects&) = delete;

  // Its present content is no effect.
  void Watch(const std::string& name, const std::string& path) {
    const std::lock_guard<std::mutex> guard(mutex_);
    watched_[name] = {path, Stamp(path)};
  }

  // Makes the engine refuse commands of this name with this code.
  void Refuse(const std::string& command, int code) {
    const std::lock_guard<std::mutex> guard(mutex_);
    refused_[command] = code;
  }

  void OnDaemonCommand(const Json::Value& command) { Record("daemon " + toString(command)); }

  std::vector<std::string> All() {
    const std::lock_guard<std::mutex> guard(mutex_);
    LookAtFiles();
    return effects_;
  }

 private:
  struct File {
    std::string path;
    std::string stamp;
  };

  // Which file it is, and which of its states; "" when there is none.
  static std::string Stamp(const std::string& path) {
    struct stat info;
    if (stat(path.c_str(), &info) != 0) return "";
    return std::to_string(info.st_ino) + " " + std::to_string(info.st_size) + " " +
           std::to_string(info.st_mtim.tv_sec) + " " + std::to_string(info.st_mtim.tv_nsec);
  }

  void OnCall(const std::string& function) {
    static const std::set<std::string> kHarmless = {"TARNShareGet",
                                                    "TARNShareFree",
                                                    "TARNShareNamePathGet",
                                                    "TARNGetFSType",
                                                    "TARNFSIsRemoteFS",
                                                    "TARNFSIsImageFS",
                                                    "TARNFSDirIsMntPoint",
                                                    "HLIBFhsPathInSnapshot",
                                                    "TARNShareIsShareRecycle",
                                                    "TARNRecycleUserHomePathIsExist",
                                                    "HLIBShareIsEncryptedGet",
                                                    "HLIBShareIsReadOnlyGet",
                                                    "HLIBShareIsEncryptionGet",
                                                    "TARNQuotaIsEnough",
                                                    "FILEIDXQueuePathCompose",
                                                    "FILEIDXDBPathCompose",
                                                    "FILEIDXGetIndexID",
                                                    "TARNSMBIsEnableSpotlight",
                                                    "HLIBGroupIsAdminGroupMem",
                                                    "TARNUserGet",
                                                    "TARNUserGetByUID",
                                                    "TARNUserFree",
                                                    "HLIBCErrGet",
                                                    "HLIBCErrorGetFile",
                                                    "HLIBCErrorGetLine",
                                                    "DomainSockConnection::Connect",
                                                    "SockConnection::Send",
                                                    "SockConnection::Recv",
                                                    "SockConnection::Disconnect"};
    if (kHarmless.count(function) == 0) {
      Record("call " + fake::Calls().back());
    } else {
      All();
    }
  }

  std::optional<std::string> OnRequest(const Json::Value& request) {
    const std::string command = request["command"].asString();
    Record("engine " + command + " " + request["data"]["id"].asString());
    const std::lock_guard<std::mutex> guard(mutex_);
    const auto refused = refused_.find(command);
    if (refused == refused_.end()) return R"({"success":true})";
    return R"({"success":false,"error":{"msg":"no","code":)" + std::to_string(refused->second) +
           "}}";
  }

  void Record(const std::string& effect) {
    const std::lock_guard<std::mutex> guard(mutex_);
    LookAtFiles();
    effects_.push_back(effect);
  }

  void LookAtFiles() {
    for (auto& [name, file] : watched_) {
      const std::string stamp = Stamp(file.path);
      if (stamp == file.stamp) continue;
      effects_.push_back(name + " = " + (stamp.empty() ? "" : ReadFile(file.path)));
      file.stamp = stamp;
    }
  }

  std::mutex mutex_;
  std::map<std::string, File> watched_;
  std::map<std::string, int> refused_;
  std::vector<std::string> effects_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_FILEINDEX_EFFECTS_H_
