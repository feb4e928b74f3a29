// The world and its recording.

#include "tests/fake_platform/fake_platform.h"

#include <json/json.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "tests/fake_platform/system_calls.h"
#include "tests/fake_platform/world.h"
#include "tests/support/root.h"

namespace quarry::fake {
namespace {

// As a file name: paths of shares differ in more than their last component.
std::string Flat(std::string path) {
  std::replace(path.begin(), path.end(), '/', '_');
  return path;
}

void SetErrors(const Failure& failure) {
  if (failure.platform_error != 0) SetPlatformError(failure.platform_error);
  if (failure.error_number != 0) errno = failure.error_number;
}

std::optional<Failure> FailureOf(World& world, const std::string& function) {
  const int ordinal = ++world.counts[function];
  const auto rules = world.failures.find(function);
  if (rules == world.failures.end()) return std::nullopt;
  const auto found = rules->second.by_ordinal.find(ordinal);
  return found == rules->second.by_ordinal.end() ? rules->second.every : found->second;
}

void AddDefaultUsers() {
  AddUser({"root", 0, 0, true});
  if (geteuid() != 0) AddUser({"tester", geteuid(), getegid(), false});
  AddUser({"Quarry", geteuid(), getegid(), false});
}

}  // namespace

World& TheWorld() {
  static World* const world = new World;
  return *world;
}

std::optional<Failure> EnterCall(const std::string& function, const std::string& text) {
  World& world = TheWorld();
  std::function<void(const std::string&)> hook;
  std::optional<Failure> failure;
  const int saved = errno;
  {
    WorldLock lock(world.mutex);
    if (!text.empty()) world.calls.push_back(text);
    if (!text.empty()) hook = world.call_hook;
    failure = FailureOf(world, function);
  }
  if (hook) hook(function);
  errno = saved;
  if (failure) SetErrors(*failure);
  return failure;
}

std::string CompactText(const Json::Value& value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

bool IsWithin(const std::string& path, const std::string& directory) {
  if (path.compare(0, directory.size(), directory) != 0) return false;
  return path.size() == directory.size() || path[directory.size()] == '/' || directory == "/";
}

bool IsWithinAny(const std::string& path, const std::set<std::string>& directories) {
  return std::any_of(directories.begin(), directories.end(),
                     [&path](const std::string& directory) { return IsWithin(path, directory); });
}

bool CopyOut(const std::string& text, char* buffer, size_t size) {
  if (text.size() + 1 > size) return false;
  std::memcpy(buffer, text.c_str(), text.size() + 1);
  return true;
}

void Reset() {
  ResetSystemCalls();
  World& world = TheWorld();
  {
    WorldLock lock(world.mutex);
    world.calls.clear();
    world.call_hook = nullptr;
    world.counts.clear();
    world.failures.clear();
    world.outstanding = 0;
    world.error_code = 0;
    world.error_file.clear();
    world.error_line = 0;
    world.shares.clear();
    world.users.clear();
    world.fs_types.clear();
    world.remote_types.clear();
    world.image_types.clear();
    world.mount_points.clear();
    world.snapshots.clear();
    world.share_recycles.clear();
    world.home_recycles.clear();
    world.hidden_names.clear();
    world.acl_bits.clear();
    world.quota_enough = true;
    world.quota_error = 0;
    world.spotlight = false;
    world.queue_paths.clear();
    world.index_paths.clear();
    world.exec = nullptr;
    world.parse_file = nullptr;
    world.monitor_queues.clear();
    world.requests.clear();
    world.replies.clear();
    world.engine = nullptr;
    world.unanswered.clear();
  }
  AddDefaultUsers();
}

std::vector<std::string> Calls() {
  WorldLock lock(TheWorld().mutex);
  return TheWorld().calls;
}

std::vector<std::string> CallsOf(const std::string& function) {
  std::vector<std::string> found;
  for (const std::string& call : Calls()) {
    if (call.compare(0, function.size() + 1, function + "(") == 0) found.push_back(call);
  }
  return found;
}

void ClearCalls() {
  WorldLock lock(TheWorld().mutex);
  TheWorld().calls.clear();
}

void OnCall(std::function<void(const std::string&)> hook) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().call_hook = std::move(hook);
}

int Outstanding() {
  WorldLock lock(TheWorld().mutex);
  return TheWorld().outstanding;
}

void FailCall(const std::string& function, int nth, const Failure& failure) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  world.failures[function].by_ordinal[world.counts[function] + nth] = failure;
}

