#include "daemons/common/status_file.h"

#include <fcntl.h>
#include <sys/types.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "common/json.h"
#include "common/paths.h"
#include "common/unique_fd.h"
#include "daemons/common/log.h"
#include "daemons/common/single_instance.h"

namespace quarry::daemon {
namespace {

std::string PathOf(const std::string& name) {
  return RootedPath("/var/run/" + name + ".status");
}

}  // namespace

StatusFile::StatusFile(const std::string& name) : name_(name), path_(PathOf(name)) {
  unlink(path_.c_str());
}

StatusFile::~StatusFile() {
  unlink(path_.c_str());
}

void StatusFile::Write(const Json::Value& status) {
  Json::Value document = status;
  document["pid"] = getpid();
  std::string text = toString(document) + "\n";
  if (text == written_) return;
  if (Replace(text)) {
    written_ = std::move(text);
    failed_ = false;
    return;
  }
  if (!failed_) LogWarning("Cannot write " + path_ + ": " + std::strerror(errno));
  failed_ = true;
  written_.clear();
  unlink(path_.c_str());
}

bool StatusFile::Replace(const std::string& text) const {
  const std::string beside = path_ + ".new";
  const UniqueFd fd(
      open(beside.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, 0644));
  if (!fd.valid()) return false;
  const ssize_t done = write(fd.get(), text.data(), text.size());
  if (done == static_cast<ssize_t>(text.size()) && rename(beside.c_str(), path_.c_str()) == 0) {
    return true;
  }
  // A write that was cut short, as on a full disk, leaves no reason.
  if (done >= 0 && done < static_cast<ssize_t>(text.size())) errno = ENOSPC;
  const int reason = errno;
  unlink(beside.c_str());
  errno = reason;
  return false;
}

Json::Value ReadStatusFile(const std::string& name) {
  const pid_t pid = RunningPid(PidFilePath(name));
  if (pid == 0) return {};
  Json::Value status;
  if (fromFile(status, PathOf(name)) && status.isObject() && status["pid"] == pid) return status;
  status = Json::Value(Json::objectValue);
  status["pid"] = pid;
  return status;
}

}  // namespace quarry::daemon
