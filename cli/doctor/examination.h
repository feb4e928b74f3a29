// What an examination of the system finds, and what becomes of it.

#ifndef QUARRY_CLI_DOCTOR_EXAMINATION_H_
#define QUARRY_CLI_DOCTOR_EXAMINATION_H_

#include <functional>
#include <string>
#include <vector>

namespace quarry::cli {

enum class Outcome {
  kMended,    // it was wrong and is right now
  kMendable,  // it is wrong, and only looking was asked for
  kLeft,      // it is wrong, and somebody has to do something about it
  kNote,      // nothing is wrong, but somebody may want to know
};

struct Finding {
  Outcome outcome;
  std::string trouble;
  std::string remedy;  // what was done, would be done or is to be done
};

// Collects findings. What is mended and what is left goes to the system log as well.
class Examination {
 public:
  // Returns what was done, "" for what was announced.
  using Mending = std::function<std::string()>;

  // `show` is told what is being looked at.
  explicit Examination(
      bool mends, std::function<void(const std::string&)> show = [](const std::string&) {});

  // Runs one part of the examination. What it throws is a finding, too.
  void Part(const std::string& subject, const std::function<void(Examination&)>& examine);

  // Trouble that `mend` ends; `remedy` announces it. Trouble that cannot be mended after all is
  // left.
  void Mend(const std::string& trouble, const std::string& remedy, const Mending& mend);
  void Leave(const std::string& trouble, const std::string& remedy);
  void Note(const std::string& trouble, const std::string& remedy);

  bool mends() const { return mends_; }
  const std::vector<Finding>& findings() const { return findings_; }
  // Whether nothing is wrong any more.
  bool IsWell() const;

 private:
  bool mends_;
  std::function<void(const std::string&)> show_;
  std::vector<Finding> findings_;
};

}  // namespace quarry::cli

#endif  // QUARRY_CLI_DOCTOR_EXAMINATION_H_
