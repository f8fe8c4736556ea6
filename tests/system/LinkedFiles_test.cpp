// Links on the way to a file: a name that is one, and a directory that becomes one while the file is written. What lies behind them is not
// asked for, and nobody is told of it.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>

#include "tests/system/house/TurnTest.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class LinkedFiles : public TurnTest {
 protected:
  // In the place of the directory there is a link to the trickster's documents, among which there is a file of the same name.
  void exchange(const std::string& directory) const {
    writeFile(trick("f1.txt").fileSystemPath(), "the provider's");
    fs::rename(directory, directory + ".away");
    fs::create_directory_symlink(house_.storage(kTrickster), directory);
  }
  // Nothing was asked or told of the trickster's file, which is there, and neither of the way to it.
  void expectTheProviderHeardNothing() const {
    EXPECT_EQ(house_.loggedContaining("QXFileCoordinator "), 0);
    EXPECT_EQ(contentsOf(trick("f1.txt").fileSystemPath()), "the provider's");
    EXPECT_THAT(answers({"writing", trick("f1.txt").absoluteString(), "end"}), ElementsAre("ok", "ok"));
    EXPECT_EQ(timesTold(trick("f1.txt")), 1) << "of a write of its own file it does";
  }
};

TEST_F(LinkedFiles, OfAWriteWhoseDirectoryIsExchangedForALinkToItsDocumentsAProviderHearsNothing) {
  const std::string directory = house_.home() + "/d";
  fs::create_directory(directory);
  const auto writer = holder("writing", url(directory + "/f1.txt"), "writer");
  exchange(directory);
  letGo(place("writer"));
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok"));
  expectTheProviderHeardNothing();
}

TEST_F(LinkedFiles, NeitherDoesItOfAConfinedApplicationsWrite) {
  const std::string directory = house_.container(kTurner) + "/d";
  const auto writer = askConfined({"make", "d/f1.txt", "writing", url(directory + "/f1.txt").absoluteString(), "hold", "writer", "end"});
  awaitHolding(house_.container(kTurner) + "/writer");
  exchange(directory);
  letGo(house_.container(kTurner) + "/writer");
  EXPECT_THAT(linesOf(*writer), ElementsAre("ok", "ok", "ok", "ok"));
  expectTheProviderHeardNothing();
}

TEST_F(LinkedFiles, ALinkToAProvidersFileIsNotReadAndTheProviderIsNotAsked) {
  const std::string link = house_.home() + "/link";
  writeFile(trick("f1.txt").fileSystemPath(), "the provider's");
  fs::create_symlink(trick("f1.txt").fileSystemPath(), link);
  const Ending read = house_.ctl({"read", link});
  EXPECT_NE(read.status, 0);
  EXPECT_EQ(read.output, "");
  EXPECT_THAT(read.errors, HasSubstr(std::strerror(ELOOP)));
  expectTheProviderHeardNothing();
  EXPECT_EQ(house_.ctl({"read", trick("f1.txt").fileSystemPath()}).output, "the provider's");
}

}  // namespace
}  // namespace docuvend::tests
