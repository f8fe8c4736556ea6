// What docs/protocol.md says is enough: a client and a provider extension in another language, written from that page, work with the real
// daemon, with each other, and with the providers and tools of this build.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>

#include "tests/protocol/PythonHouse.h"
#include "tools/docuvendctl/Outcome.h"

namespace docuvend::tests {
namespace {

using ::testing::Contains;
using ::testing::HasSubstr;
using ::testing::StartsWith;

TEST(ProtocolFromThePage, TheWorkedExchangesAreReadAndWrittenAlike) {
  expectPythonPasses("wire_test.py", "WorkedExchanges", {"TEST_PAGE=" DOCUVEND_DOCS "/protocol.md"});
}

TEST(ProtocolFromThePage, EveryValueComesBackAndNothingMalformedIsRead) {
  expectPythonPasses("wire_test.py", "Values", {"TEST_PAGE=" DOCUVEND_DOCS "/protocol.md"});
}

TEST(ProtocolFromThePage, TheTwoSidesOfAConnectionKeepToIt) { expectPythonPasses("connection_test.py", "Sides", {}); }

// The client over the provider of this build, and over the one in Python.
class PythonClient : public PythonHouse, public testing::WithParamInterface<std::string> {
 protected:
  void SetUp() override {
    PythonHouse::SetUp();
    open(GetParam());
  }
};

TEST_P(PythonClient, GoesThroughAllNineOperationsAndReadsForAToken) { expectClientPasses("client_test.py", "AllNineOperations"); }

TEST_P(PythonClient, SavesThroughTheHiddenSibling) { expectClientPasses("client_test.py", "Saving"); }

TEST_P(PythonClient, TakesTurnsAtFiles) { expectClientPasses("coordination_test.py", "Coordination"); }

TEST_P(PythonClient, LooksAfterTheGrants) { expectClientPasses("client_test.py", "Administration"); }

TEST_P(PythonClient, SetsItsOwnDeadlineWhereNoReplyEverComes) { expectClientPasses("client_test.py", "ProviderThatIsGone"); }

TEST_P(PythonClient, IsRefusedWhatItMayNotHave) { expectClientPasses("client_test.py", "RefusalsOfOperations"); }

TEST_P(PythonClient, IsToldWhatIsNoRequestOrNoFrame) { expectClientPasses("client_test.py", "RefusalsOfTheProtocol"); }

INSTANTIATE_TEST_SUITE_P(Over, PythonClient, testing::Values(kCellar, kShelf),
                         [](const auto& named) { return named.param == kCellar ? "Cellar" : "Shelf"; });

class PythonProvider : public PythonHouse {
 protected:
  void SetUp() override {
    PythonHouse::SetUp();
    open(kShelf);
  }

  // The operations that the provider was asked for, in order.
  [[nodiscard]] std::vector<std::string> journal() const {
    std::vector<std::string> operations;
    std::istringstream lines(contentsOf(house_.container(kShelf) + "/journal"));
    for (std::string line; std::getline(lines, line);) operations.push_back(line.substr(0, line.find(' ')));
    return operations;
  }
  // What a command of docuvendctl's prints.
  [[nodiscard]] std::string says(const std::vector<std::string>& words) const {
    const Ending ended = house_.ctl(words);
    EXPECT_EQ(ended.status, 0) << words.front() << ": " << ended.errors;
    return ended.output;
  }
};

TEST_F(PythonProvider, IsSetUpOnceBeforeAnythingElse) {
  EXPECT_EQ(journal(), std::vector<std::string>{"_performInitialSetupWithCompletion:"});
  EXPECT_THAT(says({"--as", kEditor, "providers"}), HasSubstr(kShelf));
}

TEST_F(PythonProvider, PlaysAllSevenOperationsForTheCommandLine) {
  std::string string = says({"bookmark", document()});
  EXPECT_EQ(string, "docuvend:com.example.shelf/doc/a letter – 1.txt\n");
  string.pop_back();
  (void)says({"--as", kPicker, "grant", document(), kShelf, kEditor});
  ASSERT_EQ(::unlink(document().c_str()), 0);
  (void)says({"--as", kEditor, "placeholder", document(), kShelf, kEditor});
  EXPECT_EQ(contentsOf(document()), std::string(contentsOf(original()).size(), '\0'));
  (void)says({"--as", kEditor, "start", document(), kShelf, kEditor});
  EXPECT_EQ(contentsOf(document()), contentsOf(original()));
  EXPECT_EQ(says({"--as", kEditor, "cat", string}), contentsOf(original()));

  const Ending put = house_.ctl({"--as", kEditor, "put", string}, "put from the command line\n");
  EXPECT_EQ(put.status, 0) << put.errors;
  eventually("the cloud has the change", [this] { return contentsOf(original()) == "put from the command line\n"; });

  (void)says({"--as", kEditor, "stop", document(), kShelf, kEditor});
  EXPECT_EQ(contentsOf(document()), std::string(contentsOf(original()).size(), '\0'));

  const auto asked = journal();
  for (const char* operation :
       {"_performInitialSetupWithCompletion:", "_providePlaceholderAtURL:completion:", "_startProvidingItemAtURL:completion:",
        "_itemChangedAtURL:completion:", "_stopProvidingItemAtURL:completion:", "_identifierForItemAtURL:completion:",
        "_URLForItemIdentifier:completion:"}) {
    EXPECT_THAT(asked, Contains(operation));
  }
  EXPECT_EQ(std::count(asked.begin(), asked.end(), "_itemChangedAtURL:completion:"), 1);
}

TEST_F(PythonProvider, BringsTheContentsForAProgramThatKnowsNothingOfProviders) {
  const std::string placeholder = contentsOf(document());
  EXPECT_EQ(says({"read", document()}), contentsOf(original()));
  EXPECT_NE(contentsOf(document()), placeholder);
}

TEST_F(PythonProvider, ItsErrorsReachTheCommandLine) {
  const Ending ended = house_.ctl({"bookmark", house_.storage(kShelf) + "/missing.txt"});
  EXPECT_EQ(ended.status, static_cast<int>(ctl::ExitStatus::providerFailed));
  EXPECT_THAT(ended.errors, HasSubstr("ShelfErrorDomain 1: There is no missing.txt on this shelf."));
}

TEST_F(PythonProvider, IsStartedAgainWhenItWasKilled) {
  const auto processes = house_.processesOf("python3");
  ASSERT_FALSE(processes.empty());
  for (const pid_t process : processes) ::kill(process, SIGKILL);
  eventually("it has ended", [this] { return house_.processesOf("python3").empty(); });
  EXPECT_THAT(says({"bookmark", document()}), StartsWith("docuvend:com.example.shelf/"));
}

}  // namespace
}  // namespace docuvend::tests
