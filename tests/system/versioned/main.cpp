// A small provider of which there are versions: the text of the file "version" beside its program, read when it starts. Any name below its
// storage is an item whose identifier is the name; the identifier of the item "version" is the version.
//
//   startProviding  stuck     says so, and waits until the file "free" lies in its container
//                   anything  succeeds
//   setup           if the file "slow" lies in its container, says so, and waits until "free" does
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include "sdk/Provider.h"

namespace docuvend {
namespace {

namespace fs = std::filesystem;

std::string storage() {
  const std::string identifier = fs::path(providerContainer().value_or("")).filename();
  return providerGroupContainer(identifier + ".documents").value_or("") + "/Docuvend Storage";
}

std::string readVersion() {
  std::string version;
  std::ifstream(fs::read_symlink("/proc/self/exe").parent_path() / "version") >> version;
  return version;
}

void waitUntilFree(const char* what) {
  std::fprintf(stderr, "%s\n", what);
  while (access("free", F_OK) != 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));
}

class Versioned : public Provider {
 public:
  [[nodiscard]] Failure performInitialSetup() override {
    if (access("slow", F_OK) == 0) waitUntilFree("is slow");
    std::error_code error;
    fs::create_directory(storage(), error);
    if (error) return QXError::system(error.value(), "cannot make the storage");
    return std::nullopt;
  }
  [[nodiscard]] Failure providePlaceholder(const QXURL&) override { return std::nullopt; }
  [[nodiscard]] Failure startProviding(const QXURL& url) override {
    if (nameOf(url) == "stuck") waitUntilFree("is stuck");
    return std::nullopt;
  }
  [[nodiscard]] Failure itemChanged(const QXURL&) override { return std::nullopt; }
  [[nodiscard]] Failure stopProviding(const QXURL&) override { return std::nullopt; }
  [[nodiscard]] Result<ItemID> identifierForItem(const QXURL& url) override {
    const std::string name = nameOf(url);
    return ItemID{name == "version" ? version_ : name};
  }
  [[nodiscard]] Result<QXURL> itemURL(const ItemID& identifier) override {
    return QXURL::fileURL(storage() + "/" + identifier.value, QXURLKind::file);
  }

 private:
  static std::string nameOf(const QXURL& url) { return fs::path(url.fileSystemPath()).filename(); }

  const std::string version_ = readVersion();
};

}  // namespace
}  // namespace docuvend

int main() {
  docuvend::Versioned provider;
  return docuvend::runProvider(provider);
}
