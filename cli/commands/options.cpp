#include <memory>

#include "cli/commands/commands.h"

namespace quarry::cli {

const bool& JsonOption(CLI::App& command) {
  auto value = std::make_shared<bool>(false);
  // The lambda keeps the value alive as long as the option.
  command.add_flag_callback(
      "--json", [value] { *value = true; }, "Print JSON");
  return *value;
}

void Examples(CLI::App& command, const std::string& lines) {
  command.footer("Examples:\n" + lines);
}

}  // namespace quarry::cli
