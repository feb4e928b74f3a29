// The completion script for bash, cli/completion/quarry.bash.

#ifndef QUARRY_CLI_COMPLETION_COMPLETION_H_
#define QUARRY_CLI_COMPLETION_COMPLETION_H_

namespace quarry::cli {

// Text in UTF-8 that ends in a newline.
extern const char kBashCompletion[];

}  // namespace quarry::cli

#endif  // QUARRY_CLI_COMPLETION_COMPLETION_H_
