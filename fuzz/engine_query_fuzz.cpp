// Whatever is typed, a search answers with hits or with the error for what cannot be understood.

#include <cstddef>
#include <cstdint>
#include <cstdio>

#include "daemons/tarnelasticd/engine_error.h"
#include "fuzz/engine_fuzz_place.h"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  static quarry::engine::FuzzPlace place;
  Json::Value request;
  request["command"] = "search";
  request["data"]["query"] = std::string(reinterpret_cast<const char*>(bytes), size);
  const Json::Value answer = place.engine().Handle(request);
  if (answer["success"].asBool()) return 0;
  if (answer["error"]["code"].asInt() == quarry::engine::kQuerySyntax) return 0;
  std::fprintf(stderr, "%s\n", quarry::toString(answer).c_str());
  std::abort();
}
