// A provider that is in league with an application: it answers what lies written in its container.
//
//   storage      performInitialSetup makes the storage a symbolic link with that text; without it a directory
//   identifier   what identifierForItem answers; without it the name
//   url          the URL that itemURL answers; without it the one of the file of that name
//
// To start providing the item "x" is to exchange the names "x" and "x.decoy" of the storage again and again, until the file "enough" lies
// in its container; how often is said on the standard error output. To start providing the item "never" is not to answer until that file
// lies there, and to copy meanwhile what is in the file "secret" of the container to the file "seen".
#include <fcntl.h>
#include <stdio.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>
#include <thread>

#include "sdk/Provider.h"

namespace docuvend {
namespace {

// A test that ended without a word is not waited for.
constexpr long kMostExchanges = 50'000'000;
constexpr long kMostLooks = 600'000;

std::optional<std::string> written(const std::string& name) {
  std::ifstream file(name, std::ios::binary);
  if (!file) return std::nullopt;
  return std::string(std::istreambuf_iterator<char>(file), {});
}

// The bundle's identifier is its container's name.
std::string storage() {
  const std::string self = std::filesystem::path(providerContainer().value_or("")).filename();
  return providerGroupContainer(self + ".documents").value_or("") + "/Docuvend Storage";
}

std::string nameOf(const QXURL& url) {
  const std::string path = url.fileSystemPath();
  return path.substr(path.rfind('/') + 1);
}

bool isEnough() { return ::access("enough", F_OK) == 0; }

void lookAround() {
  std::ofstream("seen") << "nothing yet";
  for (long look = 0; look < kMostLooks && !isEnough(); ++look) {
    if (const auto secret = written("secret")) std::ofstream("seen") << *secret;
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
}

class Colluder : public Provider {
 public:
  [[nodiscard]] Failure performInitialSetup() override {
    std::error_code error;
    if (const auto target = written("storage")) {
      std::filesystem::create_symlink(*target, storage(), error);
    } else {
      std::filesystem::create_directory(storage(), error);
    }
    if (error && error != std::errc::file_exists) return QXError::system(error.value(), "cannot make the storage");
    return std::nullopt;
  }

  [[nodiscard]] Failure providePlaceholder(const QXURL&) override { return std::nullopt; }

  [[nodiscard]] Failure startProviding(const QXURL& url) override {
    if (nameOf(url) == "never") {
      lookAround();
      return std::nullopt;
    }
    const std::string name = storage() + "/" + nameOf(url);
    const std::string decoy = name + ".decoy";
    long count = 0;
    while (count < kMostExchanges && ::renameat2(AT_FDCWD, name.c_str(), AT_FDCWD, decoy.c_str(), RENAME_EXCHANGE) == 0) {
      ++count;
      if (isEnough()) break;
    }
    std::fprintf(stderr, "has exchanged %s %ld times\n", nameOf(url).c_str(), count);
    return std::nullopt;
  }

  [[nodiscard]] Failure itemChanged(const QXURL&) override { return std::nullopt; }
  [[nodiscard]] Failure stopProviding(const QXURL&) override { return std::nullopt; }

  [[nodiscard]] Result<ItemID> identifierForItem(const QXURL& url) override { return ItemID{written("identifier").value_or(nameOf(url))}; }

  [[nodiscard]] Result<QXURL> itemURL(const ItemID& identifier) override {
    const auto answer = QXURL::fromString(written("url").value_or(""));
    return answer ? *answer : QXURL::fileURL(storage() + "/" + identifier.value, QXURLKind::file);
  }
};

}  // namespace
}  // namespace docuvend

int main() {
  docuvend::Colluder provider;
  return docuvend::runProvider(provider);
}
