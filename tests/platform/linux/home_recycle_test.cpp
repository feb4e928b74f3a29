#include <gmock/gmock.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "platform/include/error.h"
#include "platform/include/recycle.h"
#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;

class HomeRecycleTest : public ShareTest {
 protected:
  HomeRecycleTest() : list_(HLIBCSzListAlloc(16)) {}
  ~HomeRecycleTest() override { HLIBCSzListFree(list_); }

  std::vector<std::string> Listed() const {
    std::vector<std::string> texts;
    for (int i = 0; i < HLIBCSzListCount(list_); ++i) texts.emplace_back(HLIBCSzListGet(list_, i));
    return texts;
  }

  HLIBCSZLIST* list_;
};

TEST_F(HomeRecycleTest, ListsTheBinsThatAreDirectories) {
  const std::string homes = Add("homes").path;
  test::MakeDirs(homes + "/bob/#recycle");
  test::MakeDirs(homes + "/ann/#recycle/deep/#recycle");
  test::MakeDirs(homes + "/none");
  test::MakeDirs(homes + "/#recycle");
  test::WriteFile(homes + "/file/#recycle", "");
  test::WriteFile(homes + "/plain", "");
  test::MakeDirs(homes + "/link");
  ASSERT_EQ(symlink((homes + "/bob/#recycle").c_str(), (homes + "/link/#recycle").c_str()), 0);
  EXPECT_EQ(TARNRecycleHomeEnumRecyclePath(&list_), 0);
  EXPECT_THAT(Listed(), ElementsAre(homes + "/ann/#recycle", homes + "/bob/#recycle"));
}

TEST_F(HomeRecycleTest, AnAccountThatTheMachineKeepsItselfIsLocal) {
  const std::string homes = Add("homes").path;
  test::MakeDirs(homes + "/root/#recycle");
  test::MakeDirs(homes + "/no such account/#recycle");
  EXPECT_EQ(TARNRecycleHomeEnumRecyclePathForAuthType(&list_, AUTH_TYPE_LOCAL), 0);
  EXPECT_THAT(Listed(), ElementsAre(homes + "/root/#recycle"));
  EXPECT_EQ(TARNRecycleHomeEnumRecyclePathForAuthType(&list_, AUTH_TYPE_DOMAIN), 0);
  EXPECT_THAT(Listed(), ElementsAre(homes + "/root/#recycle", homes + "/no such account/#recycle"));
}

TEST_F(HomeRecycleTest, WithoutHomesThereIsNothing) {
  Add("photo");
  EXPECT_EQ(TARNRecycleHomeEnumRecyclePath(&list_), 0);
  EXPECT_EQ(TARNRecycleHomeEnumRecyclePathForAuthType(&list_, AUTH_TYPE_LOCAL), 0);
  EXPECT_THAT(Listed(), IsEmpty());
}

TEST_F(HomeRecycleTest, HomesThatCannotBeReadAreAFailure) {
  test::MakeDirs(Add("homes").path);
  ASSERT_EQ(rmdir((volume_ / "homes").c_str()), 0);
  EXPECT_LT(TARNRecycleHomeEnumRecyclePath(&list_), 0);
  EXPECT_EQ(errno, ENOENT);
  EXPECT_NE(HLIBCErrGet(), 0);
  WriteShareFile("nonsense");
  EXPECT_LT(TARNRecycleHomeEnumRecyclePath(&list_), 0);
  EXPECT_LT(TARNRecycleHomeEnumRecyclePath(nullptr), 0);
}

}  // namespace
}  // namespace quarry::platform
