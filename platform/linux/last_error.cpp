#include "platform/linux/last_error.h"

#include "platform/include/error.h"

namespace quarry::platform {
namespace {

struct Place {
  int error = 0;
  const char* file = "";
  int line = 0;
};

thread_local Place last;

}  // namespace

int SetLastError(int error, const char* file, int line) {
  last = {error, file, line};
  return -1;
}

}  // namespace quarry::platform

using namespace quarry::platform;

extern "C" {

int HLIBCErrGet() {
  return last.error;
}

const char* HLIBCErrorGetFile() {
  return last.file;
}

int HLIBCErrorGetLine() {
  return last.line;
}

}  // extern "C"
