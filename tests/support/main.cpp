// The entry of every test program.
//
// Fixed paths are computed while static objects are made, so the private root must be in the
// environment before: the program makes the root, then starts itself again in the same process.

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <string>

#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace {

constexpr char kOwnerVariable[] = "QUARRY_TEST_ROOT_OWNER";

// "pid:descriptor:root" of the program that made the root; a program that it starts inherits the
// variable, finds another pid in it, and shares the root without removing it.
struct RootOwner {
  pid_t pid = 0;
  int alive_fd = -1;
  std::string root;
};

RootOwner ReadOwner() {
  RootOwner owner;
  const char* text = std::getenv(kOwnerVariable);
  if (text == nullptr) return owner;
  int consumed = 0;
  if (std::sscanf(text, "%d:%d:%n", &owner.pid, &owner.alive_fd, &consumed) != 2) return owner;
  owner.root = text + consumed;
  return owner;
}

[[noreturn]] void Die(const char* what) {
  std::perror(what);
  std::_Exit(70);
}

// Waits in a process of its own, a child of nobody here, until the program has ended however it
// did, and removes what a crash would leave behind.
void StartSweeper(const std::string& root, int alive_read, int alive_write) {
  const pid_t child = fork();
  if (child < 0) Die("fork");
  if (child > 0) {
    int status = 0;
    waitpid(child, &status, 0);
    return;
  }
  if (fork() != 0) std::_Exit(0);
  setsid();
  close(alive_write);
  const int null = open("/dev/null", O_RDWR);
  for (int fd = 0; fd < 3; ++fd) dup2(null, fd);
  char byte = 0;
  while (read(alive_read, &byte, 1) < 0 && errno == EINTR) {
  }
  quarry::test::RemoveTree(root);
  std::_Exit(0);
}

// Does not return.
[[noreturn]] void RestartWithRoot(char** argv) {
  std::string root =
      (std::filesystem::canonical(std::filesystem::temp_directory_path()) / "quarry-root-XXXXXX")
          .string();
  int alive[2];
  if (mkdtemp(root.data()) == nullptr || pipe(alive) != 0) Die("private root");
  StartSweeper(root, alive[0], alive[1]);
  close(alive[0]);
  const std::string owner = std::to_string(getpid()) + ":" + std::to_string(alive[1]) + ":" + root;
  setenv("QUARRY_ROOT", root.c_str(), 1);
  setenv(kOwnerVariable, owner.c_str(), 1);
  execv("/proc/self/exe", argv);
  Die("/proc/self/exe");
}

// What each open descriptor of the process leads to.
std::map<int, std::string> OpenDescriptors() {
  std::map<int, std::string> open_now;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    const auto target = std::filesystem::read_symlink(entry.path(), error);
    open_now[std::stoi(entry.path().filename().string())] = error ? "" : target.string();
  }
  // The listing itself held one open.
  for (auto it = open_now.begin(); it != open_now.end();) {
    it = fcntl(it->first, F_GETFD) < 0 ? open_now.erase(it) : std::next(it);
  }
  return open_now;
}

class DescriptorLeakCheck : public ::testing::EmptyTestEventListener {
 public:
  void OnTestStart(const ::testing::TestInfo&) override { before_ = OpenDescriptors(); }

  void OnTestEnd(const ::testing::TestInfo&) override {
    for (const auto& [fd, target] : OpenDescriptors()) {
      if (before_.count(fd) == 0) {
        ADD_FAILURE() << "descriptor " << fd << " was left open on " << target;
      }
    }
  }

 private:
  std::map<int, std::string> before_;
};

bool ListsOnly(int argc, char** argv) {
  for (int i = 1; i < argc; ++i) {
    if (std::strncmp(argv[i], "--gtest_list_tests", 18) == 0) return true;
  }
  return false;
}

}  // namespace

int main(int argc, char** argv) {
  const RootOwner owner = ReadOwner();
  const char* root = std::getenv("QUARRY_ROOT");
  const bool ready = !owner.root.empty() && root != nullptr && owner.root == root;
  if (!ready && !ListsOnly(argc, argv)) RestartWithRoot(argv);

  const bool owns_root = ready && owner.pid == getpid();
  if (owns_root) {
    fcntl(owner.alive_fd, F_SETFD, FD_CLOEXEC);
    quarry::test::ResetTestRoot();
  }
  ::testing::InitGoogleMock(&argc, argv);
  ::testing::UnitTest::GetInstance()->listeners().Append(new DescriptorLeakCheck);
  const int result = RUN_ALL_TESTS();
  if (owns_root) quarry::test::RemoveTree(owner.root);
  return result;
}
