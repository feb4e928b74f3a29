#include "common/paths.h"

#include <cstdlib>

namespace quarry {

const std::string& Root() {
  static const std::string root = [] {
    const char* value = secure_getenv("QUARRY_ROOT");
    std::string text = value == nullptr ? "" : value;
    while (!text.empty() && text.back() == '/') text.pop_back();
    return text;
  }();
  return root;
}

std::string RootedPath(const std::string& fixed_path) {
  return Root() + fixed_path;
}

}  // namespace quarry
