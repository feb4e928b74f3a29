#include "cli/problem.h"

#include <algorithm>

namespace quarry::cli {
namespace {

struct Explanation {
  int code;
  const char* text;
};

// What each code means to somebody who only sees the command line.
constexpr Explanation kExplanations[] = {
    {kErrorBadParameter, "The request was not understood; check its arguments"},
    {kErrorShareEnum, "The list of shares cannot be read; look at etc/quarry/shares.json"},
    {kErrorSystem,
     "A call to the system or to the index daemon failed; see that \"quarry run\" is "
     "running, then try again"},
    {kErrorCredentials, "The right to act as another user is missing; run as root"},
    {kErrorLoadFile, "A state file is damaged; restore it from a backup or move it away"},
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
     "that "
     "is neither encrypted nor read-only, named without symbolic links"},
    {kErrorMalformedEvent, "The share's queue holds a line that cannot be read"},
    {kErrorEngineRequest,
     "The search engine (tarnelasticd) did not answer; start it with \"quarry run\""},
    {kErrorParseDocument,
     "A document could not be read; see that tarncontentextractd runs (\"quarry status\")"},
    {kErrorEngineQuery, "The search engine could not look up or move entries; see its log"},
    {kErrorNoSpace, "The volume is full; free at least 100 MiB, then try again"},
    {kErrorEngineBusy, "The search engine is busy; try again in a while"},
    {kErrorEngineBusyMemory, "The search engine is busy; try again in a while"},
};

}  // namespace

std::string Explain(const Error& error) {
  const int code = error.code();
  const auto* found = std::find_if(std::begin(kExplanations), std::end(kExplanations),
                                   [&](const Explanation& e) { return e.code == code; });
  std::string text = error.reason();
  if (found != std::end(kExplanations)) {
    text = std::string(found->text) + (text.empty() ? text : ": " + text);
  } else if (text.empty()) {
    text = "The request failed";  // the engine gives a reason with each code of its own
  }
  return text + " (code " + std::to_string(code) + ")";
}

}  // namespace quarry::cli
