// The disk as a worker sees it: where the truth is.

#ifndef QUARRY_DAEMONS_FILEINDEXD_FILE_SYSTEM_H_
#define QUARRY_DAEMONS_FILEINDEXD_FILE_SYSTEM_H_

#include <string>
#include <vector>

namespace quarry::fileindexd {

enum class PlaceKind {
  kAbsent,     // nothing there, or only behind something that is no directory
  kUnknown,    // it cannot be told: no permission, a failing disk
  kFile,       // a regular file
  kDirectory,  // a directory
  kForeign,    // the root of another file system
  kOther,      // a symbolic link, a device, a socket, a pipe
};

struct Place {
  PlaceKind kind = PlaceKind::kAbsent;
  // What a document made of the place now would remember; for files and directories only. Files
  // alone have the second one.
  std::string attribute_stamp;
  std::string content_stamp;
};

// Tells whether the directory at a path is still the one that was there before.
struct Identity {
  bool exists = false;
  unsigned long long device = 0;
  unsigned long long inode = 0;
  bool mount_root = false;  // something is mounted exactly there

  bool operator==(const Identity&) const = default;
};

// Paths are absolute, without "." and "..". No member throws; any may be called from any thread.
class FileSystem {
 public:
  virtual ~FileSystem() = default;

  // What is at `path`, which is `base` or lies below it. Symbolic links and other file systems are
  // not entered on the way from `base`; what `base` itself is does not matter.
  virtual Place Look(const std::string& base, const std::string& path) = 0;

  // The same for an entry of a directory that is known to be one, faster.
  virtual Place Peek(const std::string& path) = 0;

  // The names in the directory, in no particular order, without "." and "..". kDirectory when
  // `names` holds all of them, else why it does not.
  virtual PlaceKind List(const std::string& dir, std::vector<std::string>& names) = 0;

  virtual Identity Identify(const std::string& dir) = 0;
};

// The running machine's. A place on another file system that is a share's own root is not foreign.
class PosixFileSystem : public FileSystem {
 public:
  Place Look(const std::string& base, const std::string& path) override;
  Place Peek(const std::string& path) override;
  PlaceKind List(const std::string& dir, std::vector<std::string>& names) override;
  Identity Identify(const std::string& dir) override;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_FILE_SYSTEM_H_
