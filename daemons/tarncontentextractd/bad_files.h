// Files that no worker survives.

#ifndef QUARRY_DAEMONS_TARNCONTENTEXTRACTD_BAD_FILES_H_
#define QUARRY_DAEMONS_TARNCONTENTEXTRACTD_BAD_FILES_H_

#include <cstddef>
#include <list>
#include <mutex>
#include <string>
#include <unordered_map>

namespace quarry::extract {

// Remembers the last `max_files` of them, and no more of their paths than `max_bytes`. Any thread.
class BadFiles {
 public:
  BadFiles(std::size_t max_files, std::size_t max_bytes)
      : max_files_(max_files), max_bytes_(max_bytes) {}

  // Remembers the file as it is now: one that has changed since is another.
  void Add(const std::string& path, const std::string& stamp);
  // Whether the file, as it is now, is remembered; that counts as a use, the least used are
  // forgotten first.
  bool Contains(const std::string& path, const std::string& stamp);
  std::size_t size() const;

 private:
  struct Entry {
    std::string path;
    std::string stamp;
  };
  using Entries = std::list<Entry>;

  void Erase(Entries::iterator entry);

  const std::size_t max_files_;
  const std::size_t max_bytes_;
  mutable std::mutex mutex_;
  Entries entries_;  // the last used first
  std::unordered_map<std::string, Entries::iterator> by_path_;
  std::size_t bytes_ = 0;
};

}  // namespace quarry::extract

#endif  // QUARRY_DAEMONS_TARNCONTENTEXTRACTD_BAD_FILES_H_
