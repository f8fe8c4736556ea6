#include "platform/linux/bundles/BundleInstaller.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <future>
#include <regex>
#include <thread>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/bundles/BundleCopy.h"
#include "platform/linux/bundles/BundleErrors.h"
#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
using Outcome = InstalledBundle::Outcome;
using ::testing::ElementsAre;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

constexpr std::chrono::seconds kPatience{30};

std::string contentsOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

class BundleInstallerTest : public ::testing::Test {
 protected:
  void SetUp() override { BundleHouse::install(source_, "org.a"); }

  std::variant<InstalledBundle, QXError> install(const std::string& directory) {
    return installBundle(directory, house_.paths, house_.propertyLists);
  }
  InstalledBundle installed(const std::string& directory) {
    auto result = install(directory);
    if (const auto* error = std::get_if<QXError>(&result)) {
      ADD_FAILURE() << error->description();
      return {};
    }
    return std::get<InstalledBundle>(std::move(result));
  }
  std::optional<QXError> uninstall(const std::string& identifier) {
    return uninstallBundle(identifier, house_.paths, house_.propertyLists);
  }
  // Installing is refused with that code, and leaves the user's directory as it is.
  std::string refusal(BundleErrorCode code, const std::string& directory) {
    const auto before = entries();
    const auto result = install(directory);
    const auto* error = std::get_if<QXError>(&result);
    if (error == nullptr) return "installed";
    EXPECT_EQ(error->domain, kBundleErrorDomain);
    EXPECT_EQ(error->code, static_cast<std::int64_t>(code)) << error->description();
    EXPECT_EQ(entries(), before);
    return error->description();
  }
  [[nodiscard]] std::string user(const std::string& name) const { return house_.paths.userBundles + "/" + name; }
  // The names in the user's directory, hidden ones too.
  [[nodiscard]] std::vector<std::string> entries() const {
    std::vector<std::string> result;
    std::error_code ignored;
    for (const auto& entry : fs::directory_iterator(house_.paths.userBundles, ignored)) result.push_back(entry.path().filename());
    std::sort(result.begin(), result.end());
    return result;
  }
  static void note(const std::string& bundle, const std::string& text) { BundleHouse::write(bundle + "/note", text); }

  BundleHouse house_;
  const std::string source_ = house_.root() + "/source";
};

TEST_F(BundleInstallerTest, InstallsUnderTheIdentifierAndLeavesTheSourceAsItIs) {
  note(source_, "one");
  const auto result = installed(source_);
  EXPECT_EQ(result.identifier, "org.a");
  EXPECT_EQ(result.directory, user("org.a"));
  EXPECT_EQ(result.outcome, Outcome::installed);
  EXPECT_EQ(house_.scan().at("org.a").directory, user("org.a"));
  EXPECT_EQ(contentsOf(user("org.a") + "/note"), "one");
  EXPECT_EQ(contentsOf(source_ + "/note"), "one");
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, UpdatesInPlaceWithAnotherVersion) {
  BundleHouse::write(source_ + "/only-old", "");
  installed(source_);
  const std::string before = house_.scan().at("org.a").version;
  const std::string incarnation = house_.scan().at("org.a").incarnation;
  fs::remove(source_ + "/only-old");
  note(source_, "two");
  const auto result = installed(source_);
  EXPECT_EQ(result.outcome, Outcome::updated);
  EXPECT_EQ(result.directory, user("org.a"));
  EXPECT_NE(house_.scan().at("org.a").version, before);
  EXPECT_NE(house_.scan().at("org.a").incarnation, incarnation);
  EXPECT_EQ(contentsOf(user("org.a") + "/note"), "two");
  EXPECT_FALSE(fs::exists(user("org.a") + "/only-old")) << "an update is no mixture";
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, InstallingTheSameAgainIsAnUpdateToo) {
  installed(source_);
  const std::string before = house_.scan().at("org.a").version;
  EXPECT_EQ(installed(user("org.a")).outcome, Outcome::updated) << "even from where it is installed";
  EXPECT_NE(house_.scan().at("org.a").version, before);
}

