// One line that is written over and over, while something takes long.

#ifndef QUARRY_CLI_MOVING_LINE_H_
#define QUARRY_CLI_MOVING_LINE_H_

#include <cstddef>
#include <string>

namespace quarry::cli {

// Shows nothing unless stderr is a terminal. The line is wiped away at the end of the object's
// life.
class MovingLine {
 public:
  MovingLine();
  ~MovingLine() { Show(""); }
  MovingLine(const MovingLine&) = delete;
  MovingLine& operator=(const MovingLine&) = delete;

  // Replaces what was shown by the beginning of `text`, as far as it fits.
  void Show(const std::string& text) const;

 private:
  bool terminal_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_MOVING_LINE_H_
