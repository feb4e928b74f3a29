#include "tests/support/temp_dir.h"

#include <cstdlib>
#include <filesystem>
#include <stdexcept>
#include <system_error>

namespace fs = std::filesystem;

namespace quarry::test {
namespace {

// Directories that their owner may not list or change cannot be emptied.
void MakeWritable(const std::string& path) {
  std::error_code ignored;
  fs::permissions(path, fs::perms::owner_all, fs::perm_options::add, ignored);
  fs::recursive_directory_iterator entry(path, ignored);
  for (const fs::recursive_directory_iterator end; !ignored && entry != end;
       entry.increment(ignored)) {
    if (!entry->is_directory(ignored) || entry->is_symlink(ignored)) continue;
    fs::permissions(entry->path(), fs::perms::owner_all, fs::perm_options::add, ignored);
  }
}

}  // namespace

void RemoveTree(const std::string& path) {
  std::error_code error;
  fs::remove_all(path, error);
  if (!error) return;
  MakeWritable(path);
  fs::remove_all(path, error);
}

TempDir::TempDir() {
  std::string pattern = (fs::canonical(fs::temp_directory_path()) / "quarry-temp-XXXXXX").string();
  if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no temporary directory");
  path_ = pattern;
}

TempDir::~TempDir() {
  RemoveTree(path_);
}

}  // namespace quarry::test
