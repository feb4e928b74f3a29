#include "daemons/tarnelasticd/memory_budget.h"

#include <gtest/gtest.h>

#include <memory>
#include <thread>

#include "common/error.h"

namespace quarry::engine {
namespace {

TEST(MemoryBudgetTest, RefusesWhatExceedsTheBound) {
  MemoryBudget budget(100, std::chrono::seconds(0));
  auto first = std::make_unique<MemoryBudget::Share>(&budget, 60);
  const MemoryBudget::Share second(&budget, 40);
  try {
    const MemoryBudget::Share third(&budget, 1);
    ADD_FAILURE();
  } catch (const Error& error) {
    EXPECT_EQ(error.code(), kErrorEngineBusy);
  }
  first.reset();
  const MemoryBudget::Share third(&budget, 60);
}

TEST(MemoryBudgetTest, NeverRefusesTheOnlyOne) {
  MemoryBudget budget(100, std::chrono::seconds(0));
  const MemoryBudget::Share large(&budget, 1000);
  EXPECT_THROW(MemoryBudget::Share(&budget, 1), Error);
}

TEST(MemoryBudgetTest, WaitsForOthersToEnd) {
  MemoryBudget budget(100, std::chrono::hours(1));
  auto first = std::make_unique<MemoryBudget::Share>(&budget, 100);
  std::thread waiting([&] { const MemoryBudget::Share second(&budget, 100); });
  first.reset();
  waiting.join();
}

TEST(MemoryBudgetTest, CountsTheTextsOfADocument) {
  Json::Value document;
  EXPECT_EQ(EstimateMemory(document), 0U);
  document["a"] = 1;
  const std::size_t small = EstimateMemory(document);
  document["b"] = std::string(100000, 'x');
  EXPECT_GT(EstimateMemory(document), small + 100000);
}

}  // namespace
}  // namespace quarry::engine
