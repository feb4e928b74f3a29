#include "tests/daemons/fileindexd/fake_index.h"

#include <algorithm>
#include <iterator>

#include "common/error.h"
#include "common/file_util.h"
#include "daemons/tarnelasticd/engine_error.h"

namespace quarry::fileindexd {

void FakeIndex::Enter(const std::string& command, bool changes) {
  Hook hook;
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    ++calls_;
    hook = hook_;
  }
  if (hook) hook(command);
  const std::lock_guard<std::mutex> lock(mutex_);
  if (changes) commands_.push_back(command);
  if (!exists_ && command != "epoch" && command != "create") {
    throw Error(engine::kUnknownIndex, "Request failed, msg=There is no such index");
  }
}

void FakeIndex::Unrecord(const std::string& command) {
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto last = std::find(commands_.rbegin(), commands_.rend(), command);
  if (last != commands_.rend()) commands_.erase(std::next(last).base());
}

std::vector<std::string> FakeIndex::Commands() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return commands_;
}

std::size_t FakeIndex::CallCount() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return calls_;
}

void FakeIndex::ForgetCommands() {
  const std::lock_guard<std::mutex> lock(mutex_);
  commands_.clear();
  calls_ = 0;
}

FakeIndex::Documents FakeIndex::All() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return documents_;
}

void FakeIndex::Put(const Document& document) {
  const std::lock_guard<std::mutex> lock(mutex_);
  documents_[document.path] = document;
  committed_ = documents_;
}

void FakeIndex::SetHook(Hook hook) {
  const std::lock_guard<std::mutex> lock(mutex_);
  hook_ = std::move(hook);
}

void FakeIndex::Restart() {
  const std::lock_guard<std::mutex> lock(mutex_);
  documents_ = committed_;
  ++epoch_;
}

void FakeIndex::DeleteIndex() {
  const std::lock_guard<std::mutex> lock(mutex_);
  exists_ = false;
  documents_.clear();
  committed_.clear();
}

void FakeIndex::SetReaderRunning(bool runs) {
  const std::lock_guard<std::mutex> lock(mutex_);
  reader_runs_ = runs;
}

void FakeIndex::MakeUnparsable(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  unparsable_[path] = false;
}

void FakeIndex::MakeContentUnparsable(const std::string& path) {
  const std::lock_guard<std::mutex> lock(mutex_);
  unparsable_[path] = true;
}

Place FakeIndex::Parse(const std::string& path, bool need_meta) {
  const Place place = disk_.Peek(path);
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto bad = unparsable_.find(path);
  const bool readable = bad == unparsable_.end() || (bad->second && !need_meta);
  const bool there = place.kind == PlaceKind::kFile || place.kind == PlaceKind::kDirectory ||
                     place.kind == PlaceKind::kForeign;
  if (!there || !readable || !reader_runs_) {
    throw Error(kErrorParseDocument, "Parse failed, path=" + path);
  }
  return place;
}

std::string FakeIndex::Epoch() {
  Enter("epoch", false);
  const std::lock_guard<std::mutex> lock(mutex_);
  return std::to_string(epoch_);
}

void FakeIndex::Create() {
  Enter("create", true);
  const std::lock_guard<std::mutex> lock(mutex_);
  exists_ = true;
}

void FakeIndex::Commit() {
  Enter("commit", true);
  const std::lock_guard<std::mutex> lock(mutex_);
  committed_ = documents_;
}

std::uint64_t FakeIndex::Count() {
  Enter("count", false);
  const std::lock_guard<std::mutex> lock(mutex_);
  return documents_.size();
}

void FakeIndex::Upsert(const std::string& path, bool need_meta) {
  Enter("upsert " + path + (need_meta ? " content" : ""), true);
  const Place place = Parse(path, need_meta);
  const std::lock_guard<std::mutex> lock(mutex_);
  const bool is_dir = place.kind != PlaceKind::kFile;
  documents_[path] = {path, is_dir, place.attribute_stamp, need_meta ? place.content_stamp : ""};
}

