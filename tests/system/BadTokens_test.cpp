// Sandbox tokens that are not, or no longer, what was issued.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include "platform/linux/wire/SandboxProtocol.h"
#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {
namespace {

using linux_platform::QXSandboxRedemption;
using linux_platform::SandboxErrorCode;

class BadTokens : public SystemTest {
 protected:
  void SetUp() override {
    SystemTest::SetUp();
    house_.install(kCellar);
    house_.install(kPicker);
    house_.putInCloud("a.txt", "a");
    house_.putInCloud("b.txt", "b");
    house_.startDaemon();
    caller_ = house_.client(kPicker);
    a_ = grant("a.txt");
    b_ = grant("b.txt");
    redeemer_ = house_.client(std::nullopt, linux_platform::kSandboxServiceName);
  }

  struct Tokens {
    QXData item;
    QXData sibling;
  };
  Tokens grant(const std::string& name) {
    const auto answer = caller_->ask<&DVDaemon::extendSandboxForFileURL>(QXURL::fileURL(house_.document(name), QXURLKind::file),
                                                                         ProviderID{kCellar}, ConsumerID{kPicker});
    if (answer.index() != 0) return {};
    return {std::get<1>(std::get<0>(answer)).value_or(QXData{}), std::get<3>(std::get<0>(answer)).value_or(QXData{})};
  }

  std::optional<std::int64_t> refusal(const std::optional<QXData>& token, std::optional<bool> forWriting = false) {
    const auto error = errorOf(redeemer_->ask<&QXSandboxRedemption::redeemToken>(token, forWriting));
    if (!error) return std::nullopt;
    EXPECT_EQ(error->domain, linux_platform::kQXSandboxErrorDomain);
    return error->code;
  }
  std::optional<std::int64_t> replaceRefusal(const std::optional<QXData>& item, const std::optional<QXData>& sibling) {
    const auto error = errorOf(redeemer_->ask<&QXSandboxRedemption::replaceItemWithToken>(item, sibling));
    if (!error) return std::nullopt;
    return error->code;
  }
  int lines() const { return house_.loggedBeginning("[NOTICE] Refusing a sandbox token from PID " + std::to_string(::getpid()) + ": "); }

  static constexpr auto kBad = static_cast<std::int64_t>(SandboxErrorCode::badToken);
  std::unique_ptr<Client> caller_;
  std::unique_ptr<Client> redeemer_;
  Tokens a_;
  Tokens b_;
};

TEST_F(BadTokens, NoBitOfATokenMayBeChanged) {
  ASSERT_EQ(refusal(a_.item), std::nullopt);
  for (std::size_t i = 0; i < a_.item.bytes.size(); ++i) {
    QXData changed = a_.item;
    changed.bytes[i] ^= static_cast<std::uint8_t>(1U << (i % 8));
    ASSERT_EQ(refusal(changed), kBad) << "byte " << i << " of " << a_.item.text();
  }
  EXPECT_EQ(lines(), 1) << "one line for all of a connection's bad tokens";
  EXPECT_EQ(house_.loggedContaining(a_.item.text().substr(a_.item.text().rfind(':'))), 0) << "a token is in the log";
  EXPECT_EQ(refusal(a_.item), std::nullopt);
}

TEST_F(BadTokens, EveryBeginningOfATokenIsRefused) {
  for (std::size_t length = 0; length < a_.item.bytes.size(); ++length) {
    QXData cut = a_.item;
    cut.bytes.resize(length);
    ASSERT_EQ(refusal(cut), kBad) << length;
  }
}

TEST_F(BadTokens, WhatIsNoTokenAtAllIsRefused) {
  EXPECT_EQ(refusal(std::nullopt), kBad);
  EXPECT_EQ(refusal(a_.item, std::nullopt), std::nullopt) << "an absent use is reading";
  QXData longer = a_.item;
  longer.bytes.push_back('\n');
  EXPECT_EQ(refusal(longer), kBad);
  EXPECT_EQ(refusal(QXData::fromText(std::string(100'000, 'x'))), kBad);
  EXPECT_EQ(refusal(QXData::fromText(std::string("\0\0", 2))), kBad);
}

TEST_F(BadTokens, TheTagOfOneFileDoesNotOpenAnother) {
  const std::string a = a_.item.text();
  const std::string b = b_.item.text();
  EXPECT_EQ(refusal(QXData::fromText(a.substr(0, a.rfind(':')) + b.substr(b.rfind(':')))), kBad);
  const std::size_t path = b.find("/b.txt");
  ASSERT_NE(path, std::string::npos);
  std::string other = b;
  other[path + 1] = 'a';
  EXPECT_EQ(refusal(QXData::fromText(other)), kBad);
}

TEST_F(BadTokens, OneItemsSiblingDoesNotReplaceAnotherItem) {
  ASSERT_EQ(refusal(b_.sibling, true), std::nullopt);  // makes it
  EXPECT_EQ(replaceRefusal(a_.item, b_.sibling), static_cast<std::int64_t>(SandboxErrorCode::notSiblings));
  EXPECT_EQ(replaceRefusal(a_.item, b_.item), static_cast<std::int64_t>(SandboxErrorCode::notSiblings));
  EXPECT_EQ(replaceRefusal(a_.sibling, a_.item), static_cast<std::int64_t>(SandboxErrorCode::notSiblings));
  EXPECT_EQ(replaceRefusal(a_.item, std::nullopt), kBad);
  EXPECT_EQ(replaceRefusal(b_.item, b_.sibling), std::nullopt);
}

TEST_F(BadTokens, ATokenOfAnotherSessionsKeyIsRefused) {
  house_.killDaemon();
  ASSERT_EQ(::unlink((house_.runtime() + "/docuvend/token-key").c_str()), 0);
  house_.startDaemon();
  redeemer_ = house_.client(std::nullopt, linux_platform::kSandboxServiceName);
  EXPECT_EQ(refusal(a_.item), kBad);
  EXPECT_EQ(lines(), 1);
}

TEST_F(BadTokens, AConfinedProcessCannotReachTheKey) {
  house_.install(kEditor);
  eventually("the bundle is known", [this] { return house_.confined(kEditor, {"open", "/dev/null"}).status == 0; });
  EXPECT_NE(house_.confined(kEditor, {"open", house_.runtime() + "/docuvend/token-key"}).status, 0);
}

}  // namespace
}  // namespace docuvend::tests
