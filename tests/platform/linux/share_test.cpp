#include "platform/include/share.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstring>

#include "platform/include/error.h"
#include "platform/linux/account.h"
#include "platform/linux/last_error.h"
#include "tests/platform/linux/share_fixture.h"

namespace quarry::platform {
namespace {

struct Free {
  void operator()(TARNSHARE* share) const { TARNShareFree(share); }
};
using Share = std::unique_ptr<TARNSHARE, Free>;

Share Get(const std::string& name) {
  TARNSHARE* share = nullptr;
  EXPECT_EQ(TARNShareGet(name.c_str(), &share), 0);
  return Share(share);
}

class PlatformShareTest : public ShareTest {};

TEST_F(PlatformShareTest, HandsOutARecordByItsExactName) {
  const ShareRecord record = Add("photo");
  const Share share = Get("photo");
  ASSERT_NE(share, nullptr);
  EXPECT_STREQ(share->szName, "photo");
  EXPECT_EQ(share->szPath, record.path);
  EXPECT_EQ(share->ftpPrivilege, TARN_PRIV_READ_WRITE);
  for (const char* name : {"", "Photo", "phot", "photos"}) {
    auto* none = reinterpret_cast<TARNSHARE*>(1);
    EXPECT_LT(TARNShareGet(name, &none), 0) << name;
    EXPECT_EQ(none, nullptr);
    EXPECT_EQ(HLIBCErrGet(), kErrNotFound);
  }
}

TEST_F(PlatformShareTest, SurvivesNullPointers) {
  TARNSHARE* share = nullptr;
  int value = 0;
  HLIBCSZLIST* list = nullptr;
  EXPECT_LT(TARNShareGet(nullptr, &share), 0);
  EXPECT_LT(TARNShareGet("a", nullptr), 0);
  TARNShareFree(nullptr);
  EXPECT_LT(HLIBShareEnum(&list, nullptr), 0);
  EXPECT_LT(HLIBShareEnum(nullptr, HLIBCSzListPush), 0);
  EXPECT_LT(HLIBShareIsEncryptedGet(nullptr, &value), 0);
  EXPECT_LT(TARNShareUserPrivGet(nullptr, "root"), 0);
  EXPECT_LT(TARNShareNamePathGet(nullptr, nullptr, 0, nullptr, 0), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrBadParameter);
}

TEST_F(PlatformShareTest, EachFlagIsItsOwn) {
  using Getter = int (*)(const TARNSHARE*, int*);
  const std::vector<std::pair<bool ShareRecord::*, Getter>> flags = {
      {&ShareRecord::hide_unreadable, HLIBShareHideUnreadableGet},
      {&ShareRecord::encrypted, HLIBShareIsEncryptedGet},
      {&ShareRecord::read_only, HLIBShareIsReadOnlyGet},
      {&ShareRecord::encryption, HLIBShareIsEncryptionGet},
      {&ShareRecord::recycle_bin, HLIBShareRecycleStatusGet}};
  for (const auto& [set, setter] : flags) {
    ShareRecord record = Add("photo");
    record.*set = true;
    AddShare(record);
    const Share share = Get("photo");
    for (const auto& [flag, getter] : flags) {
      int value = 7;
      EXPECT_EQ(getter(share.get(), &value), 0);
      EXPECT_EQ(value, flag == set ? 1 : 0);
    }
    EXPECT_LT(setter(share.get(), nullptr), 0);
    EXPECT_EQ(share->ftpPrivilege,
              set == &ShareRecord::read_only ? TARN_PRIV_READ_ONLY : TARN_PRIV_READ_WRITE);
  }
}

TEST_F(PlatformShareTest, FindsTheShareThatHoldsAPath) {
  const ShareRecord record = Add("photo");
  char name[492];
  char path[4096];
  for (const char* inner : {"", "/", "/2019", "/no/such/place", "/../photo"}) {
    ASSERT_EQ(
        TARNShareNamePathGet((record.path + inner).c_str(), name, sizeof(name), path, sizeof(path)),
        0);
    EXPECT_STREQ(name, "photo");
    EXPECT_EQ(path, record.path);
  }
  for (const std::string& outside :
       {std::string("/"), volume_.path(), record.path + "s", std::string("photo"), std::string()}) {
    EXPECT_LT(TARNShareNamePathGet(outside.c_str(), name, sizeof(name), path, sizeof(path)), 0);
  }
}

TEST_F(PlatformShareTest, RefusesBuffersThatAreTooSmall) {
  const ShareRecord record = Add("photo");
  char name[492];
  char path[4096];
  const std::size_t name_size = std::strlen("photo") + 1;
  const std::size_t path_size = record.path.size() + 1;
  const auto get = [&](std::size_t n, std::size_t p) {
    return TARNShareNamePathGet(record.path.c_str(), name, n, path, p);
  };
  EXPECT_EQ(get(name_size, path_size), 0);
  EXPECT_LT(get(name_size - 1, path_size), 0);
  EXPECT_LT(get(name_size, path_size - 1), 0);
  EXPECT_LT(get(0, 0), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrNameTooLong);
}

TEST_F(PlatformShareTest, EnumeratesInTheOrderOfTheFile) {
  HLIBCSZLIST* list = HLIBCSzListAlloc(1);
  EXPECT_EQ(HLIBShareEnum(&list, HLIBCSzListPush), 0);
  EXPECT_EQ(HLIBCSzListCount(list), 0);
  Add("b");
  Add("a");
  EXPECT_EQ(HLIBShareEnum(&list, HLIBCSzListPush), 0);
  ASSERT_EQ(HLIBCSzListCount(list), 2);
  EXPECT_STREQ(HLIBCSzListGet(list, 0), "b");
  EXPECT_STREQ(HLIBCSzListGet(list, 1), "a");
  HLIBCSzListFree(list);
}

int StopAtB(const char* name, HLIBCSZLIST** list) {
  return std::strcmp(name, "b") == 0 ? -1 : HLIBCSzListPush(name, list);
}

TEST_F(PlatformShareTest, AnEnumerationThatIsStoppedFails) {
  Add("a");
  Add("b");
  Add("c");
  HLIBCSZLIST* list = HLIBCSzListAlloc(1);
  EXPECT_LT(HLIBShareEnum(&list, StopAtB), 0);
  EXPECT_EQ(HLIBCSzListCount(list), 1);
  HLIBCSzListFree(list);
}

TEST_F(PlatformShareTest, ABadShareFileFailsEveryQuestion) {
  WriteShareFile("{");
  TARNSHARE* share = nullptr;
  char buffer[100];
  HLIBCSZLIST* list = HLIBCSzListAlloc(1);
  EXPECT_LT(TARNShareGet("photo", &share), 0);
  EXPECT_LT(TARNShareNamePathGet("/v/photo", buffer, 100, buffer, 100), 0);
  EXPECT_LT(HLIBShareEnum(&list, HLIBCSzListPush), 0);
  EXPECT_EQ(HLIBCErrGet(), kErrShareFile);
  HLIBCSzListFree(list);
}

TEST_F(PlatformShareTest, PrivilegesFollowTheDirectorysMode) {
  ShareRecord record = Add("photo");
  Account caller;
  ASSERT_TRUE(FindAccountByUid(geteuid(), &caller));
  const auto privilege = [&](const std::string& user) {
    return TARNShareUserPrivGet(Get("photo").get(), user.c_str());
  };
  EXPECT_EQ(privilege("root"), TARN_PRIV_READ_WRITE);
  EXPECT_EQ(privilege(caller.name), TARN_PRIV_READ_WRITE);
  EXPECT_LT(privilege("no such account"), 0);
  const std::string stranger = caller.name == "nobody" ? "daemon" : "nobody";
  chmod(record.path.c_str(), 0700);
  EXPECT_EQ(privilege(stranger), TARN_PRIV_NONE);
  chmod(record.path.c_str(), 0705);
  EXPECT_EQ(privilege(stranger), TARN_PRIV_READ_ONLY);
  chmod(record.path.c_str(), 0707);
  EXPECT_EQ(privilege(stranger), TARN_PRIV_READ_WRITE);
  record.read_only = true;
  AddShare(record);
  EXPECT_EQ(privilege(stranger), TARN_PRIV_READ_ONLY);
  EXPECT_EQ(privilege("root"), TARN_PRIV_READ_ONLY);
}

}  // namespace
}  // namespace quarry::platform