void FakeIndex::MakeDoubtful(unsigned seed) {
  const std::lock_guard<std::mutex> lock(mutex_);
  doubt_.emplace(seed);
}

// 0 to 7; 7 where nothing is in doubt.
unsigned FakeIndex::Doubt() {
  const std::lock_guard<std::mutex> lock(mutex_);
  return doubt_ ? static_cast<unsigned>((*doubt_)() % 8) : 7;
}

std::vector<bool> FakeIndex::UpsertMany(const std::vector<Wish>& wishes) {
  std::vector<bool> done;
  for (const auto& [path, need_meta] : wishes) {
    const unsigned doubt = Doubt();
    try {
      if (doubt > 0) Upsert(path, need_meta);
      done.push_back(doubt > 1);
    } catch (const std::exception&) {
      Unrecord("upsert " + path + (need_meta ? " content" : ""));
      done.push_back(false);
    }
  }
  return done;
}

void FakeIndex::SetAttributes(const std::string& path) {
  Enter("attributes " + path, true);
  const Place place = Parse(path, false);
  const std::lock_guard<std::mutex> lock(mutex_);
  Document& document = documents_[path];
  document.path = path;
  document.is_dir = place.kind != PlaceKind::kFile;
  document.attribute_stamp = place.attribute_stamp;
}

void FakeIndex::Delete(const std::string& path) {
  Enter("delete " + path, true);
  const std::lock_guard<std::mutex> lock(mutex_);
  documents_.erase(path);
}

void FakeIndex::DeleteBelow(const std::string& dir) {
  Enter("delete below " + dir, true);
  const std::lock_guard<std::mutex> lock(mutex_);
  std::erase_if(documents_,
                [&](const auto& entry) { return StringStartWith(entry.first, dir + "/"); });
}

void FakeIndex::Rename(const std::string& new_path, const std::string& old_path) {
  Enter("rename " + old_path + " " + new_path, true);
  const std::lock_guard<std::mutex> lock(mutex_);
  Documents moved;
  for (auto it = documents_.begin(); it != documents_.end();) {
    if (it->first == old_path || StringStartWith(it->first, old_path + "/")) {
      Document document = it->second;
      document.path = new_path + it->first.substr(old_path.size());
      moved[document.path] = document;
      it = documents_.erase(it);
    } else {
      ++it;
    }
  }
  for (auto& [path, document] : moved) documents_[path] = document;
}

std::optional<Document> FakeIndex::Find(const std::string& path) {
  Enter("find " + path, false);
  const std::lock_guard<std::mutex> lock(mutex_);
  const auto found = documents_.find(path);
  if (found == documents_.end()) return std::nullopt;
  return found->second;
}

std::vector<Document> FakeIndex::Children(const std::string& dir, const std::string& after,
                                          std::size_t limit) {
  Enter("children " + dir, false);
  const std::lock_guard<std::mutex> lock(mutex_);
  std::vector<Document> children;
  for (const auto& [path, document] : documents_) {
    if (path > after && StringStartWith(path, dir + "/") && Dirname(path) == dir &&
        children.size() < limit) {
      children.push_back(document);
    }
  }
  return children;
}

std::vector<std::string> FakeIndex::PathsBelow(const std::string& dir, const std::string& after,
                                               std::size_t limit) {
  Enter("paths below " + dir, false);
  const std::lock_guard<std::mutex> lock(mutex_);
  std::vector<std::string> paths;
  for (const auto& [path, document] : documents_) {
    if (path > after && StringStartWith(path, dir + "/") && paths.size() < limit) {
      paths.push_back(path);
    }
  }
  return paths;
}

bool FakeIndex::CanRead() {
  const std::lock_guard<std::mutex> lock(mutex_);
  return reader_runs_;
}

}  // namespace quarry::fileindexd
