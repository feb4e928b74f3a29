// The index daemon with a real disk, engine and extractor, while trees change at random, daemons
// are killed and settings change. In the end the index is what the disk is.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <future>
#include <map>
#include <optional>
#include <random>

#include "cli/supervisor/child.h"
#include "comm/comm.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/sdk/share.h"
#include "daemons/common/client.h"
#include "daemons/fileindexd/elastic_index.h"
#include "daemons/fileindexd/index_daemon.h"
#include "daemons/fileindexd/stamps.h"
#include "daemons/tarncontentextractd/stamp.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/queue/event.h"
#include "fileindex/util/file_type.h"
#include "tests/daemons/common/harness.h"
#include "tests/daemons/fileindexd/share_fixture.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::fileindexd {
namespace {

namespace fs = std::filesystem;
using test::WaitUntil;

constexpr std::chrono::milliseconds kPatience = std::chrono::minutes(2);

std::string ProgramPath(const std::string& name) {
  return Dirname(Dirname(RealPath("/proc/self/exe"))) + "/bin/" + name;
}

class DaemonProcess {
 public:
  DaemonProcess(const std::string& name, const std::string& log) : name_(name), log_(log) {}

  void Start() { child_.emplace(ProgramPath(name_), std::vector<std::string>(), log_); }
  void End(int signal) {
    child_->Signal(signal);
    EXPECT_TRUE(child_->WaitEnded(60000));
    end_ = child_->Ended().value_or("");
    child_.reset();
  }
  // How it ended.
  const std::string& end() const { return end_; }

 private:
  std::string name_;
  std::string log_;
  std::string end_;
  std::optional<cli::Child> child_;
};

class RealDaemonsTest : public ::testing::Test {
 protected:
  void SetUp() override {
    test::ResetTestRoot();
    test::MakeDirs(top_);
    RegisterShare(top_);
  }

  void StartAll() {
    for (DaemonProcess& process : daemons_) process.Start();
    ASSERT_TRUE(WaitUntil(
        [] {
          return daemon::IsListening(EngineSocketPath()) &&
                 daemon::IsListening(ExtractorSocketPath()) &&
                 daemon::IsListening(CommandSocketPath());
        },
        kPatience));
  }

  static Json::Value FolderRecord(const std::string& path, unsigned int kinds) {
    Json::Value record;
    record["path"] = path;
    record["name"] = "n";
    record["document"] = (kinds & 1) != 0;
    record["audio"] = (kinds & 2) != 0;
    record["video"] = record["photo"] = (kinds & 4) != 0;
    return record;
  }

  void AddFolder(const std::string& path, unsigned int kinds) {
    Json::Value list;
    list.append(FolderRecord(path, kinds));
    fileindex::FolderAdd(list, false);
    kinds_[path] = kinds;
  }

  void SetFolder(const std::string& path, unsigned int kinds) {
    Json::Value list;
    list.append(FolderRecord(path, kinds));
    fileindex::FolderSet(list, false);
    kinds_[path] = kinds;
  }

  std::string QueuePath() const { return sdk::SDKShare("s").GetQueuePath(); }

  void Tell(unsigned int event, const std::string& path, bool is_dir, const std::string& old = "") {
    Json::Value line;
    line["event"] = event;
    line["is_dir"] = is_dir;
    line["path"] = path;
    line["path_old"] = old;
    const LockFile lock(QueuePath(), true);
    std::ofstream(QueuePath(), std::ios::app) << toString(line) << "\n";
  }

  bool IsQueueEmpty() const {
    std::error_code error;
    const auto size = fs::file_size(QueuePath(), error);
    return (error || size == 0) && !fs::exists(QueuePath() + ".tmp");
  }

  static Json::Value ShareStatus() {
    Json::Value request;
    request["type"] = "status";
    try {
      return daemon::Request("fileindexd", CommandSocketPath(), request)["data"]["shares"][0];
    } catch (const Error&) {
      return Json::Value();
    }
  }

