#include "daemons/fileindexd/document_writer.h"

#include <algorithm>
#include <utility>

#include "daemons/common/log.h"
#include "daemons/fileindexd/failure.h"

namespace quarry::fileindexd {
namespace {

// A reader of files that was started anew meanwhile does better the second time.
constexpr int kAttempts = 2;

// A document that is set aside must still go when its file has gone.
constexpr char kRemoval[] = " (removal)";

}  // namespace

DocumentWriter::DocumentWriter(Index& index, FileSystem& files, TaskLane& lane, Progress& progress,
                               SetAside& aside, RemovalGuard may_remove)
    : index_(index),
      files_(files),
      lane_(lane),
      progress_(progress),
      aside_(aside),
      may_remove_(std::move(may_remove)),
      upsert_together_([this](const auto& wishes) { return UpsertTogether(wishes); }) {}

std::function<void()> DocumentWriter::Task(const std::string& path, const std::string& name,
                                           std::function<void()> change) {
  return [this, path, name, change = std::move(change)] {
    progress_.Begin(path);
    aside_.Try(name, change);
    progress_.TakeWaiting(path);
  };
}

void DocumentWriter::Submit(const std::string& path, const std::string& name,
                            std::function<void()> change) {
  progress_.AddWaiting(path);
  lane_.Submit(path, Task(path, name, std::move(change)));
}

void DocumentWriter::Upsert(const std::string& path, bool need_meta) {
  progress_.AddWaiting(path);
  lane_.SubmitSmall({path, need_meta},
                    Task(path, path, [this, path, need_meta] { UpsertNow(path, need_meta); }),
                    upsert_together_);
}

std::vector<bool> DocumentWriter::UpsertTogether(const std::vector<Wish>& wishes) {
  if (std::any_of(wishes.begin(), wishes.end(),
                  [&](auto& wish) { return aside_.Has(wish.path); })) {
    return std::vector<bool>(wishes.size(), false);
  }
  progress_.Begin(wishes.front().path);
  std::vector<bool> done = index_.UpsertMany(wishes);
  for (std::size_t i = 0; i < wishes.size(); ++i) {
    if (!done[i]) continue;
    progress_.Begin(wishes[i].path);
    progress_.Done(wishes[i].path);
    progress_.TakeWaiting(wishes[i].path);
  }
  return done;
}

void DocumentWriter::ReplaceDirectory(const std::string& path, bool need_meta) {
  may_remove_();
  Submit(path, path, [this, path, need_meta] {
    index_.DeleteBelow(path);
    UpsertNow(path, need_meta);
  });
}

void DocumentWriter::SetAttributes(const std::string& path) {
  Submit(path, path, [this, path] { SetAttributesNow(path); });
}

void DocumentWriter::Remove(const std::string& path) {
  may_remove_();
  Submit(path, path + kRemoval, [this, path] {
    index_.Delete(path);
    aside_.Forget(path, false);
    progress_.Done(path);
  });
}

void DocumentWriter::RemoveTree(const std::string& path) {
  may_remove_();
  Submit(path, path + kRemoval, [this, path] {
    RemoveTreeNow(path);
    aside_.Forget(path, true);
  });
}

void DocumentWriter::Rename(const std::string& new_path, const std::string& old_path) {
  lane_.Drain();
  progress_.Begin(new_path);
  index_.DeleteBelow(new_path);
  index_.Delete(new_path);
  index_.Rename(new_path, old_path);
  progress_.Done(new_path);
}

void DocumentWriter::UpsertNow(const std::string& path, bool need_meta) {
  std::optional<Error> failure = Attempt(path, [&] { index_.Upsert(path, need_meta); });
  if (failure && need_meta && !IsGone(path)) {
    CountFailure(path, *failure);
    // At least its name is found.
    failure = Attempt(path, [&] { index_.Upsert(path, false); });
    if (!failure) return;
  }
  if (!failure) {
    progress_.Done(path);
  } else if (IsGone(path)) {
    RemoveTreeNow(path);
  } else if (!need_meta) {
    CountFailure(path, *failure);
  }
}

void DocumentWriter::SetAttributesNow(const std::string& path) {
  const std::optional<Error> failure = Attempt(path, [&] { index_.SetAttributes(path); });
  if (!failure) {
    progress_.Done(path);
  } else if (IsGone(path)) {
    RemoveTreeNow(path);
  } else {
    CountFailure(path, *failure);
  }
}

// The document itself goes last: as long as it is there, a walk that begins anew finds the way to
// what lies below it.
void DocumentWriter::RemoveTreeNow(const std::string& path) {
  may_remove_();
  index_.DeleteBelow(path);
  index_.Delete(path);
  progress_.Done(path);
}

std::optional<Error> DocumentWriter::Attempt(const std::string& path,
                                             const std::function<void()>& change) {
  std::optional<Error> failure;
  for (int i = 0; i < kAttempts; ++i) {
    try {
      change();
      return std::nullopt;
    } catch (const Error& error) {
      RequireOwnFault(error);
      failure = error;
    }
    if (IsGone(path)) break;
  }
  return failure;
}

// Throws unless the failure is due to the one document that was asked for.
void DocumentWriter::RequireOwnFault(const Error& error) {
  switch (Classify(error)) {
    case Failure::kDocument:
      if (error.code() == kErrorParseDocument && !index_.CanRead()) {
        throw Error(kErrorParseDocument,
                    "The content extractor (tarncontentextractd) is not running");
      }
      return;
    case Failure::kChannel:
      index_.Epoch();
      return;
    case Failure::kIndexMissing:
    case Failure::kPlace:
    case Failure::kPass:
      throw error;
  }
}

bool DocumentWriter::IsGone(const std::string& path) {
  const PlaceKind kind = files_.Look(path, path).kind;
  return kind == PlaceKind::kAbsent || kind == PlaceKind::kOther;
}

void DocumentWriter::CountFailure(const std::string& path, const Error& error) {
  const std::string text = path + ": " + Describe(error);
  progress_.Failed(path, text);
  daemon::LogWarning("Cannot index " + text);
}

}  // namespace quarry::fileindexd
