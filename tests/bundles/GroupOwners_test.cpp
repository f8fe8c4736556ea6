#include "platform/linux/bundles/GroupOwners.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <set>
#include <thread>
#include <vector>

#include "tests/bundles/BundleHouse.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;
const std::string kGroup = "org.a.documents";

class GroupOwnersTest : public ::testing::Test {
 protected:
  [[nodiscard]] std::string file() const { return house_.paths.groupOwners + "/" + kGroup; }
  static unsigned modeOf(const std::string& path) {
    struct stat status {};
    EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
    return status.st_mode & 07777U;
  }
  std::string recorded(const std::string& owner) const {
    const auto result = owners_.record(kGroup, owner);
    const auto* error = std::get_if<QXError>(&result);
    return error != nullptr ? "error " + std::to_string(error->code) : std::get<std::string>(result);
  }
  // "none", or an error's code.
  [[nodiscard]] std::string known() const {
    const auto result = owners_.ownerOf(kGroup);
    if (const auto* error = std::get_if<QXError>(&result)) return "error " + std::to_string(error->code);
    return std::get<std::optional<std::string>>(result).value_or("none");
  }

  BundleHouse house_;
  const GroupOwners owners_{house_.paths.groupOwners};
};

TEST_F(GroupOwnersTest, NothingIsRecordedAndNothingMadeAtFirst) {
  EXPECT_EQ(known(), "none");
  EXPECT_FALSE(fs::exists(house_.paths.groupOwners));
}

TEST_F(GroupOwnersTest, TheFirstOwnerIsKeptInAFileOfTheUsersAlone) {
  const mode_t before = ::umask(0);
  EXPECT_EQ(recorded("org.a"), "org.a");
  ::umask(before);
  EXPECT_EQ(recorded("org.b"), "org.a");
  EXPECT_EQ(known(), "org.a");
  EXPECT_EQ(modeOf(file()), 0600U);
  EXPECT_EQ(modeOf(house_.paths.groupOwners), 0700U);
  EXPECT_EQ(std::distance(fs::directory_iterator(house_.paths.groupOwners), {}), 1);
}

TEST_F(GroupOwnersTest, WhoeverRemovesTheRecordGivesTheGroupFree) {
  EXPECT_EQ(recorded("org.a"), "org.a");
  fs::remove(file());
  EXPECT_EQ(known(), "none");
  EXPECT_EQ(recorded("org.b"), "org.b");
}

TEST_F(GroupOwnersTest, ARecordThatIsNotOneIsAnErrorAndStays) {
  EXPECT_EQ(recorded("org.a"), "org.a");
  for (const std::string& text : {std::string(), std::string("org.b"), std::string("\n"), std::string("../b\n"),
                                  std::string("org.b\norg.c\n"), std::string("org.b\0\n", 7), std::string(200, 'x') + "\n"}) {
    BundleHouse::write(file(), text);
    EXPECT_THAT(known(), ::testing::StartsWith("error ")) << text;
    EXPECT_THAT(recorded("org.b"), ::testing::StartsWith("error ")) << text;
  }
  BundleHouse::write(file(), "org.b\n");
  EXPECT_EQ(known(), "org.b");
  ::chmod(file().c_str(), 0620);
  EXPECT_EQ(known(), "error " + std::to_string(EPERM)) << "somebody else may have written it";
  fs::remove(file());
  fs::create_symlink(house_.root() + "/else", file());
  EXPECT_EQ(known(), "error " + std::to_string(ELOOP));
}

TEST_F(GroupOwnersTest, WhereNothingCanBeWrittenTheErrorIsTheAnswer) {
  BundleHouse::write(house_.paths.groupOwners, "a file");
  EXPECT_EQ(recorded("org.a"), "error " + std::to_string(ENOTDIR));
}

TEST_F(GroupOwnersTest, OfManyAtOnceTheFirstOnesWordCountsForAll) {
  constexpr int kMany = 8;
  std::vector<std::string> answers(kMany);
  std::vector<std::thread> threads;
  for (int i = 0; i < kMany; ++i) {
    threads.emplace_back([this, &answers, i] { answers[static_cast<std::size_t>(i)] = recorded("org.a" + std::to_string(i)); });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(std::set<std::string>(answers.begin(), answers.end()), std::set<std::string>{known()});
}

}  // namespace
}  // namespace docuvend::linux_platform
