// Documents as open files, and their saving.
//
// Several may save one item at once, and they share its hidden sibling. So a saver first locks (flock) the item, then the sibling, and
// keeps both until it is done. A lock belongs to a file, not to a name, and a save exchanges the file: the item is what was the sibling,
// whose lock its saver still holds, and the next saver finds it locked under its new name. The file that somebody has waited for is the old
// item then, so who gets a lock opens the token again and goes on only if that is still the same file.
//
// When no answer tells whether the sibling has taken the item's place, the request may still be on its way, and the next saver must not
// begin to write what may become the item at any moment: the locks are held until the answer comes or can come no more.
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <thread>
#include <utility>

#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "sdk/Consumer.h"
#include "sdk/FileProgress.h"
#include "sdk/LiveTokens.h"
#include "sdk/ServiceConnections.h"

namespace docuvend {

using linux_platform::QXFileCoordination;
using linux_platform::QXSandboxRedemption;
using linux_platform::SandboxErrorCode;
using sdk_detail::after;
using sdk_detail::errorOf;
using sdk_detail::isSandboxError;
using sdk_detail::Repeat;
using sdk_detail::timeLeft;
using sdk_detail::TimePoint;
using sdk_detail::valueOf;
using sdk_detail::withLiveTokens;

namespace {

constexpr std::chrono::milliseconds kBusyInterval{20};

bool isDeadline(const QXError& error) {
  return error.domain == kConsumerErrorDomain && error.code == static_cast<std::int64_t>(ConsumerErrorCode::deadlinePassed);
}

// Waits a little before the next try. False: the time is over.
bool pauseUntil(TimePoint until) {
  const auto left = timeLeft(until);
  std::this_thread::sleep_for(std::min(left, kBusyInterval));
  return left > left.zero();
}

bool isSameFile(const QXDescriptor& one, const QXDescriptor& other) {
  struct stat first {};
  struct stat second {};
  return ::fstat(one.number, &first) == 0 && ::fstat(other.number, &second) == 0 && first.st_dev == second.st_dev &&
         first.st_ino == second.st_ino;
}

// An open file with its lock, which goes with it.
class LockedFile {
 public:
  // Does not wait. EWOULDBLOCK: somebody else has the lock.
  static std::variant<std::shared_ptr<const LockedFile>, int> lock(QXDescriptor file) {
    if (::flock(file.number, LOCK_EX | LOCK_NB) != 0) return errno;
    return std::shared_ptr<const LockedFile>(new LockedFile(std::move(file)));
  }
  // The descriptor's end alone would not do: a child process may have a copy.
  ~LockedFile() { ::flock(file_.number, LOCK_UN); }
  LockedFile(const LockedFile&) = delete;
  LockedFile& operator=(const LockedFile&) = delete;

  [[nodiscard]] const QXDescriptor& file() const { return file_; }

 private:
  explicit LockedFile(QXDescriptor file) : file_(std::move(file)) {}

