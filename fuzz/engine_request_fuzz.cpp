// Whatever a peer sends, it gets an answer that is well formed, and the index stays sound.

#include <cstddef>
#include <cstdint>
#include <cstdio>

#include "daemons/tarnelasticd/engine_error.h"
#include "fuzz/engine_fuzz_place.h"

namespace {

// These may name any directory of the machine.
bool NamesDirectories(const Json::Value& request) {
  if (!request.isObject()) return false;
  const Json::Value& command = request["command"];
  return command.isString() && command.asString().rfind("index_c", 0) == 0;
}

bool IsHarmless(const std::string& text) {
  Json::Value request;
  if (!quarry::fromString(request, text)) return true;
  if (NamesDirectories(request)) return false;
  if (!request.isObject() || !request["compound"].isArray()) return true;
  for (const Json::Value& element : request["compound"]) {
    if (NamesDirectories(element)) return false;
  }
  return true;
}

bool IsAnswer(const Json::Value& answer) {
  if (!answer.isObject() || !answer["success"].isBool()) return false;
  if (answer["success"].asBool()) return true;
  const Json::Value& error = answer["error"];
  if (!error.isObject() || !error["code"].isInt() || !error["msg"].isString()) return false;
  const int code = error["code"].asInt();
  return code != quarry::engine::kDamagedIndex && code != quarry::engine::kStorageFailed &&
         code != quarry::engine::kInternalFailure;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  static quarry::engine::FuzzPlace place;
  const std::string text(reinterpret_cast<const char*>(bytes), size);
  if (!IsHarmless(text)) return 0;
  const std::string reply = place.engine().HandleText(text);
  Json::Value answer;
  if (quarry::fromString(answer, reply) && IsAnswer(answer)) return 0;
  std::fprintf(stderr, "%s\n", reply.c_str());
  std::abort();
}
