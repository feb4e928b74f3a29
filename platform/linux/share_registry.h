// The shares of this machine: RootedPath("/etc/quarry/shares.json").
//
//   {"shares": [{"name": "photo", "path": "/volume1/photo", "encrypted": false, "encryption":
//   false,
//                "read_only": false, "hide_unreadable": false, "recycle_bin": false}, ...]}
//
// The flags may be left out. A share's directory ends in its name. Any process may read the file at
// any time: it is only ever replaced whole. A missing file is a machine without shares.

#ifndef QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_
#define QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_

#include <string>
#include <vector>

#include "common/export.h"

namespace quarry::platform {

struct ShareRecord {
  std::string name;
  std::string path;         // absolute, without links, ".", ".." or a "/" at its end
  bool encrypted = false;   // the files are encrypted at present
  bool encryption = false;  // the share can be encrypted, locked or not
  bool read_only = false;
  bool hide_unreadable = false;  // files that a user cannot read are hidden from that user
  bool recycle_bin = false;
};

// All shares, in the order of the file. Throws quarry::Error 502 when the file cannot be read, is
// no such document, or holds a share that ValidateShare refuses.
QUARRY_EXPORT std::vector<ShareRecord> ReadShares();

// Adds a share, or changes the flags of the one with the same name and path, and makes the
// directories in which its queue and its index will be kept. The path must be an existing
// directory. Throws quarry::Error 120 with a sentence for people when ValidateShare refuses it,
// another share has its name, or its path is that of, above or below another share; 502 when the
// file cannot be read or replaced; 506 when another process keeps the file locked.
QUARRY_EXPORT void AddShare(const ShareRecord& share);

// Removes a share; its files are left alone. Returns whether there was one. Throws as AddShare.
QUARRY_EXPORT bool RemoveShare(const std::string& name);

// Throws quarry::Error 120 with a sentence for people when the record cannot be a share on any
// machine: the name is empty, "." or "..", longer than 255 bytes, or has a "/" or a control
// character; the path is not absolute, not in its shortest form, "/", does not end in the name, or
// is longer than 3000 bytes. Asks nothing of the file system.
QUARRY_EXPORT void ValidateShare(const ShareRecord& share);

// The place of the file, for messages.
QUARRY_EXPORT const std::string& ShareFilePath();

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_
