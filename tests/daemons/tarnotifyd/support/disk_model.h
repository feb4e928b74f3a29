// What somebody knows of a directory tree who is told of changes and looks only where they lead.

#ifndef QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_DISK_MODEL_H_
#define QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_DISK_MODEL_H_

#include <map>
#include <set>
#include <string>
#include <vector>

#include "daemons/tarnotifyd/change_source.h"

namespace quarry::test {

// Paths, each with what tells a regular file from what it was before it was written to or its
// attributes were changed.
using StampedTree = std::map<std::string, std::string>;

// Everything at and below `top` but what has one of the names `ignored`, or is below one.
StampedTree StampTree(const std::string& top, const std::set<std::string>& ignored = {});
std::set<std::string> ListTree(const std::string& top, const std::set<std::string>& ignored = {});

class DiskModel : public notify::ChangeSink {
 public:
  DiskModel(const std::string& top, const std::set<std::string>& ignored)
      : top_(top), ignored_(ignored) {}

  // A directory that appears is looked through whole; of a rename both places are. What lies
  // elsewhere than at or below `top` is not looked at.
  void OnChange(const notify::Change& change) override;
  void OnDoubt(const std::string& directory) override;

  std::set<std::string> Paths() const;
  const StampedTree& Stamps() const { return paths_; }
  // What it was told, in words.
  const std::vector<std::string>& Told() const { return told_; }
  void ForgetTold() { told_.clear(); }
  int Doubts() const { return doubts_; }

 private:
  bool IsWithin(const std::string& path) const;
  void LookAt(const std::string& path, bool and_below);
  void Restamp(const std::string& path);

  const std::string top_;
  const std::set<std::string> ignored_;
  StampedTree paths_;
  std::vector<std::string> told_;
  int doubts_ = 0;
};

// "create dir /p", "rename file /old -> /new".
std::string InWords(const notify::Change& change);

// Reads until the source has nothing to tell for a moment, 20 seconds at most.
void ReadAll(notify::ChangeSource& source, notify::ChangeSink& sink);

}  // namespace quarry::test

#endif  // QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_DISK_MODEL_H_
