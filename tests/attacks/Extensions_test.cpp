// What a provider's extension may ask of the daemon that started it: nothing but what stands in its bundle, wherever it finds a socket.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;

const std::string kRefused = "QXRpcErrorDomain 9";
const std::string kSelf = kAttacker + ".extension1";

class ExtensionAttacks : public TwoApplications {
 protected:
  // The daemon's sockets by other names, where the extension can see them; the run-time directory that it is to believe in.
  [[nodiscard]] std::string doors() const {
    const std::string runtime = house_.container(kSelf);
    fs::create_directories(runtime + "/docuvend/public");
    fs::permissions(runtime, fs::perms::owner_all);
    fs::create_hard_link(house_.publicSocket(kDVServiceName), runtime + "/docuvend/public/" + kDVServiceName);
    fs::create_hard_link(house_.administrationSocket(), door(runtime));
    return runtime;
  }
  [[nodiscard]] static std::string door(const std::string& runtime) { return runtime + "/docuvend/" + kDVAdministrationServiceName; }
};

TEST_F(ExtensionAttacks, AnExtensionFindsNoSocketOfTheDaemons) {
  EXPECT_EQ(attackAsExtension({"reach", house_.publicSocket(kDVServiceName), "reach", house_.administrationSocket()}),
            (Lines{"ENOENT", "ENOENT"}));
  EXPECT_EQ(unconfined({"reach", house_.publicSocket(kDVServiceName), "reach", house_.administrationSocket()}), (Lines{"ok", "ok"}));
}

TEST_F(ExtensionAttacks, AnExtensionThatFindsThemDeclaresNothingAndIsItself) {
  const std::string runtime = doors();
  const Lines acts = {"ask-as", kVictim, others_, "ask-as", kSelf, own_, "ask-as", kPicker, own_, "ask", others_, "ask", own_};
  Lines words = {"runtime", runtime};
  EXPECT_EQ(attackAsExtension(joined(words, acts)), (Lines{"ok", kRefused, kRefused, kRefused, "DVErrorDomain 2", "DVErrorDomain 2"}));
  EXPECT_EQ(refusalsOf(kSelf), 2) << "it is known for what it is";
  EXPECT_EQ(house_.loggedContaining(" declares itself to be " + kVictim), 0);
  EXPECT_EQ(unconfined({"runtime", runtime, "ask-as", kVictim, others_}), (Lines{"ok", "ok"}));
  EXPECT_EQ(house_.loggedContaining(" declares itself to be " + kVictim), 1);
}

TEST_F(ExtensionAttacks, AnExtensionThatFindsThemNeitherAdministersNorAnnouncesTheUnlock) {
  const std::string runtime = doors();
  EXPECT_EQ(attackAsExtension({"knock", door(runtime), "status", "knock", door(runtime), "first-unlock", "orphan", "knock", door(runtime),
                               "first-unlock"}),
            (Lines{kRefused, kRefused, "ok", kRefused}));
  EXPECT_EQ(house_.loggedContaining(" announces the first unlock."), 0);
  EXPECT_EQ(unconfined({"knock", door(runtime), "status", "knock", door(runtime), "first-unlock"}), (Lines{"answered", "answered"}));
  EXPECT_EQ(house_.loggedContaining(" announces the first unlock."), 1);
}

TEST_F(ExtensionAttacks, AnExtensionHasNoEntitlementToGrantOrProvideInItsOwnOrAnothersName) {
  const std::string runtime = doors();
  const std::string before = house_.accessControl();
  EXPECT_EQ(attackAsExtension({"runtime", runtime, "grant", othersPath_, kCellar, kSelf, "provide", othersPath_, kCellar, kVictim,
                               "providers", "pass-on", othersPath_, kSelf}),
            (Lines{"ok", "DVErrorDomain 1", "DVErrorDomain 1", "DVErrorDomain 1", "DVErrorDomain 2"}));
  EXPECT_EQ(house_.accessControl(), before);
  EXPECT_EQ(told(errorOf(
                house_.client(kPicker)->ask<&DVDaemon::extendSandboxForFileURL>(url(othersPath_), ProviderID{kCellar}, ConsumerID{kSelf}))),
            "ok");
  EXPECT_NE(house_.accessControl(), before);
}

}  // namespace
}  // namespace docuvend::tests
