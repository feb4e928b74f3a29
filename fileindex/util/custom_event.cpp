#include "fileindex/util/custom_event.h"

#include <fcntl.h>

#include <cerrno>
#include <cstring>

#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/share.h"
#include "common/unique_fd.h"
#include "fileindex/config/status_mgr.h"
#include "fileindex/queue/queue_append.h"
#include "fileindex/queue/queue_mgr.h"
#include "fileindex/util/util.h"
#include "platform/include/service.h"

namespace quarry::fileindex {
namespace {

// How the platform is to run its notification tool.
constexpr unsigned int kExecFlags = 0xBB;

const std::string kNotifyTool = RootedPath("/usr/tarn/bin/tarnhelmnotify");

std::string EventText(int event, const std::string& full_path, const std::string& old_path,
                      const Json::Value& data) {
  Json::Value line(Json::objectValue);
  line["event"] = event;
  line["path"] = full_path;
  line["path_old"] = old_path;
  line["data"] = data;
  return toString(line);
}

// Appends `text` as a line of its own, all of it or nothing. The caller holds the queue's lock.
void AppendLine(const std::string& queue_path, const std::string& text) {
  // A queue that cannot be opened loses the event without a word: callers count on that.
  const UniqueFd fd(open(queue_path.c_str(), O_RDWR | O_APPEND | O_CREAT | O_CLOEXEC, 0644));
  if (!fd.valid()) return;
  int cut_error = 0;
  if (AppendLines(fd.get(), text + "\n", &cut_error)) return;
  const std::string reason = strerror(errno);
  if (cut_error != 0) {
    errno = cut_error;
    LogFailure(QUARRY_SITE("util"), "0 > ftruncate(fd, size)", queue_path);
  }
  throw Error(kErrorSystem, "write failed, reason=" + reason);
}

void QueueEvent(int event, const std::string& share_name, const std::string& full_path,
                const std::string& old_path, const Json::Value& data) {
  // Readers of the queue drop such an event.
  if (old_path.find('\0') != std::string::npos) {
    throw Error(kErrorBadParameter, "NUL byte in path: " + old_path);
  }
  const std::string queue_path = sdk::SDKShare(share_name).GetQueuePath();
  // The reindex will find all that the event is about.
  if (QueueMgr(queue_path).IsReindexWaitingFor(full_path)) return;
  const LockFile lock(queue_path, true);
  AppendLine(queue_path, EventText(event, full_path, old_path, data));
}

// The event is lost, so the share as a whole is doubtful. A failure here must not hide the one that
// brought us here.
void MarkShare(const std::string& share_name) {
  try {
    StatusMgr().SetShareStatus(share_name, kShareNeedReindex);
  } catch (const Error& error) {
    LogError({"util.cpp", __LINE__, "AddCustomEvent"},
             "SetShareStatus failed, code=" + std::to_string(error.code()) +
                 ", reason=" + error.reason());
  }
}

}  // namespace

void AddCustomEvent(int event, const std::string& full_path, const std::string& old_path,
                    const Json::Value& data) {
  std::string share_name;
  std::string share_path;
  GetShareNamePathByFullPath(share_name, share_path, full_path);
  try {
    QueueEvent(event, share_name, full_path, old_path, data);
  } catch (const Error& error) {
    LogError(QUARRY_SITE("util"), "AddCustomEvent failed, code=" + std::to_string(error.code()) +
                                      ", reason=" + error.reason() + ". Set [" + share_name +
                                      "] need reindex");
    MarkShare(share_name);
    throw;
  }
}

int SendHelmNotify() {
  const char* tool = kNotifyTool.c_str();
  return HLIBCExecl(tool, kExecFlags, tool, "-c", "TARN.Quarry.Application", "-b", "true", "-e",
                    "false", "@administrators", "app:displayname", "error:index_no_space",
                    "<a data-tarn-app=\"TARN.Quarry.Application\" data-tarn-fn=\"preference\">",
                    "</a>", static_cast<char*>(nullptr));
}

int NotifyLackOfMemory() {
  const char* tool = kNotifyTool.c_str();
  return HLIBCExecl(tool, kExecFlags, tool, "-c", "TARN.Quarry.Application", "@administrators",
                    "app:displayname", "error:lack_of_memory", static_cast<char*>(nullptr));
}

}  // namespace quarry::fileindex
