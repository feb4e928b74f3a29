// What the system is doing about each folder.

#ifndef QUARRY_CLI_FOLDER_STATUS_H_
#define QUARRY_CLI_FOLDER_STATUS_H_

#include <json/json.h>

#include <string>

#include "fileindex/config/folder.h"

namespace quarry::cli {

// The index daemon's report, or null when it does not run: it is stopped while nothing is indexed.
Json::Value IndexDaemonReport();

// {"path", "state", "waiting", "done", "failed", "rate", "current", "last_error"} of a folder: the
// numbers from the daemon's report, the state from what the library knows. A share that has
// vanished gives the state "error" with its reason as "last_error".
Json::Value FolderStatus(const fileindex::Folder& folder, const Json::Value& report);

// What the daemon has given up for now: {"share", "path", "error"} each.
Json::Value WorkSetAside(const Json::Value& report);

// {"share", "problem"} of each index that the engine cannot use. None while it does not answer.
Json::Value UnusableIndexes();

// A state of FolderStatus in words for a person.
std::string StateInWords(const Json::Value& status);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_FOLDER_STATUS_H_
