#include "cli/moving_line.h"

#include <sys/ioctl.h>
#include <unistd.h>

#include <iostream>

namespace quarry::cli {
namespace {

std::size_t Columns() {
  winsize size{};
  const bool known = ioctl(STDERR_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 1;
  return known ? size.ws_col : 80;
}

}  // namespace

MovingLine::MovingLine() : terminal_(isatty(STDERR_FILENO) == 1) {}

void MovingLine::Show(const std::string& text) const {
  if (terminal_) std::cerr << "\r\033[K" << text.substr(0, Columns() - 1) << std::flush;
}

}  // namespace quarry::cli
