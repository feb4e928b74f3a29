#include "cli/share_plan.h"

#include "cli/place.h"
#include "cli/problem.h"
#include "common/error.h"
#include "common/file_util.h"

namespace quarry::cli {
namespace {

using platform::ShareRecord;
using Shares = std::vector<ShareRecord>;

const ShareRecord* Find(const Shares& shares, const std::string& name) {
  for (const ShareRecord& share : shares) {
    if (share.name == name) return &share;
  }
  return nullptr;
}

std::string CommandFor(const ShareRecord& moved) {
  const std::string from = Basename(moved.moved_from);
  if (from != moved.name) return "quarry share rename " + from + " " + moved.name;
  return "quarry share migrate " + moved.name + " " + Dirname(moved.path) + "/";
}

SharePlan Resumed(const ShareRecord& share) {
  return {Basename(share.moved_from), share.name, share.moved_from, share.path, true};
}

// Whether a share could live there, were it not for its files.
void RequireFreePlace(const Shares& shares, const ShareRecord& share, const std::string& new_path) {
  ShareRecord moved = share;
  moved.name = Basename(new_path);
  moved.path = new_path;
  try {
    platform::ValidateShare(moved);
  } catch (const Error& error) {
    throw Problem(error.reason());
  }
  std::vector<KnownShare> others;
  for (const ShareRecord& other : shares) {
    if (other.name != share.name) others.push_back({other.name, other.path});
  }
  const Place place = PlanPlace(new_path, others);
  if (!place.new_share) {
    throw Problem("\"" + new_path + "\" lies in the share \"" + place.share +
                  "\". Shares cannot lie within each other; name another place.");
  }
}

SharePlan NewPlan(const Shares& shares, const ShareRecord& share, const std::string& new_path) {
  RequireArrived(share);
  RequireFreePlace(shares, share, new_path);
  if (StringStartWith(new_path, share.path + "/")) {
    throw Problem("\"" + new_path + "\" lies in the share itself. Name another place.");
  }
  return {share.name, Basename(new_path), share.path, new_path, false};
}

}  // namespace

const ShareRecord& RequireShare(const Shares& shares, const std::string& name) {
  const ShareRecord* share = Find(shares, name);
  if (share != nullptr) return *share;
  throw Problem("There is no share named \"" + name +
                "\". \"quarry share list\" names those there are.");
}

void RequireArrived(const ShareRecord& share) {
  if (share.moved_from.empty()) return;
  throw Problem("The share \"" + share.name + "\" is still on its way from \"" + share.moved_from +
                "\". End that first: " + CommandFor(share));
}

SharePlan PlanRename(const Shares& shares, const std::string& from, const std::string& to) {
  const ShareRecord* target = Find(shares, to);
  if (target != nullptr && from != to && Basename(target->moved_from) == from) {
    return Resumed(*target);
  }
  const ShareRecord& share = RequireShare(shares, from);
  if (from == to) throw Problem("The share \"" + from + "\" has that name already.");
  if (to.empty() || to.find('/') != std::string::npos) {
    throw Problem("\"" + to + "\" is no name for a share. Name it without any \"/\".");
  }
  return NewPlan(shares, share, Dirname(share.path) + "/" + to);
}

SharePlan PlanMigration(const Shares& shares, const std::string& name, const std::string& parent) {
  const ShareRecord& share = RequireShare(shares, name);
  const std::string new_path = (parent == "/" ? "" : parent) + "/" + name;
  if (share.path == new_path) {
    if (Basename(share.moved_from) == name) return Resumed(share);
    throw Problem("The share \"" + name + "\" is at \"" + new_path + "\" already.");
  }
  return NewPlan(shares, share, new_path);
}

std::string UnfinishedMove(const Shares& shares, const std::string& name) {
  for (const ShareRecord& share : shares) {
    if (share.moved_from.empty()) continue;
    if (share.name == name || Basename(share.moved_from) == name) return CommandFor(share);
  }
  return "";
}

}  // namespace quarry::cli