TEST_F(BundleInstallerTest, AnOlderCopyUnderAnotherNameIsUpdatedWhereItLies) {
  BundleHouse::install(user("by-hand"), "org.a");
  note(source_, "new");
  const auto result = installed(source_);
  EXPECT_EQ(result.outcome, Outcome::updated);
  EXPECT_EQ(result.directory, user("by-hand"));
  EXPECT_EQ(contentsOf(user("by-hand") + "/note"), "new");
  EXPECT_THAT(entries(), ElementsAre("by-hand"));
}

TEST_F(BundleInstallerTest, OfSeveralCopiesTheOneThatCountsIsUpdatedAndTheOthersGo) {
  BundleHouse::install(user("one"), "org.a");
  BundleHouse::install(user("two"), "org.a");
  BundleHouse::install(user("three"), "org.b");
  EXPECT_EQ(installed(source_).directory, user("one"));
  EXPECT_THAT(entries(), ElementsAre("one", "three"));
}

TEST_F(BundleInstallerTest, ABrokenBundleAtTheNameIsReplaced) {
  BundleHouse::write(user("org.a") + "/program", "half");
  EXPECT_EQ(installed(source_).outcome, Outcome::installed);
  EXPECT_TRUE(house_.scan().contains("org.a"));
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, NeitherAnotherBundleNorAnythingElseAtTheNameIsReplaced) {
  BundleHouse::install(user("org.a"), "org.other");
  EXPECT_THAT(refusal(BundleErrorCode::inTheWay, source_), HasSubstr(user("org.a") + " is in the way."));
  EXPECT_TRUE(house_.scan().contains("org.other"));
  fs::remove_all(user("org.a"));
  BundleHouse::write(user("org.a"), "a file");
  refusal(BundleErrorCode::inTheWay, source_);
  fs::remove(user("org.a"));
  fs::create_directory_symlink(source_, user("org.a"));
  refusal(BundleErrorCode::inTheWay, source_);
}

TEST_F(BundleInstallerTest, AnIdentifierOfTheSystemsIsRefused) {
  BundleHouse::install(house_.paths.systemBundles + "/anything", "org.a");
  fs::create_directories(house_.paths.userBundles);
  EXPECT_THAT(refusal(BundleErrorCode::notPermitted, source_), HasSubstr("org.a is the system's"));
}

TEST_F(BundleInstallerTest, ABundleThatClaimsWhatIsAnothersIsRefusedWithTheReason) {
  const std::string docs = BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.one.docs"}));
  const std::string whose = " the group org.owner.one.docs, which is org.owner.one's.";
  for (const std::string& owner : {user("owner"), house_.paths.systemBundles + "/owner"}) {
    BundleHouse::install(owner, "org.owner.one", docs);
    for (const std::string& claimant : {std::string("org.a"), std::string("org.owner.one.docs"), std::string("org.owner")}) {
      BundleHouse::install(source_, claimant, docs);
      EXPECT_THAT(refusal(BundleErrorCode::notItsOwn, source_), EndsWith(": The bundle " + claimant + " may not belong to" + whose))
          << owner;
    }
    fs::remove_all(owner);
  }
}

TEST_F(BundleInstallerTest, ABundleThatNamesMembersOfWhatIsAnothersIsRefusedAlsoWhenThatOneIsNotThereYet) {
  const std::string list =
      BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.one.docs</key>" + BundleHouse::array({"org.owner.one"}) + "</dict>");
  for (const std::string& claimant : {std::string("org.a"), std::string("org.owner.one.docs"), std::string("org.owner")}) {
    BundleHouse::install(source_, claimant, list);
    EXPECT_THAT(refusal(BundleErrorCode::notItsOwn, source_),
                EndsWith(": The bundle " + claimant + " may not name members of the group org.owner.one.docs, which is org.owner.one's."));
  }
  BundleHouse::install(source_, "org.owner.one", list);
  EXPECT_EQ(installed(source_).outcome, Outcome::installed);
}

