#include "daemons/fileindexd/failure.h"

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::fileindexd {

Failure Classify(const Error& error) {
  switch (static_cast<int>(error.code())) {
    case kErrorParseDocument:
    case kErrorBadParameter:
    case engine::kMalformedRequest:
      return Failure::kDocument;
    case kErrorEngineRequest:
      return Failure::kChannel;
    case engine::kUnknownIndex:
    case engine::kDamagedIndex:
      return Failure::kIndexMissing;
    case kErrorShareEnum:
    case kErrorSystem:
    case kErrorCredentials:
    case kErrorLoadFile:
    case kErrorSaveFile:
    case kErrorLock:
    case kErrorShareNotFound:
    case kErrorServiceAccount:
    case kErrorEngineBusy:
    case kErrorEngineBusyMemory:
    case kErrorNoSpace:
    case engine::kPausedIndex:
    case engine::kDiskFull:
    case engine::kMovingIndex:
      return Failure::kPass;
    default:
      return Failure::kPlace;
  }
}

std::string Describe(const Error& error) {
  const std::string code = "code " + std::to_string(error.code());
  return error.reason().empty() ? code : error.reason() + " (" + code + ")";
}

}  // namespace quarry::fileindexd
