#include "tests/attacks/FileAttackTest.h"

#include <unistd.h>

#include <array>
#include <filesystem>

namespace docuvend::tests {

using linux_platform::QXSandboxRedemption;

std::string outcomeOf(const std::optional<QXError>& error) { return error ? error->domain + " " + std::to_string(error->code) : "ok"; }

void FileAttackTest::SetUp() {
  SystemTest::SetUp();
  house_.install(kCellar);
  house_.install(kPicker);
  installAttacker();
  installColluder();
  (void)house_.putInCloud("letter.txt", kLetterText);
  house_.startDaemon();
  writeFile(diary(), kDiaryText);
  picker_ = house_.client(kPicker);
  redeemer_ = house_.client(std::nullopt, linux_platform::kSandboxServiceName);
}

void FileAttackTest::installColluder(const std::string& identifier) const {
  const std::string group = identifier + ".documents";
  house_.install(identifier, "docuvend-colluder",
                 stringEntry("QXBundleIdentifier", identifier) + "<key>QXGroups</key><array><string>" + group +
                     "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
                     stringEntry("QXExtensionDocuvendDocumentGroup", group) + "</dict>",
                 {});
}

void FileAttackTest::whisper(const std::string& name, const std::string& contents, const std::string& identifier) const {
  const std::filesystem::path container = house_.container(identifier);
  std::filesystem::create_directories(container);
  std::filesystem::permissions(container, std::filesystem::perms::owner_all);
  writeFile(container / name, contents);
}

std::string FileAttackTest::put(const std::string& name, const std::string& contents) const {
  writeFile(place(name), contents);
  return place(name);
}

FileAttackTest::Tokens FileAttackTest::grant(const QXURL& item, const std::string& provider) {
  auto answer = picker_->ask<&DVDaemon::extendSandboxForFileURL>(item, ProviderID{provider}, ConsumerID{kAttacker});
  if (const auto error = errorOf(answer)) return {outcomeOf(error), {}, {}, {}};
  const auto& [none, token, siblingURL, sibling] = std::get<0>(answer);
  return {"ok", token, siblingURL, sibling};
}

FileAttackTest::Opened FileAttackTest::redeem(const std::optional<QXData>& token, Access access) {
  auto answer = redeemer_->ask<&QXSandboxRedemption::redeemToken>(token, access == Access::readWrite);
  if (const auto error = errorOf(answer)) return {outcomeOf(error), {}};
  return {"ok", std::get<1>(std::get<0>(std::move(answer)))};
}

std::string FileAttackTest::replace(const std::optional<QXData>& item, const std::optional<QXData>& sibling) {
  return outcomeOf(errorOf(redeemer_->ask<&QXSandboxRedemption::replaceItemWithToken>(item, sibling)));
}

std::string FileAttackTest::Opened::contents() const {
  constexpr std::size_t kMostContents = 4096;
  std::array<char, kMostContents> bytes{};
  const ssize_t count = file ? ::pread(file->number, bytes.data(), bytes.size(), 0) : -1;
  return count < 0 ? outcome : std::string(bytes.data(), static_cast<std::size_t>(count));
}

}  // namespace docuvend::tests
