// Processes that work on the same files at the same time, and what they tell each other.
//
// The tests here do a bounded amount of work, a few seconds' worth. QUARRY_TEST_EFFORT=20 in the
// environment makes it twenty times as much.

#ifndef QUARRY_TESTS_FILEINDEX_CONCURRENCY_PROCESSES_H_
#define QUARRY_TESTS_FILEINDEX_CONCURRENCY_PROCESSES_H_

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <exception>
#include <functional>
#include <memory>
#include <new>
#include <random>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "common/error.h"
#include "tests/fake_platform/fake_platform.h"
#include "tests/fake_platform/system_calls.h"
#include "tests/fileindex/index_daemon.h"
#include "tests/support/files.h"

namespace quarry::test {

// How often the usual amount of work is to be done.
inline int Effort() {
  const char* text = std::getenv("QUARRY_TEST_EFFORT");
  return text == nullptr ? 1 : std::clamp(std::atoi(text), 1, 1000);
}

// An object that all processes see which are forked after it was made.
template <typename T>
class Shared {
 public:
  Shared()
      : place_(
            mmap(nullptr, sizeof(T), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0)) {
    if (place_ == MAP_FAILED) throw std::runtime_error("no shared memory");
    object_ = new (place_) T();
  }
  ~Shared() {
    object_->~T();
    munmap(place_, sizeof(T));
  }
  Shared(const Shared&) = delete;
  Shared& operator=(const Shared&) = delete;

  T* operator->() const { return object_; }
  T& operator*() const { return *object_; }

 private:
  void* place_;
  T* object_;
};

// The first complaint of any process, which ends them all.
class Complaints {
 public:
  void Add(const std::string& text) {
    if (taken_.exchange(true)) return;
    text_[text.copy(text_.data(), text_.size() - 1)] = '\0';
    written_ = true;
  }
  bool Any() const { return taken_; }
  std::string Text() const { return written_ ? text_.data() : taken_ ? "complaint cut short" : ""; }

 private:
  std::atomic<bool> taken_{false};
  std::atomic<bool> written_{false};
  std::array<char, 2000> text_{};
};

// The library's pauses, which the stand-in platform leaves out, at a hundredth of their length.
// Without any, all attempts at a lock would be over before its holder has had a turn; and with
// shorter ones those who wait would take a busy machine's time from the one they wait for.
inline void PauseBriefly() {
  fake::OnSleep([](std::chrono::microseconds length) {
    const timespec brief{0, static_cast<long>(length.count()) * 10};
    clock_nanosleep(CLOCK_MONOTONIC, 0, &brief, nullptr);
  });
}

// Ends this process by SIGKILL just before the nth system call from now on that reads or changes a
// file. Attempts at a lock do not count, else one who waits for long would die before its turn.
inline void DieAtCall(int nth) {
  const auto left = std::make_shared<int>(nth);
  const auto count = [left] {
    if (--*left <= 0) raise(SIGKILL);
  };
  for (const char* call : {"read", "write", "fsync", "rename", "chmod", "fchmod", "unlink"}) {
    fake::OnSystemCall(call, count);
  }
}

// Runs one step, again and again while it fails for want of a lock, as callers do.
inline void DoLocked(const std::function<void()>& step) {
  for (;;) {
    try {
      return step();
    } catch (const Error& error) {
      if (error.code() != 506 || error.reason().rfind("Exceed max retry", 0) != 0) throw;
    }
  }
}

// The processes of one test. Each stands in a slot of its own; when it was killed, another may take
// the slot. None outlives this object, nor the test program.
class Crew {
 public:
  using Work = std::function<void(std::mt19937& random)>;

  explicit Crew(Complaints& complaints) : complaints_(complaints) {}
  ~Crew() {
    for (const Member& member : members_) {
      if (member.pid == 0) continue;
      kill(member.pid, SIGKILL);
      waitpid(member.pid, nullptr, 0);
    }
  }
  Crew(const Crew&) = delete;
  Crew& operator=(const Crew&) = delete;

  // Starts a process that does `work` and ends. Returns its slot.
  size_t Start(Work work) {
    members_.push_back({std::move(work), 0, 0});
    Fork(members_.back());
    return members_.size() - 1;
  }

  // Until the processes of these slots have done their work. Those that were killed are followed by
  // another of the same slot.
  void Finish(const std::vector<size_t>& slots) {
    const auto is_busy = [this](size_t slot) { return members_[slot].pid != 0; };
    while (std::any_of(slots.begin(), slots.end(), is_busy)) ReapOne();
  }

  // How many processes of these slots were killed.
  int Killed(const std::vector<size_t>& slots) const {
    int killed = 0;
    for (const size_t slot : slots) killed += static_cast<int>(members_[slot].started) - 1;
    return killed;
  }

 private:
  struct Member {
    Work work;
    pid_t pid;
    unsigned int started;
  };

  void ReapOne() {
    int status = 0;
    const pid_t pid = waitpid(-1, &status, 0);
    const auto member = std::find_if(members_.begin(), members_.end(),
                                     [pid](const Member& m) { return m.pid == pid; });
    if (pid <= 0 || member == members_.end()) throw std::runtime_error("waitpid");
    member->pid = 0;
    if (WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) {
      Fork(*member);
    } else if (status != 0) {
      complaints_.Add("a process ended with status " + std::to_string(status));
    }
  }

  void Fork(Member& member) {
    const auto slot = static_cast<unsigned int>(&member - members_.data());
    const unsigned int seed = slot * 10000U + member.started++;
    const pid_t parent = getpid();
    member.pid = fork();
    if (member.pid < 0) throw std::runtime_error("fork");
    if (member.pid > 0) return;
    // Not even a test program that is killed leaves it behind.
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    if (getppid() == parent) Run(member.work, seed);
    _exit(0);
  }

  void Run(const Work& work, unsigned int seed) const {
    try {
      srand(seed);  // else all would pause for the same time
      PauseBriefly();
      fake::SkipSync();
      std::mt19937 random(seed);
      work(random);
    } catch (const std::exception& error) {
      complaints_.Add(std::string("unexpected: ") + error.what());
    }
  }

  Complaints& complaints_;
  std::vector<Member> members_;
};

// A number from `from` up to and including `to`.
inline int Draw(std::mt19937& random, int from, int to) {
  return std::uniform_int_distribution<int>(from, to)(random);
}

// What a process has recorded of its own calls would grow for as long as it works.
inline void ForgetRecords() {
  fake::ClearCalls();
  fake::ClearRequests();
  fake::ClearLogs();
}

// An index daemon in a process of its own, until `stop`.
inline void ServeAsDaemon(const std::atomic<bool>& stop, std::atomic<bool>& ready,
                          std::function<void(const Json::Value&)> on_command = nullptr) {
  const IndexDaemon daemon(std::move(on_command));
  ready = true;
  WaitUntil([&stop] { return stop.load(); }, std::chrono::hours(1));
}

}  // namespace quarry::test

#endif  // QUARRY_TESTS_FILEINDEX_CONCURRENCY_PROCESSES_H_
