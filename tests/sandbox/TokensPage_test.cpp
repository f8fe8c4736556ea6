// docs/tokens.md shows what the code makes.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cctype>
#include <fstream>
#include <iterator>
#include <string>

#include "tests/sandbox/SandboxHouse.h"

namespace docuvend::linux_platform {
namespace {

class TokensPageTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::ifstream file(DOCUVEND_DOCS "/tokens.md");
    page.assign(std::istreambuf_iterator<char>(file), {});
    ASSERT_FALSE(page.empty());
    std::string bytes;
    for (int byte = 0; byte < 32; ++byte) bytes += static_cast<char>(byte);
    put(paths.tokenKey, bytes);
  }
  static void put(const std::string& path, const std::string& contents) {
    testing::write(path, contents);
    ASSERT_EQ(::chmod(path.c_str(), 0600), 0);
  }
  // The indented lines from that one on, each without its indentation.
  [[nodiscard]] std::string shownFrom(const std::string& firstLine) const {
    std::string shown;
    for (std::size_t at = page.find("    " + firstLine + "\n"); at < page.size() && page.compare(at, 4, "    ") == 0;) {
      const std::size_t end = page.find('\n', at) + 1;
      shown += page.substr(at + 4, end - at - 4);
      at = end;
    }
    return shown;
  }

  const testing::TemporaryDirectory directory;
  const Paths paths = testing::pathsIn(directory.path());
  std::string page;
};

TEST_F(TokensPageTest, ShowsTheTokenOfTheWorkedExample) {
  SandboxToken token;
  token.number = 7;
  token.path = "/home/u/Docuvend Storage/café.txt";
  for (std::size_t i = 0; i < token.nonce.size(); ++i) token.nonce[i] = static_cast<std::uint8_t>(i);
  const auto key = TokenKey::load(paths.tokenKey);
  ASSERT_TRUE(std::holds_alternative<TokenKey>(key));
  std::string shown = shownFrom("docuvend-token:2:rw:7:");
  std::erase(shown, '\n');
  EXPECT_EQ(shown, token.sealed(std::get<TokenKey>(key)));
  EXPECT_NE(page.find("printf %s '" + shown.substr(0, shown.rfind(':')) + "' |"), std::string::npos);
}

TEST_F(TokensPageTest, ShowsAFloorsFileThatASessionGoesOnFrom) {
  const std::string shown = shownFrom("docuvend-token-floors:2");
  put(paths.tokenFloors, shown);
  fake_platform::FakeLog log;
  auto loaded = TokenSession::load(paths, log.defaultLog());
  ASSERT_TRUE(std::holds_alternative<std::unique_ptr<TokenSession>>(loaded));
  EXPECT_EQ(log.texts(), std::vector<std::string>());
  auto& session = *std::get<std::unique_ptr<TokenSession>>(loaded);
  const auto key = TokenKey::load(paths.tokenKey);
  const auto isGood = [&session, &key](TokenNumber number, const std::string& path) {
    const std::string token = SandboxToken{TokenKind::readWrite, number, path, {}}.sealed(std::get<TokenKey>(key));
    return std::holds_alternative<SandboxToken>(session.opened(token));
  };
  EXPECT_FALSE(isGood(5, "/home/u/Docuvend Storage/a"));
  EXPECT_TRUE(isGood(6, "/home/u/Docuvend Storage/a"));
  EXPECT_FALSE(isGood(6, "/home/u/notes/a"));
  EXPECT_TRUE(isGood(7, "/home/u/notes/a"));
  EXPECT_FALSE(isGood(8, "/home/u/notes/a"));
  EXPECT_TRUE(isGood(1, "/home/u/a"));
  const std::string token = session.issue("/home/u/a").value_or("");
  EXPECT_TRUE(token.starts_with("docuvend-token:2:rw:7:")) << token;
}

TEST_F(TokensPageTest, NamesTheBounds) {
  EXPECT_NE(page.find("at most " + std::to_string(SandboxToken::kMaximumTextLength) + " characters"), std::string::npos);
  EXPECT_NE(page.find("at most " + std::to_string(kMaximumTokenPathLength) + " bytes"), std::string::npos);
  EXPECT_NE(page.find("*" + std::to_string(kMaximumTokenNumberDigits - 1) + "digit"), std::string::npos);
  EXPECT_NE(page.find("There are at most " + std::to_string(TokenFloors::kMaximumDirectories) + ":"), std::string::npos);
}

}  // namespace
}  // namespace docuvend::linux_platform
