#include "platform/include/recycle.h"

#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

constexpr int kKind = 11;

class RecycleTest : public ShareTest {};

TEST_F(RecycleTest, AShareHasOneRecycleBinAtItsTop) {
  const std::string share = Add("photo", true).path;
  const auto in_bin = [&](const std::string& inner) {
    return TARNShareIsShareRecycle((share + inner).c_str());
  };
  EXPECT_EQ(in_bin("/#recycle"), 1);
  EXPECT_EQ(in_bin("/#recycle/deep/file"), 1);
  EXPECT_EQ(in_bin("/#recycled"), 0);
  EXPECT_EQ(in_bin("/folder/#recycle"), 0);
  EXPECT_EQ(in_bin("/my#recycle"), 0);
  EXPECT_EQ(in_bin(""), 0);
  EXPECT_EQ(in_bin("/"), 0);
  EXPECT_LT(TARNShareIsShareRecycle("/nowhere/#recycle"), 0);
  EXPECT_LT(TARNShareIsShareRecycle("relative"), 0);
  EXPECT_LT(TARNShareIsShareRecycle(nullptr), 0);
}

TEST_F(RecycleTest, AUsersHomeHasARecycleBinAtItsTop) {
  const std::string homes = Add("homes", true).path;
  const std::string other = Add("other", true).path;
  const auto in_bin = [&](const std::string& path) {
    return TARNRecycleUserHomePathIsExist(path.c_str(), kKind);
  };
  EXPECT_EQ(in_bin(homes + "/alice/#recycle"), 1);
  EXPECT_EQ(in_bin(homes + "/alice/#recycle/x"), 1);
  EXPECT_EQ(in_bin(homes + "/alice"), 0);
  EXPECT_EQ(in_bin(homes + "/alice/x/#recycle"), 0);
  EXPECT_EQ(in_bin(homes + "/#recycle"), 0);
  EXPECT_EQ(in_bin(homes), 0);
  EXPECT_EQ(in_bin(other + "/alice/#recycle"), 0);
  EXPECT_LT(in_bin("/nowhere"), 0);
  EXPECT_LT(TARNRecycleUserHomePathIsExist((homes + "/alice/#recycle").c_str(), 10), 0);
}

TEST_F(RecycleTest, WithoutARecycleBinADirectoryOfItsNameIsOneLikeAnyOther) {
  ShareRecord photo = Add("photo");
  ShareRecord homes = Add("homes");
  const std::string in_photo = photo.path + "/#recycle/x";
  const std::string in_homes = homes.path + "/alice/#recycle/x";
  EXPECT_EQ(TARNShareIsShareRecycle(in_photo.c_str()), 0);
  EXPECT_EQ(TARNRecycleUserHomePathIsExist(in_homes.c_str(), kKind), 0);
  photo.recycle_bin = true;
  homes.recycle_bin = true;
  AddShare(photo);
  AddShare(homes);
  EXPECT_EQ(TARNShareIsShareRecycle(in_photo.c_str()), 1);
  EXPECT_EQ(TARNRecycleUserHomePathIsExist(in_homes.c_str(), kKind), 1);
}

}  // namespace
}  // namespace quarry::platform
