// Whether the lists that every command needs can be used. What fails in the library for want of
// them names other reasons, since it only sees that something is not there.

#ifndef QUARRY_CLI_STATE_CHECK_H_
#define QUARRY_CLI_STATE_CHECK_H_

#include <string>
#include <vector>

namespace quarry::cli {

// Which of the list of shares, the list of folders and the status cannot be read, and what to do
// about it, in a sentence without its last point; "" when all can. One that is missing is empty,
// and can be read.
std::string UnreadableState();

// The shares that hold indexed folders and are not known, or cannot be told from a list that cannot
// be read: none.
std::vector<std::string> VanishedShares();

// What to do about shares that hold indexed folders and are not known, in a sentence without its
// last point.
std::string HowToRegain(const std::vector<std::string>& shares);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_STATE_CHECK_H_
