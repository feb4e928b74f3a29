// One index, open and in use by several threads.

#ifndef QUARRY_DAEMONS_TARNELASTICD_INDEX_H_
#define QUARRY_DAEMONS_TARNELASTICD_INDEX_H_

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <shared_mutex>
#include <string>

#include "common/error.h"
#include "daemons/tarnelasticd/engine_error.h"
#include "daemons/tarnelasticd/index_reader.h"
#include "daemons/tarnelasticd/index_writer.h"
#include "daemons/tarnelasticd/schema.h"

namespace quarry::engine {

// Any thread. Writers of one index wait for each other; readers wait for nobody but for who
// replaces or moves the database.
class Index {
 public:
  // `on_lost` is called, from any thread, when work that was not committed has been undone.
  Index(std::string directory, bool paused, WriterLimits limits, std::function<void()> on_lost);
  Index(const Index&) = delete;
  Index& operator=(const Index&) = delete;

  // Keeps the database open as long as it lives: replacing or moving it waits.
  class Access {
   public:
    // Throws the Error that keeps the database from being open: kDamagedIndex when it is not
    // sound. What may have passed since the last try, as a want of memory, is tried again. A
    // database that is being replaced or moved is waited for, or, without `wait`, Error
    // kMovingIndex.
    explicit Access(Index* index, bool wait = true);

    const std::shared_ptr<const Schema>& schema() const;
    ReaderPool::Lease TakeReader();

    // Runs `action` with the writer to itself. Throws Error kPausedIndex when the index takes no
    // writes.
    template <typename Action>
    auto Write(Action action) {
      return index_->UseWriter(/*paused_too=*/false, action);
    }
    // The same for what changes nothing that was not there.
    template <typename Action>
    auto UseWriter(Action action) {
      return index_->UseWriter(/*paused_too=*/true, action);
    }

   private:
    void Lock(bool wait);

    Index* index_;
    std::shared_lock<std::shared_mutex> lock_;
  };

  // Opens the database. Where that fails the log says why, and every Access. Opening what is open
  // already does nothing.
  void Open();
  // Whether the database is unsound or missing, as far as is known; the other reasons for which it
  // may not be open can pass.
  bool IsDamaged();
  // Remembers that the database turned out to be damaged. Logs it. Other errors are ignored.
  void NoteDamage(const Error& error);

  // Replaces the database, sound or not, by an empty one.
  void Recreate(const Schema& schema);
  // Gives a sound database other mappings; its documents stay.
  void Remap(const Schema& schema);
  // Closes the database for good and removes it.
  void Remove();
  // Moves the database to another directory, which holds none. All is committed before. `begin` is
  // called before anything moves, `abandon` when moving has failed and the database is where it
  // was, `end` once it has moved; what they throw is passed on. A database that is damaged moves as
  // it is, and where there is none only the directory's name changes.
  struct MoveSteps {
    std::function<void()> begin;
    std::function<void()> abandon;
    std::function<void()> end;
  };
  void Move(const std::string& to, const MoveSteps& steps);

  void Commit();
  // Commits what has been open for too long. Does not wait for a writer that is at work.
  void CommitIfOld();
  // Commits, then refuses writes until Resume(). Where no database is open there is nothing to
  // commit.
  void Pause();
  void Resume() { paused_ = false; }

  bool paused() const { return paused_; }
  // Documents, uncommitted ones included; 0 while there is no sound database.
  std::int64_t documents();
  // Why the database cannot be used, or nothing.
  std::optional<Error> Problem();
  std::string directory();

 private:
  struct Store {
    std::shared_ptr<const Schema> schema;
    std::unique_ptr<IndexWriter> writer;
    std::unique_ptr<ReaderPool> readers;
  };

  struct Reopen;
  // Whatever becomes of what the writer does, its loss is known afterwards.
  struct ReportLost {
    Index* index;
    ~ReportLost() { index->CheckLost(); }
  };

  template <typename Action>
  auto UseWriter(bool paused_too, Action action);
  void CheckLost();
  void CloseCommitted();
  void OpenLocked();
  void SetProblem(std::optional<Error> problem);
  // The problem, or one of that code where the database has not been opened yet.
  Error ProblemOr(int code);
  void CopyDocuments(const Schema& schema, const std::string& database_path);

  const WriterLimits limits_;
  const std::function<void()> on_lost_;
  std::atomic<bool> paused_;

  // Shared by those who use the store, exclusive for those who replace it. Taken before
  // writer_mutex_.
  std::shared_mutex gate_;
  std::mutex writer_mutex_;
  std::string directory_;         // guarded by gate_
  std::unique_ptr<Store> store_;  // guarded by gate_; its writer by writer_mutex_
  std::mutex problem_mutex_;
  std::optional<Error> problem_;  // guarded by problem_mutex_
};

template <typename Action>
auto Index::UseWriter(bool paused_too, Action action) {
  // The next one gets the writer before this one does what has been left beside it.
  struct Afterwards {
    IndexWriter* writer;
    ~Afterwards() { writer->RunSideWork(); }
  } afterwards{store_->writer.get()};
  const std::lock_guard<std::mutex> lock(writer_mutex_);
  if (paused_ && !paused_too) throw Error(kPausedIndex, "The index is paused");
  const ReportLost report{this};
  return action(*store_->writer);
}

}  // namespace quarry::engine

#endif  // QUARRY_DAEMONS_TARNELASTICD_INDEX_H_
