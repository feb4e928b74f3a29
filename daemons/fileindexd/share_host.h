// What a worker needs to know about its share, and from the rest of the system.

#ifndef QUARRY_DAEMONS_FILEINDEXD_SHARE_HOST_H_
#define QUARRY_DAEMONS_FILEINDEXD_SHARE_HOST_H_

#include <functional>
#include <memory>
#include <string>

#include "daemons/fileindexd/folder_rules.h"

namespace quarry::fileindexd {

struct ShareLayout {
  std::string root;        // the share's full path
  std::string queue_path;  // its event queue
  std::shared_ptr<const FolderRules> rules;
};

// Every member may throw Error, and may be called from the worker's thread only.
class ShareHost {
 public:
  virtual ~ShareHost() = default;

  // Asks the platform and the folder list anew.
  virtual ShareLayout Load() = 0;

  // Whether the share is marked as needing a reindex, without its index having to be rebuilt; and
  // setting that mark and taking it away.
  virtual bool NeedsReindex() = 0;
  virtual void MarkNeedsReindex() = 0;
  virtual void ClearNeedsReindex() = 0;

  // Whether the place is a recycle bin or lies in one.
  virtual bool IsInRecycleBin(const std::string& path) = 0;

  // Calls `create` if folders of the share are indexed, with the folder list kept from changing
  // meanwhile: an index that is being deleted for good must not come back. Returns whether it did.
  virtual bool CreateIndexIfWanted(const std::function<void()>& create) = 0;
};

// The share of this name on the running system.
std::unique_ptr<ShareHost> MakeShareHost(const std::string& share);

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_SHARE_HOST_H_
