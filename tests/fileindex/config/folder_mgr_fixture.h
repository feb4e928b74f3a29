// What the tests of the folder list share.

#ifndef QUARRY_TESTS_FILEINDEX_CONFIG_FOLDER_MGR_FIXTURE_H_
#define QUARRY_TESTS_FILEINDEX_CONFIG_FOLDER_MGR_FIXTURE_H_

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "common/error.h"
#include "fileindex/config/folder_mgr.h"
#include "tests/fake_platform/fixture.h"
#include "tests/support/files.h"
#include "tests/support/thrown.h"

namespace quarry::fileindex {

using test::FailureOf;
using FolderPtr = std::shared_ptr<Folder>;

// A folder whose kinds are given by letters: "davp" is all four.
inline FolderPtr Make(const std::string& path, const std::string& kinds,
                      const std::string& name = "n") {
  const auto has = [&](char kind) { return kinds.find(kind) != std::string::npos; };
  return std::make_shared<Folder>(path, name, has('d'), has('a'), has('v'), has('p'), false, false);
}

inline std::string Kinds(const FolderPtr& folder) {
  if (!folder) return "none";
  return std::string(folder->IsDocument() ? "d" : "") + (folder->IsAudio() ? "a" : "") +
         (folder->IsVideo() ? "v" : "") + (folder->IsPhoto() ? "p" : "");
}

inline std::string PathOf(const FolderPtr& folder) {
  return folder ? folder->GetPath() : "none";
}

inline std::vector<std::string> Paths(const std::vector<FolderPtr>& folders) {
  std::vector<std::string> paths;
  for (const FolderPtr& folder : folders) paths.push_back(folder->GetPath());
  return paths;
}

class FolderMgrTest : public fake::FakePlatformTest {
 protected:
  FolderMgrTest() {
    fake::AddShare("s", volume_ + "/s");
    fake::AddShare("t", volume_ + "/t");
  }

  static void Store(const std::string& text) { test::WriteFile(kFileIndexFoldersCfgPath, text); }
  static std::string Stored() { return test::ReadFile(kFileIndexFoldersCfgPath); }

  // A list of folders of all kinds, in this order.
  static FolderMgr ListOf(const std::vector<std::string>& paths) {
    FolderMgr folders;
    for (const std::string& path : paths) Upsert(folders, Make(path, "davp"));
    return folders;
  }
  static FolderPtr Upsert(FolderMgr& folders, const FolderPtr& folder) {
    FolderPtr diff;
    folders.Upsert(diff, folder);
    return diff;
  }
  static FolderPtr Delete(FolderMgr& folders, const std::string& path) {
    FolderPtr diff;
    folders.Delete(diff, path);
    return diff;
  }

  static std::string LoadFailure() {
    return FailureOf([] { FolderMgr folders; });
  }

  const std::string volume_ = test::TestRoot() + "/volume1";
};

}  // namespace quarry::fileindex

#endif  // QUARRY_TESTS_FILEINDEX_CONFIG_FOLDER_MGR_FIXTURE_H_
