#include "cli/problem.h"

#include <algorithm>

#include "cli/state_check.h"
#include "common/file_util.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::cli {
namespace {

struct Explanation {
  int code;
  const char* text;
};

// What each code means to somebody who only sees the command line.
constexpr Explanation kExplanations[] = {
    {kErrorBadParameter, "The request was not understood; check its arguments"},
    {kErrorShareEnum, "The list of shares cannot be read; see the system log"},
    {kErrorSystem,
     "A call to the system or to a daemon failed; \"quarry doctor\" finds out what is wrong"},
    {kErrorCredentials, "The right to act as another user is missing; run as root"},
    {kErrorLoadFile, "A state file is damaged; mend it with \"quarry doctor\""},
    {kErrorSaveFile, "A state file cannot be written; check free space and permissions"},
    {kErrorLock, "Another process holds the lock; try again when it is done"},
    {kErrorShareNotFound, "There is no such share; \"quarry share list\" names those there are"},
    {kErrorServiceAccount,
     "The account that the package runs as is missing; install the package anew"},
    {kErrorTooManyFolders, "The list of folders is full (1000); remove one first"},
    {kErrorFolderExists, "The folder is indexed already; change it with \"quarry folder set\""},
    {kErrorFolderNotFound,
     "No such folder is indexed; \"quarry folder list\" names those there are"},
    {kErrorPathNotIndexable,
     "The place cannot be indexed; it must be an existing directory on a local disk, in a share "
     "that is neither encrypted nor read-only, named without symbolic links"},
    {kErrorMalformedEvent,
     "The share's queue holds a line that cannot be read; mend it with \"quarry doctor\""},
    {kErrorEngineRequest,
     "The search engine (tarnelasticd) did not answer; start it with \"quarry run\""},
    {kErrorParseDocument,
     "A document could not be read; see that tarncontentextractd runs (\"quarry status\")"},
    {kErrorEngineQuery, "The search engine could not look up or move entries; see its log"},
    {kErrorNoSpace, "The volume is full; free at least 100 MiB, then try again"},
    {kErrorEngineBusy, "The search engine is busy; try again in a while"},
    {kErrorEngineBusyMemory, "The search engine is busy; try again in a while"},
    {engine::kDamagedIndex,
     "An index cannot be used; it is made anew when its share is indexed next, or by "
     "\"quarry doctor\""},
    {engine::kMovingIndex, "An index is being made anew; try again in a while"},
};

// The library's words for state that is damaged or missing are the same as for a wrong argument.
std::string CauseInState(const Error& error) {
  switch (error.code()) {
    case kErrorBadParameter:
    case kErrorShareEnum:
    case kErrorSystem:
    case kErrorLoadFile:
      return UnreadableState();
    case kErrorShareNotFound: {
      const std::string unreadable = UnreadableState();
      const std::vector<std::string> vanished = VanishedShares();
      if (!unreadable.empty() || vanished.empty()) return unreadable;
      return HowToRegain(vanished);
    }
    default:
      return "";
  }
}

const char* Meaning(const Error& error) {
  if (error.code() == kErrorLock && StringStartWith(error.reason(), "open failed")) {
    return "A lock file cannot be used; run as the user who started the system, or as root";
  }
  const auto* found = std::find_if(std::begin(kExplanations), std::end(kExplanations),
                                   [&](const Explanation& e) { return e.code == error.code(); });
  return found == std::end(kExplanations) ? nullptr : found->text;
}

std::string General(const Error& error) {
  const char* meaning = Meaning(error);
  std::string text = error.reason();
  if (meaning != nullptr) {
    text = meaning + (text.empty() ? text : ": " + text);
  } else if (text.empty()) {
    text = "The request failed";  // the engine gives a reason with each code of its own
  }
  return text;
}

}  // namespace

std::string Explain(const Error& error) {
  const std::string cause = CauseInState(error);
  return (cause.empty() ? General(error) : cause) + " (code " + std::to_string(error.code()) + ")";
}

}  // namespace quarry::cli
