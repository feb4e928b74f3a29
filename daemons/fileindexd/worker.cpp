#include "daemons/fileindexd/worker.h"

#include <sys/stat.h>

#include <algorithm>
#include <exception>
#include <utility>

#include "common/error.h"
#include "daemons/common/log.h"
#include "daemons/common/priority.h"
#include "daemons/fileindexd/failure.h"

namespace quarry::fileindexd {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

constexpr milliseconds kPoll(200);
constexpr milliseconds kFirstBackoff(500);
constexpr milliseconds kLongestBackoff = seconds(60);

// An index is missing for a moment while it gets another name. One that was made anew then would
// take the name, and be empty.
constexpr int kMissesBeforeCreate = 3;

// A queue that is there but empty was only touched in order to lock it.
bool HasLines(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 && status.st_size > 0;
}

bool Exists(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0;
}

bool HasNewlyActive(const FolderRules& before, const FolderRules& now) {
  return std::any_of(now.folders().begin(), now.folders().end(), [&](const auto& entry) {
    const FolderRule* old = before.At(entry.first);
    return !entry.second.paused && old != nullptr && old->paused;
  });
}

}  // namespace

Worker::Worker(const std::string& share, WorkerParts parts)
    : share_(share),
      parts_(std::move(parts)),
      gate_(*parts_.gate),
      progress_(share),
      survey_(
          *parts_.files, [this] { return CurrentRules(); },
          [this](const std::string& path) { return parts_.host->IsInRecycleBin(path); }) {}

Json::Value Worker::Report() const {
  Json::Value report = progress_.Report(gate_.Paused());
  report["set_aside"] = aside_.Report();
  return report;
}

void Worker::Reload() {
  reload_ = true;
  gate_.Wake();
}

void Worker::Run() {
  if (!parts_.full_speed) daemon::WorkInBackground();
  daemon::LogInfo("Worker of share " + share_ + " started");
  // What has its worker started queues its event only now: one walk can do for both.
  gate_.WaitFor(kPoll);
  while (!gate_.Stopping()) gate_.WaitFor(Step());
  daemon::LogInfo("Worker of share " + share_ + " stopped");
}

Worker::Milliseconds Worker::Step() {
  if (gate_.Stopping()) return milliseconds(0);
  try {
    RefreshLayout();
    MarkForSetAside();
    ClaimReindex();
    if (gate_.Paused() || layout_.rules->AllPaused()) return kPoll;
    FollowRoot();
    if (!HasWork()) {
      Recover();
      progress_.SetState(WorkState::kIdle);
      return kPoll;
    }
    progress_.SetState(WorkState::kIndexing);
    RunOnePass();
    return milliseconds(0);
  } catch (const Interrupted&) {
    return milliseconds(0);
  } catch (const Error& error) {
    const Milliseconds wait = Fail(Describe(error));
    HandleMissingIndex(error);
    return wait;
  } catch (const std::exception& error) {
    return Fail(error.what());
  }
}

// The folder list is loaded when it may have changed, in the middle of a pass too. What the pass
// has judged by the old one is told of by an event that was queued after the change, and so is left
// to the next pass. While a folder was paused nobody watched it.
void Worker::RefreshLayout() {
  if (!reload_.exchange(false)) return;
  try {
    ShareLayout layout = parts_.host->Load();
    if (layout_.rules && HasNewlyActive(*layout_.rules, *layout.rules)) CompareAll();
    if (layout.root != layout_.root) root_ = Identity();
    layout_ = std::move(layout);
    progress_.SetFolders(layout_.rules);
  } catch (...) {
    reload_ = true;
    throw;
  }
}

Survey::Rules Worker::CurrentRules() {
  RefreshLayout();
  return layout_.rules;
}

void Worker::ClaimReindex() {
  if (aside_.IsDue()) aside_.GiveAnotherChance();
  if (aside_.IsEmpty() && std::exchange(marked_, false)) check_status_ = true;
  if (!check_status_.exchange(false)) return;
  try {
    FollowMark(parts_.host->NeedsReindex());
  } catch (...) {
    check_status_ = true;
    throw;
  }
}

