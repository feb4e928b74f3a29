// What a share's new name or place means, before anything is changed.

#ifndef QUARRY_CLI_SHARE_PLAN_H_
#define QUARRY_CLI_SHARE_PLAN_H_

#include <string>
#include <vector>

#include "platform/linux/share_registry.h"

namespace quarry::cli {

struct SharePlan {
  std::string from;  // names; the same when the share only moves
  std::string to;
  std::string old_path;  // full paths
  std::string new_path;
  bool registered = false;  // an earlier attempt was cut short: the share is known by its new path
};

// The share of that name. Throws Problem when there is none.
const platform::ShareRecord& RequireShare(const std::vector<platform::ShareRecord>& shares,
                                          const std::string& name);

// Throws Problem, with the command that ends it, when the share's move was cut short.
void RequireArrived(const platform::ShareRecord& share);

// The share `from` gets the name `to`, in the directory in which it is. Throws Problem.
SharePlan PlanRename(const std::vector<platform::ShareRecord>& shares, const std::string& from,
                     const std::string& to);

// The share gets a place in the directory `parent`, an absolute path without links. Throws Problem.
SharePlan PlanMigration(const std::vector<platform::ShareRecord>& shares, const std::string& name,
                        const std::string& parent);

// The command that ends a move which was cut short, of the share that is or was called `name`; ""
// when there is no such move.
std::string UnfinishedMove(const std::vector<platform::ShareRecord>& shares,
                           const std::string& name);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_SHARE_PLAN_H_
