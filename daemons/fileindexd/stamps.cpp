#include "daemons/fileindexd/stamps.h"

#include <cstddef>

namespace quarry::fileindexd {
namespace {

// The stamp without its device; empty when it is no stamp.
std::string WithoutDevice(const std::string& stamp) {
  const std::size_t colon = stamp.find(':');
  return colon == std::string::npos ? std::string() : stamp.substr(colon + 1);
}

std::string InodeOf(const std::string& stamp) {
  const std::string rest = WithoutDevice(stamp);
  return rest.substr(0, rest.find(':'));
}

}  // namespace

bool SameAttributes(const std::string& a, const std::string& b) {
  const std::string state = WithoutDevice(a);
  return !state.empty() && state == WithoutDevice(b);
}

bool SameInode(const std::string& a, const std::string& b) {
  const std::string inode = InodeOf(a);
  return !inode.empty() && inode == InodeOf(b);
}

}  // namespace quarry::fileindexd