TEST_F(BundleInstallerTest, AGroupThatNobodyCanOwnIsRefused) {
  for (const std::string& group : {std::string("documents"), std::string("org.documents")}) {
    BundleHouse::install(source_, "org.a", BundleHouse::entry("QXGroups", BundleHouse::array({group})));
    EXPECT_THAT(refusal(BundleErrorCode::notItsOwn, source_),
                EndsWith(": The bundle org.a may not belong to the group " + group +
                         ", which is nobody's: a group's name is its owner's identifier and one part more."));
  }
}

TEST_F(BundleInstallerTest, WhoIsNamedAsAMemberMayBeInstalledAndWhoWaitsForTheOwnerToo) {
  const std::string docs = BundleHouse::entry("QXGroups", BundleHouse::array({"org.owner.docs"}));
  BundleHouse::install(source_, "org.a", docs);
  EXPECT_EQ(installed(source_).outcome, Outcome::installed) << "the owner is not there yet";
  EXPECT_TRUE(house_.scan().at("org.a").groups.empty());
  BundleHouse::install(user("owner"), "org.owner",
                       BundleHouse::entry("QXGroupMembers", "<dict><key>org.owner.docs</key>" + BundleHouse::array({"org.a"}) + "</dict>"));
  EXPECT_EQ(installed(source_).outcome, Outcome::updated);
  EXPECT_EQ(house_.scan().at("org.a").groups.size(), 1U);
}

TEST_F(BundleInstallerTest, TheUsersDirectoryIsTheUsersAloneWhateverTheMask) {
  const auto modeOf = [](const std::string& path) {
    struct stat status {};
    EXPECT_EQ(::stat(path.c_str(), &status), 0) << path;
    return status.st_mode & 07777U;
  };
  const mode_t before = ::umask(0);
  installed(source_);
  ::umask(before);
  EXPECT_EQ(modeOf(house_.paths.userBundles), 0700U);
  EXPECT_EQ(modeOf(fs::path(house_.paths.userBundles).parent_path()), 0700U);
  ::chmod(house_.paths.userBundles.c_str(), 0775);
  installed(source_);
  EXPECT_EQ(modeOf(house_.paths.userBundles), 0755U) << "closed to those who could write it";
  EXPECT_TRUE(house_.scan().contains("org.a"));
}

TEST_F(BundleInstallerTest, WhatIsNoBundleIsRefusedWithTheReason) {
  EXPECT_THAT(refusal(BundleErrorCode::noBundle, house_.root() + "/missing"), HasSubstr("cannot be opened"));
  EXPECT_THAT(refusal(BundleErrorCode::noBundle, source_ + "/Info.plist"), HasSubstr("cannot be opened"));
  fs::remove(source_ + "/program");
  EXPECT_THAT(refusal(BundleErrorCode::noBundle, source_), HasSubstr("its executable cannot be opened"));
  fs::remove(source_ + "/Info.plist");
  EXPECT_THAT(refusal(BundleErrorCode::noBundle, source_), HasSubstr(source_ + " is no bundle: has no Info.plist."));
  EXPECT_FALSE(fs::exists(house_.paths.userBundles)) << "refused before anything is made";
}

// Spoils a file as soon as a property list was read.
class SpoilingPropertyLists : public LinuxPropertyLists {
 public:
  explicit SpoilingPropertyLists(std::string path) : path_(std::move(path)) {}

  ReadResult read(std::istream& stream) override {
    auto result = LinuxPropertyLists::read(stream);
    BundleHouse::write(path_, "no list");
    return result;
  }

 private:
  const std::string path_;
};

TEST_F(BundleInstallerTest, WhatCountsIsTheCopyAndNotWhatTheSourceWas) {
  SpoilingPropertyLists spoiling(source_ + "/Info.plist");
  const auto result = installBundle(source_, house_.paths, spoiling);
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_THAT(std::get<QXError>(result).description(), HasSubstr("Info.plist is no property list"));
  EXPECT_THAT(entries(), IsEmpty());
}

