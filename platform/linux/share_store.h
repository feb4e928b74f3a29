// The share file as the platform's own functions read it.

#ifndef QUARRY_PLATFORM_LINUX_SHARE_STORE_H_
#define QUARRY_PLATFORM_LINUX_SHARE_STORE_H_

#include <memory>
#include <string>
#include <vector>

#include "platform/linux/share_registry.h"

namespace quarry::platform {

using ShareList = std::shared_ptr<const std::vector<ShareRecord>>;

// All shares, as ReadShares(). What has been read is kept until the file is another one, so that
// asking costs one look at it. Any thread.
ShareList LoadShares();

// The same without exceptions: null, with the platform's last error set, when the file is bad.
ShareList TryLoadShares();

// Whether the platform may say that there is this share: it is not on its way to another place, or
// this process wants to know those, too.
bool IsShown(const ShareRecord& share);

// The deepest share that holds the absolute path, or null.
const ShareRecord* ShareHolding(const std::vector<ShareRecord>& shares, const std::string& path);

// The shares in the text of a share file. Throws quarry::Error 504.
std::vector<ShareRecord> ParseShares(const std::string& text);

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SHARE_STORE_H_
