// A program that does what its words say, one thing after another, in one launch; confined when it is launched as an application.
//
//   placeholder URL PROVIDER CONSUMER
//   start URL PROVIDER CONSUMER
//   stop URL PROVIDER CONSUMER
//   extend URL CONSUMER          passes a document on
//   read STRING                  opens a document for reading, as it is, and keeps it open
//   write STRING                 the same for writing
//   map STRING                   maps a document for reading, and closes it
//   make PATH                    makes a file, with its directories
//   link PATH TARGET             makes a symbolic link, with its directories
//   hold PLACE                   makes the file PLACE.holding, and waits until PLACE.go is there
//
// and those of Turns.h. Relative paths begin in its container.
//
// Prints a line for each: "ok", a string, or the domains and codes of an error and of what stands beneath it.
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "sdk/Consumer.h"
#include "tests/system/asker/Turns.h"
#include "tests/system/asker/Words.h"

namespace docuvend::asker {
namespace {

constexpr auto kPatience = std::chrono::seconds(60);
constexpr auto kBetweenLooks = std::chrono::milliseconds(2);
constexpr std::size_t kMapped = 1;

class Asker {
 public:
  explicit Asker(Consumer& consumer) : consumer_(consumer), turns_(consumer) {}

  std::string perform(Words& words) {
    const std::string verb = words.next();
    if (verb == "placeholder" || verb == "start" || verb == "stop") return text(askForItem(verb, words));
    if (verb == "extend") return extend(words);
    if (verb == "read") return keep(open(words, Access::read));
    if (verb == "write") return keep(open(words, Access::readWrite));
    if (verb == "map") return map(open(words, Access::read));
    if (verb == "make") return make(words.next());
    if (verb == "link") return link(words);
    if (verb == "hold") return hold(words.next());
    return turns_.perform(verb, words).value_or("no such word: " + verb);
  }

 private:
  Failure askForItem(const std::string& verb, Words& words) {
    const QXURL url = words.nextURL();
    const ProviderID provider{words.next()};
    const ConsumerID consumer{words.next()};
    if (verb == "placeholder") return consumer_.providePlaceholder(url, provider, consumer);
    if (verb == "start") return consumer_.startProviding(url, provider, consumer);
    return consumer_.stopProviding(url, provider, consumer);
  }

  std::string extend(Words& words) {
    const QXURL url = words.nextURL();
    const auto result = consumer_.extendBookmark(url, ConsumerID{words.next()});
    const auto* error = std::get_if<QXError>(&result);
    return error != nullptr ? text(*error) : std::get<std::string>(result);
  }

  Result<QXDescriptor> open(Words& words, Access access) {
    const auto resolved = consumer_.documentURL(words.next());
    if (const auto* error = std::get_if<QXError>(&resolved)) return *error;
    return consumer_.redeem(std::get<Document>(resolved).itemToken.value_or(QXData{}), access);
  }
  std::string keep(Result<QXDescriptor> opened) {
    if (const auto* error = std::get_if<QXError>(&opened)) return text(*error);
    kept_.push_back(std::get<QXDescriptor>(std::move(opened)));
    return "ok";
  }
  static std::string map(Result<QXDescriptor> opened) {
    if (const auto* error = std::get_if<QXError>(&opened)) return text(*error);
    const void* mapped = ::mmap(nullptr, kMapped, PROT_READ, MAP_SHARED, std::get<QXDescriptor>(opened).number, 0);
    return mapped == MAP_FAILED ? text(QXError::system(errno, "cannot map")) : "ok";
  }

  static std::error_code makeDirectoriesOf(const std::filesystem::path& path) {
    std::error_code error;
    std::filesystem::create_directories(path.parent_path(), error);
    return error;
  }
  static std::string make(const std::string& path) {
    if (const auto error = makeDirectoriesOf(path)) return text(QXError::system(error.value(), "cannot make the directories"));
    std::ofstream file(path);
    return file << "mine" << std::flush ? "ok" : "cannot make the file";
  }
  static std::string link(Words& words) {
    const std::filesystem::path path = words.next();
    auto error = makeDirectoriesOf(path);
    if (!error) std::filesystem::create_symlink(words.next(), path, error);
    return error ? text(QXError::system(error.value(), "cannot make the link")) : "ok";
  }
  static std::string hold(const std::string& place) {
    std::ofstream(place + ".holding").close();
    const std::string go = place + ".go";
    const auto deadline = std::chrono::steady_clock::now() + kPatience;
    while (::access(go.c_str(), F_OK) != 0) {
      if (std::chrono::steady_clock::now() > deadline) return "in vain";
      std::this_thread::sleep_for(kBetweenLooks);
    }
    return "ok";
  }

  Consumer& consumer_;
  Turns turns_;
  std::vector<QXDescriptor> kept_;
};

int run(Words words) {
  Consumer::Options options;
  options.restartPatience = kPatience;
  auto connected = Consumer::connect(options);
  if (const auto* error = std::get_if<QXError>(&connected)) {
    std::cout << text(*error) << "\n";
    return 1;
  }
  Asker asker(*std::get<std::unique_ptr<Consumer>>(connected));
  while (!words.isEmpty()) std::cout << asker.perform(words) << std::endl;
  return 0;
}

}  // namespace
}  // namespace docuvend::asker

int main(int count, char** words) { return docuvend::asker::run(docuvend::asker::Words(count, words)); }
