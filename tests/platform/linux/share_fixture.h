// Tests that need shares.

#ifndef QUARRY_TESTS_PLATFORM_LINUX_SHARE_FIXTURE_H_
#define QUARRY_TESTS_PLATFORM_LINUX_SHARE_FIXTURE_H_

#include <gtest/gtest.h>

#include <string>

#include "platform/linux/share_registry.h"
#include "tests/support/files.h"
#include "tests/support/root.h"
#include "tests/support/temp_dir.h"

namespace quarry::platform {

// A fresh root without shares, and a volume to make some on.
class ShareTest : public ::testing::Test {
 protected:
  ShareTest() { test::ResetTestRoot(); }

  // Makes the share's directory and registers it.
  ShareRecord Add(const std::string& name, bool recycle_bin = false) {
    ShareRecord share;
    share.recycle_bin = recycle_bin;
    share.name = name;
    share.path = volume_ / name;
    test::MakeDirs(share.path);
    AddShare(share);
    return share;
  }
  static void WriteShareFile(const std::string& text) { test::WriteFile(ShareFilePath(), text); }

  test::TempDir volume_;
};

}  // namespace quarry::platform

#endif  // QUARRY_TESTS_PLATFORM_LINUX_SHARE_FIXTURE_H_
