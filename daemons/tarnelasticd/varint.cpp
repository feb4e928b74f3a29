#include "daemons/tarnelasticd/varint.h"

#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::engine {
namespace {

[[noreturn]] void FailDamaged() {
  throw Error(kDamagedIndex, "A stored document is damaged");
}

}  // namespace

void AppendNumber(std::string* out, std::uint64_t number) {
  for (; number >= 0x80; number >>= 7) out->push_back(static_cast<char>(0x80 | (number & 0x7f)));
  out->push_back(static_cast<char>(number));
}

std::uint64_t TakeNumber(std::string_view* bytes) {
  std::uint64_t number = 0;
  for (unsigned shift = 0; shift < 63; shift += 7) {
    if (bytes->empty()) FailDamaged();
    const auto byte = static_cast<unsigned char>(bytes->front());
    bytes->remove_prefix(1);
    number |= static_cast<std::uint64_t>(byte & 0x7f) << shift;
    if (byte < 0x80) return number;
  }
  FailDamaged();
}

std::string_view TakeCounted(std::string_view* bytes) {
  const std::uint64_t size = TakeNumber(bytes);
  if (size > bytes->size()) FailDamaged();
  const std::string_view taken = bytes->substr(0, size);
  bytes->remove_prefix(size);
  return taken;
}

}  // namespace quarry::engine
