// A search engine in memory that records what it is asked and fails where it is told to.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_INDEX_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_INDEX_H_

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <random>
#include <string>
#include <vector>

#include "daemons/fileindexd/index.h"
#include "tests/daemons/fileindexd/fake_disk.h"

namespace quarry::fileindexd {

// Reads files from a disk in memory. Any thread.
class FakeIndex : public Index {
 public:
  using Documents = std::map<std::string, Document>;

  explicit FakeIndex(FakeDisk& disk) : disk_(disk) {}

  // The commands so far that change something, such as "upsert /v/s/a content", and their number
  // with questions included.
  std::vector<std::string> Commands() const;
  std::size_t CallCount() const;
  void ForgetCommands();
  Documents All() const;
  void Put(const Document& document);

  // Called before each call is answered, without a lock; may throw what the call is to throw.
  using Hook = std::function<void(const std::string& command)>;
  void SetHook(Hook hook);

  // The engine dies and is started anew: what was not committed is gone.
  void Restart();
  void DeleteIndex();
  void SetReaderRunning(bool runs);
  void MakeDoubtful(unsigned seed);
  // Files of this path cannot be read, their attributes either.
  void MakeUnparsable(const std::string& path);
  // Only their content cannot.
  void MakeContentUnparsable(const std::string& path);

  std::string Epoch() override;
  void Create() override;
  void Commit() override;
  std::uint64_t Count() override;
  void Upsert(const std::string& path, bool need_meta) override;
  // One after the other, each recorded as an Upsert() is if it succeeds.
  // With MakeDoubtful() some are left out, and others done without a word of it.
  std::vector<bool> UpsertMany(const std::vector<Wish>& wishes) override;
  void SetAttributes(const std::string& path) override;
  void Delete(const std::string& path) override;
  void DeleteBelow(const std::string& dir) override;
  void Rename(const std::string& new_path, const std::string& old_path) override;
  std::optional<Document> Find(const std::string& path) override;
  std::vector<Document> Children(const std::string& dir, const std::string& after,
                                 std::size_t limit) override;
  std::vector<std::string> PathsBelow(const std::string& dir, const std::string& after,
                                      std::size_t limit) override;
  bool CanRead() override;

 private:
  void Enter(const std::string& command, bool changes);
  void Unrecord(const std::string& command);
  unsigned Doubt();
  Place Parse(const std::string& path, bool need_meta);

  FakeDisk& disk_;
  mutable std::mutex mutex_;
  Hook hook_;
  Documents documents_;
  Documents committed_;
  std::vector<std::string> commands_;
  std::size_t calls_ = 0;
  int epoch_ = 1;
  bool exists_ = true;
  bool reader_runs_ = true;
  std::optional<std::mt19937> doubt_;
  std::map<std::string, bool> unparsable_;  // whether attributes can be had
};

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_FAKE_INDEX_H_
