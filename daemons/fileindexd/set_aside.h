// What passes fail at again and again, so that it does not hold up the rest of its share for ever.

#ifndef QUARRY_DAEMONS_FILEINDEXD_SET_ASIDE_H_
#define QUARRY_DAEMONS_FILEINDEXD_SET_ASIDE_H_

#include <json/json.h>

#include <chrono>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <utility>

namespace quarry::fileindexd {

// Pieces of work are named for people: "/v/s/a.txt" for a document, "/v/s/a.txt (removal)" for
// removing it, "/v/s/d/" for comparing a directory, "/v/s/a -> /v/s/b" for a move. One at which
// several passes have failed, and whose own fault that may be, is set aside: it is left out until
// GiveAnotherChance(). All members may be called from any thread; BeginPass() to Failed() belong to
// one pass at a time.
class SetAside {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;
  using Clock = std::function<TimePoint()>;

  struct Work {
    std::string name;
    std::string error;  // for people
  };

  explicit SetAside(Clock clock = std::chrono::steady_clock::now) : clock_(std::move(clock)) {}

  // A pass begins. `can_read`: the reader of files runs, so that it is some file's fault when it
  // does not run any longer.
  void BeginPass(bool can_read);
  // Whether that piece of work is set aside.
  bool Has(const std::string& name) const;
  // Does the work unless it is set aside. Throws what the work throws.
  void Try(const std::string& name, const std::function<void()>& work);
  // The document of that path, and with `below` all below it, is gone, and its troubles with it.
  void Forget(const std::string& path, bool below);
  // The pass is over. After a failure returns what was set aside for it.
  void Succeeded();
  std::optional<Work> Failed();

  // Whether the last passes failed at something. With one piece of work at a time the next failure
  // shows which it is.
  bool IsSearching() const;
  bool IsEmpty() const;
  // Whether what is set aside has waited long enough.
  bool IsDue() const;
  // Everything is tried again, and at its next failure set aside again.
  void GiveAnotherChance();

  // An array of {"path": name, "error"}, in ascending order.
  Json::Value Report() const;

 private:
  struct Trouble {
    int passes = 0;  // that failed at it
    bool aside = false;
    std::string error;
  };

  void Blame(const std::string& name, const std::string& error);
  bool MakeRoom();

  const Clock clock_;
  mutable std::mutex mutex_;
  bool can_read_ = false;
  std::optional<Work> blamed_;  // the first failure of this pass
  std::map<std::string, Trouble> troubles_;
  TimePoint due_{};
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_DAEMONS_FILEINDEXD_SET_ASIDE_H_
