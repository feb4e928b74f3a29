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
#include "fileindex/queue/name_table.h"
#include "fileindex/queue/optree.h"
#include "fileindex/queue/queue_reader.h"

namespace quarry::fileindex {

// What the lines of a queue often share with others.
struct LinePath {
  std::string_view directory;  // up to the last "/", which is not part of it
  std::string_view name;       // behind it; empty when the path ends in "/" or has none
};

struct QueueLine {
  std::string_view text;
  bool is_usual = false;             // `event` has been read from it
  bool is_repeated = false;          // the line before is usual too, and about the same path
  EventLine event{};                 // of a usual line
  LinePath path{};                   // of a usual line
  std::uint32_t directory_hash = 0;  // of a usual line
  OPNode* directory = nullptr;       // the node above that of the event's path, where it is known
  std::uint32_t hash = 0;            // then, that of the name
  std::uint32_t place = 0;           // where it is expected among the directory's children
  const OPNode* node = nullptr;      // what is there
};

// For one tree while it is being built: nodes must not go away.
class LookAhead {
 public:
  // Reads the next lines. False at the end of the queue.
  bool Read(QueueReader& input);

  // The lines that were read, which stay where they are until the next ones are.
  std::span<QueueLine> lines() { return {lines_.data(), count_}; }

  // Remembers the directory of a usual line's path, whose node is known now.
  void Learn(const QueueLine& line, const OPNode& node);

 private:
  // Directories under the texts that queues name them by; one directory may have several texts.
  struct Directory {
    std::string path;
    OPNode* node;
  };
  static constexpr std::size_t kMostDirectories = 131072;
  static constexpr std::size_t kLongestPath = 512;

  void ReadUsual(QueueLine& line, const QueueLine* previous) const;
  std::uint32_t FindDirectory(const LinePath& path, std::uint32_t hash) const;
  void PrefetchDirectory(const QueueLine& line) const;
  void SetDirectory(QueueLine& line) const;
  template <typename Step>
  void ForEachKnown(Step step);
  void Prefetch();

  std::vector<Directory> directories_;
  NameTable names_;  // of the directories' paths
  std::array<QueueLine, 32> lines_;
  std::size_t count_ = 0;
};

}  // namespace quarry::fileindex

#endif  // QUARRY_FILEINDEX_QUEUE_LOOK_AHEAD_H_