void FailEveryCall(const std::string& function, const Failure& failure) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().failures[function].every = failure;
}

void StopFailing(const std::string& function) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().failures.erase(function);
}

void SetPlatformError(int code, const std::string& file, int line) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  world.error_code = code;
  world.error_file = file;
  world.error_line = line;
}

void AddShare(const Share& share) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  for (Share& known : world.shares) {
    if (known.name == share.name) {
      known = share;
      return;
    }
  }
  world.shares.push_back(share);
}

void AddShare(const std::string& name, const std::string& path) {
  Share share;
  share.name = name;
  share.path = path;
  AddShare(share);
}

void RemoveShare(const std::string& name) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  auto same = [&name](const Share& share) { return share.name == name; };
  world.shares.erase(std::remove_if(world.shares.begin(), world.shares.end(), same),
                     world.shares.end());
}

void SetPrivilege(const std::string& share, const std::string& user, int privilege) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  for (Share& known : world.shares) {
    if (known.name == share) known.privileges[user] = privilege;
  }
}

void AddUser(const User& user) {
  RemoveUser(user.name);
  WorldLock lock(TheWorld().mutex);
  TheWorld().users.push_back(user);
}

void RemoveUser(const std::string& name) {
  World& world = TheWorld();
  WorldLock lock(world.mutex);
  auto same = [&name](const User& user) { return user.name == name; };
  world.users.erase(std::remove_if(world.users.begin(), world.users.end(), same),
                    world.users.end());
}

void SetFSType(const std::string& directory, int type) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().fs_types[directory] = type;
}

void SetRemoteFSType(int type) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().remote_types.insert(type);
}

void SetImageFSType(int type) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().image_types.insert(type);
}

void AddMountPoint(const std::string& path) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().mount_points.insert(path);
}

void AddSnapshot(const std::string& directory) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().snapshots.insert(directory);
}

void AddShareRecycle(const std::string& directory) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().share_recycles.insert(directory);
}

void AddHomeRecycle(const std::string& directory, int auth) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().home_recycles[auth].insert(directory);
}

void AddHiddenDirName(const std::string& name) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().hidden_names.insert(name);
}

void SetACLPerm(const std::string& path, int bits) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().acl_bits[path] = bits;
}

void SetQuota(bool enough, int error) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().quota_enough = enough;
  TheWorld().quota_error = error;
}

void SetSpotlight(bool enabled) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().spotlight = enabled;
}

bool SpotlightEnabled() {
  WorldLock lock(TheWorld().mutex);
  return TheWorld().spotlight;
}

std::string QueuePath(const std::string& share_path) {
  WorldLock lock(TheWorld().mutex);
  const auto found = TheWorld().queue_paths.find(share_path);
  if (found != TheWorld().queue_paths.end()) return found->second;
  return test::TestRoot() + "/var/lib/quarry/queue/" + Flat(share_path);
}

std::string IndexPath(const std::string& share_path) {
  WorldLock lock(TheWorld().mutex);
  const auto found = TheWorld().index_paths.find(share_path);
  if (found != TheWorld().index_paths.end()) return found->second;
  return test::TestRoot() + "/var/lib/quarry/index/" + Flat(share_path);
}

std::string IndexID(const std::string& share_name) {
  return "fileindex_" + share_name;
}

void SetQueuePath(const std::string& share_path, const std::string& queue_path) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().queue_paths[share_path] = queue_path;
}

void SetIndexPath(const std::string& share_path, const std::string& index_path) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().index_paths[share_path] = index_path;
}

void OnExec(std::function<int(const std::vector<std::string>&)> run) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().exec = std::move(run);
}

void OnParseFile(std::function<Json::Value(const std::string&, const Json::Value&)> f) {
  WorldLock lock(TheWorld().mutex);
  TheWorld().parse_file = std::move(f);
}

std::map<std::pair<std::string, std::string>, Json::Value> MonitorQueues() {
  WorldLock lock(TheWorld().mutex);
  return TheWorld().monitor_queues;
}

}  // namespace quarry::fake
