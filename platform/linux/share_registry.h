// The shares of this machine: RootedPath("/etc/quarry/shares.json").
//
//   {"shares": [{"name": "photo", "path": "/volume1/photo", "encrypted": false, "encryption":
//   false,
//                "read_only": false, "hide_unreadable": false, "recycle_bin": false}, ...]}
//
// The flags may be left out, and so may "moved_from", a path. A share's directory ends in its name.
// Any process may read the file at any time: it is only ever replaced whole. A missing file is a
// machine without shares.

#ifndef QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_
#define QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_

#include <functional>
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
  // Where the share lived, as long as a move to `path` is not ended; else "".
  std::string moved_from;
};

// All shares, in the order of the file. Throws quarry::Error 504 when the file cannot be read, is
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

// Gives the share another full path and, as its last component, another name. The place it had is
// kept as "moved_from" until EndShareMove(). `prepare` is called right before the file is replaced,
// when nothing can be refused any more. Throws as AddShare, and what `prepare` throws, with the
// file as it was; also Error 120 when there is no such share or a former move of it is not ended.
QUARRY_EXPORT void ReplaceSharePath(const std::string& name, const std::string& new_path,
                                    const std::function<void()>& prepare);

// Forgets where the share was moved from; without effect for a share that was not moved. Throws as
// RemoveShare.
QUARRY_EXPORT void EndShareMove(const std::string& name);

// Throws quarry::Error 120 with a sentence for people when the record cannot be a share on any
// machine: the name is empty, "." or "..", longer than 255 bytes, or has a "/" or a control
// character; the path is not absolute, not in its shortest form, "/", does not end in the name, or
// is longer than 3000 bytes. Asks nothing of the file system.
QUARRY_EXPORT void ValidateShare(const ShareRecord& share);

// The place of the file, for messages.
QUARRY_EXPORT const std::string& ShareFilePath();

}  // namespace quarry::platform

#endif  // QUARRY_PLATFORM_LINUX_SHARE_REGISTRY_H_
