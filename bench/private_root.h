// A private root for one benchmark program, removed when the program ends.
//
// Fixed paths are computed while static objects are made, so the program makes the root, then
// starts itself again in the same process with QUARRY_ROOT set.

#ifndef QUARRY_BENCH_PRIVATE_ROOT_H_
#define QUARRY_BENCH_PRIVATE_ROOT_H_

#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

namespace quarry::bench {

class PrivateRoot {
 public:
  // To be called first thing in main(); comes back in the program that has its root.
  explicit PrivateRoot(char** argv) {
    const char* made = std::getenv(kVariable);
    if (made == nullptr) Restart(argv);
    path_ = made;
    unsetenv(kVariable);
  }
  ~PrivateRoot() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  PrivateRoot(const PrivateRoot&) = delete;
  PrivateRoot& operator=(const PrivateRoot&) = delete;

  const std::string& path() const { return path_; }

  // Replaces a file below the root and makes its directories.
  void Write(const std::string& name, const std::string& text) const {
    const std::string path = path_ + "/" + name;
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path) << text;
  }

 private:
  static constexpr char kVariable[] = "QUARRY_BENCH_ROOT";

  [[noreturn]] static void Restart(char** argv) {
    std::string root = std::filesystem::temp_directory_path() / "quarry-bench-XXXXXX";
    if (mkdtemp(root.data()) == nullptr) std::abort();
    setenv("QUARRY_ROOT", root.c_str(), 1);
    setenv(kVariable, root.c_str(), 1);
    execv("/proc/self/exe", argv);
    std::abort();
  }

  std::string path_;
};

}  // namespace quarry::bench

#endif  // QUARRY_BENCH_PRIVATE_ROOT_H_