  bool WaitIdle() {
    return WaitUntil([this] { return IsQueueEmpty() && ShareStatus()["state"] == "idle"; },
                     kPatience);
  }

  // All documents, by path.
  static std::map<std::string, Json::Value> Documents() {
    Json::Value request;
    request["command"] = "document_get_by_query";
    request["data"]["id"] = "fileindex_s";
    request["data"]["query"]["qsl"]["prefix"]["TARNMDPath"] = "/";
    for (const char* field : {"TARNMDPath", "TARNMDParent", "TARNMDFSName", "TARNMDIsDir",
                              "TARNMDTextContent", "QuarryAttributeStamp", "QuarryContentStamp"}) {
      request["data"]["query"]["load_field"].append(field);
    }
    Json::Value response;
    fileindex::elastic::SendRequest(response, request);
    std::map<std::string, Json::Value> documents;
    for (const Json::Value& fields : response["data"]) {
      EXPECT_TRUE(documents.emplace(fields["TARNMDPath"].asString(), fields).second)
          << fields["TARNMDPath"] << " is there twice";
    }
    return documents;
  }

  bool WantsContent(const std::string& path) const {
    const auto deepest = std::max_element(kinds_.begin(), kinds_.end(), [&](auto& a, auto& b) {
      return Covers(a.first, path) < Covers(b.first, path);
    });
    switch (fileindex::GetFileTypeByFullPath(path)) {
      case fileindex::kDocument:
        return (deepest->second & 1) != 0;
      case fileindex::kAudio:
        return (deepest->second & 2) != 0;
      case fileindex::kOther:
        return true;
      default:
        return (deepest->second & 4) != 0;
    }
  }

  // The length of the folder's path if it covers the place.
  std::size_t Covers(const std::string& folder, const std::string& path) const {
    const std::string full = Dirname(top_) + folder;
    return StringStartWith(path + "/", full + "/") ? full.size() : 0;
  }

  void ExpectDocument(const std::string& path, const Json::Value& document, bool attributes) {
    struct stat status {};
    ASSERT_EQ(0, lstat(path.c_str(), &status));
    const bool is_dir = S_ISDIR(status.st_mode);
    EXPECT_EQ(is_dir, document["TARNMDIsDir"].asBool()) << path;
    EXPECT_EQ(Dirname(path), document["TARNMDParent"].asString()) << path;
    EXPECT_EQ(Basename(path), document["TARNMDFSName"].asString()) << path;
    const bool content = !is_dir && WantsContent(path);
    EXPECT_EQ(content ? extract::ContentStamp(status) : "",
              document["QuarryContentStamp"].asString())
        << path;
    if (attributes) {
      EXPECT_TRUE(SameAttributes(extract::AttributeStamp(status),
                                 document["QuarryAttributeStamp"].asString()))
          << path << " " << document;
    }
    if (!is_dir && path.ends_with(".txt")) {
      const std::string text = document["TARNMDTextContent"].asString();
      EXPECT_EQ(content ? test::ReadFile(path) : "", text) << path;
    }
  }

  // With `attributes` those are compared too: a change of a directory's own time is not told.
  void ExpectIndexIsTheDisk(bool attributes) {
    std::map<std::string, Json::Value> documents = Documents();
    const auto take = [&](const std::string& path) {
      ASSERT_EQ(1U, documents.count(path)) << path << " is missing";
      ExpectDocument(path, documents[path], attributes);
      documents.erase(path);
    };
    take(top_);
    for (const auto& entry : fs::recursive_directory_iterator(top_)) {
      if (!entry.is_symlink()) take(entry.path());
    }
    for (const auto& [path, document] : documents) ADD_FAILURE() << path << " should not be there";
  }

