// Pausing, resuming and dropping what is indexed. Every function looks first whether there is
// anything to do it to, and throws Problem with nothing changed when there is not; it throws Error
// as the library's operation of the same name. All take the folder lock.

#ifndef QUARRY_CLI_INDEXING_H_
#define QUARRY_CLI_INDEXING_H_

#include <set>
#include <string>
#include <vector>

namespace quarry::cli {

void PauseShare(const std::string& name);
void ResumeShare(const std::string& name);

// Drops a paused share. `path` is where it lived; "" for a share that is still known.
void ClearShare(const std::string& name, const std::string& path);

// Each returns the shares that it was done to.
std::set<std::string> PauseVolume(const std::string& mount_point);
std::set<std::string> ResumeVolume(const std::string& mount_point);
// Drops the shares with folders that PauseVolume has paused for this volume, their indexes and
// queues included.
std::set<std::string> ClearVolume(const std::string& mount_point);

// Has each place looked at anew.
void ReindexFolders(const std::vector<std::string>& paths);

// The sentence with which somebody is told that nothing of the share is indexed, as a Problem.
void RequireIndexed(const std::string& name);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_INDEXING_H_
