// What becomes of a directory that somebody asks to index: a folder of a share that is there, or of
// a new share.

#ifndef QUARRY_CLI_PLACE_H_
#define QUARRY_CLI_PLACE_H_

#include <string>
#include <vector>

namespace quarry::cli {

struct KnownShare {
  std::string name;
  std::string path;  // full path
};

struct Place {
  std::string share;       // the share's name
  std::string share_path;  // the share's full path
  std::string folder;      // the directory as a share path: "/" + share + the path inside it
  bool new_share = false;  // the share has to be added first
};

// The directory that `argument` names, without links. Throws Problem when it is missing, no
// directory or not readable.
std::string ResolveDirectory(const std::string& argument);

// Decides for `directory`, an absolute path without links. Throws Problem for "/", for a parent of
// a share, and where the new share's name is taken.
Place PlanPlace(const std::string& directory, const std::vector<KnownShare>& shares);

// The shares that the platform knows. A share that vanishes meanwhile is left out.
std::vector<KnownShare> KnownShares();

}  // namespace quarry::cli

#endif  // QUARRY_CLI_PLACE_H_
