// What a failed request means for the pass that made it.

#ifndef QUARRY_DAEMONS_FILEINDEXD_FAILURE_H_
#define QUARRY_DAEMONS_FILEINDEXD_FAILURE_H_

#include <string>

#include "common/error.h"

namespace quarry::fileindexd {

enum class Failure {
  kDocument,      // this one place is the trouble
  kChannel,       // an exchange broke off: the engine's trouble, or this document's
  kIndexMissing,  // the engine has no such index, or it is damaged: it can be made anew
  kPlace,         // nobody can tell: perhaps this one place's
  kPass,          // nothing else would go better now
};

Failure Classify(const Error& error);

// "reason (code)" for people.
std::string Describe(const Error& error);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_FAILURE_H_
