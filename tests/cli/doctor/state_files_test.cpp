// Every state file, cut at every byte and filled with other things: it is found, kept under another
// name, and replaced by what there is to be had.

#include <gtest/gtest.h>
#include <sys/resource.h>

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <functional>

#include "cli/doctor/checks.h"
#include "cli/doctor/known_places.h"
#include "cli/doctor/state_text.h"
#include "common/error.h"
#include "common/file_util.h"
#include "common/json.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "platform/linux/share_registry.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

// Power is never lost here, and a busy disk would be waited for again and again.
extern "C" __attribute__((visibility("default"))) int fsync(int) {
  return 0;
}

namespace quarry::test {
namespace {

using cli::Examination;
using cli::Outcome;
using fileindex::FolderMgr;
using fileindex::kFileIndexFoldersCfgPath;
using fileindex::kFileIndexStatusCfgPath;
using fileindex::StatusMgr;

using Check = void (*)(Examination&);

// The names of what was set aside beside `path`.
std::vector<std::string> SetAside(const std::string& path) {
  std::vector<std::string> found;
  for (const std::string& name : ListDir(Dirname(path))) {
    if (StringStartWith(name, Basename(path) + ".damaged-")) {
      found.push_back(Dirname(path) + "/" + name);
    }
  }
  return found;
}

std::string FolderText(const std::string& path, bool photo) {
  return R"({"path":")" + path + R"(","name":"n","document":true,"audio":true,"video":false,)" +
         R"("photo":)" + (photo ? "true" : "false") + R"(,"paused":false})";
}

class StateFilesTest : public testing::Test {
 protected:
  void SetUp() override {
    ResetTestRoot();
    for (const char* share : {"docs", "pics"}) {
      MakeDirs(files_ / share);
      platform::ShareRecord record;
      record.name = share;
      record.path = files_ / share;
      platform::AddShare(record);
    }
    WriteFile(cli::EngineListPath(), R"({"indexes":[)" + IndexText("docs") + "," +
                                         IndexText("pics") + R"(],"version":1})");
    WriteFile(kFileIndexFoldersCfgPath,
              "[" + FolderText("/docs/a", false) + "," + FolderText("/pics", true) + "]");
    WriteFile(kFileIndexStatusCfgPath, R"({"resume_time":4102444800,"share":{"pics":1}})");
    RegisterPlace("docs/a");
  }

  void RegisterPlace(const std::string& place) const {
    WriteFile(cli::MonitorDirectory() + "/fileindex-q.json",
              R"({"application":"fileindex","type":1,"queue":"/q","config":[{"path":")" +
                  (files_ / place) + R"(","mask":65478,"ignore":[]}]})");
  }

  std::string IndexText(const std::string& share) const {
    std::string name = (files_ / share).substr(1);
    std::replace(name.begin(), name.end(), '/', '+');
    return R"({"id":"fileindex_)" + share + R"(","path":")" + TestRoot() +
           "/var/lib/quarry/index/" + name + R"(","paused":false,"mappings":{}})";
  }

  // Runs the check on the file with this text. Whatever is found must be mended, and then `load`
  // must be content; the damaged text is kept.
  static void ExpectMended(Check check, const std::string& path, const std::string& text,
                           const std::function<void()>& load) {
    WriteFile(path, text);
    Examination look(false);
    check(look);
    EXPECT_EQ(ReadFile(path), text);
    EXPECT_TRUE(SetAside(path).empty());
    Examination mend(true);
    check(mend);
    ASSERT_EQ(look.findings().empty(), mend.findings().empty()) << text;
    EXPECT_NO_THROW(load()) << text;
    if (mend.findings().empty()) return;
    EXPECT_EQ(look.findings()[0].outcome, Outcome::kMendable);
    EXPECT_NE(look.findings()[0].trouble.find(path), std::string::npos);
    EXPECT_EQ(mend.findings()[0].outcome, Outcome::kMended) << mend.findings()[0].remedy;
    ASSERT_EQ(SetAside(path).size(), 1U);
    EXPECT_NE(mend.findings()[0].remedy.find(SetAside(path)[0]), std::string::npos);
    EXPECT_EQ(ReadFile(SetAside(path)[0]), text);
    Unlink(SetAside(path)[0]);
    Examination again(true);
    check(again);
    EXPECT_TRUE(again.findings().empty()) << text;
  }

  TempDir files_;
};

