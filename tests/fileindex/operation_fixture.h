// The base of tests that compare all that an index management operation does.

#ifndef QUARRY_TESTS_FILEINDEX_OPERATION_FIXTURE_H_
#define QUARRY_TESTS_FILEINDEX_OPERATION_FIXTURE_H_

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "common/error.h"
#include "common/json.h"
#include "common/paths.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "platform/include/error.h"
#include "tests/fake_platform/fixture.h"
#include "tests/fileindex/effects.h"
#include "tests/fileindex/index_daemon.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex {

using Texts = std::vector<std::string>;

inline Texts operator+(Texts a, const Texts& b) {
  a.insert(a.end(), b.begin(), b.end());
  return a;
}

inline const std::string kFolderLock = RootedPath("/tmp/quarry_cfg_folder.lock");
inline constexpr char kBecomeRoot[] = "call ResetCredentialsByName(root, true)";

// The record of a folder whose kinds are given by letters, as a caller hands it in.
inline Json::Value Record(const std::string& path, const std::string& kinds = "davp") {
  const auto has = [&](char kind) { return kinds.find(kind) != std::string::npos; };
  return Folder(path, "n", has('d'), has('a'), has('v'), has('p'), false, false).GetData();
}

inline Json::Value Array(const std::vector<Json::Value>& elements) {
  Json::Value array(Json::arrayValue);
  for (const Json::Value& element : elements) array.append(element);
  return array;
}

// Two shares on one volume, an engine that agrees to everything, and an index daemon.
class OperationTest : public fake::FakePlatformTest {
 protected:
  // What an operation came to: its failure as FailureOf gives it, and its effects.
  struct Outcome {
    std::string failure;
    Texts effects;
  };
  using Action = std::function<void()>;

  OperationTest() { MakeWorld(); }

  void MakeWorld() const {
    for (const char* share : {"music", "photo"}) fake::AddShare(share, volume_ + "/" + share);
    for (const char* place : {"/music", "/photo/a", "/photo/b", "/photo/a/deep"}) {
      test::MakeDirs(volume_ + place);
    }
    test::WriteFile(RootedPath("/var/run/tarnelasticd.sock"), "");
  }

  // Starts the daemon and records from here on.
  void Begin() {
    effects_ = std::make_unique<test::Effects>();
    effects_->Watch("list", kFileIndexFoldersCfgPath);
    effects_->Watch("status", kFileIndexStatusCfgPath);
    for (const auto& [name, share] : watched_queues_)
      effects_->Watch("queue " + name, QueueOf(share));
    daemon_ = std::make_unique<test::IndexDaemon>(
        [this](const Json::Value& command) { OnCommand(command); });
    fake::ClearCalls();
    fake::ClearLogs();
    errno = 0;
  }

  void End() {
    daemon_.reset();
    effects_.reset();
  }

  void OnCommand(const Json::Value& command) {
    effects_->OnDaemonCommand(command);
    const int fd = open(kFolderLock.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC, 0644);
    EXPECT_EQ(flock(fd, LOCK_SH | LOCK_NB) != 0, holds_lock_) << "the folder lock";
    close(fd);
    if (vanish_after_command_) unlink(test::IndexDaemon::Path().c_str());
  }

  std::string QueueOf(const std::string& share) const {
    return fake::QueuePath(volume_ + "/" + share);
  }

  // The failure of an operation, as "code reason"; "" when it does not fail. The lock is free in
  // either case.
  static std::string FailureOf(const Action& operation) {
    const std::string failure = test::FailureOf(operation);
    const int fd = open(kFolderLock.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd >= 0) {
      EXPECT_EQ(flock(fd, LOCK_EX | LOCK_NB), 0);
      close(fd);
    }
    return failure;
  }

  static void SaveList(const std::vector<Json::Value>& records) {
    test::WriteFile(kFileIndexFoldersCfgPath, toString(Array(records)));
  }
  static std::string StoredList() {
    return access(kFileIndexFoldersCfgPath.c_str(), F_OK) == 0
               ? test::ReadFile(kFileIndexFoldersCfgPath)
               : "";
  }

