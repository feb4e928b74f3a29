// A share's surroundings that a test decides about.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_HOST_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_HOST_H_

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "common/error.h"
#include "daemons/fileindexd/share_host.h"

namespace quarry::fileindexd {

// What the share's surroundings are. Any thread.
class HostState {
 public:
  explicit HostState(const std::string& queue_path) : queue_path_(queue_path) {}

  void SetFolders(const std::vector<FolderRule>& folders) {
    const std::lock_guard<std::mutex> lock(mutex_);
    rules_ = std::make_shared<const FolderRules>(folders);
  }
  void SetRoot(const std::string& root) {
    const std::lock_guard<std::mutex> lock(mutex_);
    root_ = root;
  }
  // Loading fails from now on, or works again.
  void FailLoad(const std::optional<Error>& error) {
    const std::lock_guard<std::mutex> lock(mutex_);
    load_error_ = error;
  }
  void FailClear(const std::optional<Error>& error) {
    const std::lock_guard<std::mutex> lock(mutex_);
    clear_error_ = error;
  }
  void FailMark(const std::optional<Error>& error) {
    const std::lock_guard<std::mutex> lock(mutex_);
    mark_error_ = error;
  }
  void MarkNeedsReindex() {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (mark_error_) throw Error(*mark_error_);
    needs_reindex_ = true;
  }
  bool NeedsReindex() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return needs_reindex_;
  }
  void Clear() {
    const std::lock_guard<std::mutex> lock(mutex_);
    if (clear_error_) throw Error(*clear_error_);
    needs_reindex_ = false;
  }
  int Loads() const {
    const std::lock_guard<std::mutex> lock(mutex_);
    return loads_;
  }
  ShareLayout Load() {
    const std::lock_guard<std::mutex> lock(mutex_);
    ++loads_;
    if (load_error_) throw Error(*load_error_);
    return {root_, queue_path_, rules_};
  }

 private:
  mutable std::mutex mutex_;
  const std::string queue_path_;
  std::string root_ = "/v/s";
  std::shared_ptr<const FolderRules> rules_ =
      std::make_shared<const FolderRules>(std::vector<FolderRule>());
  std::optional<Error> load_error_;
  std::optional<Error> clear_error_;
  std::optional<Error> mark_error_;
  bool needs_reindex_ = false;
  int loads_ = 0;
};

class FakeHost : public ShareHost {
 public:
  // `state` outlives the host.
  explicit FakeHost(HostState& state) : state_(state) {}

  ShareLayout Load() override { return state_.Load(); }
  bool NeedsReindex() override { return state_.NeedsReindex(); }
  void MarkNeedsReindex() override { state_.MarkNeedsReindex(); }
  void ClearNeedsReindex() override { state_.Clear(); }
  bool IsInRecycleBin(const std::string&) override { return false; }
  bool CreateIndexIfWanted(const std::function<void()>& create) override {
    if (state_.Load().rules->folders().empty()) return false;
    create();
    return true;
  }

 private:
  HostState& state_;
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_HOST_H_
