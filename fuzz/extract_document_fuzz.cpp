// Every format on any bytes. The first byte chooses the name's extension. What comes out must be
// what the daemon accepts from a worker.

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <iterator>
#include <string>
#include <vector>

#include "daemons/tarncontentextractd/extractor.h"
#include "daemons/tarncontentextractd/worker.h"
#include "daemons/tarncontentextractd/worker_protocol.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace quarry::extract;
  static const Registry registry = StandardRegistry();
  static constexpr const char* kExtensions[] = {"txt", "html", "xml", "md", "svg", "c", ""};
  if (size == 0) return 0;
  const char* extension = kExtensions[data[0] % std::size(kExtensions)];
  Source source =
      Source::OfBytes(std::string(reinterpret_cast<const char*>(data + 1), size - 1), extension);
  std::vector<Field> fields;
  if (!DecodeFields(EncodeFields(ParseFile(registry, source)), &fields)) std::abort();
  return 0;
}
