#include "fileindex/queue/look_ahead.h"

#include <cstring>

#include "fileindex/queue/ledger.h"

namespace quarry::fileindex {
namespace {

LinePath Split(std::string_view path) {
  const void* const slash = memrchr(path.data(), '/', path.size());
  if (slash == nullptr) return {};
  const auto length = static_cast<std::size_t>(static_cast<const char*>(slash) - path.data());
  return {path.substr(0, length), path.substr(length + 1)};
}

}  // namespace

bool LookAhead::Read(QueueReader& input) {
  count_ = 0;
  const QueueLine* previous = nullptr;
  do {
    QueueLine& line = lines_[count_];
    line = QueueLine();
    if (!input.Next(line.text)) break;
    line.is_usual = ReadEventLine(line.text, line.event, input.is_plain());
    if (line.is_usual) ReadUsual(line, previous);
    previous = line.is_usual ? &line : nullptr;
    ++count_;
  } while (count_ < lines_.size() && input.has_line());
  Prefetch();
  return count_ > 0;
}

// Neighbouring lines are often about the same file, or about files of one directory.
void LookAhead::ReadUsual(QueueLine& line, const QueueLine* previous) const {
  line.is_repeated = previous != nullptr && previous->event.path == line.event.path;
  if (line.is_repeated) {
    line.path = previous->path;
    line.directory_hash = previous->directory_hash;
    return;
  }
  line.path = Split(line.event.path);
  if (previous != nullptr && previous->path.directory == line.path.directory) {
    line.directory_hash = previous->directory_hash;
  } else {
    line.directory_hash = NameTable::HashOf(line.path.directory);
    names_.Prefetch(line.directory_hash);
  }
}

std::uint32_t LookAhead::FindDirectory(const LinePath& path, std::uint32_t hash) const {
  return names_.Find(hash,
                     [&](std::uint32_t at) { return directories_[at].path == path.directory; });
}

void LookAhead::PrefetchDirectory(const QueueLine& line) const {
  const std::uint32_t at = names_.Find(line.directory_hash, [](std::uint32_t) { return true; });
  if (at != NameTable::kNone) __builtin_prefetch(&directories_[at]);
}

void LookAhead::SetDirectory(QueueLine& line) const {
  if (line.path.name.empty()) return;
  const std::uint32_t at = FindDirectory(line.path, line.directory_hash);
  if (at == NameTable::kNone) return;
  line.directory = directories_[at].node;
  line.hash = NameTable::HashOf(line.path.name);
  Ledger::PrefetchDirectory(*line.directory);
}

void LookAhead::Learn(const QueueLine& line, const OPNode& node) {
  const LinePath& path = line.path;
  if (path.name.empty() || path.directory.size() > kLongestPath) return;
  if (FindDirectory(path, line.directory_hash) != NameTable::kNone) return;
  if (directories_.size() == kMostDirectories) {
    directories_.clear();
    names_ = NameTable();
  }
  names_.Add(line.directory_hash, static_cast<std::uint32_t>(directories_.size()));
  directories_.push_back({std::string(path.directory), node.parent.get()});
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
  const auto is_new = [](const QueueLine& line) { return line.is_usual && !line.is_repeated; };
  for (const QueueLine& line : lines()) {
    if (is_new(line)) PrefetchDirectory(line);
  }
  for (QueueLine& line : lines()) {
    if (is_new(line)) SetDirectory(line);
  }
  ForEachKnown([](QueueLine& line) { Ledger::PrefetchBooks(*line.directory); });
  ForEachKnown([](QueueLine& line) { Ledger::PrefetchName(*line.directory, line.hash); });
  ForEachKnown(
      [](QueueLine& line) { line.place = Ledger::PrefetchPlace(*line.directory, line.hash); });
  ForEachKnown(
      [](QueueLine& line) { line.node = Ledger::PrefetchChild(*line.directory, line.place); });
  ForEachKnown([](QueueLine& line) {
    if (line.node != nullptr) Ledger::PrefetchList(*line.node);
  });
  ForEachKnown([](QueueLine& line) {
    if (line.node != nullptr) Ledger::PrefetchRecord(*line.node);
  });
}

}  // namespace quarry::fileindex
