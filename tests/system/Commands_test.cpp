// docuvendctl's commands over the real daemon: what they print, and the status for each kind of failure.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>

#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using ::testing::HasSubstr;
using ::testing::IsEmpty;
using ::testing::MatchesRegex;
using ::testing::StartsWith;
using JSON = nlohmann::json;
namespace fs = std::filesystem;

using Words = std::vector<std::string>;

// What --help lists.
constexpr int kDone = 0;
constexpr int kUsage = 2;
constexpr int kNotPermitted = 3;
constexpr int kNotFound = 4;
constexpr int kProviderFailed = 5;
constexpr int kInvalidInput = 6;
constexpr int kUnreachable = 7;
constexpr int kDeadlinePassed = 8;
constexpr int kFileError = 9;

std::set<std::string> keysOf(const JSON& object) {
  std::set<std::string> keys;
  for (const auto& item : object.items()) keys.insert(item.key());
  return keys;
}

class Commands : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    for (const auto& bundle : {kCellar, kPicker, kStranger}) house_.install(bundle);
    house_.installTrickster();
    letter_ = house_.putInCloud("letter.txt", "Dear all\n");
    house_.startDaemon();
  }

  static std::string urlOf(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file).absoluteString(); }
  // What the letter is called in the list.
  [[nodiscard]] std::string itemOf(const std::string& string) const { return string.substr(string.find('/') + 1); }

  // Succeeds with that output and without a word on the standard error.
  void expectPrinted(const Ending& ending, const std::string& output) const {
    EXPECT_EQ(ending.status, kDone);
    EXPECT_EQ(ending.output, output);
    EXPECT_EQ(ending.errors, "");
  }
  void expectRefused(const Ending& ending, int status) const {
    EXPECT_EQ(ending.status, status) << ending.errors;
    EXPECT_EQ(ending.output, "");
    EXPECT_THAT(ending.errors, StartsWith("docuvendctl: "));
    EXPECT_EQ(ending.errors.find('\n'), ending.errors.size() - 1) << ending.errors;
  }
  [[nodiscard]] JSON json(Words words) const {
    words.insert(words.begin(), "--json");
    const Ending ending = house_.ctl(words);
    EXPECT_EQ(ending.status, kDone) << ending.errors;
    EXPECT_EQ(ending.output.find('\n'), ending.output.size() - 1) << ending.output;
    return JSON::parse(ending.output, nullptr, /*allow_exceptions=*/false);
  }
  // The daemon hears of bundles by and by.
  void awaitProviders(std::size_t count) const {
    eventually("so many providers are there", [this, count] { return json({"--as", kPicker, "providers"}).size() == count; });
  }
  [[nodiscard]] static long blocksOf(const std::string& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 ? status.st_blocks : -1;
  }

  std::string letter_;
};

