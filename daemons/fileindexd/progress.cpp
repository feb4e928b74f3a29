#include "daemons/fileindexd/progress.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace quarry::fileindexd {
namespace {

constexpr std::chrono::seconds kWindow(10);

}  // namespace

void Rate::Add(Clock::time_point now) {
  while (!seconds_.empty() && now - seconds_.front().begin > kWindow) seconds_.pop_front();
  if (seconds_.empty() || now - seconds_.back().begin >= std::chrono::seconds(1)) {
    seconds_.push_back({now, 0});
  }
  ++seconds_.back().count;
}

double Rate::PerSecond(Clock::time_point now) const {
  std::uint64_t count = 0;
  Clock::time_point begin = now;
  for (const Second& second : seconds_) {
    if (now - second.begin > kWindow) continue;
    begin = std::min(begin, second.begin);
    count += second.count;
  }
  // Less than a second of work says little about a second.
  const double span = std::max(1.0, std::chrono::duration<double>(now - begin).count());
  return std::round(static_cast<double>(count) / span * 10) / 10;
}

Progress::Progress(const std::string& share, Clock clock)
    : share_(share), clock_(std::move(clock)) {}

void Progress::SetFolders(std::shared_ptr<const FolderRules> folders) {
  const std::lock_guard<std::mutex> lock(mutex_);
  folders_ = std::move(folders);
}

void Progress::SetState(WorkState state) {
  const std::lock_guard<std::mutex> lock(mutex_);
  state_ = state;
}

WorkState Progress::State() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return state_;
}

template <typename Change>
void Progress::ForPlace(const std::string& path, const Change& change) {
  const std::lock_guard<std::mutex> lock(mutex_);
  change(total_);
  const FolderRule* folder = folders_ ? folders_->Governing(path) : nullptr;
  if (folder != nullptr) change(by_folder_[folder->path]);
}

void Progress::AddWaiting(const std::string& path) {
  ForPlace(path, [](Counts& counts) { ++counts.waiting; });
}

void Progress::Begin(const std::string& path) {
  ForPlace(path, [&](Counts& counts) { counts.current = path; });
}

void Progress::TakeWaiting(const std::string& path) {
  // The folder that governs a place may have changed since it was counted.
  ForPlace(path, [](Counts& counts) { counts.waiting -= counts.waiting > 0 ? 1 : 0; });
}

void Progress::Done(const std::string& path) {
  const Rate::Clock::time_point now = clock_();
  ForPlace(path, [&](Counts& counts) {
    ++counts.done;
    counts.rate.Add(now);
  });
}

void Progress::Failed(const std::string& path, const std::string& error) {
  ForPlace(path, [&](Counts& counts) {
    ++counts.failed;
    counts.last_error = error;
  });
}

void Progress::EndPass(const std::string& error) {
  const std::lock_guard<std::mutex> lock(mutex_);
  pass_error_ = error;
  total_.waiting = 0;
  for (auto& [path, counts] : by_folder_) counts.waiting = 0;
}

std::uint64_t Progress::DoneCount() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return total_.done;
}

std::uint64_t Progress::FailedCount() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return total_.failed;
}

const char* Progress::StateName(bool paused) const {
  if (paused) return "paused";
  switch (state_) {
    case WorkState::kWaiting:
      return "waiting";
    case WorkState::kIndexing:
      return "indexing";
    case WorkState::kRetrying:
      return "retrying";
    case WorkState::kIdle:
      break;
  }
  return "idle";
}

Json::Value Progress::ReportCounts(const Counts& counts, const char* state,
                                   const char* current_key) const {
  Json::Value report;
  report["state"] = state;
  report["waiting"] = Json::UInt64(counts.waiting);
  report["done"] = Json::UInt64(counts.done);
  report["failed"] = Json::UInt64(counts.failed);
  report["rate"] = counts.rate.PerSecond(clock_());
  report[current_key] = counts.current;
  report["last_error"] = pass_error_.empty() ? counts.last_error : pass_error_;
  return report;
}

Json::Value Progress::Report(bool paused) const {
  const std::lock_guard<std::mutex> lock(mutex_);
  const bool all_paused = paused || (folders_ && folders_->AllPaused());
  Json::Value report = ReportCounts(total_, StateName(all_paused), "path");
  report["share"] = share_;
  report["folders"] = Json::Value(Json::arrayValue);
  if (!folders_) return report;
  static const Counts kNone;
  for (const auto& [place, folder] : folders_->folders()) {
    const auto found = by_folder_.find(folder.path);
    const Counts& counts = found == by_folder_.end() ? kNone : found->second;
    Json::Value entry = ReportCounts(counts, StateName(paused || folder.paused), "current");
    entry["path"] = folder.path;
    report["folders"].append(entry);
  }
  return report;
}

}  // namespace quarry::fileindexd