  // Single effects, as they are recorded.
  static Texts ServicesOn() {
    return {"call TARNSMBSetSpotlight(1)", "call HLIBServiceRestart(samba)",
            "call HLIBServiceStart(tarncontentextractd, 1)",
            "call HLIBServicectlStart(pkg-Quarry-fileindexd, 1)"};
  }
  // Those of a system whose search support was off already.
  static Texts ServicesOff() {
    return {"call HLIBServiceStop(tarncontentextractd, 0)",
            "call HLIBServicectlStop(pkg-Quarry-fileindexd, 1)"};
  }
  std::string Monitored(const std::string& share, const Texts& folders) const {
    Json::Value config;
    config["queue"] = QueueOf(share);
    config["config"] = Json::Value(Json::arrayValue);
    for (const std::string& folder : folders) {
      Json::Value entry;
      entry["path"] = volume_ + folder;
      entry["mask"] = 65478;
      entry["ignore"].append("@eaDir");
      config["config"].append(entry);
    }
    return "call MonitorQueue::Upsert(" + toString(config) + ", fileindex, 1)";
  }
  std::string Unmonitored(const std::string& share) const {
    return "call MonitorQueue::Delete(" + QueueOf(share) + ", fileindex, 1)";
  }
  static std::string Saved(const std::vector<Json::Value>& records) {
    return "list = " + toString(Array(records));
  }
  static std::string Told(const std::string& share, bool is_upsert = true) {
    return std::string(R"(daemon {"data":{"is_upsert":)") + (is_upsert ? "true" : "false") +
           R"(,"share_name":")" + share + R"("},"type":"notify_setting_changed"})";
  }
  static std::string Worker(const std::string& command, const std::string& share) {
    return R"(daemon {"data":{"share_name":")" + share + R"("},"type":")" + command + "\"}";
  }
  // Lines of a queue: all that is in the configuration of `kinds` is to be looked at anew; a place
  // is to be reindexed; a place has moved.
  std::string Line(const std::string& path, const std::string& kinds) const {
    Json::Value data;
    const Json::Value record = Record("", kinds);
    for (const char* kind : {"document", "audio", "video", "photo"}) data[kind] = record[kind];
    return EventLine(0x20000, volume_ + path, "", data);
  }
  std::string ReindexLine(const std::string& path) const {
    return EventLine(0x10000, volume_ + path, "", Json::Value());
  }
  static std::string EventLine(int event, const std::string& path, const std::string& path_old,
                               const Json::Value& data) {
    Json::Value line;
    line["event"] = event;
    line["path"] = path;
    line["path_old"] = path_old;
    line["data"] = data;
    return toString(line) + "\n";
  }

  // ---- Every single failure

  // Runs `operation`, which is to succeed, in a world that `prepare` has completed; then again and
  // again in a fresh one, with each call of the platform and each system call that it makes failing
  // in turn. What it did before a failure must stay as it is, and nothing may follow but the mark
  // of a share whose event was lost.
  void ExpectEveryFailureToEndIt(const Action& prepare, const Action& operation) {
    std::map<std::string, int> system_calls;
    const Outcome whole = RunIn(prepare, [&] {
      const auto before = SystemCallCounts();
      operation();
      for (const auto& [name, count] : SystemCallCounts()) {
        system_calls[name] = count - before.at(name);
      }
    });
    EXPECT_EQ(whole.failure, "");
    for (const auto& [function, count] : CountsOf(fake::Calls())) {
      if (CannotFail(function)) continue;
      for (int nth = 1; nth <= count; ++nth) {
        SCOPED_TRACE(function + " " + std::to_string(nth));
        const Outcome outcome = RunIn(prepare, [&, name = function] {
          fake::FailCall(name, nth, FailureOfCall(name));
          operation();
        });
        if (IsOnlyLogged(function)) {
          EXPECT_EQ(outcome.failure, "");
          EXPECT_EQ(WithoutSharing(outcome.effects), WithoutSharing(whole.effects));
        } else {
          ExpectCutShort(outcome, whole.effects);
        }
      }
    }
    for (const auto& [name, count] : system_calls) {
      for (int nth = 1; nth <= count; ++nth) {
        SCOPED_TRACE(name + " " + std::to_string(nth));
        ExpectCutShort(RunIn(prepare,
                             [&, call = name] {
                               fake::FailSystemCall(call, nth, EIO);
                               operation();
                             }),
                       whole.effects);
      }
    }
  }

  const std::string volume_ = test::TestRoot() + "/volume1";
  // Queues to be watched: the name in the effects, and the share.
  std::map<std::string, std::string> watched_queues_ = {{"music", "music"}, {"photo", "photo"}};
  bool holds_lock_ = true;  // whether the daemon is to be told under the folder lock
  bool vanish_after_command_ = false;
  std::unique_ptr<test::Effects> effects_;
  std::unique_ptr<test::IndexDaemon> daemon_;

 private:
  Outcome RunIn(const Action& prepare, const Action& operation) {
    End();
    EXPECT_EQ(fake::Outstanding(), 0);
    fake::Reset();
    test::ResetTestRoot();
    MakeWorld();
    prepare();
    Begin();
    Outcome outcome;
    outcome.failure = FailureOf(operation);
    outcome.effects = effects_->All();
    EXPECT_EQ(fake::Outstanding(), 0) << "platform records were not released";
    return outcome;
  }

  static std::map<std::string, int> SystemCallCounts() {
    std::map<std::string, int> counts;
    for (const char* name : {"rename", "chmod", "fsync", "write"}) {
      counts[name] = fake::SystemCallCount(name);
    }
    return counts;
  }
  static std::map<std::string, int> CountsOf(const Texts& calls) {
    std::map<std::string, int> counts;
    for (const std::string& call : calls) ++counts[call.substr(0, call.find('('))];
    return counts;
  }
  static bool CannotFail(const std::string& function) {
    static const std::set<std::string> kReleases = {
        "TARNShareFree",     "TARNUserFree",      "HLIBCSzListFree",           "HLIBCErrGet",
        "HLIBCErrorGetFile", "HLIBCErrorGetLine", "SockConnection::Disconnect"};
    return kReleases.count(function) != 0;
  }
  // Functions whose failure does not end an operation.
  static bool IsOnlyLogged(const std::string& function) {
    static const std::set<std::string> kTolerated = {
        "TARNSMBIsEnableSpotlight", "TARNSMBSetSpotlight", "HLIBServiceRestart", "HLIBServiceStart",
        "HLIBServiceStop",          "HLIBServicectlStart", "HLIBServicectlStop", "HLIBCExec",
        "HLIBGroupIsAdminGroupMem", "TARNFSDirIsMntPoint"};
    return kTolerated.count(function) != 0;
  }
  static fake::Failure FailureOfCall(const std::string& function) {
    // Any answer but 0 means that there is room.
    if (function == "TARNQuotaIsEnough") return {0, 0, kHLIBErrNoSpace};
    return {-1, EIO, 0};
  }
  // A setting of the sharing service that fails does not restart it.
  static Texts WithoutSharing(const Texts& effects) {
    Texts others;
    for (const std::string& effect : effects) {
      if (effect.find("Spotlight") == std::string::npos &&
          effect.find("HLIBServiceRestart") == std::string::npos) {
        others.push_back(effect);
      }
    }
    return others;
  }
  static void ExpectCutShort(const Outcome& outcome, const Texts& whole) {
    EXPECT_NE(outcome.failure, "");
    const auto end =
        std::mismatch(outcome.effects.begin(), outcome.effects.end(), whole.begin(), whole.end());
    Texts rest(end.first, outcome.effects.end());
    // A queue may have been made before its first line could not be written.
    if (!rest.empty() && rest[0].rfind("queue ", 0) == 0 && rest[0].back() == ' ') {
      rest.erase(rest.begin());
    }
    if (rest.empty()) return;
    ASSERT_EQ(rest.size(), 2U) << ::testing::PrintToString(rest);
    EXPECT_EQ(rest[0], kBecomeRoot);
    EXPECT_EQ(rest[1].substr(0, 18), R"(status = {"share":)");
  }
};

}  // namespace quarry::fileindex

#endif  // QUARRY_TESTS_FILEINDEX_OPERATION_FIXTURE_H_
