#include "platform/linux/path_name.h"

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <memory>

namespace quarry::platform {
namespace {

constexpr std::size_t kMaxNameBytes = 240;
constexpr std::size_t kHashTextBytes = 33;  // "~" and 32 digits

// FNV-1a over 64 bits from two starting points.
std::uint64_t Hash(const std::string& text, std::uint64_t hash) {
  for (const char c : text) {
    hash ^= static_cast<unsigned char>(c);
    hash *= 0x100000001b3ULL;
  }
  return hash;
}

std::string HashText(const std::string& text) {
  const std::uint64_t first = Hash(text, 0xcbf29ce484222325ULL);
  const std::uint64_t second = Hash(text + std::to_string(text.size()), ~first);
  char digits[kHashTextBytes + 1];
  std::snprintf(digits, sizeof(digits), "~%016llx%016llx", static_cast<unsigned long long>(first),
                static_cast<unsigned long long>(second));
  return digits;
}

bool NeedsEscape(char c, bool first) {
  const auto byte = static_cast<unsigned char>(c);
  if (byte <= 0x20 || byte == 0x7f) return true;
  if (first && c == '.') return true;  // neither hidden nor "." nor ".."
  return c == '%' || c == '+' || c == '~';
}

}  // namespace

bool IsPlainAbsolutePath(const std::string& path) {
  if (path.size() < 2 || path.front() != '/' || path.back() == '/') return false;
  for (std::size_t begin = 1; begin <= path.size();) {
    std::size_t end = path.find('/', begin);
    if (end == std::string::npos) end = path.size();
    const std::string part = path.substr(begin, end - begin);
    if (part.empty() || part == "." || part == "..") return false;
    begin = end + 1;
  }
  return true;
}

bool IsSameOrBelow(const std::string& path, const std::string& directory) {
  if (directory == "/") return !path.empty() && path.front() == '/';
  return path.compare(0, directory.size(), directory) == 0 &&
         (path.size() == directory.size() || path[directory.size()] == '/');
}

std::string ResolvedPath(const std::string& path) {
  const std::unique_ptr<char, decltype(&std::free)> resolved(realpath(path.c_str(), nullptr),
                                                             &std::free);
  return resolved == nullptr ? std::string() : std::string(resolved.get());
}

std::string NameForPath(const std::string& path) {
  std::string name;
  for (std::size_t i = 1; i < path.size(); ++i) {
    if (path[i] == '/') {
      name += '+';
    } else if (NeedsEscape(path[i], i == 1)) {
      char hex[4];
      std::snprintf(hex, sizeof(hex), "%%%02X", static_cast<unsigned char>(path[i]));
      name += hex;
    } else {
      name += path[i];
    }
  }
  if (name.size() <= kMaxNameBytes) return name;
  return name.substr(0, kMaxNameBytes - kHashTextBytes) + HashText(path);
}

}  // namespace quarry::platform
