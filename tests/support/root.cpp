#include "tests/support/root.h"

#include <cstdlib>
#include <filesystem>
#include <stdexcept>

#include "tests/support/files.h"
#include "tests/support/temp_dir.h"

namespace quarry::test {

std::string TestRoot() {
  const char* root = std::getenv("QUARRY_ROOT");
  if (root == nullptr || *root == '\0') throw std::runtime_error("the test has no root");
  return root;
}

void ResetTestRoot() {
  const std::string root = TestRoot();
  for (const auto& entry : std::filesystem::directory_iterator(root)) RemoveTree(entry.path());
  for (const char* name : {"etc/quarry", "tmp", "var/run", "var/packages/Quarry/etc",
                           "var/lib/quarry/queue", "var/lib/quarry/index"}) {
    MakeDirs(root + "/" + name);
  }
}

}  // namespace quarry::test
