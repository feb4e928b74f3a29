#include "daemons/tarnotifyd/registrations.h"

#include <sys/inotify.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <utility>

#include "daemons/common/log.h"

namespace quarry::notify {
namespace {

using platform::MonitorRegistration;
using platform::WatchedPlace;

constexpr std::uint32_t kDirectoryChanges = IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM |
                                            IN_CREATE | IN_DELETE | IN_DELETE_SELF | IN_MOVE_SELF |
                                            IN_ONLYDIR;

// "" when there is nothing of that name. Files are replaced whole, so a new text has a new inode;
// the times are for those that somebody edits by hand.
std::string VersionOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  const auto time = [](const timespec& t) {
    return std::to_string(t.tv_sec) + "." + std::to_string(t.tv_nsec);
  };
  return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino) + ":" +
         std::to_string(status.st_size) + ":" + time(status.st_mtim) + ":" + time(status.st_ctim);
}

// Which directory it is, whatever is in it.
std::string IdentityOf(const std::string& path) {
  struct stat status {};
  if (stat(path.c_str(), &status) != 0) return {};
  return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
}

void Drain(int fd) {
  char buffer[4096];
  while (fd >= 0 && read(fd, buffer, sizeof(buffer)) > 0) {
  }
}

// Brings a path into its shortest form, in which paths are compared. False for what is no absolute
// path, or the root of everything.
bool Shorten(std::string* path) {
  *path = std::filesystem::path(*path + "/.").lexically_normal().parent_path();
  return path->size() > 1 && path->front() == '/' && path->find('\0') == std::string::npos;
}

bool ShortenAll(MonitorRegistration* registration) {
  return Shorten(&registration->queue) &&
         std::all_of(registration->places.begin(), registration->places.end(),
                     [](WatchedPlace& place) { return Shorten(&place.path); });
}

// Whether an error of reading is about the file, not about the state of the system.
bool IsLasting(int error) {
  return error == EINVAL || error == EFBIG || error == ENOENT;
}

void PassOver(const std::string& file, const std::string& reason) {
  daemon::LogError("Passing over " + file + ", which " + reason);
}

std::optional<MonitorRegistration> Parse(const std::string& file, const Json::Value& document) {
  MonitorRegistration registration;
  platform::ParseRegistration(document, &registration);
  if (ShortenAll(&registration)) return registration;
  PassOver(file, "names a place that is no absolute path");
  return std::nullopt;
}

}  // namespace

// The directory may be another one after a restore. It is made here as the first registration would
// make it: that one is then followed as soon as it is there, and not when somebody looks next.
void Registrations::Watch() {
  const std::string& directory = platform::MonitorDirectory();
  mkdir(directory.c_str(), 0750);
  const std::string now = IdentityOf(directory);
  if (watch_.valid() && now == watched_) return;
  watch_.Reset();
  if (now.empty()) return;
  watch_.Reset(inotify_init1(IN_NONBLOCK | IN_CLOEXEC));
  if (!watch_.valid()) return;
  if (inotify_add_watch(watch_.get(), directory.c_str(), kDirectoryChanges) < 0) watch_.Reset();
  watched_ = now;
}

bool Registrations::Refresh() {
  Watch();
  Drain(watch_.get());
  std::vector<std::string> names;
  if (!platform::ListRegistrationFiles(&names)) {
    if (!list_failed_) {
      daemon::LogError("Cannot list the registrations: " + std::string(std::strerror(errno)));
    }
    list_failed_ = true;
    return false;
  }
  list_failed_ = false;
  std::map<std::string, File> now;
  bool changed = names.size() != files_.size();
  for (const std::string& name : names) {
    const auto known = files_.find(name);
    std::string version = VersionOf(name);
    if (known != files_.end() && known->second.version == version) {
      now.emplace(name, std::move(known->second));
      continue;
    }
    changed = true;
    File file = known != files_.end() ? std::move(known->second) : File();
    Load(name, std::move(version), &file);
    now.emplace(name, std::move(file));
  }
  files_ = std::move(now);
  if (!changed) return false;
  const QueuePlaces before = std::move(queues_);
  Collect();
  return queues_ != before;
}

bool Registrations::IsStillThere(const std::string& queue) const {
  return std::any_of(files_.begin(), files_.end(), [&](const auto& entry) {
    const auto& registration = entry.second.registration;
    return registration && registration->queue == queue && !VersionOf(entry.first).empty();
  });
}

// One that cannot be read for want of descriptors, for instance, holds as it was, and is read
// again.
void Registrations::Load(const std::string& name, std::string version, File* file) {
  Json::Value document;
  if (platform::ReadRegistrationFile(name, &document)) {
    *file = {std::move(version), Parse(name, document), false};
    return;
  }
  const int error = errno;
  if (error != ENOENT && !file->failed) {
    PassOver(name, std::string("cannot be read as a registration: ") + std::strerror(error));
  }
  if (IsLasting(error)) {
    *file = {std::move(version), std::nullopt, false};
  } else {
    file->version.clear();
    file->failed = true;
  }
}

void Registrations::Collect() {
  queues_.clear();
  for (const auto& [name, file] : files_) {
    if (!file.registration) continue;
    std::vector<WatchedPlace>& places = queues_[file.registration->queue];
    places.insert(places.end(), file.registration->places.begin(), file.registration->places.end());
  }
}

}  // namespace quarry::notify
