// Files with names that are made to mislead: the log and a terminal show them, and nothing that they say happens.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "platform/xml_text.h"
#include "tests/attacks/FileAttackTest.h"
#include "tests/tools/PseudoTerminal.h"

namespace docuvend::tests {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

constexpr unsigned short kColumns = 200;

const std::string kForgedLine = "docuvendd[1]: [NOTICE] All is well";

struct Name {
  const char* what;
  std::string text;
};

const std::vector<Name> kNames = {
    {"a line", "x\n" + kForgedLine},
    {"a line's beginning", "x\r" + kForgedLine},
    {"a screen's end", "x\x1b[2J\x1b[31mred"},
    {"a title", "x\x1b]0;title\x07"},
    {"an 8-bit sequence",
     "x\xc2\x9b"
     "31mred"},
    {"other lines", "x\xe2\x80\xa8" + kForgedLine + "\xe2\x80\xa9"},
    {"another direction", "\xe2\x80\xaetxt.exe"},
    {"an isolated direction", "\xe2\x81\xa7txt.exe\xe2\x81\xa9"},
    {"bells and backspaces", "x\x07\x08\x08\x7f"},
    {"255 bytes", std::string(255, 'n')},
    {"255 bytes of many-byte characters",
     [] {
       std::string name;
       while (name.size() < 255) name += "\xe2\x82\xac";
       return name;
     }()},
};

// What may start a line, steer a terminal or reorder what it shows.
bool misleads(const std::string& text) {
  if (std::any_of(text.begin(), text.end(),
                  [](char c) { return (static_cast<unsigned char>(c) < 0x20 && c != '\n' && c != '\t') || c == '\x7f'; })) {
    return true;
  }
  for (const char* sequence : {"\xc2\x9b", "\xe2\x80\xa8", "\xe2\x80\xa9", "\xe2\x80\xae", "\xe2\x81\xa7", "\xe2\x81\xa9"}) {
    if (text.find(sequence) != std::string::npos) return true;
  }
  return false;
}

class Names : public FileAttackTest {};

TEST_F(Names, AMisleadingNameIsShownInTheLogAndForgesNoLine) {
  for (const auto& [what, name] : kNames) {
    const QXURL item = url(put(name));
    // In URLs it is escaped, in identifiers it stands as it is.
    whisper("identifier", "named " + name);
    const bool isXML = qxIsXMLText(name);
    const Tokens tokens = grant(item);
    EXPECT_EQ(tokens.outcome, isXML ? "ok" : "DVErrorDomain 7") << what;
    EXPECT_EQ(redeem(tokens.item).contents(), isXML ? kLetterText : kBadToken) << what;
    EXPECT_THAT(attack({"resolve", stringFor(name)}), ElementsAre(isXML ? kNotPermitted : "QXRpcErrorDomain 4")) << what;
  }
  EXPECT_GT(house_.loggedContaining("named x"), 0);
  for (const std::string& line : house_.log()) {
    EXPECT_FALSE(misleads(line)) << ::testing::PrintToString(line);
    EXPECT_FALSE(line.starts_with("[NOTICE] All is well"));
  }
}

TEST_F(Names, ANameThatIsNoTextIsNotServedAndTheNextOneIs) {
  const std::string name = place("x\xff\xfe");
  writeFile(name, kLetterText);
  const Ending refused = house_.ctl({"--as", kPicker, "grant", name, kColluder, kAttacker});
  EXPECT_NE(refused.status, 0);
  EXPECT_FALSE(misleads(refused.errors)) << ::testing::PrintToString(refused.errors);
  EXPECT_EQ(house_.ctl({"--as", kPicker, "grant", put("x"), kColluder, kAttacker}).status, 0);
}

TEST_F(Names, ATerminalShowsAMisleadingBookmarkAsOneLineOfText) {
  const std::string path = put("x");
  for (const auto& [what, name] : kNames) {
    whisper("identifier", "named " + name);
    PseudoTerminal terminal(kColumns);
    Command command{{std::string(DOCUVEND_BIN) + "/docuvendctl", "bookmark", path}, house_.environment(), {}};
    command.environment.push_back("TERM=xterm");
    command.output = terminal.descriptor();
    command.errors = terminal.descriptor();
    static_cast<void>(Process(command).wait());
    const std::string& shown = terminal.finished();
    EXPECT_THAT(shown, HasSubstr(qxIsXMLText(name) ? "docuvend:" + kColluder + "/named " : "docuvendctl: DVErrorDomain 7")) << what;
    EXPECT_FALSE(misleads(shown)) << what << ": " << ::testing::PrintToString(shown);
    EXPECT_EQ(std::count(shown.begin(), shown.end(), '\n'), 1) << what << ": " << ::testing::PrintToString(shown);
  }
}

TEST_F(Names, ATerminalShowsMisleadingNamesAndDoesNothingThatTheySay) {
  for (const auto& [what, name] : kNames) {
    whisper("identifier", "named " + name);
    (void)grant(url(put(name)));
  }
  PseudoTerminal terminal(kColumns);
  Command command{{std::string(DOCUVEND_BIN) + "/docuvendctl", "grants"}, house_.environment(), {}};
  command.environment.push_back("TERM=xterm");
  command.output = terminal.descriptor();
  command.errors = terminal.descriptor();
  EXPECT_EQ(Process(command).wait().status, 0);
  command.words = {std::string(DOCUVEND_BIN) + "/docuvendctl", "bookmark", place(kNames.front().text)};
  static_cast<void>(Process(command).wait());
  const std::string shown = terminal.finished();
  EXPECT_THAT(shown, HasSubstr("named "));
  EXPECT_THAT(shown, HasSubstr("txt.exe"));
  EXPECT_FALSE(misleads(shown)) << ::testing::PrintToString(shown);
  EXPECT_THAT(shown, Not(HasSubstr("\n" + kForgedLine)));
}

}  // namespace
}  // namespace docuvend::tests
