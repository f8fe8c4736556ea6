#include "service/DVHiddenSibling.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace docuvend {
namespace {

TEST(DVHiddenSibling, PutsADotBeforeTheLastComponent) {
  struct Case {
    const char* item;
    const char* sibling;
  };
  for (const Case& c : std::vector<Case>{{"file:///Folder/report.txt", "file:///Folder/.report.txt"},
                                         {"file:///a", "file:///.a"},
                                         {"file:///a/b/c", "file:///a/b/.c"},
                                         {"file:///a/.b", "file:///a/..b"},
                                         // A directory loses its final slash.
                                         {"file:///Folder/Sub/", "file:///Folder/.Sub"},
                                         {"file:///Folder/Sub//", "file:///Folder/.Sub"},
                                         {"file:///a/", "file:///.a"},
                                         // Repeated slashes collapse.
                                         {"file:///a//b///c.txt", "file:///a/b/.c.txt"},
                                         {"file:////a//b", "file:///a/.b"},
                                         // Escapes stay as they are.
                                         {"file:///a%20b/c%2Fd.txt", "file:///a%20b/.c%2Fd.txt"},
                                         {"file:///%e2%82%ac/%E2%82%AC", "file:///%e2%82%ac/.%E2%82%AC"},
                                         {"file:///a/%2E", "file:///a/.%2E"}}) {
    const auto url = QXURL::fromString(c.item);
    ASSERT_TRUE(url) << c.item;
    const auto sibling = dvHiddenSiblingURL(*url);
    ASSERT_TRUE(sibling) << c.item;
    EXPECT_EQ(sibling->absoluteString(), c.sibling) << c.item;
  }
}

TEST(DVHiddenSibling, TheRootHasNone) {
  for (const char* root : {"file:///", "file:////"}) EXPECT_FALSE(dvHiddenSiblingURL(*QXURL::fromString(root))) << root;
}

}  // namespace
}  // namespace docuvend
