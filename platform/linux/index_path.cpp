#include "platform/include/index_path.h"

#include <cerrno>
#include <cstring>
#include <string>

#include "common/paths.h"
#include "platform/linux/last_error.h"
#include "platform/linux/path_name.h"

namespace quarry::platform {
namespace {

const std::string& QueueDirectory() {
  static const std::string directory = RootedPath("/var/lib/quarry/queue/");
  return directory;
}

const std::string& IndexDirectory() {
  static const std::string directory = RootedPath("/var/lib/quarry/index/");
  return directory;
}

constexpr char kIndexPrefix[] = "fileindex_";

int Write(const std::string& text, char* buffer, size_t size) {
  if (buffer == nullptr || text.size() >= size) {
    errno = ENAMETOOLONG;
    return QUARRY_PLATFORM_FAIL(kErrNameTooLong);
  }
  std::memcpy(buffer, text.c_str(), text.size() + 1);
  return 0;
}

int Compose(const std::string& directory, const char* share_path, char* buffer, size_t size) {
  if (share_path == nullptr || !IsPlainAbsolutePath(share_path)) {
    errno = EINVAL;
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  return Write(directory + NameForPath(share_path), buffer, size);
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int FILEIDXQueuePathCompose(const char* share_path, char* buffer, size_t size) {
  return Compose(QueueDirectory(), share_path, buffer, size);
}

int FILEIDXDBPathCompose(const char* share_path, char* buffer, size_t size) {
  return Compose(IndexDirectory(), share_path, buffer, size);
}

int FILEIDXGetIndexID(const char* share_name, char* buffer, size_t size) {
  if (share_name == nullptr || *share_name == '\0' || std::strchr(share_name, '/') != nullptr) {
    errno = EINVAL;
    return QUARRY_PLATFORM_FAIL(kErrBadParameter);
  }
  return Write(std::string(kIndexPrefix) + share_name, buffer, size);
}

}  // extern "C"