  test::TempDir volume_;
  const std::string top_ = volume_ / "s";
  std::map<std::string, unsigned int> kinds_;  // by share path: 1 documents, 2 audio, 4 the rest
  DaemonProcess daemons_[3] = {{"tarnelasticd", volume_ / "engine.log"},
                               {"tarncontentextractd", volume_ / "extractor.log"},
                               {"fileindexd", volume_ / "fileindexd.log"}};
  DaemonProcess& fileindexd_ = daemons_[2];
};

class RandomTreeTest : public RealDaemonsTest, public ::testing::WithParamInterface<unsigned int> {
 protected:
  std::string RandomPath() {
    static const char* const kNames[] = {"a", "b", "c.txt", "d.txt", "e.mp3", "f.unknown"};
    std::string path = top_;
    for (std::size_t depth = random_() % 3 + 1; depth > 0; --depth) {
      path += std::string("/") + kNames[random_() % 6];
    }
    return path;
  }

  void Change() {
    const std::string path = RandomPath();
    const fs::file_status status = fs::symlink_status(path);
    switch (random_() % 8) {
      case 0:
      case 1:
      case 2:
      case 3:
        return Write(path);
      case 4:
        if (!fs::exists(status)) return;
        fs::remove_all(path);
        return Tell(fileindex::EVENT_DELETE, path, fs::is_directory(status));
      case 5:
        if (!fs::is_regular_file(status)) return;
        chmod(path.c_str(), random_() % 2 == 0 ? 0600 : 0644);
        return Tell(fileindex::EVENT_ATTR, path, false);
      case 6:
        if (fs::exists(status) || !fs::is_directory(Dirname(path))) return;
        fs::create_symlink("/etc/passwd", path);
        return Tell(fileindex::EVENT_CREATE, path, false);
      default:
        return Move(path, RandomPath());
    }
  }

  void Write(const std::string& path) {
    const std::string dir = Dirname(path);
    std::error_code error;
    fs::create_directories(dir, error);
    if (error || fs::is_directory(path) || fs::is_symlink(path)) return;
    const bool is_new = !fs::exists(path);
    std::ofstream(path) << "text number " << ++texts_;
    // Directories that were made on the way are told of as one.
    if (dir != top_) Tell(fileindex::EVENT_CREATE, dir, true);
    Tell(is_new ? fileindex::EVENT_CREATE : fileindex::EVENT_MODIFY, path, false);
    const std::string above = Dirname(dir);
    if (above.size() > top_.size()) Tell(fileindex::EVENT_CREATE, above, true);
  }

  void Move(const std::string& from, const std::string& to) {
    if (!fs::exists(fs::symlink_status(from)) || PathsMeet(from, to)) return;
    if (!fs::is_directory(Dirname(to)) || fs::is_directory(fs::symlink_status(to))) return;
    const bool is_dir = fs::is_directory(fs::symlink_status(from));
    std::error_code error;
    fs::rename(from, to, error);
    if (!error) Tell(fileindex::EVENT_RENAME, to, is_dir, from);
  }

  void Disturb() {
    switch (random_() % 6) {
      case 0:
      case 1: {
        DaemonProcess& victim = daemons_[random_() % 3];
        victim.End(SIGKILL);
        return victim.Start();
      }
      case 2:
        return SetFolder("/s", static_cast<unsigned int>(random_() % 8));
      case 3:
        fileindex::StatusMgr().Pause(0);
        for (int i = 0; i < 5; ++i) Change();
        return fileindex::StatusMgr().Resume();
      default:
        return;
    }
  }

