// To learn the tokens of another application: from answers, from errors, from the log, from the status, from its process.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdint>
#include <set>

#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/attacks/TwoApplications.h"
#include "tests/attacks/told.h"

namespace docuvend::tests {
namespace {

using linux_platform::kSandboxServiceName;
using linux_platform::QXSandboxRedemption;
using ::testing::AllOf;
using ::testing::AnyOf;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr std::size_t kTag = 64;  // digits at a token's end
constexpr std::size_t kNonce = 32;

class SecretAttacks : public TwoApplications {
 protected:
  using Resolved =
      std::tuple<std::optional<QXURL>, std::optional<QXData>, std::optional<QXURL>, std::optional<QXData>, std::optional<QXError>>;
  [[nodiscard]] static Resolved resolve(Client& caller, const std::string& string) {
    return std::get<0>(caller.ask<&DVDaemon::documentURLFromBookmarkableString>(string));
  }
  [[nodiscard]] static std::string textOf(const QXData& token) { return {token.bytes.begin(), token.bytes.end()}; }
  [[nodiscard]] static QXData dataOf(const std::string& text) { return {std::vector<std::uint8_t>(text.begin(), text.end())}; }
  [[nodiscard]] std::optional<QXError> redeem(const std::string& token) const {
    return errorOf(
        house_.client(std::nullopt, kSandboxServiceName)->ask<&QXSandboxRedemption::redeemToken>(dataOf(token), /*forWriting=*/true));
  }
  // The parts of a token that nobody could guess.
  static void expectNothingOf(const std::set<std::string>& tokens, const std::string& text) {
    EXPECT_THAT(text, Not(HasSubstr("docuvend-token")));
    for (const auto& token : tokens) {
      EXPECT_THAT(text, Not(HasSubstr(token.substr(token.size() - kTag))));
      EXPECT_THAT(text, Not(HasSubstr(token.substr(token.size() - kTag - 1 - kNonce, kNonce))));
    }
  }
  [[nodiscard]] static std::string described(const std::optional<QXError>& error) {
    std::string text;
    for (const QXError* level = error ? &*error : nullptr; level != nullptr; level = level->underlying.get()) text += level->description();
    return text;
  }
};

TEST_F(SecretAttacks, AnAnswerThatRefusesADocumentCarriesNoToken) {
  Accomplice accomplice(house_, {"connect", kDVServiceName});
  Client connection(accomplice.connection());
  const auto [url, token, sibling, siblingToken, error] = resolve(connection, others_);
  EXPECT_EQ(told(error), "DVErrorDomain 2");
  EXPECT_FALSE(url || token || sibling || siblingToken);
  const auto [ownURL, ownToken, ownSibling, ownSiblingToken, ownError] = resolve(connection, own_);
  EXPECT_EQ(ownError, std::nullopt);
  EXPECT_TRUE(ownURL && ownToken && ownSibling && ownSiblingToken);
}

TEST_F(SecretAttacks, NoTokenIsInTheLogInTheStatusOrInAnError) {
  std::set<std::string> tokens;
  const auto victim = house_.client(kVictim);
  const auto keep = [&tokens](const std::optional<QXData>& token) { return token ? *tokens.insert(textOf(*token)).first : std::string(); };
  const auto resolved = resolve(*victim, others_);
  const std::string token = keep(std::get<1>(resolved));
  const std::string sibling = keep(std::get<3>(resolved));
  ASSERT_EQ(tokens.size(), 2U);
  EXPECT_EQ(redeem(token), std::nullopt);
  EXPECT_EQ(redeem(sibling), std::nullopt);

  // Everything that can go wrong with one.
  std::string errors;
  for (const std::string& bad : {token + "0", token.substr(1), token.substr(0, token.size() - 1), " " + token, token + "\n" + sibling}) {
    const auto error = redeem(bad);
    EXPECT_EQ(told(error), "QXSandboxErrorDomain 1");
    errors += described(error);
  }
  const auto sandbox = house_.client(std::nullopt, kSandboxServiceName);
  errors += described(errorOf(sandbox->ask<&QXSandboxRedemption::replaceItemWithToken>(dataOf(token), dataOf(token))));
  EXPECT_THAT(errors, HasSubstr("token"));
  expectNothingOf(tokens, errors);

  std::string log;
  for (const auto& line : house_.log()) log += line + "\n";
  expectNothingOf(tokens, log);
  EXPECT_THAT(log, HasSubstr("[DEBUG]"));
  const Ending status = house_.ctl({"status"});
  EXPECT_EQ(status.status, 0);
  expectNothingOf(tokens, status.output);
  EXPECT_THAT(status.output, Not(::testing::IsEmpty()));
}

TEST_F(SecretAttacks, AConfinedProcessDoesNotSeeTheProcessOfAnotherApplication) {
  const auto listener = listenAt(house_.container(kVictim) + "/hatch");
  const Process victim(
      {{std::string(DOCUVEND_BIN) + "/docuvend-run", kVictim, "connect", kDVServiceName, "hand-over", house_.container(kVictim) + "/hatch"},
       house_.environment(),
       {}});
  const auto hand = acceptAt(listener);
  const Lines seen = attack({"processes"});
  ASSERT_EQ(seen.size(), 1U);
  EXPECT_THAT(seen.front(), Not(AnyOf(HasSubstr("docuvendd"), HasSubstr("docuvend-run"), HasSubstr("cellar"))));
  EXPECT_THAT(seen.front(), HasSubstr("docuvend-attacker"));
  EXPECT_EQ(attack({"processes", "orphan", "processes"}), (Lines{seen.front(), "ok", seen.front()}));
  EXPECT_THAT(unconfined({"processes"}).front(), AllOf(HasSubstr("docuvendd"), HasSubstr("bwrap")));
}

}  // namespace
}  // namespace docuvend::tests