struct Case {
  const char* name;
  Check check;
  std::string path;
  std::function<void()> load;
};

std::vector<Case> Cases() {
  return {{"Shares", cli::CheckShareFile, platform::ShareFilePath(),
           [] { EXPECT_EQ(platform::ReadShares().size(), 2U); }},
          {"Engine", cli::CheckEngineList, cli::EngineListPath(),
           [] {
             Json::Value root;
             EXPECT_TRUE(fromFile(root, cli::EngineListPath()));
             EXPECT_EQ(root["version"], 1);
             EXPECT_TRUE(root["indexes"].isArray());
           }},
          {"Folders", cli::CheckFolderList, kFileIndexFoldersCfgPath,
           [] { EXPECT_TRUE(FolderMgr().HasFolder("/docs/a")); }},
          {"Status", cli::CheckStatusFile, kFileIndexStatusCfgPath,
           [] { StatusMgr().GetShareStatus("pics"); }}};
}

class DamageTest : public StateFilesTest, public testing::WithParamInterface<Case> {
 protected:
  void Expect(const std::string& text) {
    ExpectMended(GetParam().check, GetParam().path, text, GetParam().load);
  }
};

TEST_P(DamageTest, CutAtEveryByte) {
  const std::string whole = ReadFile(GetParam().path);
  for (std::size_t length = 0; length < whole.size(); ++length) Expect(whole.substr(0, length));
}

TEST_P(DamageTest, AByteIsLostAnywhere) {
  const std::string whole = ReadFile(GetParam().path);
  for (std::size_t at = 0; at < whole.size(); at += 3) {
    std::string text = whole;
    text[at] = '\0';
    Expect(text);
  }
}

TEST_P(DamageTest, SomethingElse) {
  for (const char* text : {"", "\n", "7", "\"text\"", "[7]", "[{}]", "[[]]", "{\"shares\":7}",
                           "{\"shares\":[{}]}", "{\"share\":7}", "{\"indexes\":{}}", "\xff\xfe",
                           R"([{"path":"no share","name":"","document":true,"audio":true,)"
                           R"("video":true,"photo":true}])"}) {
    Examination mend(true);
    WriteFile(GetParam().path, text);
    GetParam().check(mend);
    Examination again(true);
    GetParam().check(again);
    EXPECT_TRUE(again.findings().empty()) << text;
  }
}

TEST_P(DamageTest, NoFile) {
  const std::string path = GetParam().path;
  Unlink(path);
  Examination missing(true);
  GetParam().check(missing);
  EXPECT_TRUE(missing.findings().empty());
  MakeDirs(path);
  Examination mend(true);
  GetParam().check(mend);
  ASSERT_FALSE(mend.findings().empty());
  EXPECT_EQ(mend.findings()[0].outcome, Outcome::kMended);
  EXPECT_NE(mend.findings()[0].trouble.find("it is no file"), std::string::npos);
  EXPECT_TRUE(IsDirExist(SetAside(path)[0], false));
  EXPECT_NO_THROW(GetParam().load());
}

// A disk without room for what is to replace the damaged file.
class NoRoom {
 public:
  NoRoom() {
    getrlimit(RLIMIT_FSIZE, &before_);
    const rlimit none{0, before_.rlim_max};
    setrlimit(RLIMIT_FSIZE, &none);
    std::signal(SIGXFSZ, SIG_IGN);
  }
  ~NoRoom() { setrlimit(RLIMIT_FSIZE, &before_); }
  NoRoom(const NoRoom&) = delete;
  NoRoom& operator=(const NoRoom&) = delete;

 private:
  rlimit before_{};
};

TEST_P(DamageTest, AFullDiskLeavesTheDamagedFileWhereItIsUntilItIsFreed) {
  const std::string path = GetParam().path;
  const std::string text = ReadFile(path).substr(0, 40);
  WriteFile(path, text);
  {
    const NoRoom full;
    Examination examination(true);
    GetParam().check(examination);
    ASSERT_EQ(examination.findings().size(), 1U);
    EXPECT_EQ(examination.findings()[0].outcome, Outcome::kLeft);
    EXPECT_NE(examination.findings()[0].remedy.find("Cannot write " + path), std::string::npos)
        << examination.findings()[0].remedy;
  }
  EXPECT_EQ(ReadFile(path), text);
  EXPECT_TRUE(SetAside(path).empty());
  ExpectMended(GetParam().check, path, text, GetParam().load);
}

