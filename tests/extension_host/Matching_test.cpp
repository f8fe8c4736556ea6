#include "platform/linux/extension_host/Matching.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>
#include <utility>
#include <vector>

namespace docuvend::linux_platform {
namespace {

Bundle bundleWith(QXValue extension) {
  Bundle bundle;
  bundle.info.emplace("QXExtension", std::move(extension));
  return bundle;
}

TEST(Matching, EveryAttributeMustBeThereAsThatString) {
  const QXExtensionHost::Attributes attributes = {{"point", "p"}, {"kind", "k"}};
  EXPECT_TRUE(hasAttributes(bundleWith(QXDictionary{{"point", "p"}, {"kind", "k"}, {"more", 1}}), attributes));
  const std::vector<std::pair<const char*, Bundle>> others = {
      {"one is missing", bundleWith(QXDictionary{{"point", "p"}})},
      {"one differs", bundleWith(QXDictionary{{"point", "p"}, {"kind", "K"}})},
      {"one is no string", bundleWith(QXDictionary{{"point", "p"}, {"kind", true}})},
      {"no dictionary", bundleWith("p")},
      {"no extension", Bundle{}},
  };
  for (const auto& [name, bundle] : others) EXPECT_FALSE(hasAttributes(bundle, attributes)) << name;
}

TEST(Matching, WithoutAttributesEveryExtensionMatchesAndNothingElse) {
  EXPECT_TRUE(hasAttributes(bundleWith(QXDictionary{}), {}));
  EXPECT_FALSE(hasAttributes(Bundle{}, {}));
}

TEST(Matching, AnythingThatAProcessDependsOnMakesAnotherInstallation) {
  const Bundle bundle = [] {
    Bundle made = bundleWith(QXDictionary{{"point", "p"}});
    made.identifier = "com.orvane.a";
    made.version = "1";
    return made;
  }();
  EXPECT_TRUE(isSameInstallation(bundle, bundle));
  const std::vector<std::pair<const char*, std::function<void(Bundle&)>>> changes = {
      {"identifier", [](Bundle& changed) { changed.identifier = "b"; }},
      {"incarnation", [](Bundle& changed) { changed.incarnation = "2"; }},
      {"version", [](Bundle& changed) { changed.version = "2"; }},
      {"directory", [](Bundle& changed) { changed.directory = "/d"; }},
      {"executable", [](Bundle& changed) { changed.executable = "/e"; }},
      {"info", [](Bundle& changed) { changed.info.emplace("k", "v"); }},
      {"entitlements", [](Bundle& changed) { changed.entitlements.emplace("k", "v"); }},
      {"groups", [](Bundle& changed) { changed.groups.emplace("g", "/g"); }},
      {"container", [](Bundle& changed) { changed.container = "/c"; }},
  };
  for (const auto& [name, change] : changes) {
    Bundle changed = bundle;
    change(changed);
    EXPECT_FALSE(isSameInstallation(bundle, changed)) << name;
  }
}

TEST(Matching, ASuccessorHasAllThatAProcessHas) {
  Bundle bundle = bundleWith(QXDictionary{{"point", "p"}});
  bundle.identifier = "com.orvane.a";
  bundle.incarnation = "1";
  bundle.version = "1";
  bundle.entitlements = {{"k", true}};
  bundle.groups = {{"g", "/g"}, {"h", "/h"}};
  using Changes = std::vector<std::pair<const char*, std::function<void(Bundle&)>>>;
  const Changes successors = {
      {"nothing", [](Bundle&) {}},
      {"version", [](Bundle& changed) { changed.version = "2"; }},
      {"executable", [](Bundle& changed) { changed.executable = "/e"; }},
      {"info", [](Bundle& changed) { changed.info.emplace("k", "v"); }},
      {"incarnation", [](Bundle& changed) { changed.incarnation = "2"; }},
      {"a group more", [](Bundle& changed) { changed.groups.emplace("f", "/f"); }},
  };
  for (const auto& [name, change] : successors) {
    Bundle changed = bundle;
    change(changed);
    EXPECT_TRUE(isSuccessor(bundle, changed)) << name;
  }
  const Changes others = {
      {"identifier", [](Bundle& changed) { changed.identifier = "b"; }},
      {"directory", [](Bundle& changed) { changed.directory = "/d"; }},
      {"container", [](Bundle& changed) { changed.container = "/c"; }},
      {"an entitlement less", [](Bundle& changed) { changed.entitlements.clear(); }},
      {"a group less", [](Bundle& changed) { changed.groups.erase("g"); }},
      {"a group's directory", [](Bundle& changed) { changed.groups["g"] = "/other"; }},
      {"a group for another",
       [](Bundle& changed) {
         changed.groups.erase("g");
         changed.groups.emplace("f", "/f");
       }},
  };
  for (const auto& [name, change] : others) {
    Bundle changed = bundle;
    change(changed);
    EXPECT_FALSE(isSuccessor(bundle, changed)) << name;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
