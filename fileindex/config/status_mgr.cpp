#include "fileindex/config/status_mgr.h"

#include <sys/stat.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <ctime>

#include "comm/communication.h"
#include "common/error.h"
#include "common/json.h"
#include "common/lock_file.h"
#include "common/log.h"
#include "common/paths.h"
#include "common/sdk/credentials.h"
#include "fileindex/config/state_file.h"

namespace quarry::fileindex {
namespace {

constexpr char kResumeTime[] = "resume_time";
constexpr char kShare[] = "share";
constexpr long long kNotPaused = -1;
constexpr long long kPausedWithoutEnd = 0;

const std::string kStatusLockPath = RootedPath("/tmp/quarry_cfg_fi_status.lock");

// In 32 bits, as whoever reads the file expects it; unsigned, so that wrapping round is defined.
long long PauseEnd(int hours) {
  if (hours == 0) return kPausedWithoutEnd;
  const std::uint32_t now = static_cast<std::uint32_t>(time(nullptr));
  const std::uint32_t end = now + static_cast<std::uint32_t>(hours) * 3600U;
  return static_cast<std::int32_t>(end);
}

}  // namespace

const std::string kFileIndexStatusCfgPath = RootedPath("/var/packages/Quarry/etc/fileindex.status");

StatusMgr::StatusMgr() {
  if (IsAnythingAt(kFileIndexStatusCfgPath) && !fromFile(data_, kFileIndexStatusCfgPath)) {
    Fail(QUARRY_SITE_AT("status_mgr", 20),
         "IsFileExist(kFileIndexStatusCfgPath) && !data_.fromFile(kFileIndexStatusCfgPath)",
         kErrorLoadFile, "Cannot load json: " + kFileIndexStatusCfgPath);
  }
  if (!isObject(data_)) {
    Fail(QUARRY_SITE("status_mgr"), "!data_.isObject()", kErrorBadParameter,
         "Not an object" + AppendData(data_));
  }
}

void StatusMgr::Save() const {
  const sdk::SDKCredentials credentials("root");
  if (!toFile(data_, kFileIndexStatusCfgPath)) {
    Fail(QUARRY_SITE_AT("status_mgr", 121), "!data_.toFile(kFileIndexStatusCfgPath)",
         kErrorSaveFile, "Failed to save json: " + kFileIndexStatusCfgPath);
  }
  if (-1 == chmod(kFileIndexStatusCfgPath.c_str(), 0644)) {
    Fail(QUARRY_SITE_AT("status_mgr", 123), "-1 == chmod(kFileIndexStatusCfgPath, 0644)",
         kErrorSystem, std::string("chmod failed, reason=") + strerror(errno));
  }
}

long long StatusMgr::GetPauseInfo() const {
  long long pause_end = kNotPaused;
  GetJsonValue(pause_end, data_, kResumeTime, false);
  return pause_end;
}

void StatusMgr::Pause(int hours) {
  const LockFile lock(kStatusLockPath, true);
  if (hours < 0) throw Error(kErrorBadParameter, "Pause length should NOT be negative");
  const long long pause_end = PauseEnd(hours);
  SetResumeTime(pause_end);
  Json::Value command;
  command[kResumeTime] = static_cast<Json::Int64>(pause_end);
  SendCommandToDaemon("pause", command);
}

void StatusMgr::Resume() {
  const LockFile lock(kStatusLockPath, true);
  SetResumeTime(kNotPaused);
  SendCommandToDaemon("resume", Json::Value());
}

int StatusMgr::GetShareStatus(const std::string& share) const {
  int bits = 0;
  GetJsonValue(bits, Shares(), share, false);
  return bits;
}

void StatusMgr::SetShareStatus(const std::string& share, int bits) {
  const LockFile lock(kStatusLockPath, true);
  StoreBits(share, StoredBits(share) | static_cast<unsigned int>(bits));
}

void StatusMgr::UnsetShareStatus(const std::string& share, int bits) {
  const LockFile lock(kStatusLockPath, true);
  StoreBits(share, StoredBits(share) & ~static_cast<unsigned int>(bits));
}

void StatusMgr::ClearShareStatus(const std::string& share) {
  const LockFile lock(kStatusLockPath, true);
  Json::Value& shares = data_[kShare];
  if (!isObject(shares)) throw Error(kErrorBadParameter, "Not an object" + AppendData(shares));
  shares.removeMember(share);
  Save();
}

void StatusMgr::SetResumeTime(long long resume_time) {
  data_[kResumeTime] = static_cast<Json::Int64>(resume_time);
  Save();
}

const Json::Value& StatusMgr::Shares() const {
  // A constant document is not changed by being asked.
  const Json::Value& data = data_;
  return data[kShare];
}

// Bits are stored as a signed integer, so the highest one makes the number negative, which is no
// unsigned integer to the JSON library.
unsigned int StatusMgr::StoredBits(const std::string& share) const {
  unsigned int bits = static_cast<unsigned int>(GetShareStatus(share));
  GetJsonValue(bits, Shares(), share, false);
  return bits;
}

void StatusMgr::StoreBits(const std::string& share, unsigned int bits) {
  data_[kShare][share] = static_cast<int>(bits);
  Save();
}

}  // namespace quarry::fileindex
