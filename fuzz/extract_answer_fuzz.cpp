// What a worker may send: fields that are taken must be the same when they are sent once more.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "daemons/tarncontentextractd/worker_protocol.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quarry::extract;
  const std::string_view bytes(reinterpret_cast<const char*>(data), size);
  std::vector<Field> fields;
  if (!DecodeFields(bytes, &fields)) {
    if (!fields.empty()) std::abort();
  } else if (EncodeFields(fields) != bytes) {
    std::abort();
  }
  return 0;
}
