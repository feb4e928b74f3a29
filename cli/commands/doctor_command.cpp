#include <algorithm>
#include <iostream>
#include <memory>

#include "cli/commands/commands.h"
#include "cli/doctor/checks.h"
#include "cli/layout.h"
#include "cli/moving_line.h"
#include "cli/output.h"
#include "cli/problem.h"

namespace quarry::cli {
namespace {

const char* Name(Outcome outcome) {
  switch (outcome) {
    case Outcome::kMended:
      return "mended";
    case Outcome::kMendable:
      return "found";
    case Outcome::kLeft:
      return "left";
    case Outcome::kNote:
      return "note";
  }
  return "";
}

Json::Value Report(const Examination& examination) {
  Json::Value report;
  report["well"] = examination.IsWell();
  report["findings"] = Json::Value(Json::arrayValue);
  for (const Finding& finding : examination.findings()) {
    Json::Value entry;
    entry["outcome"] = Name(finding.outcome);
    entry["trouble"] = finding.trouble;
    entry["remedy"] = finding.remedy;
    report["findings"].append(entry);
  }
  return report;
}

std::string Line(const Finding& finding) {
  switch (finding.outcome) {
    case Outcome::kMended:
      return "mended: " + finding.trouble + ". Done: " + finding.remedy;
    case Outcome::kMendable:
      return "found:  " + finding.trouble +
             ". To be mended by \"quarry doctor\": " + finding.remedy;
    case Outcome::kLeft:
      return "left:   " + finding.trouble + ". " + finding.remedy;
    case Outcome::kNote:
      return "note:   " + finding.trouble + ". " + finding.remedy;
  }
  return "";
}

std::string Summary(const Examination& examination) {
  const auto& all = examination.findings();
  const auto left = std::count_if(all.begin(), all.end(), [](const Finding& finding) {
    return finding.outcome == Outcome::kLeft || finding.outcome == Outcome::kMendable;
  });
  if (left > 0) return "Still wrong: " + std::to_string(left) + ".";
  const bool mended = std::any_of(all.begin(), all.end(), [](const Finding& finding) {
    return finding.outcome == Outcome::kMended;
  });
  return mended ? "All is well again." : "All is well.";
}

void Print(const Examination& examination) {
  for (const Finding& finding : examination.findings()) {
    std::cout << Printable(Line(finding)) << '\n';
  }
  std::cout << Summary(examination) << '\n';
}

void Examine(bool check, bool json) {
  EnsureLayout();
  auto line = std::make_unique<MovingLine>();
  Examination examination(!check, [&](const std::string& what) { line->Show(Printable(what)); });
  ExamineSystem(examination);
  line.reset();
  if (json) {
    PrintJson(std::cout, Report(examination));
  } else {
    Print(examination);
  }
  if (!examination.IsWell()) throw Unwell();
}

}  // namespace

void AddDoctorCommand(CLI::App& app) {
  CLI::App* command = app.add_subcommand(
      "doctor", "Find what is damaged, mend what can be mended, and say what to do about the rest");
  auto check = std::make_shared<bool>(false);
  command->add_flag("--check", *check, "Change nothing, only look");
  const bool& json = JsonOption(*command);
  Examples(*command,
           "  quarry doctor          mend\n"
           "  quarry doctor --check  only look\n"
           "No file is deleted that might hold anything: damaged ones get another name, which ends "
           "in\n\".damaged-\" and the time. An index that is damaged is made anew from the files.\n"
           "The exit code is 0 when all is well in the end, else 1.");
  command->callback([check, &json] { Examine(*check, json); });
}

}  // namespace quarry::cli