TEST_F(BundleInstallerTest, TheBundleMayBeNamedThroughALink) {
  fs::create_directory_symlink(source_, house_.root() + "/link");
  EXPECT_EQ(installed(house_.root() + "/link").outcome, Outcome::installed);
  EXPECT_EQ(fs::symlink_status(user("org.a")).type(), fs::file_type::directory);
}

TEST_F(BundleInstallerTest, ModesAreNormalisedAndExecutableFilesStaySo) {
  BundleHouse::writeExecutable(source_ + "/lib/deep/tool", "x");
  BundleHouse::write(source_ + "/lib/data", "x");
  ::chmod((source_ + "/lib/data").c_str(), 0466);
  ::chmod((source_ + "/lib/deep/tool").c_str(), 0700);
  ::chmod((source_ + "/lib").c_str(), 02777);
  ::chmod(source_.c_str(), 0777);
  const mode_t before = ::umask(0077);
  installed(source_);
  ::umask(before);
  const auto modeOf = [this](const std::string& path) {
    struct stat status {};
    EXPECT_EQ(::stat((user("org.a") + path).c_str(), &status), 0) << path;
    return status.st_mode & 07777U;
  };
  EXPECT_EQ(modeOf(""), 0755U);
  EXPECT_EQ(modeOf("/lib"), 0755U);
  EXPECT_EQ(modeOf("/lib/deep"), 0755U);
  EXPECT_EQ(modeOf("/lib/deep/tool"), 0755U);
  EXPECT_EQ(modeOf("/program"), 0755U);
  EXPECT_EQ(modeOf("/lib/data"), 0644U);
}

TEST_F(BundleInstallerTest, LinksInsideTheBundleAreKept) {
  BundleHouse::write(source_ + "/lib/one.so.1", "x");
  fs::create_symlink("one.so.1", source_ + "/lib/one.so");
  fs::create_symlink("../program", source_ + "/lib/back");
  fs::create_directory_symlink("lib", source_ + "/lib64");
  installed(source_);
  EXPECT_EQ(fs::read_symlink(user("org.a") + "/lib/one.so"), "one.so.1");
  EXPECT_EQ(contentsOf(user("org.a") + "/lib64/one.so"), "x");
  EXPECT_EQ(fs::read_symlink(user("org.a") + "/lib/back"), "../program");
}

TEST_F(BundleInstallerTest, LinksThatLeadOutOrNowhereAreRefused) {
  fs::create_directories(source_ + "/a/b");
  BundleHouse::write(house_.root() + "/secret", "x");
  fs::create_directory_symlink("a/b", source_ + "/ab");
  struct Case {
    std::string target;
    std::string expected;
  };
  for (const auto& [target, expected] : std::vector<Case>{
           {"/etc/passwd", "leads out"},
           {source_ + "/program", "leads out"},
           {"..", "leads out"},
           {"../secret", "leads out"},
           {"a/../../secret", "leads out"},
           {"ab/../../../secret", "leads out"},
           {"missing", "leads nowhere"},
           {"link", "leads nowhere"},
           {"program/x", "leads nowhere"},
       }) {
    fs::create_symlink(target, source_ + "/link");
    const std::string text = refusal(BundleErrorCode::forbidden, source_);
    EXPECT_THAT(text, HasSubstr("\"link\" is a link that " + expected)) << target;
    fs::remove(source_ + "/link");
  }
  EXPECT_EQ(installed(source_).outcome, Outcome::installed) << "without the link it is sound";
}

