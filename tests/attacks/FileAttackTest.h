// An attacker in league with a provider, beside the cellar with a diary that neither may see.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/QXURL.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/Consumer.h"
#include "tests/attacks/AttackTest.h"

namespace docuvend::tests {

// The bundle of colluder/main.cpp.
inline const std::string kColluder = "com.orvane.colluder";

inline constexpr const char* kDiaryText = "Dear diary";
inline constexpr const char* kLetterText = "Dear all";

// What the attacker says of refusals.
inline constexpr const char* kBadToken = "QXSandboxErrorDomain 1";
inline constexpr const char* kNotRegularFile = "QXSandboxErrorDomain 2";
inline constexpr const char* kGone = "QXSandboxErrorDomain 3";
inline constexpr const char* kBusy = "QXSandboxErrorDomain 4";
inline constexpr const char* kNotPermitted = "DVErrorDomain 2";
inline constexpr const char* kNoTurn = "QXFileCoordinationErrorDomain 2";

class FileAttackTest : public AttackTest {
 protected:
  // The daemon runs, and has the cellar, the picker, the attacker and the colluder.
  void SetUp() override;

  static QXURL url(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }

  // Installs the colluder's program as a provider of that name.
  void installColluder(const std::string& identifier = kColluder) const;
  // Writes what the colluder is to answer.
  void whisper(const std::string& name, const std::string& contents, const std::string& identifier = kColluder) const;
  // A path in the colluder's storage, and a file there.
  [[nodiscard]] std::string place(const std::string& name) const { return house_.storage(kColluder) + "/" + name; }
  std::string put(const std::string& name, const std::string& contents = kLetterText) const;
  // The document of the cellar.
  [[nodiscard]] std::string diary() const { return house_.document("diary.txt"); }

  // The tokens that the picker is given when it grants the attacker an item; the errors of this and of opening are texts as the
  // attacker says them.
  struct Tokens {
    std::string outcome = "ok";
    std::optional<QXData> item;
    std::optional<QXURL> siblingURL;
    std::optional<QXData> sibling;
  };
  Tokens grant(const QXURL& item, const std::string& provider = kColluder);
  // The bookmarkable string that an item has.
  [[nodiscard]] static std::string stringFor(const std::string& item, const std::string& provider = kColluder) {
    return "docuvend:" + provider + "/" + item;
  }

  struct Opened {
    std::string outcome = "ok";
    std::optional<QXDescriptor> file;
    // What the file holds.
    [[nodiscard]] std::string contents() const;
  };
  Opened redeem(const std::optional<QXData>& token, Access access = Access::read);
  std::string replace(const std::optional<QXData>& item, const std::optional<QXData>& sibling);

  std::unique_ptr<Client> picker_;
  std::unique_ptr<Client> redeemer_;
};

// As the attacker says it.
[[nodiscard]] std::string outcomeOf(const std::optional<QXError>& error);

}  // namespace docuvend::tests
