#include "daemons/tarncontentextractd/bad_files.h"

#include <iterator>

namespace quarry::extract {

void BadFiles::Erase(Entries::iterator entry) {
  bytes_ -= entry->path.size();
  by_path_.erase(entry->path);
  entries_.erase(entry);
}

void BadFiles::Add(const std::string& path, const std::string& stamp) {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto known = by_path_.find(path);
  if (known != by_path_.end()) Erase(known->second);
  entries_.push_front(Entry{path, stamp});
  by_path_[path] = entries_.begin();
  bytes_ += path.size();
  while (entries_.size() > max_files_ || bytes_ > max_bytes_) Erase(std::prev(entries_.end()));
}

bool BadFiles::Contains(const std::string& path, const std::string& stamp) {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto known = by_path_.find(path);
  if (known == by_path_.end()) return false;
  if (known->second->stamp != stamp) {
    Erase(known->second);
    return false;
  }
  entries_.splice(entries_.begin(), entries_, known->second);
  return true;
}

std::size_t BadFiles::size() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return entries_.size();
}

}  // namespace quarry::extract
