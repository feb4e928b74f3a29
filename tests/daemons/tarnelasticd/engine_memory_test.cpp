// What becomes of an index when there is no memory for a moment, whatever it was doing then.

#include <atomic>
#include <cstddef>
#include <cstdlib>
#include <functional>
#include <memory>
#include <new>
#include <set>
#include <utility>

#include "common/json.h"
#include "daemons/tarnelasticd/side_work.h"
#include "tests/daemons/tarnelasticd/support/engine_fixture.h"
#include "tests/support/files.h"

namespace {

// Of this thread: so many allocations succeed, then so many fail.
thread_local long succeeding = 0;
thread_local long failing = 0;

void* AllocateOrNull(std::size_t size) noexcept {
  if (succeeding > 0) {
    --succeeding;
  } else if (failing > 0) {
    --failing;
    return nullptr;
  }
  return std::malloc(size == 0 ? 1 : size);
}

void* Allocate(std::size_t size) {
  void* const given = AllocateOrNull(size);
  if (given == nullptr) throw std::bad_alloc();
  return given;
}

}  // namespace

// Not inlined, or compilers see memory of one kind given back as another.
[[gnu::noinline]] void* operator new(std::size_t size) {
  return Allocate(size);
}
[[gnu::noinline]] void* operator new[](std::size_t size) {
  return Allocate(size);
}
[[gnu::noinline]] void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
  return AllocateOrNull(size);
}
[[gnu::noinline]] void* operator new[](std::size_t size, const std::nothrow_t&) noexcept {
  return AllocateOrNull(size);
}
[[gnu::noinline]] void operator delete(void* memory) noexcept {
  std::free(memory);
}
[[gnu::noinline]] void operator delete[](void* memory) noexcept {
  std::free(memory);
}
[[gnu::noinline]] void operator delete(void* memory, std::size_t) noexcept {
  std::free(memory);
}
[[gnu::noinline]] void operator delete[](void* memory, std::size_t) noexcept {
  std::free(memory);
}

namespace quarry::engine {
namespace {

class MemoryTest : public EngineTest {
 protected:
  MemoryTest() { UseAge(std::chrono::hours(1)); }

  void UseAge(std::chrono::steady_clock::duration age) {
    options_.writer.commit_age = age;
    Restart();
    Create();
  }
  std::string Epoch() { return Ask("engine_status", Json::objectValue)["epoch"].asString(); }
  std::size_t Documents() {
    return Ask("engine_status", Json::objectValue)["indexes"][0]["documents"].asUInt();
  }

  // Runs `action` without memory for `count` allocations behind the first `after`. Returns whether
  // it has asked for as many.
  static bool RunFailing(long after, long count, const std::function<void()>& action) {
    succeeding = after;
    failing = count;
    action();
    succeeding = 0;
    return std::exchange(failing, 0) < count;
  }

  // Calls action(name) after storing a document of that name, with each of its allocations failing
  // in turn, by itself and with some behind it: all that was stored is found after the next commit,
  // or was said to be lost.
  void ExpectNothingLostUntold(const std::function<void(const std::string&)>& action) {
    for (const long count : {1L, 2L, 3L, 9L}) {
      long after = 0;
      while (FailOnce(after, count, action)) ++after;
      EXPECT_GT(after, 0);
    }
    ExpectWhatIsKept();
  }

  // Returns whether anything has failed.
  bool FailOnce(long after, long count, const std::function<void(const std::string&)>& action) {
    const std::string name = "word" + std::to_string(tries_++);
    const std::string before = Epoch();
    Upsert(FileDocument("/s/" + name, "alpha " + name));
    const bool has_failed = RunFailing(after, count, [&] { action(name); });
    Commit();
    const bool is_kept = Epoch() == before;
    if (is_kept) expected_.insert("/s/" + name);
    EXPECT_EQ(Paths(name).size(), is_kept ? 1U : 0U) << name;
    EXPECT_EQ(Documents(), expected_.size()) << name;
    return has_failed && !HasFailure();
  }

  void ExpectWhatIsKept() {
    const std::vector<std::string> found = Below("/s/");
    EXPECT_EQ(std::set<std::string>(found.begin(), found.end()), expected_);
    Ask("index_check", Parse(R"({"id":"a"})"));
  }

  int tries_ = 0;
  std::set<std::string> expected_;
};

TEST_F(MemoryTest, CommittingAllLosesNothingUntold) {
  ExpectNothingLostUntold([this](const std::string&) { engine_->CommitAll(); });
}

// Waiting for each of them takes time, so several fail at once.
TEST_F(MemoryTest, EndingAnOldTransactionLosesNothingUntold) {
  UseAge(std::chrono::milliseconds(20));
  constexpr long kAtOnce = 9;
  for (long after = 0; after < 50 * kAtOnce; after += kAtOnce) {
    FailOnce(0, 0, [&](const std::string& name) {
      EXPECT_TRUE(test::WaitUntil([&] {
        return RunFailing(after, kAtOnce, [this] { engine_->Tick(); }) || !Paths(name).empty();
      }));
    });
  }
  ExpectWhatIsKept();
}

// Also where side work fails, which the commit finds out.
TEST_F(MemoryTest, RequestsLoseNothingUntold) {
  const std::string commit = R"({"command":"commit","data":{"id":"a"}})";
  ExpectNothingLostUntold([&](const std::string& name) {
    try {
      engine_->HandleText(toString(UpsertRequest("a", FileDocument("/s/" + name, "beta " + name))));
      engine_->HandleText(commit);
    } catch (const std::bad_alloc&) {
      // There was none for the answer either.
    }
  });
}

// Neither is anything begun that nobody can ask for, nor does it need a thread of its own.
TEST(SideWorkMemoryTest, LargeWorkIsDoneOnceOrRefused) {
  long after = 0;
  int refused = 0;
  for (bool has_failed = true; has_failed; ++after) {
    std::atomic<int> done{0};
    std::shared_ptr<SideWork::Task> task;
    {
      SideWork work;
      std::function<void()> run = [&done] { ++done; };
      succeeding = after;
      failing = 1;
      try {
        task = work.Add(SideWork::kLarge, std::move(run));
      } catch (const std::bad_alloc&) {
      }
      has_failed = std::exchange(failing, 0) == 0;
      succeeding = 0;
      if (task) work.Finish(task);
    }
    EXPECT_EQ(done, task ? 1 : 0);
    if (!task) ++refused;
  }
  EXPECT_GT(refused, 0);
  EXPECT_GT(after, refused + 1) << "No thread was refused";
}

}  // namespace
}  // namespace quarry::engine
