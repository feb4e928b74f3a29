// Adding shares, and what is known of them.

#ifndef QUARRY_CLI_SHARES_H_
#define QUARRY_CLI_SHARES_H_

#include <string>

#include "cli/place.h"

namespace quarry::cli {

// Makes the share of `place` known to the platform. Throws Problem.
void AddShare(const Place& place);

// Makes the platform forget the share of `place`; its files are left alone. Throws Error.
void RemoveShare(const Place& place);

// The share path that `argument` means: a share path of a known share as it stands, or an existing
// directory inside a share. Throws Problem when it is neither.
std::string SharePathOf(const std::string& argument);

// The index identifiers of the shares that have an indexed folder.
std::vector<std::string> IndexedShares();

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SHARES_H_
