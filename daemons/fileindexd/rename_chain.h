// Renames that follow each other.

#ifndef QUARRY_DAEMONS_FILEINDEXD_RENAME_CHAIN_H_
#define QUARRY_DAEMONS_FILEINDEXD_RENAME_CHAIN_H_

#include <vector>

#include "daemons/fileindexd/operation_handler.h"

namespace quarry::fileindexd {

// What was renamed, and then renamed again, is at the last place only: each rename is given the
// last one of its chain as its destination, so that documents go there at once. The later renames
// stay, as reasons to look at the places between.
void FollowRenames(std::vector<Operation>* operations);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_RENAME_CHAIN_H_
