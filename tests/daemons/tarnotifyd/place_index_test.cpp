#include "daemons/tarnotifyd/place_index.h"

#include <gtest/gtest.h>

namespace quarry::notify {
namespace {

using Wanted = PlaceIndex::Wanted;

const QueuePlaces kQueues{
    {"/q/a", {{"/v/a", 0xFFC6, {"@eaDir"}}, {"/v/a/sub", 0x2, {}}}},
    {"/q/b", {{"/v/b", 0x40, {}}, {"/v/a/sub/deep", 0x80, {}}}},
};

class PlaceIndexTest : public ::testing::Test {
 protected:
  Wanted Find(const std::string& path) const {
    Wanted wanted{{9, 9}};
    index_.Find(path, &wanted);
    return wanted;
  }
  std::vector<std::string> Touching(const std::string& path) const {
    std::vector<std::string> found;
    index_.ForEachTouching(path, [&](std::size_t queue, const std::string& place) {
      found.push_back(std::to_string(queue) + " " + place);
    });
    return found;
  }

  const PlaceIndex index_{kQueues};
};

TEST_F(PlaceIndexTest, FindsThePlacesThatHoldAPath) {
  EXPECT_EQ(Find("/v/a"), (Wanted{{0, 0xFFC6}}));
  EXPECT_EQ(Find("/v/a/x/y"), (Wanted{{0, 0xFFC6}}));
  EXPECT_EQ(Find("/v/ab"), Wanted{});
  EXPECT_EQ(Find("/v"), Wanted{});
  EXPECT_EQ(Find("/"), Wanted{});
  EXPECT_EQ(Find("/v/a/sub/deep/x"), (Wanted{{0, 0xFFC6}, {1, 0x80}}));
}

TEST_F(PlaceIndexTest, LeavesOutIgnoredNamesAtAnyDepth) {
  EXPECT_EQ(Find("/v/a/@eaDir"), Wanted{});
  EXPECT_EQ(Find("/v/a/x/@eaDir/y"), Wanted{});
  EXPECT_EQ(Find("/v/a/x@eaDir/@eaDirx"), (Wanted{{0, 0xFFC6}}));
  // One of the overlapping places does not leave it out.
  EXPECT_EQ(Find("/v/a/sub/@eaDir"), (Wanted{{0, 0x2}}));
}

TEST_F(PlaceIndexTest, TouchesPlacesAboveAndBelow) {
  using Found = std::vector<std::string>;
  EXPECT_EQ(Touching("/v/b"), Found{"1 /v/b"});
  EXPECT_EQ(Touching("/v/b/x"), Found{"1 /v/b"});
  EXPECT_EQ(Touching("/v/a/sub"), (Found{"1 /v/a/sub/deep", "0 /v/a/sub", "0 /v/a"}));
  EXPECT_EQ(Touching("/").size(), 4U);
  EXPECT_EQ(Touching("/v").size(), 4U);
  EXPECT_EQ(Touching("/w"), Found{});
  EXPECT_EQ(Touching("/v/a/@eaDir"), Found{});
}

}  // namespace
}  // namespace quarry::notify