TEST_F(BundleInstallerTest, PipesSocketsAndSetIdBitsAreRefused) {
  ASSERT_EQ(::mkfifo((source_ + "/pipe").c_str(), 0666), 0);
  EXPECT_THAT(refusal(BundleErrorCode::forbidden, source_), HasSubstr("\"pipe\" is neither a file nor a directory"));
  fs::remove(source_ + "/pipe");

  fs::create_directory(source_ + "/sub");
  const std::string path = source_ + "/sub/socket";
  const UniqueDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(static_cast<char*>(address.sun_path), sizeof(address.sun_path) - 1);
  ASSERT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)), 0);
  EXPECT_THAT(refusal(BundleErrorCode::forbidden, source_), HasSubstr("\"sub/socket\" is neither"));
  fs::remove(path);

  for (const mode_t bit : {S_ISUID, S_ISGID}) {
    ASSERT_EQ(::chmod((source_ + "/program").c_str(), 0755 | bit), 0);
    EXPECT_THAT(refusal(BundleErrorCode::forbidden, source_), HasSubstr("\"program\" has a set-id bit"));
  }
}

TEST_F(BundleInstallerTest, ABundleThatIsTooLargeIsRefusedBeforeItIsCopied) {
  BundleHouse::write(source_ + "/holes", "");
  fs::resize_file(source_ + "/holes", BundleLimits().bytes);
  EXPECT_THAT(refusal(BundleErrorCode::tooLarge, source_), HasSubstr("too many bytes"));
}

TEST_F(BundleInstallerTest, ABundleAroundTheUsersDirectoryIsNotCopiedIntoItself) {
  BundleHouse::install(house_.paths.home, "org.home");
  fs::create_directories(house_.paths.userBundles);
  refusal(BundleErrorCode::tooLarge, house_.paths.home);
}

TEST_F(BundleInstallerTest, WhatCannotBeReadIsTheSystemsError) {
  if (::geteuid() == 0) GTEST_FAIL() << "root reads everything; run this test as an unprivileged user";
  BundleHouse::write(source_ + "/closed", "x");
  ::chmod((source_ + "/closed").c_str(), 0);
  const auto result = install(source_);
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_EQ(std::get<QXError>(result).domain, kQXSystemErrorDomain);
  EXPECT_EQ(std::get<QXError>(result).code, EACCES);
  EXPECT_THAT(entries(), IsEmpty());
}