TEST_F(Commands, EachKindOfFailureHasAStatusOfItsOwnAndOneLine) {
  const std::string item = letter_;
  const std::string none = house_.document("none");
  const std::vector<std::pair<Words, int>> table = {
      {{"--as", kStranger, "grant", item, kCellar, kStranger}, kNotPermitted},
      {{"--as", kPicker, "grant", item, "com.example.none", kPicker}, kNotFound},
      {{"--as", kPicker, "grant", none, kCellar, kPicker}, kProviderFailed},
      {{"providers"}, kNotPermitted},
      {{"--as", kPicker, "start", item, kCellar, kPicker}, kNotPermitted},
      {{"--as", kPicker, "start", "/etc/passwd", kCellar, kPicker}, kNotFound},
      {{"--as", kPicker, "start", item, kTrickster, kPicker}, kInvalidInput},
      {{"--as", kPicker, "placeholder", item, kCellar, kPicker}, kNotPermitted},
      {{"placeholder", item, kCellar, kPicker}, kNotPermitted},
      {{"--as", kPicker, "stop", item, "com.example.none", kPicker}, kInvalidInput},
      {{"--as", kPicker, "stop", "/etc/passwd", kCellar, kPicker}, kNotFound},
      {{"stop", item, kCellar, kPicker}, kNotPermitted},
      {{"bookmark", "/etc/passwd"}, kNotFound},
      {{"bookmark", "https://example.com/"}, kInvalidInput},
      {{"bookmark", "relative"}, kInvalidInput},
      {{"extend-bookmark", item, kPicker}, kNotPermitted},
      {{"extend-bookmark", "relative", kPicker}, kInvalidInput},
      {{"--as", kPicker, "resolve", "docuvend:"}, kInvalidInput},
      {{"--as", kPicker, "resolve", "docuvend:com.orvane.cellar/none"}, kNotPermitted},
      {{"--as", kPicker, "cat", "docuvend:com.orvane.cellar/none"}, kNotPermitted},
      {{"--as", kPicker, "put", "docuvend:com.orvane.cellar/none"}, kNotPermitted},
      {{"--as", "com.example.none", "wake"}, 10},
      {{"revoke", kCellar, "none", kPicker}, kNotFound},
      {{"install", house_.home()}, kInvalidInput},
      {{"install", house_.home() + "/none"}, kInvalidInput},
      {{"uninstall", "com.example.none"}, kNotFound},
      {{"uninstall", "--remove-grants", "com.example.none"}, kNotFound},
      {{"platform", "lock-state", "1000"}, kUsage},
      {{"platform", "lock-state", "open"}, kUsage},
      {{"platform", "lock-state", "3x"}, kUsage},
      {{"platform", "lock-state", ""}, kUsage},
      {{"platform", "lock-state", "1", "maybe"}, kUsage},
      {{"help", "dance"}, kUsage},
  };
  for (const auto& [arguments, status] : table) {
    SCOPED_TRACE(::testing::PrintToString(arguments));
    expectRefused(house_.ctl(arguments), status);
    Words inJSON = arguments;
    inJSON.insert(inJSON.begin(), "--json");
    const Ending ending = house_.ctl(inJSON);
    EXPECT_EQ(ending.status, status);
    EXPECT_EQ(ending.output, "");
    const JSON error = JSON::parse(ending.errors, nullptr, /*allow_exceptions=*/false);
    ASSERT_TRUE(error.is_object()) << ending.errors;
    EXPECT_EQ(keysOf(error), std::set<std::string>{"error"});
    EXPECT_EQ(keysOf(error["error"]), (std::set<std::string>{"domain", "code", "description"}));
  }
}

TEST_F(Commands, WhatCannotBeDoneFromInsideAConfinementSaysSo) {
  const std::vector<std::pair<Words, int>> table = {
      {{"grants"}, kUnreachable},
      {{"revoke", kCellar, "i", kPicker}, kUnreachable},
      {{"status"}, kUnreachable},
      {{"install", "/usr"}, kNotPermitted},
      {{"uninstall", kCellar}, kNotPermitted},
      {{"uninstall", "--remove-grants", kCellar}, kNotPermitted},
      {{"platform", "lock-state"}, kNotPermitted},
      {{"platform", "lock-state", "1", "locked"}, kNotPermitted},
      {{"platform", "first-unlock"}, kNotPermitted},
  };
  for (const auto& [arguments, status] : table) {
    SCOPED_TRACE(::testing::PrintToString(arguments));
    const Ending ending = house_.confined(kStranger, arguments);
    expectRefused(ending, status);
    if (status == kUnreachable) continue;
    EXPECT_EQ(ending.errors, "docuvendctl: this cannot be done from inside a confinement\n");
  }
  EXPECT_TRUE(fs::exists(house_.bundles() + "/" + kCellar));
  EXPECT_FALSE(fs::exists(house_.runtime() + "/docuvend/lock-state"));
  EXPECT_EQ(house_.loggedContaining("announces the first unlock"), 0);
}

TEST_F(Commands, WithoutADaemonEveryoneWhoNeedsItSaysSo) {
  house_.killDaemon();
  for (const Words& arguments : std::vector<Words>{{"wake"},
                                                   {"providers"},
                                                   {"bookmark", letter_},
                                                   {"grants"},
                                                   {"revoke", kCellar, "i", kPicker},
                                                   {"status"},
                                                   {"uninstall", "--remove-grants", kStranger}}) {
    SCOPED_TRACE(::testing::PrintToString(arguments));
    expectRefused(house_.ctl(arguments), kUnreachable);
  }
  EXPECT_TRUE(fs::exists(house_.bundles() + "/" + kStranger)) << "nothing was removed";
}

