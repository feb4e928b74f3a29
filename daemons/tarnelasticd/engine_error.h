// What the engine answers when a request fails. Error carries these numbers to the answer's "code".

#ifndef QUARRY_DAEMONS_TARNELASTICD_ENGINE_ERROR_H_
#define QUARRY_DAEMONS_TARNELASTICD_ENGINE_ERROR_H_

#include "common/error.h"

namespace quarry::engine {

// Described one by one in docs/engine-protocol.md. The two busy codes are kErrorEngineBusy and
// kErrorEngineBusyMemory of common/error.h.
enum EngineCode : int {
  kMalformedRequest = 1402,  // a property is missing, of the wrong type or out of range
  kUnknownCommand = 1403,
  kUnknownIndex = 1404,
  kDamagedIndex = 1405,  // its database is missing or unreadable; index_create makes it anew
  kPausedIndex = 1406,   // the index takes no writes
  kDiskFull = 1407,
  kStorageFailed = 1408,  // the file system or the database failed in another way
  kQuerySyntax = 1409,
  kIndexConflict = 1410,  // the new id or path belongs to another index
  kSearchTooLong = 1411,  // the search was given up
  kBadMappings = 1412,
  kInternalFailure = 1413,
  kOutOfMemory = 1414,  // where a command must not answer busy
  kMovingIndex = 1415,  // its database is being replaced or moved
};

// Whether the error carries that code.
inline bool HasCode(const Error& error, EngineCode code) {
  return static_cast<int>(error.code()) == code;
}

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_ENGINE_ERROR_H_
