// A provider that does what the name of an item says, and takes any name below its storage for an item.
//
//   at the start                 if the file "flood" lies in its container, removes it, floods the daemon with frames and ends
//   performInitialSetup          waits while the file "hang" lies in its container, and fails while "unwell" does
//
//   identifierForItem  control   an identifier with the character U+0001
//                      refused   an error, whose text is the file "says" in its container, if that is there
//                      prints    prints the file "prints" in its container
//                      garbage   bytes that are no frame, to the daemon
//                      unasked   an answer to a message that it was not sent
//                      leave     closes its connection and stays
//                      abort     abort()
//                      knock     what the administration answers at the socket "door" in its group's container
//                      hoard     has as many descriptors on their way as the kernel allows it, and says so
//                      weary     the name, after a while
//                      anything  the name
//   startProviding     stuck     says so, and waits until the file "free" lies in its container
//                      forks     starts as many processes as it may, says so, and waits in the same way
//                      memory    allocates memory until there is none, which ends it
//                      chatter   writes 20,000 lines
//                      anything  succeeds
//   itemChanged        laggard*  waits until the file "free" lies in its container
//                      anything  succeeds
//   providePlaceholder, startProviding, stopProviding
//                      sour      an error
//                      bomb      abort()
//                      anything  succeeds
//   itemURL            outside   a file of the system
//                      cellar    a file where another provider has its documents
//                      storage   the storage itself
//                      refused   an error
//                      anything  the file of that name
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <span>
#include <string>
#include <thread>
#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/wire/Frame.h"
#include "sdk/Provider.h"
#include "tests/system/knock.h"
#include "tests/system/provider/excess.h"

namespace docuvend {
namespace {

using linux_platform::EncodedFrame;
using linux_platform::encodeFrame;
using linux_platform::ReplyFrame;

constexpr int kDaemonSocket = 3;
constexpr int kManyLines = 20'000;
constexpr std::chrono::milliseconds kWhile{200};
constexpr std::uint64_t kNeverAsked = 1'000'000'000;

std::string contentsOf(const char* path, std::string otherwise) {
  std::ifstream file(path, std::ios::binary);
  return file ? std::string(std::istreambuf_iterator<char>(file), {}) : std::move(otherwise);
}

QXError refusal() { return QXError::make("TricksterErrorDomain", 1, contentsOf("says", "No.")); }

void sendToDaemon(std::span<const std::uint8_t> bytes) {
  if (send(kDaemonSocket, bytes.data(), bytes.size(), MSG_NOSIGNAL) < 0) std::abort();
}

std::string storage(const std::string& group = "com.orvane.trickster.documents") {
  return providerGroupContainer(group).value_or("") + "/Docuvend Storage";
}

std::string nameOf(const QXURL& url) {
  const std::string path = url.fileSystemPath();
  return path.substr(path.rfind('/') + 1);
}

class Trickster : public Provider {
 public:
  [[nodiscard]] Failure performInitialSetup() override {
    while (access("hang", F_OK) == 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));
    if (access("unwell", F_OK) == 0) return refusal();
    std::error_code error;
    std::filesystem::create_directory(storage(), error);
    if (error) return QXError::system(error.value(), "cannot make the storage");
    return std::nullopt;
  }

  [[nodiscard]] Failure providePlaceholder(const QXURL& url) override { return performAsNamed(url); }

  [[nodiscard]] Failure startProviding(const QXURL& url) override {
    const std::string name = nameOf(url);
    if (name == "memory") tests::allocateWithoutEnd();
    if (name == "chatter") tests::chatter(kManyLines);
    if (name == "stuck") std::fputs("is stuck\n", stderr);
    if (name == "forks") std::fprintf(stderr, "has started %d processes\n", tests::forkWithoutEnd());
    if (name == "stuck" || name == "forks") awaitFreedom();
    return performAsNamed(url);
  }

  [[nodiscard]] Failure itemChanged(const QXURL& url) override {
    if (nameOf(url).starts_with("laggard")) awaitFreedom();
    return std::nullopt;
  }
  [[nodiscard]] Failure stopProviding(const QXURL& url) override { return performAsNamed(url); }

  [[nodiscard]] Result<ItemID> identifierForItem(const QXURL& url) override {
    const std::string name = nameOf(url);
    if (name == "weary") std::this_thread::sleep_for(kWhile);
    if (name == "control") return ItemID{"one\x01two"};
    if (name == "refused") return refusal();
    if (name == "abort") std::abort();
    if (name == "hoard") std::fprintf(stderr, "has hoarded %d descriptors\n", tests::hoardDescriptors());
    if (name == "knock") return ItemID{tests::knock(storage() + "/../door", {"first-unlock"})};
    if (name == "garbage") sendToDaemon(std::vector<std::uint8_t>(64, 0xff));
    if (name == "unasked") sendToDaemon(std::get<EncodedFrame>(encodeFrame(ReplyFrame{kNeverAsked, {}})).bytes);
    if (name == "leave") shutdown(kDaemonSocket, SHUT_RDWR);
    if (name == "prints") std::fputs(contentsOf("prints", {}).c_str(), stderr);
    return ItemID{name};
  }

  [[nodiscard]] Result<QXURL> itemURL(const ItemID& identifier) override {
    const std::string& name = identifier.value;
    if (name == "refused") return refusal();
    if (name == "outside") return QXURL::fileURL("/etc/passwd", QXURLKind::file);
    if (name == "cellar") return QXURL::fileURL(storage("com.orvane.cellar.documents") + "/letter.txt", QXURLKind::file);
    if (name == "storage") return QXURL::fileURL(storage(), QXURLKind::directory);
    return QXURL::fileURL(storage() + "/" + name, QXURLKind::file);
  }

 private:
  static void awaitFreedom() {
    while (access("free", F_OK) != 0) std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  static Failure performAsNamed(const QXURL& url) {
    if (nameOf(url) == "sour") return refusal();
    if (nameOf(url) == "bomb") std::abort();
    return std::nullopt;
  }
};

}  // namespace
}  // namespace docuvend

int main() {
  if (unlink("flood") == 0) {
    docuvend::tests::floodWithFrames(docuvend::kDaemonSocket);
    return 0;
  }
  docuvend::Trickster provider;
  return docuvend::runProvider(provider);
}
