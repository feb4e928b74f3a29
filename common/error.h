// The one exception type of the library and the numbers that it carries.

#ifndef QUARRY_COMMON_ERROR_H_
#define QUARRY_COMMON_ERROR_H_

#include <cstdint>
#include <stdexcept>
#include <string>

#include "common/export.h"

namespace quarry {

// What went wrong. The number is the contract: it is logged, sent and compared as a number. The
// search engine's own codes are carried by the same type without being enumerators here.
enum ErrorCode : std::int32_t {
  kErrorBadParameter = 120,  // a property is missing or of the wrong type, an argument out of range
  kErrorShareEnum = 121,     // the shares could not be enumerated
  kErrorSystem = 502,        // a system or platform call failed
  kErrorCredentials = 503,   // the effective user could not be switched
  kErrorLoadFile = 504,      // the folder list or the status could not be loaded
  kErrorSaveFile = 505,      // the folder list or the status could not be saved
  kErrorLock = 506,          // a lock file could not be taken
  kErrorShareNotFound = 800,      // a share could not be looked up
  kErrorServiceAccount = 801,     // the package's account could not be looked up
  kErrorTooManyFolders = 900,     // the folder list is full
  kErrorFolderExists = 901,       // the folder to add is there already
  kErrorFolderNotFound = 902,     // no such folder
  kErrorPathNotIndexable = 903,   // the path cannot hold an indexed folder
  kErrorMalformedEvent = 906,     // a queue line is not JSON
  kErrorEngineRequest = 913,      // the exchange with the search engine failed
  kErrorParseDocument = 914,      // a document could not be read
  kErrorEngineQuery = 916,        // a rename or a look-up in an index failed
  kErrorEngineBusy = 1400,        // the search engine is busy
  kErrorEngineBusyMemory = 1401,  // the search engine is busy, and short of memory
  kErrorNoSpace = 1003,           // the volume of an index is full
  kErrorTreePath = 9999,          // a path has no node in the operation tree
};

// The only exception that leaves the library. Thrown by value, copyable.
class QUARRY_EXPORT Error : public std::runtime_error {
 public:
  explicit Error(ErrorCode code) : Error(code, std::string()) {}
  Error(ErrorCode code, const std::string& reason);

  // For codes that come from outside as plain numbers, as the search engine's do.
  explicit Error(int code) : Error(static_cast<ErrorCode>(code)) {}
  Error(int code, const std::string& reason) : Error(static_cast<ErrorCode>(code), reason) {}

  ErrorCode code() const noexcept { return code_; }
  // The text given at construction, empty when none was given. Valid as long as this object.
  const std::string& reason() const noexcept { return reason_; }

 private:
  ErrorCode code_;
  std::string reason_;
};

namespace fileindex {

// 7 writes debug lines to the system log, any other value does not. A host program may change it
// at any time before it starts threads.
QUARRY_EXPORT extern std::int32_t log_level;

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_COMMON_ERROR_H_
