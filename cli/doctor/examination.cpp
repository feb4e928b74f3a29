#include "cli/doctor/examination.h"

#include <algorithm>
#include <exception>
#include <utility>

#include "cli/problem.h"
#include "common/error.h"
#include "daemons/common/log.h"

namespace quarry::cli {
namespace {

// Runs `action`. Returns why it failed, "" when it did not.
std::string FailureOf(const std::function<void()>& action) {
  try {
    action();
    return "";
  } catch (const Error& error) {
    return Explain(error);
  } catch (const std::exception& failure) {
    return failure.what();
  }
}

}  // namespace

Examination::Examination(bool mends, std::function<void(const std::string&)> show)
    : mends_(mends), show_(std::move(show)) {}

void Examination::Part(const std::string& subject,
                       const std::function<void(Examination&)>& examine) {
  show_("Looking at " + subject);
  const std::string failure = FailureOf([&] { examine(*this); });
  if (!failure.empty()) Leave("Could not look at " + subject, failure);
}

void Examination::Mend(const std::string& trouble, const std::string& remedy, const Mending& mend) {
  if (!mends_) {
    findings_.push_back({Outcome::kMendable, trouble, remedy});
    return;
  }
  show_("Mending: " + trouble);
  std::string done;
  const std::string failure = FailureOf([&] { done = mend(); });
  if (!failure.empty()) {
    Leave(trouble, "This could not be mended: " + failure);
    return;
  }
  if (done.empty()) done = remedy;
  daemon::LogWarning("Doctor: " + trouble + ". Mended: " + done);
  findings_.push_back({Outcome::kMended, trouble, done});
}

void Examination::Leave(const std::string& trouble, const std::string& remedy) {
  if (mends_) daemon::LogError("Doctor: " + trouble + ". " + remedy);
  findings_.push_back({Outcome::kLeft, trouble, remedy});
}

void Examination::Note(const std::string& trouble, const std::string& remedy) {
  findings_.push_back({Outcome::kNote, trouble, remedy});
}

bool Examination::IsWell() const {
  return std::none_of(findings_.begin(), findings_.end(), [](const Finding& finding) {
    return finding.outcome == Outcome::kLeft || finding.outcome == Outcome::kMendable;
  });
}

}  // namespace quarry::cli
