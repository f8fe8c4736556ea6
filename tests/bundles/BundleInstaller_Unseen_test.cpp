// What installing and removing make of bundles that cannot be looked at.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <cerrno>

#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/bundles/BundleInstaller.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/bundles/InterposedLooks.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;

constexpr int kMostCalls = 1000;  // of one installation

class BundleInstallerUnseenTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  [[nodiscard]] std::string system(const std::string& name) const { return house_.paths.systemBundles + "/" + name; }
  std::optional<QXError> install() {
    const auto result = installBundle(source_, house_.paths, house_.propertyLists);
    const auto* error = std::get_if<QXError>(&result);
    return error == nullptr ? std::nullopt : std::optional(*error);
  }
  std::optional<QXError> uninstall(const std::string& identifier) {
    return uninstallBundle(identifier, house_.paths, house_.propertyLists);
  }
  static QXError notSeen(int error, const std::string& place) { return QXError::system(error, "cannot look at " + place); }
  // The names in the user's directory that are not hidden.
  [[nodiscard]] std::vector<std::string> entries() const {
    std::vector<std::string> result;
    for (const auto& entry : fs::directory_iterator(house_.paths.userBundles)) {
      const std::string name = entry.path().filename();
      if (!name.starts_with('.')) result.push_back(name);
    }
    std::sort(result.begin(), result.end());
    return result;
  }
  // The call fails that has this number; what it was, or empty when there were not so many.
  template <class Work>
  std::string failing(int number, int error, Work work) {
    int calls = 0;
    std::string failed;
    looks_.failWith([&calls, &failed, number, error](const InterposedLooks::Call& call) {
      if (calls++ != number) return 0;
      failed = call.name + " " + call.path;
      return error;
    });
    work();
    looks_.failWith({});
    return failed;
  }

  BundleHouse house_;
  const std::string source_ = house_.root() + "/source";
  InterposedLooks looks_;
};

TEST_F(BundleInstallerUnseenTest, InstallingSaysWhatItCannotLookAtAndChangesNothing) {
  BundleHouse::install(source_, "org.a");
  BundleHouse::install(user("other"), "org.other");
  BundleHouse::install(system("s"), "org.s");
  struct Case {
    const char* call;
    std::string path;
  };
  for (const auto& [call, path] : std::vector<Case>{{"open", source_ + "/Info.plist"},
                                                    {"open", user("other") + "/Info.plist"},
                                                    {"open", system("s") + "/Info.plist"},
                                                    {"opendir", house_.paths.userBundles},
                                                    {"opendir", house_.paths.systemBundles},
                                                    {"lstat", user("other")},
                                                    {"lstat", user("org.a")}}) {
    looks_.failAt(call, path, EMFILE);
    EXPECT_EQ(install(), notSeen(EMFILE, path)) << call;
    EXPECT_THAT(entries(), ElementsAre("other")) << path;
  }
  looks_.failWith({});
  EXPECT_EQ(install(), std::nullopt);
}

TEST_F(BundleInstallerUnseenTest, UninstallingSaysWhatItCannotLookAtAndChangesNothing) {
  BundleHouse::install(user("a"), "org.a");
  BundleHouse::install(user("other"), "org.other");
  BundleHouse::install(system("s"), "org.s");
  struct Case {
    const char* call;
    std::string path;
  };
  for (const auto& [call, path] : std::vector<Case>{{"stat", house_.paths.userBundles},
                                                    {"opendir", house_.paths.userBundles},
                                                    {"opendir", house_.paths.systemBundles},
                                                    {"open", user("a") + "/Info.plist"},
                                                    {"open", user("other") + "/Info.plist"},
                                                    {"open", system("s") + "/Info.plist"}}) {
    looks_.failAt(call, path, EMFILE);
    EXPECT_EQ(uninstall("org.a"), notSeen(EMFILE, path)) << call;
    EXPECT_THAT(entries(), ElementsAre("a", "other")) << path;
  }
  looks_.failWith({});
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
}

TEST_F(BundleInstallerUnseenTest, WhereNothingMayBeLookedAtNothingIsInstalled) {
  looks_.failAt("stat", house_.paths.userBundles, EACCES);
  EXPECT_EQ(uninstall("org.a"), bundleError(BundleErrorCode::notFound, "No bundle org.a is installed."));
}

// A bundle of another identifier lies at the name; what is there and cannot be looked at is not a broken bundle.
TEST_F(BundleInstallerUnseenTest, WhateverCallFailsNoOtherBundleIsOverwritten) {
  BundleHouse::install(source_, "org.a");
  BundleHouse::install(user("org.a"), "org.other");
  for (const int error : {EMFILE, ENOMEM, EIO}) {
    for (int number = 0;; ++number) {
      ASSERT_LT(number, kMostCalls);
      std::optional<QXError> result;
      const std::string failed = failing(number, error, [this, &result] { result = install(); });
      EXPECT_TRUE(result) << failed;
      EXPECT_TRUE(house_.scan().contains("org.other")) << failed;
      if (failed.empty()) break;
    }
  }
}

TEST_F(BundleInstallerUnseenTest, WhateverCallFailsABundleIsRemovedOrThereIsAnErrorAndNeverNotFound) {
  for (const int error : {EMFILE, ENOMEM, EIO}) {
    for (int number = 0;; ++number) {
      ASSERT_LT(number, kMostCalls);
      BundleHouse::install(user("org.a"), "org.a");
      std::optional<QXError> result;
      const std::string failed = failing(number, error, [this, &result] { result = uninstall("org.a"); });
      EXPECT_EQ(house_.scan().contains("org.a"), result.has_value()) << failed;
      if (result) {
        EXPECT_EQ(result->domain, kQXSystemErrorDomain) << failed;
      }
      if (failed.empty()) break;
    }
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
