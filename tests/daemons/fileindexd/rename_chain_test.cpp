#include "daemons/fileindexd/rename_chain.h"

#include <gtest/gtest.h>

namespace quarry::fileindexd {
namespace {

using fileindex::OP_INDEX;
using fileindex::OP_RENAME;
using Texts = std::vector<std::string>;

// "old>new" is a rename, anything else is indexed.
Texts Follow(const Texts& texts) {
  std::vector<Operation> operations;
  for (const std::string& text : texts) {
    const std::size_t arrow = text.find('>');
    if (arrow == std::string::npos) {
      operations.push_back({OP_INDEX, text, ""});
    } else {
      operations.push_back({OP_RENAME, text.substr(arrow + 1), text.substr(0, arrow)});
    }
  }
  FollowRenames(&operations);
  Texts result;
  for (const Operation& operation : operations) {
    const bool rename = operation.kind == OP_RENAME;
    result.push_back(rename ? operation.old_path + ">" + operation.path : operation.path);
  }
  return result;
}

TEST(FollowRenamesTest, NothingAndSingleRenamesStay) {
  EXPECT_EQ(Follow({}), Texts{});
  EXPECT_EQ(Follow({"/s/a", "/s/a>/s/b", "/s/c>/s/d", "/s/b"}),
            (Texts{"/s/a", "/s/a>/s/b", "/s/c>/s/d", "/s/b"}));
}

TEST(FollowRenamesTest, TheFirstOfAChainGoesToItsEnd) {
  EXPECT_EQ(Follow({"/a>/b", "/b>/c"}), (Texts{"/a>/c", "/b>/c"}));
  EXPECT_EQ(Follow({"/a>/b", "/x", "/b>/c", "/c>/d"}), (Texts{"/a>/d", "/x", "/b>/d", "/c>/d"}));
}

TEST(FollowRenamesTest, ThereAndBackEndsWhereItBegan) {
  EXPECT_EQ(Follow({"/a>/b", "/b>/a"}), (Texts{"/a>/a", "/b>/a"}));
  EXPECT_EQ(Follow({"/a>/b", "/b>/a", "/a>/b"}), (Texts{"/a>/b", "/b>/b", "/a>/b"}));
}

TEST(FollowRenamesTest, WhatWentAwayBeforeIsAnother) {
  EXPECT_EQ(Follow({"/b>/c", "/a>/b"}), (Texts{"/b>/c", "/a>/b"}));
  // The first /b went to /c, the second one to /d.
  EXPECT_EQ(Follow({"/a>/b", "/b>/c", "/x>/b", "/b>/d"}),
            (Texts{"/a>/c", "/b>/c", "/x>/d", "/b>/d"}));
}

TEST(FollowRenamesTest, NeighboursAreNotMistaken) {
  EXPECT_EQ(Follow({"/a>/b", "/bc>/d", "/b/x>/e"}), (Texts{"/a>/b", "/bc>/d", "/b/x>/e"}));
}

}  // namespace
}  // namespace quarry::fileindexd
