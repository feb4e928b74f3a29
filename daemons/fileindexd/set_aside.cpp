#include "daemons/fileindexd/set_aside.h"

#include <algorithm>
#include <cstddef>
#include <exception>
#include <utility>

#include "common/error.h"
#include "daemons/fileindexd/failure.h"

namespace quarry::fileindexd {
namespace {

constexpr int kPasses = 5;
constexpr std::chrono::hours kChanceAfter(1);

// Where more than so much fails it is not the work that is at fault, and leaving it out helps
// nobody.
constexpr std::size_t kMost = 16;

// Whether the work may be what is wrong. The engine answered when the pass began, so when an
// exchange breaks off and it answers no more, the exchange may be why.
bool MayBeOwnFault(const Error& error, bool can_read) {
  switch (Classify(error)) {
    case Failure::kDocument:
      return can_read;
    case Failure::kChannel:
    case Failure::kPlace:
      return true;
    case Failure::kIndexMissing:
    case Failure::kPass:
      break;
  }
  return false;
}

}  // namespace

void SetAside::BeginPass(bool can_read) {
  const std::lock_guard<std::mutex> lock(mutex_);
  can_read_ = can_read;
  blamed_.reset();
}

void SetAside::Try(const std::string& name, const std::function<void()>& work) {
  if (Has(name)) return;
  try {
    work();
  } catch (const Error& error) {
    if (MayBeOwnFault(error, can_read_)) Blame(name, Describe(error));
    throw;
  } catch (const std::exception& error) {
    Blame(name, error.what());
    throw;
  }
}

bool SetAside::Has(const std::string& name) const {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto found = troubles_.find(name);
  return found != troubles_.end() && found->second.aside;
}

void SetAside::Forget(const std::string& path, bool below) {
  const std::lock_guard<std::mutex> lock(mutex_);
  troubles_.erase(path);
  if (!below) return;
  const std::string dir = path + '/';
  std::erase_if(troubles_, [&](const auto& entry) { return entry.first.rfind(dir, 0) == 0; });
}

// Only the first failure of a pass is surely one: it ends whatever else is being done.
void SetAside::Blame(const std::string& name, const std::string& error) {
  const std::lock_guard<std::mutex> lock(mutex_);
  if (!blamed_) blamed_ = Work{name, error};
}

void SetAside::Succeeded() {
  const std::lock_guard<std::mutex> lock(mutex_);
  blamed_.reset();
  std::erase_if(troubles_, [](const auto& entry) { return !entry.second.aside; });
}

std::optional<SetAside::Work> SetAside::Failed() {
  const std::lock_guard<std::mutex> lock(mutex_);
  const std::optional<Work> blamed = std::exchange(blamed_, std::nullopt);
  if (!blamed || (troubles_.count(blamed->name) == 0 && !MakeRoom())) return std::nullopt;
  Trouble& trouble = troubles_[blamed->name];
  trouble.error = blamed->error;
  if (++trouble.passes < kPasses) return std::nullopt;
  trouble.aside = true;
  due_ = clock_() + kChanceAfter;
  return blamed;
}

bool SetAside::MakeRoom() {
  if (troubles_.size() < kMost) return true;
  std::erase_if(troubles_, [](const auto& entry) { return !entry.second.aside; });
  return troubles_.size() < kMost;
}

bool SetAside::IsSearching() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return std::any_of(troubles_.begin(), troubles_.end(),
                     [](const auto& entry) { return !entry.second.aside; });
}

bool SetAside::IsEmpty() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return std::none_of(troubles_.begin(), troubles_.end(),
                      [](const auto& entry) { return entry.second.aside; });
}

bool SetAside::IsDue() const {
  const bool empty = IsEmpty();
  const std::lock_guard<std::mutex> lock(mutex_);
  return !empty && clock_() >= due_;
}

void SetAside::GiveAnotherChance() {
  const std::lock_guard<std::mutex> lock(mutex_);
  for (auto& [name, trouble] : troubles_) {
    trouble.aside = false;
    trouble.passes = std::min(trouble.passes, kPasses - 1);
  }
}

Json::Value SetAside::Report() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  Json::Value report(Json::arrayValue);
  for (const auto& [name, trouble] : troubles_) {
    if (!trouble.aside) continue;
    Json::Value entry;
    entry["path"] = name;
    entry["error"] = trouble.error;
    report.append(entry);
  }
  return report;
}

}  // namespace quarry::fileindexd
