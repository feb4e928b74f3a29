// Waiting until a folder is indexed.

#ifndef QUARRY_CLI_PROGRESS_H_
#define QUARRY_CLI_PROGRESS_H_

#include <cstdint>
#include <string>

namespace quarry::cli {

// Blocks until nothing waits any longer for the folder that governs `share_path`, showing what is
// being done on one moving line where stderr is a terminal. Throws Problem when the index daemon
// falls silent or the indexing cannot go on by itself.
void WaitUntilIndexed(const std::string& share_path);

// The documents in the share's index.
std::uint64_t DocumentCount(const std::string& share);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_PROGRESS_H_
