// docs/security.md names every test file of this folder, and no other.
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <regex>
#include <set>
#include <sstream>
#include <string>

namespace docuvend::tests {
namespace {

std::string page() {
  std::ifstream file(DOCUVEND_DOCS "/security.md");
  return {std::istreambuf_iterator<char>(file), {}};
}

TEST(SecurityPage, NamesEveryTestFileOfTheAttacksAndNoOther) {
  std::set<std::string> named;
  const std::string text = page();
  const std::regex pattern("`([A-Za-z]+_test\\.cpp)`");
  for (auto at = std::sregex_iterator(text.begin(), text.end(), pattern); at != std::sregex_iterator(); ++at) named.insert((*at)[1]);
  std::set<std::string> there;
  std::istringstream names(DOCUVEND_ATTACKS);
  for (std::string name; names >> name;) {
    if (name != "SecurityPage_test.cpp") there.insert(name);
  }
  EXPECT_FALSE(there.empty());
  EXPECT_EQ(named, there);
}

}  // namespace
}  // namespace docuvend::tests
