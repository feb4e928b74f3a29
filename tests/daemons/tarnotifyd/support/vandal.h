// Random changes of a directory tree.

#ifndef QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_VANDAL_H_
#define QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_VANDAL_H_

#include <random>
#include <string>

namespace quarry::test {

// Does this and that to a tree, and to a place beside it with which it exchanges things. Both
// places are on one file system. Now and then something is called "@eaDir".
class Vandal {
 public:
  Vandal(const std::string& inside, const std::string& outside, unsigned seed)
      : inside_(inside), outside_(outside), random_(seed) {}

  void DoOne();

 private:
  unsigned Below(unsigned end) { return static_cast<unsigned>(random_() % end); }
  std::string AnyName();
  std::string AnyPath();
  std::string Outside() { return outside_ + "/" + std::to_string(Below(4)); }
  void Move(const std::string& path);
  void Create(const std::string& path);
  void MakeNest(const std::string& path);
  void Replace(const std::string& path);

  const std::string inside_;
  const std::string outside_;
  std::mt19937 random_;
};

}  // namespace quarry::test

#endif  // QUARRY_TESTS_DAEMONS_TARNOTIFYD_SUPPORT_VANDAL_H_
