#include "daemons/tarncontentextractd/bad_files.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace quarry::extract {
namespace {

TEST(BadFiles, AreRememberedAsTheyWere) {
  BadFiles files(10, 1000);
  EXPECT_FALSE(files.Contains("/a", "1"));
  files.Add("/a", "1");
  EXPECT_TRUE(files.Contains("/a", "1"));
  EXPECT_FALSE(files.Contains("/b", "1"));
  EXPECT_FALSE(files.Contains("/a", "2")) << "it has changed";
  EXPECT_FALSE(files.Contains("/a", "1")) << "the one that was bad is gone";
  EXPECT_EQ(files.size(), 0u);
}

TEST(BadFiles, AreRememberedOnce) {
  BadFiles files(10, 1000);
  files.Add("/a", "1");
  files.Add("/a", "2");
  EXPECT_EQ(files.size(), 1u);
  EXPECT_TRUE(files.Contains("/a", "2"));
}

TEST(BadFiles, TheLeastUsedIsForgottenFirst) {
  BadFiles files(2, 1000);
  files.Add("/a", "1");
  files.Add("/b", "1");
  EXPECT_TRUE(files.Contains("/a", "1"));
  files.Add("/c", "1");
  EXPECT_TRUE(files.Contains("/a", "1"));
  EXPECT_FALSE(files.Contains("/b", "1"));
  EXPECT_TRUE(files.Contains("/c", "1"));
}

TEST(BadFiles, PathsAreBoundedInBytes) {
  BadFiles files(100, 10);
  files.Add("/1234", "1");
  files.Add("/5678", "1");
  EXPECT_EQ(files.size(), 2u);
  files.Add("/9", "1");
  EXPECT_EQ(files.size(), 2u);
  EXPECT_FALSE(files.Contains("/1234", "1"));
  files.Add(std::string(11, 'x'), "1");
  EXPECT_EQ(files.size(), 0u) << "what does not fit is not kept";
}

TEST(BadFiles, ServeManyThreads) {
  BadFiles files(50, 100000);
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&files] {
      for (int i = 0; i < 2000; ++i) {
        const std::string path = "/" + std::to_string(i % 70);
        if (!files.Contains(path, "1")) files.Add(path, "1");
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(files.size(), 50u);
}

}  // namespace
}  // namespace quarry::extract
