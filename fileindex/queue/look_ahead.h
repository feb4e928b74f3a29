// Reading a queue some lines ahead of folding them.
//
// A tree of a million paths is far larger than the processor's caches, and its nodes are asked for
// in no order: folding would wait for memory, line by line. So a handful of lines is read at a
// time, and what they will need is asked for at once. All of this is hints: a wrong one costs time
// and nothing else.

#ifndef QUARRY_FILEINDEX_QUEUE_LOOK_AHEAD_H_
#define QUARRY_FILEINDEX_QUEUE_LOOK_AHEAD_H_

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "fileindex/queue/event_line.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {

struct QueueLine {
  std::string_view text;
  bool is_usual = false;         // `event` has been read from it
  EventLine event{};             // of a usual line
  std::size_t slot = 0;          // where the directory of its path is remembered
  OPNode* directory = nullptr;   // the node above that of the event's path, where it is known
  std::string_view name{};       // then, the last component of the path
  std::uint32_t hash = 0;        // and its hash
  const OPNode* node = nullptr;  // what is expected to be of that name
};

// For one tree while it is being built: nodes must not go away.
class LookAhead {
 public:
  LookAhead() : directories_(kDirectories) {}

  // Reads the next lines. False at the end of the queue.
  bool Read(QueueReader& input);

  // The lines that were read, which stay where they are until the next ones are.
  std::span<QueueLine> lines() { return {lines_.data(), count_}; }

  // Remembers the directory of a path whose node is known now.
  void Learn(std::string_view path, const OPNode& node);

 private:
  // Directories under the texts that queues name them by; one directory may have several texts, and
  // a text pushes out another that falls to the same place.
  struct Directory {
    std::string path;
    OPNode* node = nullptr;
  };
  static constexpr std::size_t kDirectories = 4096;
  static constexpr std::size_t kLongestPath = 512;

  static std::size_t SlotOf(std::string_view path);
  void AskForDirectory(QueueLine& line) const;
  void FindDirectory(QueueLine& line) const;
  template <typename Step>
  void ForEachKnown(Step step);
  void Prefetch();

  std::vector<Directory> directories_;
  std::array<QueueLine, 32> lines_;
  std::size_t count_ = 0;
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_LOOK_AHEAD_H_
