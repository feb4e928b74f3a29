#include "tests/daemons/fileindexd/share_fixture.h"

#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>

#include "common/file_util.h"
#include "common/json.h"
#include "fileindex/util/util.h"
#include "platform/linux/share_registry.h"

namespace quarry::fileindexd {

FolderRule Folder(const std::string& path) {
  return {path, "/v" + path, true, true, true, true, false};
}

FolderRule DocumentFolder(const std::string& path) {
  return {path, "/v" + path, true, false, false, false, false};
}

FolderRule PausedFolder(const std::string& path) {
  FolderRule folder = Folder(path);
  folder.paused = true;
  return folder;
}

void RegisterShare(const std::string& path) {
  platform::ShareRecord share;
  share.name = Basename(path);
  share.path = path;
  share.recycle_bin = true;
  platform::AddShare(share);
}

ShareFixture::ShareFixture()
    : survey_(
          disk_, [this] { return rules_; },
          [this](const std::string& path) { return InBin(path); }) {
  disk_.AddDir(kRoot);
  SetFolders({Folder("/s")});
}

void ShareFixture::SetFolders(const std::vector<FolderRule>& folders) {
  rules_ = std::make_shared<const FolderRules>(folders);
  progress_.SetFolders(rules_);
}

bool ShareFixture::InBin(const std::string& path) const {
  return std::any_of(bins_.begin(), bins_.end(), [&](const std::string& bin) {
    return StringStartWith(path + "/", bin + "/");
  });
}

void ShareFixture::Queue(unsigned int event, const std::string& path, bool is_dir,
                         const std::string& old_path) {
  Json::Value line;
  line["event"] = event;
  line["is_dir"] = is_dir;
  line["path"] = path;
  if (!old_path.empty()) line["path_old"] = old_path;
  std::ofstream(QueuePath(), std::ios::app) << toString(line) << "\n";
}

bool ShareFixture::HasSnapshot() const {
  return access((QueuePath() + ".tmp").c_str(), F_OK) == 0;
}

bool ShareFixture::HasQueue() const {
  return access(QueuePath().c_str(), F_OK) == 0;
}

PassResult ShareFixture::Run(bool full) {
  const PassSetup setup{QueuePath(), kRoot,  index_, survey_,  gate_,
                        progress_,   aside_, slots_, threads_, disk_.Identify(kRoot)};
  return RunPass(setup, full);
}

std::vector<std::string> ShareFixture::CommandsOf(bool full) {
  index_.ForgetCommands();
  EXPECT_EQ(PassResult::kDone, Run(full));
  std::vector<std::string> commands = index_.Commands();
  EXPECT_FALSE(commands.empty());
  if (!commands.empty()) {
    EXPECT_EQ("commit", commands.back());
    commands.pop_back();
  }
  return commands;
}

bool ShareFixture::IsWanted(const std::string& path) const {
  const FolderRule* folder = nullptr;
  for (const auto& [place, rule] : rules_->folders()) {
    const bool covers = StringStartWith(path + "/", place + "/");
    if (covers && (folder == nullptr || place.size() > folder->full_path.size())) folder = &rule;
  }
  if (folder == nullptr || folder->paused || InBin(path)) return false;
  FakeDisk& disk = const_cast<FakeDisk&>(disk_);
  for (std::string place = path; place != folder->full_path; place = Dirname(place)) {
    if (fileindex::IsSystemPreservedFileName(Basename(place))) return false;
    const PlaceKind above = disk.Peek(Dirname(place)).kind;
    const bool base = Dirname(place) == folder->full_path;
    if (above != PlaceKind::kDirectory && !(base && above == PlaceKind::kForeign)) return false;
  }
  const PlaceKind kind = disk.Peek(path).kind;
  if (kind == PlaceKind::kForeign) return path == folder->full_path;
  return kind == PlaceKind::kFile || kind == PlaceKind::kDirectory;
}

FakeIndex::Documents ShareFixture::Expected() const {
  FakeIndex::Documents expected;
  for (const std::string& path : disk_.Tree(kRoot)) {
    if (!IsWanted(path)) continue;
    const Place place = const_cast<FakeDisk&>(disk_).Peek(path);
    const bool is_file = place.kind == PlaceKind::kFile;
    const bool content = is_file && rules_->WantsContent(path);
    expected[path] = {path, !is_file, place.attribute_stamp, content ? place.content_stamp : ""};
  }
  return expected;
}

void ShareFixture::ExpectInLine() const {
  const FakeIndex::Documents expected = Expected();
  FakeIndex::Documents actual = index_.All();
  std::erase_if(actual, [this](const auto& entry) { return survey_.IsAside(entry.first); });
  for (const auto& [path, document] : expected) {
    ASSERT_EQ(1U, actual.count(path)) << path << " is missing";
    EXPECT_EQ(document.is_dir, actual[path].is_dir) << path;
    EXPECT_EQ(document.attribute_stamp, actual[path].attribute_stamp) << path;
    EXPECT_EQ(document.content_stamp, actual[path].content_stamp) << path;
  }
  for (const auto& [path, document] : actual) {
    EXPECT_EQ(1U, expected.count(path)) << path << " should not be there";
  }
}

}  // namespace quarry::fileindexd
