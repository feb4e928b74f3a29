// A program of somebody else's, which knows the library by its installed headers alone. It uses a
// little of everything, and exits with 0 when all of it does what it should.

#include <comm/comm.h>
#include <comm/communication.h>
#include <comm/elastic_control.h>
#include <common/error.h>
#include <common/file_util.h>
#include <common/json.h>
#include <common/lock_file.h>
#include <common/sdk/credentials.h>
#include <common/sdk/share.h>
#include <fileindex/config/folder.h>
#include <fileindex/config/folder_mgr.h>
#include <fileindex/config/status_mgr.h>
#include <fileindex/index_mgr.h>
#include <fileindex/queue/event.h>
#include <fileindex/queue/optree.h>
#include <fileindex/queue/queue_mgr.h>
#include <fileindex/util/custom_event.h>
#include <fileindex/util/file_type.h>
#include <fileindex/util/util.h>

#include <iostream>
#include <string>

using namespace quarry;

static_assert(__cplusplus == 201703L, "the headers are for C++17");

namespace {

// The code of the error that a share which does not exist ends in.
int CodeOfMissingShare() {
  try {
    const sdk::SDKShare share("no such share");
  } catch (const Error& error) {
    return error.code();
  }
  return 0;
}

bool IsAllWell() {
  Json::Value document;
  return fileindex::GetShareNameByPath("/photo/2019") == "photo" &&
         fromString(document, "{\"a\":[1]}") && toString(document) == "{\"a\":[1]}" &&
         fileindex::FolderMgr().GetFolders().empty() && IsDirExist("/", false) &&
         CodeOfMissingShare() == 800;
}

}  // namespace

int main() {
  try {
    if (IsAllWell()) return 0;
    std::cerr << "the library does not do what it should\n";
  } catch (const Error& error) {
    std::cerr << error.what() << '\n';
  }
  return 1;
}