  const QXDescriptor file_;
};

using Lock = std::shared_ptr<const LockedFile>;

// The file that the token opens, this saver's alone.
Result<Lock> lock(Consumer& consumer, const QXData& token, Access access, TimePoint until) {
  do {
    auto opened = consumer.within(timeLeft(until)).redeem(token, access);
    if (auto* error = std::get_if<QXError>(&opened)) return std::move(*error);
    auto locked = LockedFile::lock(std::get<QXDescriptor>(std::move(opened)));
    if (const auto* errnoValue = std::get_if<int>(&locked)) {
      if (*errnoValue != EWOULDBLOCK) return QXError::system(*errnoValue, "cannot lock a file to be saved");
      continue;
    }
    auto& file = std::get<Lock>(locked);
    auto again = consumer.within(timeLeft(until)).redeem(token, access);
    if (auto* error = std::get_if<QXError>(&again)) return std::move(*error);
    if (isSameFile(file->file(), std::get<QXDescriptor>(again))) return std::move(file);
  } while (pauseUntil(until));
  return makeConsumerError(ConsumerErrorCode::deadlinePassed, "Somebody else was saving the document all the time.");
}

struct Locks {
  Lock item;
  Lock sibling;
};

QXError noTokens(const Document& document) {
  return makeConsumerError(ConsumerErrorCode::noToken, "There is no token for " + document.url.absoluteString() + ".");
}

}  // namespace

Result<QXDescriptor> Consumer::redeem(const QXData& token, Access access) {
  const TimePoint until = after(options_.deadline);
  std::optional<QXError> busy;
  do {
    auto file =
        valueOf<QXDescriptor>(services_->ask<&QXSandboxRedemption::redeemToken>(linux_platform::kSandboxServiceName, {until},
                                                                                Repeat::harmless, token, access == Access::readWrite),
                              "a file");
    const auto* error = std::get_if<QXError>(&file);
    if (error == nullptr) return file;
    // Its time may also pass in a try that is not answered any more.
    if (busy && isDeadline(*error)) break;
    if (!isSandboxError(*error, SandboxErrorCode::busy)) return file;
    busy = *error;
  } while (pauseUntil(until));
  return makeConsumerError(ConsumerErrorCode::deadlinePassed, "Somebody held the file all the time.", busy);
}

Result<QXDescriptor> Consumer::open(const Document& document, const ProviderID& provider, Access access, const ProgressHandler& progress) {
  const auto self = ownIdentifier();
  if (!self) return makeConsumerError(ConsumerErrorCode::noToken, "This process acts for no installed bundle.");
  const TimePoint until = after(options_.materialisingDeadline);
  return withLiveTokens(*this, document, until, options_.deadline, [&](const Document& live) -> Result<QXDescriptor> {
    if (!live.itemToken) return noTokens(live);
    Consumer hurried = within(timeLeft(until));
    std::function<void()> watch;
    if (progress) {
      watch = [&] {
        auto file = within(std::min(timeLeft(until), sdk_detail::kProgressInterval)).redeem(*live.itemToken, Access::read);
        struct stat status {};
        const auto* opened = std::get_if<QXDescriptor>(&file);
        if (opened != nullptr && ::fstat(opened->number, &status) == 0) sdk_detail::report(status, progress);
      };
    }
    if (auto failure = hurried.start(live.url, provider, *self, watch)) return *std::move(failure);
    return within(timeLeft(until)).redeem(*live.itemToken, access);
  });
}

Failure Consumer::replace(const Document& document, const std::function<Failure(const QXDescriptor&)>& write) {
  struct Locked {
    Document document;
    Locks locks;
  };
  const TimePoint until = after(options_.deadline);
  auto prepared = withLiveTokens(*this, document, until, options_.deadline, [&](const Document& live) -> Result<Locked> {
    if (!live.itemToken || !live.siblingToken) return noTokens(live);
    auto item = lock(*this, *live.itemToken, Access::read, until);
    if (auto* error = std::get_if<QXError>(&item)) return std::move(*error);
    auto sibling = lock(*this, *live.siblingToken, Access::readWrite, until);
    if (auto* error = std::get_if<QXError>(&sibling)) return std::move(*error);
    return Locked{live, {std::get<Lock>(item), std::get<Lock>(sibling)}};
  });
  if (auto* error = std::get_if<QXError>(&prepared)) return std::move(*error);
  const auto& [live, locks] = std::get<Locked>(prepared);
  // It may hold what an earlier attempt left.
  if (::ftruncate(locks.sibling->file().number, 0) != 0) return QXError::system(errno, "cannot empty the hidden sibling");
  if (auto failure = write(locks.sibling->file())) return failure;

  const auto replaced = services_->ask<&QXSandboxRedemption::replaceItemWithToken>(
      linux_platform::kSandboxServiceName, {.until = after(options_.deadline), .held = std::make_shared<const Locks>(locks)}, Repeat::never,
      *live.itemToken, *live.siblingToken);
  if (auto error = errorOf(replaced)) return error;
  if (auto error = finishedWriting(live.url)) {
    return makeConsumerError(ConsumerErrorCode::notTold, "The document is saved, but its provider could not be told.", error);
  }
  return std::nullopt;
}

Failure Consumer::finishedWriting(const QXURL& url) {
  return errorOf(services_->ask<&QXFileCoordination::writerDidFinishWritingForURL>(linux_platform::kFileCoordinationServiceName,
                                                                                   {after(options_.deadline)}, Repeat::harmless, url));
}

}  // namespace docuvend