TEST_F(Commands, WakingPrintsNothing) {
  expectPrinted(house_.ctl({"wake"}), "");
  EXPECT_EQ(json({"wake"}), JSON::object());
}

TEST_F(Commands, ProvidersAreListedWithTheirStorage) {
  const auto storage = [this](const std::string& provider) {
    return QXURL::fileURL(house_.storage(provider), QXURLKind::directory).absoluteString();
  };
  expectPrinted(house_.ctl({"--as", kPicker, "providers"}),
                kCellar + "\t" + storage(kCellar) + "\n" + kTrickster + "\t" + storage(kTrickster) + "\n");
  EXPECT_EQ(json({"--as", kPicker, "providers"}), JSON::array({{{"provider", kCellar}, {"storage", storage(kCellar)}},
                                                               {{"provider", kTrickster}, {"storage", storage(kTrickster)}}}));
}

TEST_F(Commands, AURLAndAPathNameTheSameDocument) { EXPECT_EQ(house_.bookmark(urlOf(letter_)), house_.bookmark(letter_)); }

TEST_F(Commands, ABookmarkIsTheStringAlone) {
  const std::string string = house_.bookmark(letter_);
  EXPECT_THAT(string, MatchesRegex("docuvend:com\\.orvane\\.cellar/[0-9a-f]+"));
  EXPECT_EQ(json({"bookmark", letter_}), JSON({{"string", string}}));
}

TEST_F(Commands, AGrantPrintsWhatOpensTheDocument) {
  const std::string url = urlOf(letter_);
  const std::string sibling = urlOf(house_.document(".letter.txt"));
  const std::string token = "docuvend-token:[^ \t\n\"]*";
  EXPECT_THAT(house_.confined(kPicker, {"grant", letter_, kCellar, kStranger}).output,
              MatchesRegex("url\t" + url + "\ntoken\t" + token + "\nsiblingURL\t" + sibling + "\nsiblingToken\t" + token + "\n"));
  EXPECT_THAT(house_.confined(kPicker, {"--json", "grant", letter_, kCellar, kStranger}).output,
              MatchesRegex("\\{\"url\":\"" + url + "\",\"token\":\"" + token + "\",\"siblingURL\":\"" + sibling + "\",\"siblingToken\":\"" +
                           token + "\"\\}\n"));
}

TEST_F(Commands, AResolvedStringPrintsTheSame) {
  const std::string string = house_.granted(letter_, kStranger);
  const JSON resolved = json({"--as", kStranger, "resolve", string});
  EXPECT_EQ(keysOf(resolved), (std::set<std::string>{"url", "token", "siblingURL", "siblingToken"}));
  EXPECT_EQ(resolved["url"], urlOf(letter_));
  EXPECT_THAT(house_.ctl({"--as", kStranger, "resolve", string}).output, StartsWith("url\t" + urlOf(letter_) + "\ntoken\t"));
}

TEST_F(Commands, AStringThatIsNeverAnsweredEndsAtTheCallersTimeout) {
  const std::string string = house_.granted(letter_, kStranger);
  ASSERT_EQ(house_.ctl({"uninstall", kCellar}).status, kDone);
  awaitProviders(1);
  expectRefused(house_.ctl({"--as", kStranger, "--timeout", "1", "resolve", string}), kDeadlinePassed);
}

