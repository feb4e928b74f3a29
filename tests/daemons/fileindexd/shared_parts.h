// Parts that outlive the worker that they are given to, so that a test can look at them.

#ifndef QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARED_PARTS_H_
#define QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARED_PARTS_H_

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "daemons/fileindexd/worker.h"
#include "tests/daemons/fileindexd/fake_disk.h"
#include "tests/daemons/fileindexd/fake_host.h"
#include "tests/daemons/fileindexd/fake_index.h"

namespace quarry::fileindexd {

class SharedIndex : public Index {
 public:
  explicit SharedIndex(Index& index) : index_(index) {}

  std::string Epoch() override { return index_.Epoch(); }
  void Create() override { index_.Create(); }
  void Commit() override { index_.Commit(); }
  std::uint64_t Count() override { return index_.Count(); }
  void Upsert(const std::string& path, bool need_meta) override { index_.Upsert(path, need_meta); }
  std::vector<bool> UpsertMany(const std::vector<Wish>& wishes) override {
    return index_.UpsertMany(wishes);
  }
  void SetAttributes(const std::string& path) override { index_.SetAttributes(path); }
  void Delete(const std::string& path) override { index_.Delete(path); }
  void DeleteBelow(const std::string& dir) override { index_.DeleteBelow(dir); }
  void Rename(const std::string& new_path, const std::string& old_path) override {
    index_.Rename(new_path, old_path);
  }
  std::optional<Document> Find(const std::string& path) override { return index_.Find(path); }
  std::vector<Document> Children(const std::string& dir, const std::string& after,
                                 std::size_t limit) override {
    return index_.Children(dir, after, limit);
  }
  std::vector<std::string> PathsBelow(const std::string& dir, const std::string& after,
                                      std::size_t limit) override {
    return index_.PathsBelow(dir, after, limit);
  }
  bool CanRead() override { return index_.CanRead(); }

 private:
  Index& index_;
};

class SharedFiles : public FileSystem {
 public:
  explicit SharedFiles(FileSystem& files) : files_(files) {}

  Place Look(const std::string& base, const std::string& path) override {
    return files_.Look(base, path);
  }
  Place Peek(const std::string& path) override { return files_.Peek(path); }
  PlaceKind List(const std::string& dir, std::vector<std::string>& names) override {
    return files_.List(dir, names);
  }
  Identity Identify(const std::string& dir) override { return files_.Identify(dir); }

 private:
  FileSystem& files_;
};

// What a worker of the share "s" needs; all of it stays the caller's.
inline std::unique_ptr<Worker> MakeWorker(HostState& host, FakeIndex& index, FakeDisk& disk,
                                          Slots& slots, bool full_speed = false) {
  WorkerParts parts;
  parts.full_speed = full_speed;
  parts.host = std::make_unique<FakeHost>(host);
  parts.index = std::make_unique<SharedIndex>(index);
  parts.files = std::make_unique<SharedFiles>(disk);
  parts.slots = &slots;
  return std::make_unique<Worker>("s", std::move(parts));
}

}  // namespace quarry::fileindexd

#endif  // QUARRY_TESTS_DAEMONS_FILEINDEXD_SHARED_PARTS_H_