  std::mt19937 random_{GetParam()};
  int texts_ = 0;
};

TEST_P(RandomTreeTest, TheIndexIsTheDiskInTheEnd) {
  StartAll();
  for (int i = 0; i < 20; ++i) Change();
  AddFolder("/s", 7);
  for (int round = 0; round < 6; ++round) {
    for (std::size_t i = random_() % 40; i > 0; --i) Change();
    Disturb();
    for (std::size_t i = random_() % 20; i > 0; --i) Change();
    ASSERT_TRUE(WaitIdle()) << ShareStatus();
    ExpectIndexIsTheDisk(false);
    if (HasFailure()) return;
  }
  // What nobody told of is found by the next start.
  fileindexd_.End(SIGTERM);
  EXPECT_EQ("exit code 0", fileindexd_.end());
  for (int i = 0; i < 20; ++i) Change();
  unlink(QueuePath().c_str());
  fileindexd_.Start();
  ASSERT_TRUE(WaitIdle()) << ShareStatus();
  ExpectIndexIsTheDisk(true);
}

INSTANTIATE_TEST_SUITE_P(Seeds, RandomTreeTest, ::testing::Range(1U, 5U));

TEST_F(RealDaemonsTest, ADirectoryOfManyEntriesIsCompared) {
  StartAll();
  for (int i = 0; i < 300; ++i) test::WriteFile(top_ + "/" + std::to_string(i) + ".txt", "x");
  AddFolder("/s", 7);
  ASSERT_TRUE(WaitIdle()) << ShareStatus();
  ExpectIndexIsTheDisk(true);
  EXPECT_EQ(301U, ShareStatus()["done"].asUInt());
  EXPECT_EQ(0U, ShareStatus()["failed"].asUInt());
}

TEST_F(RealDaemonsTest, ALostIndexIsMadeAnew) {
  StartAll();
  test::WriteFile(top_ + "/a.txt", "x");
  AddFolder("/s", 7);
  ASSERT_TRUE(WaitIdle());
  Json::Value request;
  request["command"] = "index_delete";
  request["data"]["id"] = "fileindex_s";
  Json::Value response;
  fileindex::elastic::SendRequest(response, request);
  Tell(fileindex::EVENT_MODIFY, top_ + "/a.txt", false);
  ASSERT_TRUE(WaitIdle()) << ShareStatus();
  ExpectIndexIsTheDisk(true);
}

TEST_F(RealDaemonsTest, RefusesToRunTwice) {
  fileindexd_.Start();
  ASSERT_TRUE(WaitUntil([] { return daemon::IsListening(CommandSocketPath()); }, kPatience));
  const std::string log = volume_ / "second.log";
  cli::Child second(ProgramPath("fileindexd"), {}, log);
  ASSERT_TRUE(second.WaitEnded(60000));
  EXPECT_EQ("exit code 1", second.Ended());
  EXPECT_THAT(test::ReadFile(log), ::testing::HasSubstr("already running"));
  EXPECT_TRUE(daemon::IsListening(CommandSocketPath()));
}

TEST_F(RealDaemonsTest, HelpsAndRefusesWhatItDoesNotKnow) {
  const auto end = [this](const std::vector<std::string>& arguments) {
    cli::Child daemon(ProgramPath("fileindexd"), arguments, volume_ / "options.log");
    return daemon.WaitEnded(60000) ? *daemon.Ended() : "still running";
  };
  EXPECT_EQ("exit code 0", end({"--help"}));
  EXPECT_EQ("exit code 2", end({"--unknown"}));
  EXPECT_EQ("exit code 2", end({"--threads", "0"}));
  EXPECT_EQ("exit code 2", end({"x"}));
}

// Its worker hangs in a question that nobody will answer.
TEST_F(RealDaemonsTest, StopsThoughTheEngineDoesNotAnswer) {
  std::promise<void> go;
  std::shared_future<void> gate = go.get_future().share();
  daemon::SocketServerOptions options;
  options.workers = 1;
  const test::ServerThread engine(
      EngineSocketPath(),
      [gate](const std::string&, const daemon::Peer&) {
        gate.wait();
        return std::string("{}");
      },
      options);
  test::WriteFile(top_ + "/a.txt", "x");
  Json::Value list;
  list.append(fileindex::Folder("/s", "n", true, true, true, true, false, false).GetData());
  ASSERT_TRUE(toFile(list, fileindex::kFileIndexFoldersCfgPath));
  fileindexd_.Start();
  EXPECT_TRUE(WaitUntil([&] { return engine.Requests() > 0; }, kPatience));
  fileindexd_.End(SIGTERM);
  EXPECT_EQ("exit code 0", fileindexd_.end());
  EXPECT_NE(0, access(CommandSocketPath().c_str(), F_OK));
  go.set_value();
}

}  // namespace
}  // namespace quarry::fileindexd
