// What a call throws.

#ifndef QUARRY_TESTS_SUPPORT_THROWN_H_
#define QUARRY_TESTS_SUPPORT_THROWN_H_

#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "common/error.h"

namespace quarry::test {

// The Error that `call` throws. Where it throws none the test fails and the code is 0.
inline Error Thrown(const std::function<void()>& call) {
  try {
    call();
  } catch (const Error& error) {
    return error;
  }
  ADD_FAILURE() << "nothing thrown";
  return Error(0);
}

// The Error that `call` throws, as "code reason"; "" where it throws none.
inline std::string FailureOf(const std::function<void()>& call) {
  try {
    call();
  } catch (const Error& error) {
    return std::to_string(error.code()) + " " + error.reason();
  }
  return "";
}

}  // namespace quarry::test

#endif  // QUARRY_TESTS_SUPPORT_THROWN_H_
