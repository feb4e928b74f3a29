// What is going on with indexing as a whole and with each share, and the file that keeps it.

#ifndef QUARRY_FILEINDEX_CONFIG_STATUS_MGR_H_
#define QUARRY_FILEINDEX_CONFIG_STATUS_MGR_H_

#include <json/json.h>

#include <string>

#include "common/export.h"

namespace quarry {
namespace fileindex {

// The status file: one JSON object, mode 0644. "resume_time" is the end of the pause, "share" an
// object with one bit set for each share that has any.
QUARRY_EXPORT extern const std::string kFileIndexStatusCfgPath;

// Bits of a share's status.
inline constexpr int kShareNeedReindex = 1;  // its documents are doubtful
inline constexpr int kShareNeedRebuild = 2;  // its index must be deleted and created anew

// A short-lived value: constructing one loads the file, each changing member saves it. A change is
// made to what this object loaded, so hold one for one operation only. Changing members hold the
// lock file "/tmp/quarry_cfg_fi_status.lock" to their end, which may block for up to a minute.
// One object is for one thread at a time.
//
// Members throw Error 120 where a member that is asked for exists but its parent is no object.
class QUARRY_EXPORT StatusMgr {
 public:
  // Loads the file; none at all means not paused and no bits. Throws Error 504 when there is
  // something that cannot be read as JSON or is no regular file, Error 120 when it is no object.
  StatusMgr();

  // Replaces the file, whole and durably, as the user root. Takes no lock. Throws Error 505 when it
  // cannot be written, 502 when its mode cannot be set, 503 when root cannot be become.
  void Save() const;

  // The end of the pause in seconds since the epoch; 0: paused with no end, -1: not paused. A pause
  // whose end has passed is still reported: the caller compares it with the time.
  long long GetPauseInfo() const;

  // Pauses indexing for so many hours from now, without end for 0, saves, and tells the index
  // daemon. The end is kept in 32 bits, so enormous lengths wrap round. Throws Error 120 when
  // `hours` is negative, 506 when the lock cannot be had, what Save() throws, and 502 when the
  // daemon cannot be told, with the new state saved.
  void Pause(int hours);
  // Ends the pause, saves, and tells the index daemon. Throws as Pause() does.
  void Resume();

  // The share's bits, 0 when it has none.
  int GetShareStatus(const std::string& share) const;
  // Each changes the share's bits and saves: adds `bits`, takes `bits` away, forgets the share.
  // Throw Error 506 when the lock cannot be had, and what Save() throws.
  void SetShareStatus(const std::string& share, int bits);
  void UnsetShareStatus(const std::string& share, int bits);
  void ClearShareStatus(const std::string& share);

 private:
  void SetResumeTime(long long resume_time);
  const Json::Value& Shares() const;
  unsigned int StoredBits(const std::string& share) const;
  void StoreBits(const std::string& share, unsigned int bits);

  Json::Value data_;
};

}  // namespace fileindex
}  // namespace quarry

#endif  // QUARRY_FILEINDEX_CONFIG_STATUS_MGR_H_
