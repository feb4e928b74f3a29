// What the command line says when something cannot be done.

#ifndef QUARRY_CLI_PROBLEM_H_
#define QUARRY_CLI_PROBLEM_H_

#include <exception>
#include <stdexcept>
#include <string>

#include "common/error.h"

namespace quarry::cli {

// The exit codes of the program.
enum ExitCode { kExitDone = 0, kExitFailed = 1, kExitUsage = 2 };

// A request that cannot be served, in a sentence that says what to do. what() is that sentence.
class Problem : public std::runtime_error {
 public:
  explicit Problem(const std::string& sentence) : std::runtime_error(sentence) {}
};

// Ends a command whose output says already what is wrong.
class Unwell : public std::exception {
 public:
  const char* what() const noexcept override { return "Something is wrong."; }
};

// The library's error as one line for a person: what happened and, where something can be done
// about it, what.
std::string Explain(const Error& error);

}  // namespace quarry::cli

#endif  // QUARRY_CLI_PROBLEM_H_
