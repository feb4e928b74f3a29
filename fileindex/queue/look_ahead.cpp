#include "fileindex/queue/look_ahead.h"

#include <cstring>
#include <functional>

#include "fileindex/queue/ledger.h"

namespace quarry::fileindex {
namespace {

// The path up to its last "/", which is not part of it, and what comes behind.
struct SplitPath {
  explicit SplitPath(std::string_view path) {
    const void* const slash = memrchr(path.data(), '/', path.size());
    if (slash == nullptr) return;
    const auto length = static_cast<std::size_t>(static_cast<const char*>(slash) - path.data());
    directory = path.substr(0, length);
    name = path.substr(length + 1);
  }
  std::string_view directory;
  std::string_view name;
};

}  // namespace

bool LookAhead::Read(QueueReader& input) {
  count_ = 0;
  do {
    QueueLine line;
    if (!input.Next(line.text)) break;
    line.is_usual = ReadEventLine(line.text, line.event);
    if (line.is_usual) AskForDirectory(line);
    lines_[count_++] = line;
  } while (count_ < lines_.size() && input.has_line());
  Prefetch();
  return count_ > 0;
}

std::size_t LookAhead::SlotOf(std::string_view path) {
  return std::hash<std::string_view>()(path) % kDirectories;
}

void LookAhead::AskForDirectory(QueueLine& line) const {
  line.slot = SlotOf(SplitPath(line.event.path).directory);
  __builtin_prefetch(&directories_[line.slot]);
}

void LookAhead::FindDirectory(QueueLine& line) const {
  const SplitPath split(line.event.path);
  const Directory& directory = directories_[line.slot];
  if (split.name.empty() || directory.path != split.directory) return;
  line.directory = directory.node;
  line.name = split.name;
  line.hash = NameTable::HashOf(split.name);
  if (line.directory != nullptr) Ledger::PrefetchDirectory(*line.directory);
}

void LookAhead::Learn(std::string_view path, const OPNode& node) {
  const SplitPath split(path);
  if (split.name.empty() || split.directory.size() > kLongestPath) return;
  directories_[SlotOf(split.directory)] = {std::string(split.directory), node.parent.get()};
}

template <typename Step>
void LookAhead::ForEachKnown(Step step) {
  for (QueueLine& line : lines()) {
    if (line.directory != nullptr) step(line);
  }
}

// Step by step for all lines: each step needs what the one before has asked for, but no line waits
// for another.
void LookAhead::Prefetch() {
  for (const QueueLine& line : lines()) __builtin_prefetch(directories_[line.slot].path.data());
  for (QueueLine& line : lines()) {
    if (line.is_usual) FindDirectory(line);
  }
  ForEachKnown([](QueueLine& line) { Ledger::PrefetchBooks(*line.directory); });
  ForEachKnown([](QueueLine& line) { Ledger::PrefetchName(*line.directory, line.hash); });
  ForEachKnown([](QueueLine& line) { Ledger::PrefetchPlace(*line.directory, line.hash); });
  ForEachKnown(
      [](QueueLine& line) { line.node = Ledger::PrefetchChild(*line.directory, line.hash); });
  ForEachKnown([](QueueLine& line) {
    if (line.node != nullptr) Ledger::PrefetchList(*line.node);
  });
  ForEachKnown([](QueueLine& line) {
    if (line.node != nullptr) Ledger::PrefetchRecord(*line.node);
  });
}

}  // namespace quarry::fileindex
