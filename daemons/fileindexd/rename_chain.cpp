#include "daemons/fileindexd/rename_chain.h"

#include <unordered_map>

namespace quarry::fileindexd {

void FollowRenames(std::vector<Operation>* operations) {
  // Where what is at a place will end up, by the renames that come later.
  std::unordered_map<std::string, std::string> ends;
  for (auto operation = operations->rbegin(); operation != operations->rend(); ++operation) {
    if (operation->kind != fileindex::OP_RENAME) continue;
    const auto end = ends.find(operation->path);
    if (end != ends.end()) operation->path = end->second;
    ends[operation->old_path] = operation->path;
  }
}

}  // namespace quarry::fileindexd
