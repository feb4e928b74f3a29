#include "cli/doctor/checks.h"
#include "common/error.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/config/status_mgr.h"
#include "platform/linux/share_registry.h"

namespace quarry::cli {
namespace {

// Everything else asks these.
bool AreListsReadable() {
  try {
    platform::ReadShares();
    const fileindex::FolderMgr folders;
    const fileindex::StatusMgr status;
    return true;
  } catch (const Error&) {
    return false;
  }
}

}  // namespace

void ExamineSystem(Examination& examination) {
  examination.Part("the list of shares", CheckShareFile);
  examination.Part("the engine's list of indexes", CheckEngineList);
  examination.Part("the list of folders", CheckFolderList);
  examination.Part("the status", CheckStatusFile);
  examination.Part("what is left of dead processes", CheckLeftovers);
  if (!AreListsReadable()) {
    examination.Note("The rest can only be looked at when that is mended", "Then: quarry doctor");
    return;
  }
  examination.Part("the daemons", CheckServices);
  examination.Part("the shares", CheckShares);
  examination.Part("what is to be watched", CheckRegistrations);
  examination.Part("the queues", CheckQueues);
  examination.Part("the indexes", CheckIndexes);
}

}  // namespace quarry::cli
