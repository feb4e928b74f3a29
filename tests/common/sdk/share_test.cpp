#include "common/sdk/share.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include "common/error.h"
#include "common/lock_file.h"
#include "platform/include/share.h"
#include "tests/common/sdk/lock_held.h"
#include "tests/fake_platform/fixture.h"

namespace quarry::sdk {
namespace {

using Strings = std::vector<std::string>;

class ShareTest : public fake::FakePlatformTest {
 protected:
  ShareTest() {
    fake::AddShare("photo", "/volume1/photo");
    // Every platform call is made under the lock.
    fake::OnCall([](const std::string& function) { EXPECT_FALSE(IsSDKMutexFree()) << function; });
  }
  ~ShareTest() override { fake::OnCall(nullptr); }

  static void Set(const std::function<void(fake::Share&)>& change) {
    fake::Share share;
    share.name = "photo";
    share.path = "/volume1/photo";
    change(share);
    fake::AddShare(share);
  }

  // One line was logged: the failure of `condition` in `function`, at any line.
  static void ExpectLogged(const std::string& function, const std::string& condition,
                           const std::string& rest) {
    const Strings logs = fake::Logs();
    ASSERT_EQ(logs.size(), 1u);
    EXPECT_EQ(fake::AnyLine(logs[0]), fake::AnyLine(fake::LogHead("share", 1, function)) +
                                          "Failed [" + condition + "], reason: " + rest);
  }
};

TEST_F(ShareTest, MutexIsOneForAll) {
  EXPECT_EQ(&SDKMutex(), &SDKMutex());
  EXPECT_TRUE(IsSDKMutexFree());
  LockMutex lock(SDKMutex());
  EXPECT_FALSE(IsSDKMutexFree());
}

TEST_F(ShareTest, RecordIsHeldAndReleased) {
  {
    const SDKShare share("photo");
    EXPECT_EQ(share.GetName(), "photo");
    EXPECT_EQ(share.GetPath(), "/volume1/photo");
    EXPECT_EQ(fake::Outstanding(), 1);
  }
  EXPECT_EQ(fake::Calls(), Strings({"TARNShareGet(photo)", "TARNShareFree(photo)"}));
}

TEST_F(ShareTest, IsNotCopyable) {
  EXPECT_FALSE(std::is_copy_constructible_v<SDKShare>);
  EXPECT_FALSE(std::is_copy_assignable_v<SDKShare>);
}

TEST_F(ShareTest, UnknownShareIsAnError) {
  EXPECT_EQ(FailureOf([] { SDKShare share("none"); }), "800 ");
  ExpectLogged("SDKShare", "0 > TARNShareGet(share_name.c_str(), &share_info_) || !share_info_",
               "");
}

TEST_F(ShareTest, FailedLookUpIsLoggedWithErrno) {
  fake::FailCall("TARNShareGet", 1, {-1, EIO});
  EXPECT_EQ(FailureOf([] { SDKShare share("photo"); }), "800 ");
  ExpectLogged("SDKShare", "0 > TARNShareGet(share_name.c_str(), &share_info_) || !share_info_",
               " [err: Input/output error]");
  EXPECT_EQ(errno, 0);
}

TEST_F(ShareTest, MissingRecordIsAnErrorThoughTheCallSucceeded) {
  fake::FailCall("TARNShareGet", 1, {0});
  EXPECT_EQ(FailureOf([] { SDKShare share("photo"); }), "800 ");
}

TEST_F(ShareTest, NameWithNulByteIsNotTheShareBeforeIt) {
  EXPECT_EQ(FailureOf([] { SDKShare share(std::string("photo\0x", 7)); }), "800 ");
  EXPECT_TRUE(fake::Calls().empty());
}

TEST_F(ShareTest, UnreadableFilesAreHiddenOnlyWhenThePlatformSaysOne) {
  EXPECT_FALSE(SDKShare("photo").IsHideUnReadable());
  Set([](fake::Share& share) { share.hide_unreadable = true; });
  EXPECT_TRUE(SDKShare("photo").IsHideUnReadable());
  fake::FailCall("HLIBShareHideUnreadableGet");
  EXPECT_FALSE(SDKShare("photo").IsHideUnReadable());
  EXPECT_TRUE(fake::Logs().empty());
}

TEST_F(ShareTest, SpaceIsAskedFor100MiBForUser0) {
  EXPECT_TRUE(SDKShare("photo").IsSpaceEnough());
  EXPECT_EQ(fake::CallsOf("TARNQuotaIsEnough"),
            Strings({"TARNQuotaIsEnough(/volume1/photo, 0, 104857600)"}));
  EXPECT_TRUE(fake::CallsOf("HLIBCErrGet").empty());
}

TEST_F(ShareTest, OnlyTheTwoSpaceErrorsAreNotEnough) {
  for (const int error : {0x2900, 0x2400}) {
    fake::SetQuota(false, error);
    EXPECT_FALSE(SDKShare("photo").IsSpaceEnough()) << error;
  }
  for (const int error : {0, 1, 0x2901, 0x2401, 0x28FF, -1}) {
    fake::SetQuota(false, error);
    EXPECT_TRUE(SDKShare("photo").IsSpaceEnough()) << error;
  }
}

TEST_F(ShareTest, AnyNonzeroQuotaAnswerIsEnough) {
  fake::SetPlatformError(0x2900);
  fake::FailCall("TARNQuotaIsEnough", 1, {-1});
  EXPECT_TRUE(SDKShare("photo").IsSpaceEnough());
}

TEST_F(ShareTest, PrivilegesAreThePlatforms) {
  Set([](fake::Share& share) { share.ftp_privilege = 5; });
  fake::SetPrivilege("photo", "alice", TARN_PRIV_READ_WRITE);
  const SDKShare share("photo");
  EXPECT_EQ(share.GetFTPPrivilege(), 5);
  EXPECT_EQ(share.GetPrivilege("alice"), TARN_PRIV_READ_WRITE);
  EXPECT_EQ(share.GetPrivilege("bob"), TARN_PRIV_NONE);
  fake::FailCall("TARNShareUserPrivGet", 1, {-3});
  EXPECT_EQ(share.GetPrivilege("alice"), -3);
  EXPECT_EQ(share.GetPrivilege(std::string("alice\0x", 7)), TARN_PRIV_NONE);
  EXPECT_EQ(fake::CallsOf("TARNShareUserPrivGet")[0], "TARNShareUserPrivGet(photo, alice)");
}

TEST_F(ShareTest, OnlyAWritableShareThatIsNotEncryptedIsIndexed) {
  for (const bool encrypted : {false, true}) {
    for (const bool read_only : {false, true}) {
      for (const bool encryption : {false, true}) {
        Set([&](fake::Share& share) {
          share.encrypted = encrypted;
          share.read_only = read_only;
          share.encryption = encryption;
        });
        EXPECT_EQ(SDKShare("photo").CanBeIndexed(), !encrypted && !read_only);
      }
    }
  }
  EXPECT_TRUE(fake::CallsOf("HLIBShareIsEncryptionGet").empty());
}

TEST_F(ShareTest, UnknownEncryptionIsLoggedAtItsLine) {
  const SDKShare share("photo");
  fake::FailCall("HLIBShareIsEncryptedGet");
  EXPECT_EQ(FailureOf([&] { share.CanBeIndexed(); }),
            "502 HLIBShareis_encryptedGet failed, share=photo");
  EXPECT_EQ(fake::Logs(),
            Strings({fake::LogHead("share", 73, "CanBeIndexed") +
                     "Failed [0 > HLIBShareIsEncryptedGet(share_info_, &is_encrypted)], reason: "
                     "HLIBShareis_encryptedGet failed, share=photo"}));
  EXPECT_TRUE(fake::CallsOf("HLIBShareIsReadOnlyGet").empty());
}

TEST_F(ShareTest, UnknownReadOnlyIsLoggedAtItsLine) {
  // Asked even where the first answer has decided.
  Set([](fake::Share& share) { share.encrypted = true; });
  const SDKShare share("photo");
  fake::FailCall("HLIBShareIsReadOnlyGet", 1, {-1, EPERM});
  EXPECT_EQ(FailureOf([&] { share.CanBeIndexed(); }),
            "502 HLIBShareis_readonlyGet failed, share=photo");
  EXPECT_EQ(
      fake::Logs(),
      Strings({fake::LogHead("share", 75, "CanBeIndexed") +
               "Failed [0 > HLIBShareIsReadOnlyGet(share_info_, &is_readonly)], reason: "
               "HLIBShareis_readonlyGet failed, share=photo [err: Operation not permitted]"}));
}

TEST_F(ShareTest, EncryptionIsAProperty) {
  EXPECT_FALSE(SDKShare("photo").IsEncryption());
  Set([](fake::Share& share) { share.encryption = true; });
  EXPECT_TRUE(SDKShare("photo").IsEncryption());
  fake::FailCall("HLIBShareIsEncryptionGet");
  EXPECT_EQ(FailureOf([] { SDKShare("photo").IsEncryption(); }),
            "502 HLIBShareIsEncryptionGet failed, share=photo");
  ExpectLogged("IsEncryption", "0 > HLIBShareIsEncryptionGet(share_info_, &is_encryption)",
               "HLIBShareIsEncryptionGet failed, share=photo");
}

TEST_F(ShareTest, RecycleBinIsAProperty) {
  EXPECT_FALSE(SDKShare("photo").IsEnableRecycleBin());
  Set([](fake::Share& share) { share.recycle_bin = true; });
  EXPECT_TRUE(SDKShare("photo").IsEnableRecycleBin());
  fake::FailCall("HLIBShareRecycleStatusGet");
  EXPECT_EQ(FailureOf([] { SDKShare("photo").IsEnableRecycleBin(); }),
            "502 HLIBShareRecycleStatusGet failed, share=photo");
  ExpectLogged("IsEnableRecycleBin", "0 > HLIBShareRecycleStatusGet(share_info_, &is_enabled)",
               "HLIBShareRecycleStatusGet failed, share=photo");
}

TEST_F(ShareTest, PathsAreComposedByThePlatform) {
  const SDKShare share("photo");
  EXPECT_EQ(share.GetQueuePath(), fake::QueuePath("/volume1/photo"));
  EXPECT_EQ(share.GetDBPath(), fake::IndexPath("/volume1/photo"));
  EXPECT_EQ(share.GetDBName(), fake::IndexID("photo"));
  fake::ClearCalls();
  share.GetQueuePath();
  share.GetDBPath();
  share.GetDBName();
  EXPECT_EQ(fake::Calls(), Strings({"FILEIDXQueuePathCompose(/volume1/photo, 4096)",
                                    "FILEIDXDBPathCompose(/volume1/photo, 4096)",
                                    "FILEIDXGetIndexID(photo, 1024)"}));
}

TEST_F(ShareTest, PathThatFillsTheBufferIsWhole) {
  fake::SetQueuePath("/volume1/photo", std::string(4095, 'q'));
  EXPECT_EQ(SDKShare("photo").GetQueuePath(), std::string(4095, 'q'));
  fake::SetQueuePath("/volume1/photo", std::string(4096, 'q'));
  EXPECT_EQ(FailureOf([] { SDKShare("photo").GetQueuePath(); }),
            "502 FILEIDXQueuePathCompose failed, share=photo");
}

TEST_F(ShareTest, FailedCompositionsAreErrors) {
  const SDKShare share("photo");
  fake::FailCall("FILEIDXQueuePathCompose");
  EXPECT_EQ(FailureOf([&] { share.GetQueuePath(); }),
            "502 FILEIDXQueuePathCompose failed, share=photo");
  ExpectLogged("GetQueuePath", "0 > FILEIDXQueuePathCompose(share_info_->szPath, buf, 4096)",
               "FILEIDXQueuePathCompose failed, share=photo");
  fake::ClearLogs();
  fake::FailCall("FILEIDXDBPathCompose");
  EXPECT_EQ(FailureOf([&] { share.GetDBPath(); }), "502 FILEIDXDBPathCompose failed, share=photo");
  ExpectLogged("GetDBPath", "0 > FILEIDXDBPathCompose(share_info_->szPath, buf, 4096)",
               "FILEIDXDBPathCompose failed, share=photo");
  fake::ClearLogs();
  fake::FailCall("FILEIDXGetIndexID");
  EXPECT_EQ(FailureOf([&] { share.GetDBName(); }), "502 FILEIDXGetIndexID failed, share=photo");
  ExpectLogged("GetDBName", "0 > FILEIDXGetIndexID(share_info_->szName, buf, 1024)",
               "FILEIDXGetIndexID failed, share=photo");
}

TEST_F(ShareTest, AllSharesAreNamedInThePlatformsOrder) {
  fake::AddShare("web", "/volume2/web");
  fake::AddShare("music", "/volume1/music");
  EXPECT_EQ(SDKShare::Enum(), Strings({"photo", "web", "music"}));
  EXPECT_EQ(fake::Calls(), Strings({"HLIBCSzListAlloc(" + std::to_string(BUFSIZ) + ")",
                                    "HLIBShareEnum()", "HLIBCSzListFree()"}));
}

TEST_F(ShareTest, NoSharesAreNoNames) {
  fake::RemoveShare("photo");
  EXPECT_EQ(SDKShare::Enum(), Strings());
}

TEST_F(ShareTest, MissingListIsAnError) {
  fake::FailCall("HLIBCSzListAlloc", 1, {-1, ENOMEM});
  EXPECT_EQ(FailureOf([] { SDKShare::Enum(); }), "121 ");
  ExpectLogged("Enum", "nullptr == (share_list = HLIBCSzListAlloc(BUFSIZ))",
               " [err: Cannot allocate memory]");
}

TEST_F(ShareTest, FailedEnumerationIsAnErrorAndReleasesTheList) {
  fake::FailCall("HLIBShareEnum");
  EXPECT_EQ(FailureOf([] { SDKShare::Enum(); }), "121 HLIBShareEnum failed");
  ExpectLogged("Enum", "0 > HLIBShareEnum(&share_list, &enum_func)", "HLIBShareEnum failed");
  EXPECT_EQ(fake::Outstanding(), 0);
  fake::ClearLogs();
  // The list is released before the line is written, which tells the errno of the enumeration.
  fake::FailCall("HLIBShareEnum", 1, {-1, EIO});
  fake::FailCall("HLIBCSzListFree", 1, {0, EBADF});
  EXPECT_EQ(FailureOf([] { SDKShare::Enum(); }), "121 HLIBShareEnum failed");
  ExpectLogged("Enum", "0 > HLIBShareEnum(&share_list, &enum_func)",
               "HLIBShareEnum failed [err: Input/output error]");
  EXPECT_EQ(errno, 0);
  fake::FailCall("HLIBCSzListPush");
  EXPECT_EQ(FailureOf([] { SDKShare::Enum(); }), "121 HLIBShareEnum failed");
}

}  // namespace
}  // namespace quarry::sdk
