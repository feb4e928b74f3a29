// A directory for one test, removed with all that is in it.

#ifndef QUARRY_TESTS_SUPPORT_TEMP_DIR_H_
#define QUARRY_TESTS_SUPPORT_TEMP_DIR_H_

#include <string>

namespace quarry::test {

// Removes a directory and all below it, whatever its permissions. Nothing happens without one.
void RemoveTree(const std::string& path);

class TempDir {
 public:
  // Throws std::runtime_error when no directory can be made.
  TempDir();
  ~TempDir();
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;

  // Absolute and without links.
  const std::string& path() const { return path_; }
  // path() + "/" + `name`.
  std::string operator/(const std::string& name) const { return path_ + "/" + name; }

 private:
  std::string path_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_SUPPORT_TEMP_DIR_H_
