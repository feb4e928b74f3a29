// The search support of the file-sharing service.
//
// The setting is a file of two lines that Samba can read. An administrator who wants Macs to search
// through Samba adds one line to the [global] section of /etc/samba/smb.conf:
//
//   include = /etc/quarry/samba-spotlight.conf
//
// Without that line the setting is kept and has no effect. Samba's own configuration is not
// touched.

#include <cerrno>
#include <string>

#include "common/paths.h"
#include "platform/include/service.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/last_error.h"

namespace quarry::platform {
namespace {

constexpr char kHeader[] = "# Kept by Quarry. Include it from [global] in smb.conf.\n";
constexpr char kOn[] = "spotlight = yes\n";
constexpr char kOff[] = "spotlight = no\n";
constexpr std::size_t kMaxBytes = 65536;

const std::string& SettingPath() {
  static const std::string path = RootedPath("/etc/quarry/samba-spotlight.conf");
  return path;
}

}  // namespace

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int TARNSMBIsEnableSpotlight() {
  const int before = errno;
  std::string text;
  if (!ReadWholeFile(SettingPath(), kMaxBytes, &text)) {
    if (errno != ENOENT) return QUARRY_PLATFORM_FAIL(kErrSystem);
    errno = before;
    return 0;
  }
  return ("\n" + text).find(std::string("\n") + kOn) != std::string::npos ? 1 : 0;
}

int TARNSMBSetSpotlight(int enable) {
  const std::string text = std::string(kHeader) + (enable != 0 ? kOn : kOff);
  if (!MakeDirectories(ParentDirectory(SettingPath()), 0755) ||
      !WriteFileDurably(SettingPath(), text)) {
    return QUARRY_PLATFORM_FAIL(kErrSystem);
  }
  return 0;
}

}  // extern "C"
