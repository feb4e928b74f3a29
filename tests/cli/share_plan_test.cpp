#include "cli/share_plan.h"

#include <gtest/gtest.h>

#include "cli/problem.h"

namespace quarry::cli {
namespace {

using platform::ShareRecord;
using Shares = std::vector<ShareRecord>;

ShareRecord Share(const std::string& path, const std::string& moved_from = "") {
  ShareRecord share;
  share.name = path.substr(path.rfind('/') + 1);
  share.path = path;
  share.moved_from = moved_from;
  return share;
}

const Shares kShares{Share("/srv/music"), Share("/srv/photo"), Share("/new", "/old"),
                     Share("/disk2/docs", "/disk1/docs")};

template <typename Call>
std::string ProblemOf(Call call) {
  try {
    call();
  } catch (const Problem& problem) {
    return problem.what();
  }
  return {};
}

std::string RenameProblem(const std::string& from, const std::string& to) {
  return ProblemOf([&] { PlanRename(kShares, from, to); });
}

std::string MigrationProblem(const std::string& name, const std::string& parent) {
  return ProblemOf([&] { PlanMigration(kShares, name, parent); });
}

TEST(SharePlanTest, ARenameStaysInItsDirectory) {
  const SharePlan plan = PlanRename(kShares, "music", "sound");
  EXPECT_EQ(plan.from, "music");
  EXPECT_EQ(plan.to, "sound");
  EXPECT_EQ(plan.old_path, "/srv/music");
  EXPECT_EQ(plan.new_path, "/srv/sound");
  EXPECT_FALSE(plan.registered);
}

TEST(SharePlanTest, AMigrationKeepsTheName) {
  const SharePlan plan = PlanMigration(kShares, "music", "/disk2");
  EXPECT_EQ(plan.from, "music");
  EXPECT_EQ(plan.to, "music");
  EXPECT_EQ(plan.old_path, "/srv/music");
  EXPECT_EQ(plan.new_path, "/disk2/music");
  EXPECT_FALSE(plan.registered);
  EXPECT_EQ(PlanMigration(kShares, "music", "/").new_path, "/music");
}

TEST(SharePlanTest, WhatWasCutShortIsGoneOnWith) {
  const SharePlan renamed = PlanRename(kShares, "old", "new");
  EXPECT_TRUE(renamed.registered);
  EXPECT_EQ(renamed.from, "old");
  EXPECT_EQ(renamed.old_path, "/old");
  EXPECT_EQ(renamed.new_path, "/new");
  const SharePlan migrated = PlanMigration(kShares, "docs", "/disk2");
  EXPECT_TRUE(migrated.registered);
  EXPECT_EQ(migrated.old_path, "/disk1/docs");
}

TEST(SharePlanTest, OneMoveAtATime) {
  EXPECT_NE(RenameProblem("new", "newer").find("quarry share rename old new"), std::string::npos);
  EXPECT_NE(RenameProblem("docs", "texts").find("quarry share migrate docs /disk2/"),
            std::string::npos);
  EXPECT_NE(MigrationProblem("docs", "/disk3").find("quarry share migrate docs /disk2/"),
            std::string::npos);
  EXPECT_NE(MigrationProblem("new", "/disk3").find("quarry share rename old new"),
            std::string::npos);
}

TEST(SharePlanTest, RefusesWhatCannotBeAShare) {
  EXPECT_NE(RenameProblem("nobody", "x").find("There is no share named \"nobody\""),
            std::string::npos);
  EXPECT_NE(RenameProblem("music", "music").find("has that name already"), std::string::npos);
  EXPECT_NE(RenameProblem("music", "").find("is no name for a share"), std::string::npos);
  EXPECT_NE(RenameProblem("music", "a/b").find("is no name for a share"), std::string::npos);
  EXPECT_NE(RenameProblem("music", "..").find("name"), std::string::npos);
  EXPECT_NE(RenameProblem("music", "a\nb").find("control characters"), std::string::npos);
  EXPECT_NE(RenameProblem("music", std::string(256, 'x')).find("255 bytes"), std::string::npos);
  EXPECT_NE(RenameProblem("music", "photo"), "");
  EXPECT_NE(RenameProblem("music", "docs").find("There is a share named \"docs\" already"),
            std::string::npos);
}

TEST(SharePlanTest, RefusesPlacesInAndAroundShares) {
  EXPECT_NE(MigrationProblem("nobody", "/x").find("There is no share"), std::string::npos);
  EXPECT_NE(MigrationProblem("music", "/srv").find("is at \"/srv/music\" already"),
            std::string::npos);
  EXPECT_NE(MigrationProblem("music", "/srv/photo").find("lies in the share \"photo\""),
            std::string::npos);
  EXPECT_NE(MigrationProblem("music", "/srv/music").find("lies in the share itself"),
            std::string::npos);
  Shares shares{Share("/srv/music"), Share("/disk/music/photo")};
  EXPECT_NE(ProblemOf([&] { PlanMigration(shares, "music", "/disk"); }).find("holds the share"),
            std::string::npos);
}

TEST(SharePlanTest, NamesTheCommandThatEndsAMove) {
  EXPECT_EQ(UnfinishedMove(kShares, "old"), "quarry share rename old new");
  EXPECT_EQ(UnfinishedMove(kShares, "new"), "quarry share rename old new");
  EXPECT_EQ(UnfinishedMove(kShares, "docs"), "quarry share migrate docs /disk2/");
  EXPECT_EQ(UnfinishedMove(kShares, "music"), "");
  EXPECT_EQ(UnfinishedMove(kShares, "nobody"), "");
}

}  // namespace
}  // namespace quarry::cli