TEST_F(StateFilesTest, WhatCanBeReadStaysAndWhatIsKnownElsewhereComesBack) {
  // The second share, and the second folder, are cut off.
  std::string text = ReadFile(platform::ShareFilePath());
  WriteFile(platform::ShareFilePath(), text.substr(0, text.rfind("\"name\"")));
  text = ReadFile(kFileIndexFoldersCfgPath);
  WriteFile(kFileIndexFoldersCfgPath, text.substr(0, text.find("/pics")));
  RegisterPlace("pics/b");
  Examination mend(true);
  cli::CheckShareFile(mend);
  cli::CheckFolderList(mend);
  ASSERT_EQ(mend.findings().size(), 2U);
  EXPECT_TRUE(mend.IsWell());
  EXPECT_NE(mend.findings()[0].remedy.find("because they have an index"), std::string::npos);
  EXPECT_EQ(platform::ReadShares()[1].path, files_ / "pics");
  const FolderMgr list;
  std::shared_ptr<fileindex::Folder> folder;
  list.Get(folder, "/docs/a");
  EXPECT_FALSE(folder->IsPhoto());
  list.Get(folder, "/pics/b");
  EXPECT_TRUE(folder->IsPhoto() && folder->IsVideo());
  EXPECT_EQ(folder->GetName(), "b");
  EXPECT_FALSE(list.HasFolder("/pics"));
}

TEST_F(StateFilesTest, AShareWhoseFoldersAreLostIsNamed) {
  WriteFile(kFileIndexFoldersCfgPath, "[" + FolderText("/docs/a", false) + ",");
  Examination mend(true);
  cli::CheckFolderList(mend);
  ASSERT_EQ(mend.findings().size(), 2U);
  EXPECT_FALSE(mend.IsWell());
  EXPECT_EQ(mend.findings()[1].outcome, Outcome::kLeft);
  EXPECT_NE(mend.findings()[1].remedy.find("quarry folder add /pics/..."), std::string::npos);
}

TEST_F(StateFilesTest, ThePauseAndTheNeedToCompareOutliveTheStatus) {
  const std::string whole = ReadFile(kFileIndexStatusCfgPath);
  WriteFile(kFileIndexStatusCfgPath, whole.substr(0, whole.size() - 4));
  Examination mend(true);
  cli::CheckStatusFile(mend);
  EXPECT_TRUE(mend.IsWell());
  const StatusMgr status;
  EXPECT_EQ(status.GetPauseInfo(), 4102444800);
  EXPECT_EQ(status.GetShareStatus("pics"), fileindex::kShareNeedReindex);
  EXPECT_EQ(status.GetShareStatus("docs"), fileindex::kShareNeedReindex);
  EXPECT_NE(mend.findings()[0].remedy.find("when the pause is over"), std::string::npos);
  // A number may go on behind the cut.
  WriteFile(kFileIndexStatusCfgPath, R"({"resume_time":41024)");
  Examination again(true);
  cli::CheckStatusFile(again);
  EXPECT_EQ(StatusMgr().GetPauseInfo(), -1);
  EXPECT_NE(again.findings()[0].remedy.find("not paused"), std::string::npos);
}

TEST_F(StateFilesTest, AnEngineListOfAnotherVersionIsNoDamage) {
  WriteFile(cli::EngineListPath(), R"({"version":2,"indexes":[]})");
  Examination mend(true);
  cli::CheckEngineList(mend);
  EXPECT_TRUE(mend.findings().empty());
}

TEST_F(StateFilesTest, ALinkIsKept) {
  const std::string target = files_ / "elsewhere";
  WriteFile(target, "{");
  Unlink(kFileIndexStatusCfgPath);
  std::filesystem::create_symlink(target, kFileIndexStatusCfgPath);
  Examination mend(true);
  cli::CheckStatusFile(mend);
  EXPECT_TRUE(mend.IsWell());
  EXPECT_TRUE(std::filesystem::is_symlink(kFileIndexStatusCfgPath));
  EXPECT_EQ(SetAside(target).size(), 1U);
  EXPECT_NO_THROW(StatusMgr());
}

INSTANTIATE_TEST_SUITE_P(All, DamageTest, testing::ValuesIn(Cases()),
                         [](const auto& each) { return std::string(each.param.name); });

}  // namespace
}  // namespace quarry::test
