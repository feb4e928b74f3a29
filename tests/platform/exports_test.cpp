// Whatever platform/include declares can be reached by a program that links the library.

#include <gtest/gtest.h>

#include "platform/include/content_extract.h"
#include "platform/include/error.h"
#include "platform/include/filesystem.h"
#include "platform/include/index_path.h"
#include "platform/include/list.h"
#include "platform/include/monitor.h"
#include "platform/include/recycle.h"
#include "platform/include/service.h"
#include "platform/include/share.h"
#include "platform/include/socket.h"
#include "platform/include/user.h"
#include "platform/linux/share_move.h"
#include "platform/linux/share_registry.h"
#include "tests/support/root.h"

namespace {

template <typename... Functions>
int CountOf(Functions*... functions) {
  return (0 + ... + (functions != nullptr ? 1 : 0));
}

TEST(PlatformLibraryTest, OffersEveryFunction) {
  EXPECT_EQ(CountOf(TARN_CONTENT_EXTRACT_ParseFile, HLIBCErrGet, HLIBCErrorGetFile,
                    HLIBCErrorGetLine, TARNGetFSType, TARNFSIsRemoteFS, TARNFSIsImageFS,
                    TARNFSDirIsMntPoint, HLIBFhsPathInSnapshot, TARNEAIsHiddenDir, TARNACLPermGet,
                    TARNQuotaIsEnough, TARNFileCopy, HLIBCUnicodeUTF8StrCaseCmp,
                    FILEIDXQueuePathCompose, FILEIDXDBPathCompose, FILEIDXGetIndexID),
            17);
  EXPECT_EQ(
      CountOf(HLIBCSzListAlloc, HLIBCSzListFree, HLIBCSzListPush, HLIBCSzListCount, HLIBCSzListGet,
              TARN::TARNOTIFYD::MonitorQueue::Upsert, TARN::TARNOTIFYD::MonitorQueue::Delete,
              TARNShareIsShareRecycle, TARNRecycleUserHomePathIsExist,
              TARNRecycleHomeEnumRecyclePath, TARNRecycleHomeEnumRecyclePathForAuthType),
      11);
  EXPECT_EQ(CountOf(HLIBServiceStart, HLIBServiceStop, HLIBServiceRestart, HLIBServicectlStart,
                    HLIBServicectlStop, TARNSMBIsEnableSpotlight, TARNSMBSetSpotlight, HLIBCExecl,
                    HLIBCExec),
            9);
  EXPECT_EQ(CountOf(TARNShareGet, TARNShareFree, TARNShareNamePathGet, HLIBShareEnum,
                    HLIBShareHideUnreadableGet, HLIBShareIsEncryptedGet, HLIBShareIsReadOnlyGet,
                    HLIBShareIsEncryptionGet, HLIBShareRecycleStatusGet, TARNShareUserPrivGet,
                    TARNUserGet, TARNUserGetByUID, TARNUserFree, HLIBGroupIsAdminGroupMem,
                    ResetCredentialsByName),
            15);
  EXPECT_EQ(CountOf(quarry::platform::ReadShares, quarry::platform::AddShare,
                    quarry::platform::RemoveShare, quarry::platform::ValidateShare,
                    quarry::platform::ShareFilePath, quarry::platform::ReplaceSharePath,
                    quarry::platform::EndShareMove, quarry::platform::MoveShare,
                    quarry::platform::CleanUpShareMove, quarry::platform::ShowMovingShares,
                    quarry::platform::MoveWatches, quarry::platform::RemoveQueue),
            12);
}

TEST(PlatformLibraryTest, ItsErrorsCanBeCaught) {
  EXPECT_THROW(quarry::platform::ValidateShare({}), std::runtime_error);
}

TEST(PlatformLibraryTest, ItLivesUnderTheRoot) {
  EXPECT_EQ(quarry::platform::ShareFilePath(),
            quarry::test::TestRoot() + "/etc/quarry/shares.json");
}

TEST(PlatformLibraryTest, ConnectionsCanBeUsedAndDerivedFrom) {
  struct Derived : tarndaemon::DomainSockConnection {
    using DomainSockConnection::DomainSockConnection;
  };
  Derived connection(quarry::test::TestRoot() + "/nobody");
  EXPECT_FALSE(connection.Connect());
  connection.Disconnect();
}

}  // namespace