TEST_F(Commands, ADocumentIsPrintedAndSavedByteForByte) {
  const std::string string = house_.granted(letter_, kStranger);
  EXPECT_EQ(house_.confined(kStranger, {"cat", string}).output, "Dear all\n");
  const std::string bytes = std::string(200'000, '\0') + "\xff\n\r\x1b[31m";
  expectPrinted(house_.confined(kStranger, {"put", string}, bytes), "");
  EXPECT_EQ(house_.confined(kStranger, {"cat", string}).output, bytes);
  eventually("the cloud has it", [this, &bytes] { return contentsOf(house_.cloudFile("letter.txt")) == bytes; });
  EXPECT_EQ(json({"--as", kStranger, "put", string}), JSON::object());
}

TEST_F(Commands, ADocumentInJSONIsItsURLAndItsBytesInBase64) {
  const std::string string = house_.granted(letter_, kStranger);
  EXPECT_EQ(json({"--as", kStranger, "cat", string}), JSON({{"url", urlOf(letter_)}, {"base64", "RGVhciBhbGwK"}}));
}

TEST_F(Commands, ABookmarkGrantPrintsTheStringByWhichTheOtherFindsTheDocument) {
  (void)house_.granted(letter_, kPicker);
  const std::string string = house_.bookmark(letter_);
  expectPrinted(house_.ctl({"--as", kPicker, "extend-bookmark", letter_, kStranger}), string + "\n");
  EXPECT_EQ(house_.confined(kStranger, {"cat", string}).output, "Dear all\n");
  EXPECT_EQ(json({"--as", kPicker, "extend-bookmark", letter_, kStranger}), JSON({{"string", string}}));
  expectRefused(house_.confined(kStranger, {"extend-bookmark", letter_, kPicker}), kNotPermitted);
}

TEST_F(Commands, AnItemIsMaterialisedGivenUpAndAPlaceholderAgain) {
  (void)house_.granted(letter_, kPicker);
  EXPECT_EQ(blocksOf(letter_), 0);
  expectPrinted(house_.ctl({"--as", kPicker, "start", letter_, kCellar, kPicker}), "");
  EXPECT_GT(blocksOf(letter_), 0);
  expectPrinted(house_.ctl({"--as", kPicker, "stop", letter_, kCellar, kPicker}), "");
  EXPECT_EQ(blocksOf(letter_), 0);
  fs::remove(letter_);
  expectPrinted(house_.ctl({"--as", kPicker, "placeholder", letter_, kCellar, kPicker}), "");
  EXPECT_EQ(blocksOf(letter_), 0);
  for (const char* command : {"placeholder", "start", "stop"}) {
    EXPECT_EQ(json({"--as", kPicker, command, letter_, kCellar, kPicker}), JSON::object()) << command;
  }
}

TEST_F(Commands, GrantsAreListedWholeAndByProviderAndConsumer) {
  EXPECT_EQ(json({"grants"}), JSON::array());
  expectPrinted(house_.ctl({"grants"}), "");
  const std::string item = itemOf(house_.granted(letter_, kStranger));
  (void)house_.granted(letter_, kPicker);
  const std::string picker = kCellar + "\t" + item + "\t" + kPicker + "\n";
  const std::string stranger = kCellar + "\t" + item + "\t" + kStranger + "\n";
  expectPrinted(house_.ctl({"grants"}), picker + stranger);
  expectPrinted(house_.ctl({"grants", "--consumer", kPicker}), picker);
  expectPrinted(house_.ctl({"grants", "--provider", kCellar, "--consumer", kStranger}), stranger);
  expectPrinted(house_.ctl({"grants", "--provider", kTrickster}), "");
  EXPECT_EQ(json({"grants", "--consumer", kPicker}), JSON::array({{{"provider", kCellar}, {"item", item}, {"consumer", kPicker}}}));
}

TEST_F(Commands, ARevocationTakesTheGrantAndTheTokens) {
  const std::string string = house_.granted(letter_, kStranger);
  expectPrinted(house_.ctl({"revoke", kCellar, itemOf(string), kStranger}), "");
  EXPECT_EQ(house_.ctl({"grants"}).output, "");
  expectRefused(house_.confined(kStranger, {"cat", string}), kNotPermitted);
  expectRefused(house_.ctl({"revoke", kCellar, itemOf(string), kStranger}), kNotFound);
  (void)house_.granted(letter_, kStranger);
  EXPECT_EQ(json({"revoke", kCellar, itemOf(string), kStranger}), JSON::object());
}

TEST_F(Commands, TheStatusIsLinesOfNameAndValueOrOneObject) {
  const Ending status = house_.ctl({"status"});
  EXPECT_EQ(status.status, kDone) << status.errors;
  EXPECT_THAT(status.output, HasSubstr("processIdentifier\t" + std::to_string(house_.daemon().pid()) + "\n"));
  EXPECT_THAT(status.output, HasSubstr("lockState\t3\n"));
  EXPECT_THAT(status.output, HasSubstr("providers." + kCellar + ".documentStorageURL\tfile:///"));
  const JSON object = json({"status"});
  EXPECT_EQ(object["processIdentifier"], house_.daemon().pid());
  EXPECT_EQ(object["unlockedSinceBoot"], true);
  EXPECT_TRUE(object["protections"].is_array());
  // docuvendctl and the daemon are of one version.
  EXPECT_EQ(house_.ctl({"version"}).output, object["version"].get<std::string>() + "\n");
}

TEST_F(Commands, ABundleIsInstalledAndUpdatedWhileTheDaemonRuns) {
  const std::string source = house_.home() + "/source";
  fs::copy(house_.bundles() + "/" + kCellar, source, fs::copy_options::recursive);
  const std::string place = house_.bundles() + "/" + kCellar;
  EXPECT_EQ(json({"install", source}), JSON({{"bundle", kCellar}, {"directory", place}, {"outcome", "updated"}}));
  EXPECT_EQ(json({"uninstall", kCellar}), JSON({{"bundle", kCellar}, {"remainingGrants", JSON::array()}}));
  EXPECT_FALSE(fs::exists(place));
  awaitProviders(1);
  expectPrinted(house_.ctl({"install", source}), "bundle\t" + kCellar + "\ndirectory\t" + place + "\noutcome\tinstalled\n");
  awaitProviders(2);
  EXPECT_EQ(house_.confined(kStranger, {"cat", house_.granted(letter_, kStranger)}).output, "Dear all\n");
}

TEST_F(Commands, ARelativeDirectoryIsThatOfTheCaller) {
  const fs::path source = fs::path(house_.home()) / "source";
  fs::copy(house_.bundles() + "/" + kStranger, source, fs::copy_options::recursive);
  const Ending installed = house_.ctl({"install", fs::relative(source).string()});
  EXPECT_EQ(installed.status, kDone) << installed.errors;
  EXPECT_THAT(installed.output, HasSubstr("outcome\tupdated\n"));
}

TEST_F(Commands, GrantsOfAnUninstalledBundleAreShownAsProvidersAndAsConsumers) {
  const std::string item = itemOf(house_.granted(letter_, kStranger));
  expectPrinted(house_.ctl({"uninstall", kStranger}),
                "bundle\t" + kStranger + "\nremainingGrants\t" + kCellar + "\t" + item + "\t" + kStranger + "\n");
  EXPECT_EQ(
      json({"uninstall", kCellar}),
      JSON({{"bundle", kCellar}, {"remainingGrants", JSON::array({{{"provider", kCellar}, {"item", item}, {"consumer", kStranger}}})}}));
  EXPECT_NE(house_.ctl({"grants"}).output, "");
}

TEST_F(Commands, AGrantThatNamesABundleTwiceIsShownOnce) {
  const std::string item = itemOf(house_.granted(letter_, kCellar));
  expectPrinted(house_.ctl({"uninstall", kCellar}),
                "bundle\t" + kCellar + "\nremainingGrants\t" + kCellar + "\t" + item + "\t" + kCellar + "\n");
}

TEST_F(Commands, GrantsOfAnUninstalledBundleAreRemovedOnRequest) {
  const std::string item = itemOf(house_.granted(letter_, kStranger));
  (void)house_.granted(letter_, kPicker);
  expectPrinted(house_.ctl({"uninstall", "--remove-grants", kStranger}),
                "bundle\t" + kStranger + "\nremovedGrants\t" + kCellar + "\t" + item + "\t" + kStranger + "\n");
  expectPrinted(house_.ctl({"grants"}), kCellar + "\t" + item + "\t" + kPicker + "\n");
  EXPECT_EQ(json({"uninstall", kCellar, "--remove-grants"}),
            JSON({{"bundle", kCellar}, {"removedGrants", JSON::array({{{"provider", kCellar}, {"item", item}, {"consumer", kPicker}}})}}));
  EXPECT_EQ(house_.ctl({"grants"}).output, "");
  EXPECT_THAT(house_.accessControl(), ::testing::Not(HasSubstr(kPicker)));
}

TEST_F(Commands, GrantsOfABundleThatIsGoneAlreadyAreRemovedOnRequest) {
  const std::string item = itemOf(house_.granted(letter_, kStranger));
  EXPECT_EQ(house_.ctl({"uninstall", kStranger}).status, kDone);
  expectPrinted(house_.ctl({"uninstall", "--remove-grants", kStranger}),
                "bundle\t" + kStranger + "\nremovedGrants\t" + kCellar + "\t" + item + "\t" + kStranger + "\n");
  EXPECT_EQ(house_.ctl({"grants"}).output, "");
  EXPECT_EQ(house_.ctl({"uninstall", "--remove-grants", kStranger}).status, kNotFound) << "nothing is left of it";
}

TEST_F(Commands, WithoutADaemonABundleIsUninstalledAndItsGrantsAreUnknown) {
  (void)house_.granted(letter_, kStranger);
  house_.killDaemon();
  expectPrinted(house_.ctl({"uninstall", kStranger}), "bundle\t" + kStranger + "\nremainingGrants\tunknown\n");
  EXPECT_FALSE(fs::exists(house_.bundles() + "/" + kStranger));
  EXPECT_EQ(json({"uninstall", kPicker}), JSON({{"bundle", kPicker}, {"remainingGrants", nullptr}}));
}

TEST_F(Commands, TheLockStateIsShownAndSet) {
  house_.killDaemon();
  expectPrinted(house_.ctl({"platform", "lock-state"}), "state\t3\nunlockedSinceBoot\ttrue\n");
  expectPrinted(house_.ctl({"platform", "lock-state", "1", "locked"}), "");
  EXPECT_EQ(json({"platform", "lock-state"}), JSON({{"state", 1}, {"unlockedSinceBoot", false}}));
  // What is not said stays as it is.
  expectPrinted(house_.ctl({"platform", "lock-state", "0"}), "");
  EXPECT_EQ(json({"platform", "lock-state"}), JSON({{"state", 0}, {"unlockedSinceBoot", false}}));
  expectPrinted(house_.ctl({"platform", "lock-state", "999", "unlocked"}), "");
  EXPECT_EQ(contentsOf(house_.runtime() + "/docuvend/lock-state"), "999\n1\n");
  EXPECT_EQ(json({"platform", "lock-state", "3"}), JSON::object());
  EXPECT_EQ(contentsOf(house_.runtime() + "/docuvend/lock-state"), "3\n1\n");
}

TEST_F(Commands, TheLockStateCanBeSetBeforeAnyDaemonHasRun) {
  house_.killDaemon();
  fs::remove_all(house_.runtime() + "/docuvend");
  expectPrinted(house_.ctl({"platform", "lock-state", "1", "locked"}), "");
  EXPECT_EQ(contentsOf(house_.runtime() + "/docuvend/lock-state"), "1\n0\n");
}

TEST_F(Commands, ARunTimeDirectoryThatOthersMayEnterIsRefused) {
  house_.killDaemon();
  fs::permissions(house_.runtime() + "/docuvend", fs::perms::owner_all | fs::perms::others_exec);
  expectRefused(house_.ctl({"platform", "lock-state", "1", "locked"}), kFileError);
  expectRefused(house_.ctl({"platform", "first-unlock"}), kFileError);
}

TEST_F(Commands, TheFirstUnlockReachesARunningDaemon) {
  house_.killDaemon();
  ASSERT_EQ(house_.ctl({"platform", "lock-state", "1", "locked"}).status, kDone);
  house_.startDaemon();
  EXPECT_EQ(json({"--as", kPicker, "providers"}), JSON::array());
  expectPrinted(house_.ctl({"platform", "first-unlock"}), "");
  EXPECT_EQ(contentsOf(house_.runtime() + "/docuvend/lock-state"), "1\n1\n") << "the state's number is the greeter's to change";
  awaitProviders(2);
  EXPECT_EQ(json({"platform", "first-unlock"}), JSON::object()) << "a second one is harmless";
}

TEST_F(Commands, TheFirstUnlockWithoutADaemonIsRememberedForItsStart) {
  house_.killDaemon();
  ASSERT_EQ(house_.ctl({"platform", "lock-state", "1", "locked"}).status, kDone);
  expectPrinted(house_.ctl({"platform", "first-unlock"}), "");
  house_.startDaemon();
  EXPECT_EQ(json({"--as", kPicker, "providers"}).size(), 2U);
}

TEST_F(Commands, EveryOtherCommandExplainsItself) {
  EXPECT_EQ(json({"help"})["help"], house_.ctl({"--help"}).output);
  EXPECT_EQ(keysOf(json({"version"})), std::set<std::string>{"version"});
}

}  // namespace
}  // namespace docuvend::tests