TEST_F(BundleInstallerTest, AWriteThatFailsLeavesTheOldBundle) {
  note(source_, "old");
  installed(source_);
  note(source_, std::string(100'000, 'n'));
  const auto before = ::signal(SIGXFSZ, SIG_IGN);
  rlimit limit{};
  ::getrlimit(RLIMIT_FSIZE, &limit);
  const rlimit small{50'000, limit.rlim_max};
  ::setrlimit(RLIMIT_FSIZE, &small);
  const auto result = install(source_);
  ::setrlimit(RLIMIT_FSIZE, &limit);
  ::signal(SIGXFSZ, before);
  ASSERT_TRUE(std::holds_alternative<QXError>(result));
  EXPECT_EQ(std::get<QXError>(result).code, EFBIG);
  EXPECT_EQ(contentsOf(user("org.a") + "/note"), "old");
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, LeftoversOfKilledInstallersAreClearedAwayAndOtherHiddenNamesAreNot) {
  const std::string leftover = user(".docuvend-install-1");
  BundleHouse::write(leftover + "/sub/file", "x");
  ::chmod((leftover + "/sub").c_str(), 0500);
  ::chmod(leftover.c_str(), 0);
  BundleHouse::write(user(".mine") + "/file", "x");
  installed(source_);
  EXPECT_THAT(entries(), ElementsAre(".mine", "org.a"));
}

TEST_F(BundleInstallerTest, AnInstallerWaitsForTheOneWhoseTurnItIsAndTouchesNothingOfIts) {
  const std::string staging = user(".docuvend-install-1");
  fs::create_directories(staging);
  UniqueDescriptor turn(::open(house_.paths.userBundles.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  ASSERT_EQ(::flock(turn.get(), LOCK_EX), 0);
  auto other = std::async(std::launch::async, [this] { return installed(source_); });
  // As soon as it waits, which the kernel says; nothing that it does comes before.
  struct stat place {};
  ASSERT_EQ(::fstat(turn.get(), &place), 0);
  const std::regex waiting("-> FLOCK .*:" + std::to_string(place.st_ino) + " ");
  const auto isWaited = [&waiting] { return std::regex_search(contentsOf("/proc/locks"), waiting); };
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!isWaited() && std::chrono::steady_clock::now() < deadline) std::this_thread::yield();
  EXPECT_TRUE(isWaited());
  EXPECT_THAT(entries(), ElementsAre(".docuvend-install-1"));
  turn.reset();
  ASSERT_EQ(other.wait_for(kPatience), std::future_status::ready);
  EXPECT_EQ(other.get().outcome, Outcome::installed);
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, ManyInstallersOfOneIdentifierEndWithOneWholeBundle) {
  constexpr int kInstallers = 8;
  std::vector<std::future<InstalledBundle>> results;
  for (int i = 0; i < kInstallers; ++i) {
    const std::string source = source_ + std::to_string(i);
    BundleHouse::install(source, "org.a");
    for (const char* name : {"/1", "/2"}) BundleHouse::write(source + name, std::to_string(i));
    results.push_back(std::async(std::launch::async, [this, source] { return installed(source); }));
  }
  int fresh = 0;
  for (auto& result : results) {
    if (result.get().outcome == Outcome::installed) ++fresh;
  }
  EXPECT_EQ(fresh, 1);
  EXPECT_THAT(entries(), ElementsAre("org.a"));
  EXPECT_EQ(contentsOf(user("org.a") + "/1"), contentsOf(user("org.a") + "/2"));
}

TEST_F(BundleInstallerTest, UninstallingRemovesTheBundleAndLeavesTheUsersData) {
  installed(source_);
  const std::string data = house_.paths.containers + "/org.a/file";
  BundleHouse::write(data, "x");
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_THAT(entries(), IsEmpty());
  EXPECT_TRUE(house_.scan().empty());
  EXPECT_TRUE(fs::exists(data));
  EXPECT_EQ(installed(source_).outcome, Outcome::installed);
}

TEST_F(BundleInstallerTest, UninstallingRemovesEveryCopySoThatNoneComesToLight) {
  for (const char* name : {"one", "two", "three"}) BundleHouse::install(user(name), "org.a");
  BundleHouse::install(user("other"), "org.b");
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_THAT(entries(), ElementsAre("other"));
}

TEST_F(BundleInstallerTest, UninstallingABundleWithDirectoriesThatItsOwnerMayNotWriteLeavesNothing) {
  installed(source_);
  BundleHouse::write(user("org.a") + "/sub/deep/file", "x");
  ::chmod((user("org.a") + "/sub/deep").c_str(), 0500);
  ::chmod((user("org.a") + "/sub").c_str(), 0);
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_THAT(entries(), IsEmpty());
}

// A process of the bundle's can have one, as long as it runs.
class Lease {
 public:
  explicit Lease(const std::string& path) : file_(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC)) {
    // By default who has a lease is ended when somebody wants the file.
    isTaken_ = file_ && ::fcntl(file_.get(), F_SETSIG, SIGURG) == 0 && ::fcntl(file_.get(), F_SETLEASE, F_WRLCK) == 0;
  }
  [[nodiscard]] bool isTaken() const { return isTaken_; }
  [[nodiscard]] int file() const { return file_.get(); }

 private:
  const UniqueDescriptor file_;
  bool isTaken_ = false;
};

TEST_F(BundleInstallerTest, UninstallingRemovesABundleWhosePropertyListsAreLeased) {
  for (const char* name : {"/Info.plist", "/Entitlements.plist"}) {
    installed(source_);
    BundleHouse::write(user("org.a") + "/Entitlements.plist", BundleHouse::propertyList(""));
    const Lease lease(user("org.a") + name);
    ASSERT_TRUE(lease.isTaken()) << name;
    EXPECT_EQ(uninstall("org.b"), bundleError(BundleErrorCode::notFound, "No bundle org.b is installed."));
    EXPECT_EQ(uninstall("org.a"), std::nullopt) << name;
    EXPECT_THAT(entries(), IsEmpty()) << name;
  }
}

TEST_F(BundleInstallerTest, UninstallingRemovesALeasedBundleWithItsOtherCopies) {
  installed(source_);
  BundleHouse::install(user("other"), "org.a");
  const Lease lease(user("org.a") + "/Info.plist");
  ASSERT_TRUE(lease.isTaken());
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_THAT(entries(), IsEmpty());
}

int leasedFile = -1;
void giveTheLeaseBack(int /*signal*/) { ::fcntl(leasedFile, F_SETLEASE, F_UNLCK); }

TEST_F(BundleInstallerTest, UninstallingRemovesABundleWhoseLeaseEndsWhenItIsLookedAt) {
  installed(source_);
  const Lease lease(user("org.a") + "/Info.plist");
  ASSERT_TRUE(lease.isTaken());
  leasedFile = lease.file();
  ASSERT_NE(::signal(SIGURG, giveTheLeaseBack), SIG_ERR);
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_EQ(::fcntl(lease.file(), F_GETLEASE), F_UNLCK);
  EXPECT_THAT(entries(), IsEmpty());
}

// Somebody tries to have a lease at the very moment when a property list is to be read.
class LeasedPropertyLists : public LinuxPropertyLists {
 public:
  std::unique_ptr<std::istream> openStream(const std::string& path) override {
    const Lease lease(path);
    return LinuxPropertyLists::openStream(path);
  }
};

TEST_F(BundleInstallerTest, UninstallingLetsNobodyTakeALeaseMeanwhile) {
  installed(source_);
  LeasedPropertyLists leased;
  EXPECT_EQ(uninstallBundle("org.a", house_.paths, leased), std::nullopt);
  EXPECT_THAT(entries(), IsEmpty());
}

TEST_F(BundleInstallerTest, UninstallingLeavesWhatIsNoBundleThoughItsNameIsAnIdentifier) {
  BundleHouse::write(user("org.a") + "/Info.plist", "x");
  EXPECT_EQ(uninstall("org.a"), bundleError(BundleErrorCode::notFound, "No bundle org.a is installed."));
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, UninstallingFollowsNoLink) {
  installed(source_);
  const std::string outside = house_.root() + "/outside";
  BundleHouse::write(outside + "/sub/file", "x");
  ::chmod((outside + "/sub").c_str(), 0500);
  ::chmod(outside.c_str(), 0500);
  fs::create_directory_symlink(outside, user("org.a") + "/link");
  EXPECT_EQ(uninstall("org.a"), std::nullopt);
  EXPECT_EQ(contentsOf(outside + "/sub/file"), "x");
  for (const std::string& directory : {outside, outside + "/sub"}) {
    EXPECT_EQ(fs::status(directory).permissions(), fs::perms::owner_read | fs::perms::owner_exec) << directory;
    ::chmod(directory.c_str(), 0700);
  }
}

TEST_F(BundleInstallerTest, WhatIsNotInstalledIsNotFound) {
  const QXError expected = bundleError(BundleErrorCode::notFound, "No bundle org.b is installed.");
  EXPECT_EQ(uninstall("org.b"), expected);
  EXPECT_FALSE(fs::exists(house_.paths.userBundles));
  installed(source_);
  EXPECT_EQ(uninstall("org.b"), expected);
  EXPECT_EQ(uninstall("../home"), bundleError(BundleErrorCode::notFound, "No bundle ../home is installed."));
  EXPECT_THAT(entries(), ElementsAre("org.a"));
}

TEST_F(BundleInstallerTest, ABundleOfTheSystemsIsNotUninstalledNorIsACopyBelowIt) {
  BundleHouse::install(house_.paths.systemBundles + "/org.a", "org.a");
  BundleHouse::install(user("org.a"), "org.a");
  const auto error = uninstall("org.a");
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code, static_cast<std::int64_t>(BundleErrorCode::notPermitted));
  EXPECT_TRUE(fs::exists(house_.paths.systemBundles + "/org.a"));
  EXPECT_TRUE(fs::exists(user("org.a")));
}

}  // namespace
}  // namespace docuvend::linux_platform
