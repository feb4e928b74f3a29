#include "tests/system/running_system.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <csignal>
#include <filesystem>

#include "cli/system.h"
#include "common/file_util.h"
#include "common/json.h"
#include "daemons/common/client.h"
#include "tests/support/files.h"
#include "tests/support/root.h"

namespace quarry::test {
namespace {

constexpr int kPatience = 60'000;

}  // namespace

std::string RunningSystem::Program() {
  return Dirname(Dirname(RealPath("/proc/self/exe"))) + "/bin/quarry";
}

RunningSystem::RunningSystem() {
  ResetTestRoot();
}

void RunningSystem::StartSupervisor() {
  supervisor_.emplace(Program(), std::vector<std::string>{"run"}, scratch_ / "run.log");
}

void RunningSystem::Start() {
  StartSupervisor();
  ASSERT_TRUE(WaitUntil([] {
    return daemon::IsListening(cli::SupervisorSocket()) && daemon::IsListening(cli::EngineSocket());
  })) << ReadFile(scratch_ / "run.log");
}

void RunningSystem::Stop() {
  supervisor_->Signal(SIGTERM);
  EXPECT_TRUE(supervisor_->WaitEnded(kPatience));
  EXPECT_EQ(supervisor_->Ended().value_or("still running"), "exit code 0");
  supervisor_.reset();
}

void RunningSystem::Kill() {
  supervisor_->Signal(SIGKILL);
  EXPECT_TRUE(supervisor_->WaitEnded(kPatience));
  supervisor_.reset();
}

bool RunningSystem::StopMonitor() const {
  Json::Value monitor;
  monitor["service"] = "tarnotifyd";
  cli::AskSupervisor("stop", monitor);
  return WaitUntilIdle();
}

Ran RunningSystem::Quarry(const std::vector<std::string>& arguments) const {
  const std::string output = scratch_ / "output";
  Unlink(output);
  cli::Child child(Program(), arguments, output);
  if (!child.WaitEnded(kPatience)) return {ReadFile(output), "does not end"};
  return {ReadFile(output), *child.Ended()};
}

std::string RunningSystem::Run(const std::vector<std::string>& arguments) const {
  const Ran ran = Quarry(arguments);
  EXPECT_EQ(ran.end, "exit code 0") << ran.output;
  return ran.output;
}

void RunningSystem::KillQuarry(const std::vector<std::string>& arguments, int milliseconds) const {
  cli::Child child(Program(), arguments, scratch_ / "killed.log");
  if (!child.WaitEnded(milliseconds)) child.Signal(SIGKILL);
  EXPECT_TRUE(child.WaitEnded(kPatience));
}

std::ptrdiff_t RunningSystem::Registrations() const {
  const std::vector<std::string> names = ListDir(TestRoot() + "/var/lib/quarry/monitor");
  return std::count_if(names.begin(), names.end(), [](const std::string& name) {
    return std::filesystem::path(name).extension() == ".json";
  });
}

Json::Value RunningSystem::QuarryJson(std::vector<std::string> arguments) const {
  arguments.emplace_back("--json");
  const Ran ran = Quarry(arguments);
  EXPECT_EQ(ran.end, "exit code 0") << ran.output;
  Json::Value value;
  EXPECT_TRUE(fromString(value, ran.output)) << ran.output;
  return value;
}

void RunningSystem::IndexShare(const std::string& path) const {
  Run({"share", "add", path});
  Run({"folder", "add", "/" + Basename(path)});
  ASSERT_TRUE(WaitUntilIdle());
}

bool RunningSystem::IsIdle() const {
  const Ran ran = Quarry({"folder", "list", "--status", "--json"});
  Json::Value list;
  if (!fromString(list, ran.output) || ran.end != "exit code 0") return false;
  return std::all_of(list["folder"].begin(), list["folder"].end(), [](const Json::Value& folder) {
    return folder["additional"]["status"]["text"] == "finished";
  });
}

bool RunningSystem::WaitUntilIdle() const {
  const bool idle = WaitUntil([this] { return IsIdle(); }, std::chrono::milliseconds(kPatience));
  if (!idle) ADD_FAILURE() << WhatItWaitsFor();
  return idle;
}

// All that tells an index that cannot be worked on from one that takes long.
std::string RunningSystem::WhatItWaitsFor() const {
  std::string text = Quarry({"status"}).output + Quarry({"status", "--json"}).output;
  text +=
      Quarry({"folder", "list", "--status", "--json"}).output + Quarry({"share", "list"}).output;
  const std::string queues = TestRoot() + "/var/lib/quarry/queue";
  for (const std::string& name : ListDir(queues)) {
    text += name + ":\n" + ReadFile(queues + "/" + name);
  }
  return text + Log();
}

std::multiset<std::string> RunningSystem::Documents(const std::string& share_path) const {
  Json::Value data;
  data["id"] = "fileindex_" + Basename(share_path);
  data["query"]["qsl"]["prefix"]["TARNMDPath"] = Dirname(share_path) + "/";
  data["query"]["load_field"].append("TARNMDPath");
  std::multiset<std::string> paths;
  for (const Json::Value& document : cli::AskEngine("document_get_by_query", data)) {
    paths.insert(document["TARNMDPath"].asString());
  }
  return paths;
}

std::string RunningSystem::Log() const {
  return ReadFile(scratch_ / "run.log");
}

pid_t RunningSystem::Pid(const std::string& service) const {
  const Json::Value status = cli::AskSupervisor("status", Json::Value(Json::objectValue));
  for (const Json::Value& entry : status["services"]) {
    if (entry["name"] == service) return entry["pid"].asInt();
  }
  return 0;
}

std::multiset<std::string> Listing(const std::string& top) {
  std::multiset<std::string> paths{top};
  for (const auto& entry : std::filesystem::recursive_directory_iterator(top)) {
    paths.insert(entry.path());
  }
  return paths;
}

}  // namespace quarry::test