// A share that is marked as needing a reindex gets it; the mark goes first, so that one that is set
// meanwhile is not lost. While something is set aside the mark says so and stays: whoever takes it
// away has asked for everything to be tried again.
void Worker::FollowMark(bool marked) {
  if (!marked && aside_.IsEmpty()) return;
  CompareAll();
  if (aside_.IsEmpty()) return parts_.host->ClearNeedsReindex();
  if (!marked) aside_.GiveAnotherChance();
}

// Another directory in the share's place, such as a disk's that was mounted meanwhile, comes
// without an event.
void Worker::FollowRoot() {
  const Identity root = parts_.files->Identify(layout_.root);
  if (root == root_) return;
  root_ = root;
  CompareAll();
}

bool Worker::HasWork() const {
  return MustCompare() || Exists(layout_.queue_path + ".tmp") || HasLines(layout_.queue_path);
}

void Worker::RunOnePass() {
  CheckShareIsThere();
  const std::uint64_t asked = compares_asked_;
  // The folders are loaded when the pass has its events: by older ones than its events tell of it
  // would take what was renamed into a folder for gone.
  reload_ = true;
  const PassSetup setup{layout_.queue_path,
                        layout_.root,
                        *parts_.index,
                        survey_,
                        gate_,
                        progress_,
                        aside_,
                        *parts_.slots,
                        aside_.IsSearching() ? 1 : parts_.threads,
                        root_};
  if (RunPass(setup, MustCompare()) == PassResult::kAgain) {
    daemon::LogWarning("The search engine was started anew while share " + share_ +
                       " was indexed; doing it again");
    return;
  }
  compares_done_ = asked;
  aside_.Succeeded();
  missing_index_ = 0;
  Recover();
  progress_.EndPass("");
}

// All documents of a disk that is unplugged would be deleted otherwise.
void Worker::CheckShareIsThere() {
  if (!root_.exists || (was_mounted_ && !root_.mount_root)) {
    throw Error(kErrorSystem, "The share's directory " + layout_.root + " is not there");
  }
  was_mounted_ = root_.mount_root;
}

Worker::Milliseconds Worker::Fail(const std::string& error) {
  // In this order: whoever reads that it is retrying also reads why.
  progress_.EndPass(error);
  progress_.SetState(WorkState::kRetrying);
  if (error != last_error_)
    daemon::LogError("Share " + share_ + " cannot be indexed now: " + error);
  last_error_ = error;
  SetCulpritAside();
  backoff_ = std::clamp(2 * backoff_, kFirstBackoff, kLongestBackoff);
  return backoff_;
}

// What fails again and again must not hold up the rest of the share.
void Worker::SetCulpritAside() {
  const std::optional<SetAside::Work> culprit = aside_.Failed();
  if (!culprit) return;
  mark_missing_ = true;
  backoff_ = milliseconds(0);
  daemon::LogError("Set aside in share " + share_ +
                   ", since it fails again and again: " + culprit->name + ": " + culprit->error);
}

void Worker::MarkForSetAside() {
  if (!mark_missing_) return;
  parts_.host->MarkNeedsReindex();
  mark_missing_ = false;
  marked_ = true;
}

// Also where there is nothing left to do, as after a folder list that could not be loaded.
void Worker::Recover() {
  backoff_ = milliseconds(0);
  if (last_error_.empty()) return;
  daemon::LogInfo("Share " + share_ + " is indexed again");
  last_error_.clear();
  progress_.EndPass("");
}

void Worker::HandleMissingIndex(const Error& error) {
  missing_index_ = Classify(error) == Failure::kIndexMissing ? missing_index_ + 1 : 0;
  if (missing_index_ < kMissesBeforeCreate) return;
  try {
    if (!parts_.host->CreateIndexIfWanted([this] { parts_.index->Create(); })) return;
    daemon::LogWarning("The index of share " + share_ + " was missing; made it anew");
    missing_index_ = 0;
    CompareAll();
  } catch (const Error& failure) {
    daemon::LogError("The index of share " + share_ + " cannot be made: " + Describe(failure));
  }
}

}  // namespace quarry::fileindexd
