#include "daemons/tarnelasticd/doc_set.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <limits>
#include <random>
#include <set>

#include "daemons/tarnelasticd/frequencies.h"

namespace quarry::engine {
namespace {

using Model = std::set<std::int64_t>;

Model ToModel(const DocSet& set) {
  Model model;
  set.ForEach([&](std::int64_t id) { model.insert(model.end(), id); });
  return model;
}

TEST(DocSetTest, BehavesAsASet) {
  std::mt19937_64 random(1);
  for (int round = 0; round < 300; ++round) {
    DocSet sets[2];
    Model models[2];
    for (int i = 0; i < 2; ++i) {
      const std::int64_t range = random() % 2 == 0 ? 70 : 5000;
      for (auto left = random() % 60; left > 0; --left) {
        const std::int64_t id = 1 + static_cast<std::int64_t>(random()) % range;
        sets[i].Add(std::max<std::int64_t>(id, 1));
        models[i].insert(std::max<std::int64_t>(id, 1));
      }
    }
    DocSet united = sets[0];
    united.Unite(sets[1]);
    DocSet common = sets[0];
    common.Intersect(sets[1]);
    DocSet rest = sets[0];
    rest.Subtract(sets[1]);
    Model expected_united = models[0];
    expected_united.insert(models[1].begin(), models[1].end());
    Model expected_common;
    std::set_intersection(models[0].begin(), models[0].end(), models[1].begin(), models[1].end(),
                          std::inserter(expected_common, expected_common.end()));
    Model expected_rest;
    std::set_difference(models[0].begin(), models[0].end(), models[1].begin(), models[1].end(),
                        std::inserter(expected_rest, expected_rest.end()));
    ASSERT_EQ(ToModel(united), expected_united);
    ASSERT_EQ(ToModel(common), expected_common);
    ASSERT_EQ(ToModel(rest), expected_rest);
    ASSERT_EQ(united.Count(), expected_united.size());
    ASSERT_EQ(common.Empty(), expected_common.empty());
    for (std::int64_t id = 1; id < 80; ++id) {
      ASSERT_EQ(united.Contains(id), expected_united.count(id) == 1);
    }
    if (!expected_united.empty()) {
      ASSERT_GT(united.Bound(), static_cast<std::size_t>(*expected_united.rbegin()));
    }
  }
}

TEST(DocSetTest, TakesNoMemoryForNumbersThatCannotBe) {
  constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();
  DocSet set;
  Frequencies frequencies;
  for (const std::int64_t id : {-kMost - 1, std::int64_t{-1}, std::int64_t{0}, kMaxId + 1, kMost}) {
    EXPECT_THROW(set.Add(id), Error) << id;
    EXPECT_THROW(frequencies.Add(id, 1), Error) << id;
  }
  EXPECT_EQ(set.Bound(), 0U);
  EXPECT_EQ(frequencies.Bytes(), 0U);
}

}  // namespace
}  // namespace quarry::engine
