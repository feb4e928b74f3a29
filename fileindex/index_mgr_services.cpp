// The services that indexing needs, and the suggestions of the search engine.

#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include "comm/elastic_control.h"
#include "common/log.h"
#include "common/sdk/share.h"
#include "fileindex/config/folder_mgr.h"
#include "fileindex/index_mgr.h"
#include "fileindex/index_mgr_internal.h"
#include "platform/include/error.h"
#include "platform/include/service.h"

namespace quarry::fileindex {
namespace {

constexpr int kWait = 1;     // TRUE of the service interface
constexpr int kNoForce = 0;  // FALSE of the service interface

// Logs a failed step of SetupRelatedServices, which has no reason beside errno.
void LogServiceFailure(const char* condition) {
  LogError({"index_mgr.cpp", __LINE__, "SetupRelatedServices"},
           std::string("Failed [") + condition + "]");
}

// The same for a step of which the platform says more.
void LogSharingFailure(const char* call) {
  char error[16];
  std::snprintf(error, sizeof(error), "0x%04X", static_cast<unsigned int>(HLIBCErrGet()));
  LogError({"index_mgr.cpp", __LINE__, "SetupRelatedServices"},
           std::string(call) + " failed: err=[" + error + " " + HLIBCErrorGetFile() + ":" +
               std::to_string(HLIBCErrorGetLine()) + "]");
}

// The sharing service is restarted only for a change: that interrupts its users. Where the platform
// cannot tell what is set, it is left as it is.
void SetupSearchOfSharingService(bool enable) {
  const int enabled = TARNSMBIsEnableSpotlight();
  if (0 > enabled) LogServiceFailure("0 > TARNSMBIsEnableSpotlight()");
  if (0 > enabled || (enabled != 0) == enable) return;
  if (0 > TARNSMBSetSpotlight(enable ? 1 : 0)) {
    LogSharingFailure("TARNSMBSetSpotlight");
  } else if (0 > HLIBServiceRestart("samba")) {
    LogSharingFailure("HLIBServiceRestart");
  }
}

void StartServices() {
  if (0 > HLIBServiceStart("tarncontentextractd", kWait)) {
    LogServiceFailure("0 > HLIBServiceStart(\"tarncontentextractd\", TRUE)");
  }
  if (0 > HLIBServicectlStart("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART)) {
    LogServiceFailure(
        "0 > HLIBServicectlStart(\"pkg-Quarry-fileindexd\", HLIB_SERVICECTL_UPSTART)");
  }
}

void StopServices() {
  if (0 > HLIBServiceStop("tarncontentextractd", kNoForce)) {
    LogServiceFailure("0 > HLIBServiceStop(\"tarncontentextractd\", FALSE)");
  }
  if (0 > HLIBServicectlStop("pkg-Quarry-fileindexd", HLIB_SERVICECTL_UPSTART)) {
    LogServiceFailure("0 > HLIBServicectlStop(\"pkg-Quarry-fileindexd\", HLIB_SERVICECTL_UPSTART)");
  }
}

}  // namespace

void SetupRelatedServices(bool enable) {
  SetupSearchOfSharingService(enable);
  if (enable) {
    StartServices();
  } else {
    StopServices();
  }
}

void PrepareServices() {
  SetupRelatedServices(!FolderMgr().GetFolders().empty());
}

void UpdateTermSuggestion(const std::vector<std::string>& db_names) {
  for (const std::string& share_name : FolderMgr().GetIndexedShares()) {
    const sdk::SDKShare share(share_name);
    const std::string db_name = share.GetDBName();
    if (std::find(db_names.begin(), db_names.end(), db_name) == db_names.end()) continue;
    std::vector<std::string> paths;
    elastic::IndexGetByPrefixPath(db_name, share.GetPath(), paths);
    elastic::UpdateTermSuggestion(db_name, paths);
    elastic::IndexCommit(share_name);
  }
}

}  // namespace quarry::fileindex
