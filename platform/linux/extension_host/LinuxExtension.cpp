#include "platform/linux/extension_host/LinuxExtension.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <utility>

#include "platform/linux/base/LogSubject.h"
#include "platform/linux/base/PassedDescriptors.h"
#include "platform/linux/extension_host/ExtensionConnection.h"
#include "platform/linux/extension_host/ExtensionErrors.h"
#include "platform/linux/extension_host/Matching.h"
#include "platform/linux/launch/ConfinedLaunch.h"

namespace docuvend::linux_platform {
namespace {

using Clock = std::chrono::steady_clock;

// Random, in the form that RFC 4122 gives to random ones.
QXUUID freshUUID() {
  QXUUID result;
  // Up to 256 bytes are never given in part.
  while (getrandom(result.bytes.data(), result.bytes.size(), 0) < 0 && errno == EINTR) {
  }
  result.bytes[6] = static_cast<std::uint8_t>((result.bytes[6] & 0x0FU) | 0x40U);
  result.bytes[8] = static_cast<std::uint8_t>((result.bytes[8] & 0x3FU) | 0x80U);
  return result;
}

QXError notStarted(const std::string& identifier, QXError underlying) {
  QXError error = extensionHostError(ExtensionHostErrorCode::notStarted, "The process of " + identifier + " could not be started.");
  error.underlying = std::make_shared<const QXError>(std::move(underlying));
  return error;
}

const char* describe(ProcessLifetime::Phase phase) {
  switch (phase) {
    case ProcessLifetime::Phase::none:
      return "not running";
    case ProcessLifetime::Phase::starting:
      return "starting";
    case ProcessLifetime::Phase::running:
      return "running";
    case ProcessLifetime::Phase::ending:
      return "ending";
  }
  return "";
}

QXError couldNotBeWatched() { return QXError::system(ENOMEM, "a new process could not be watched"); }

QXError hostIsStopping() { return extensionHostError(ExtensionHostErrorCode::stopped, "The extension host is stopping."); }

}  // namespace

LinuxExtension::LinuxExtension(Bundle bundle, QXExtensionContextClass contextClass, std::shared_ptr<ExtensionServices> services)
    : bundle_(std::move(bundle)), contextClass_(contextClass), services_(std::move(services)), lifetime_(services_->times) {}

std::shared_ptr<LinuxExtension> LinuxExtension::create(Bundle bundle, QXExtensionContextClass contextClass,
                                                       std::shared_ptr<ExtensionServices> services) {
  return std::shared_ptr<LinuxExtension>(new LinuxExtension(std::move(bundle), contextClass, std::move(services)));
}

LinuxExtension::~LinuxExtension() {
  for (const Waiting& waiting : waiting_) {
    waiting.completion(/*request=*/std::nullopt, extensionHostError(ExtensionHostErrorCode::stopped, "The extension was let go."));
  }
}

bool LinuxExtension::isEqual(const QXExtension& other) const {
  const auto* extension = dynamic_cast<const LinuxExtension*>(&other);
  return extension != nullptr && isSameInstallation(bundle_, extension->bundle_);
}

void LinuxExtension::beginExtensionRequest(BeginCompletion completion) {
  if (const auto process = presentProcess()) process->noticeEnd();
  const QXUUID request = freshUUID();
  ProcessLifetime::Begin begin{};
  std::optional<QXError> refusal;
  std::shared_ptr<ExtensionProcess> joined;
  {
    const std::lock_guard lock(mutex_);
    begin = isStopped_ ? ProcessLifetime::Begin::refuse : lifetime_.begin(request, Clock::now());
    if (begin == ProcessLifetime::Begin::join) joined = process_;
    if (begin == ProcessLifetime::Begin::refuse) refusal = refusalError();
    if (begin == ProcessLifetime::Begin::start || begin == ProcessLifetime::Begin::wait) {
      waiting_.push_back({request, LogSubject::carrying(std::move(completion))});
    }
  }
  switch (begin) {
    case ProcessLifetime::Begin::start:
      startOnSpawner();
      break;
    case ProcessLifetime::Begin::wait:
      break;
    case ProcessLifetime::Begin::join:
      if (joined) joined->watchLiveness();
      completion(request, /*error=*/std::nullopt);
      break;
    case ProcessLifetime::Begin::refuse:
      completion(/*request=*/std::nullopt, std::move(refusal));
      break;
  }
}

void LinuxExtension::cancelExtensionRequest(const QXUUID& request) {
  const std::lock_guard lock(mutex_);
  lifetime_.finish(request, Clock::now());
  // A timer that is set looks at the deadline of its time and is set again if that lies ahead. The grace of a retired one may be far ahead.
  if (!endTimerIsSet_ || lifetime_.isRetired()) setEndTimer();
}

std::shared_ptr<QXExtensionContext> LinuxExtension::extensionContextForRequest(const QXUUID& request) {
  const std::lock_guard lock(mutex_);
  if (!process_ || !lifetime_.isOpen(request)) return nullptr;
  // Whoever sent a message that failed leaves its request open, for ever: the request has nothing more to come and ends here.
  auto onFailedMessage = [weak = weak_from_this(), request] {
    if (const auto strongSelf = weak.lock()) strongSelf->cancelExtensionRequest(request);
  };
  return std::make_shared<ExtensionContext>(
      std::make_shared<ExtensionConnection>(process_, bundle_.entitlements, std::move(onFailedMessage)));
}

void LinuxExtension::retire(Retirement how) {
  {
    const std::lock_guard lock(mutex_);
    const auto now = Clock::now();
    lifetime_.retire(how == Retirement::atOnce ? now : now + services_->times.updateGrace);
  }
  endWhenDue();
}

void LinuxExtension::setEndTimer() {
  const std::optional<ProcessLifetime::Time> deadline = lifetime_.deadline();
  endTimerIsSet_ = deadline.has_value();
  if (deadline) endTimer_->setFor(*deadline);
}

bool LinuxExtension::hasEndTimer() {
  const std::lock_guard lock(mutex_);
  if (!endTimer_ || !endTimer_->isUsable()) {
    endTimer_ = std::make_unique<Timer>(services_->reactor, [weak = weak_from_this()] {
      if (const auto strongSelf = weak.lock()) strongSelf->endWhenDue();
    });
  }
  return endTimer_->isUsable();
}

void LinuxExtension::stop() {
  std::shared_ptr<ExtensionProcess> process;
  std::vector<Waiting> waiting;
  {
    const std::lock_guard lock(mutex_);
    isStopped_ = true;
    process.swap(process_);
    waiting.swap(waiting_);
  }
  if (process) process->endAtOnce();
  for (const Waiting& one : waiting) one.completion(/*request=*/std::nullopt, hostIsStopping());
}

std::shared_ptr<ExtensionProcess> LinuxExtension::presentProcess() const {
  const std::lock_guard lock(mutex_);
  return process_;
}

void LinuxExtension::startOnSpawner() {
  const bool isTaken = services_->spawner.perform([strongSelf = shared_from_this()] { strongSelf->start(); });
  if (!isTaken) didNotStart(hostIsStopping());
}

void LinuxExtension::start() {
  if (isOver()) {
    didNotStart(bundleIsGoneError(bundle_.identifier));
    return;
  }
  auto made = makeProcess();
  if (auto* error = std::get_if<QXError>(&made)) {
    didNotStart(notStarted(bundle_.identifier, std::move(*error)));
  } else {
    didStart(std::move(std::get<std::shared_ptr<ExtensionProcess>>(made)));
  }
}

std::variant<std::shared_ptr<ExtensionProcess>, QXError> LinuxExtension::makeProcess() {
  // A confinement that root makes keeps far too little out.
  if (geteuid() == 0) return QXError::system(EPERM, "extensions are not started by root");

  if (!hasEndTimer()) return couldNotBeWatched();
  std::array<int, 2> sockets{};
  if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, sockets.data()) != 0) {
    return QXError::system(errno, "a socket for an extension could not be made");
  }
  UniqueDescriptor ourSocket(sockets[0]);
  UniqueDescriptor theirSocket(sockets[1]);
  static_cast<void>(refusePassedDescriptors(ourSocket.get()));
  std::array<int, 2> pipes{};
  if (pipe2(pipes.data(), O_CLOEXEC) != 0) return QXError::system(errno, "a pipe for an extension could not be made");
  UniqueDescriptor ourPipe(pipes[0]);
  const UniqueDescriptor theirPipe(pipes[1]);
  if (fcntl(ourPipe.get(), F_SETFL, O_NONBLOCK) != 0) return QXError::system(errno, "a pipe for an extension could not be made");

  auto plan = planLaunch(bundle_, /*arguments=*/{}, LaunchKind::extension, std::move(theirSocket), services_->paths);
  if (auto* error = std::get_if<QXError>(&plan)) return std::move(*error);
  auto spawned = services_->spawner.spawn(std::move(std::get<LaunchPlan>(plan)), theirPipe);
  if (auto* error = std::get_if<QXError>(&spawned)) return std::move(*error);

  ExtensionProcess::Handlers handlers;
  handlers.onLost = [weak = weak_from_this()](ProcessLifetime::Cause cause) {
    if (const auto strongSelf = weak.lock()) strongSelf->processIsLost(cause);
  };
  handlers.onGone = [weak = weak_from_this()] {
    if (const auto strongSelf = weak.lock()) strongSelf->processIsGone();
  };
  handlers.hasRequests = [weak = weak_from_this()] {
    const auto strongSelf = weak.lock();
    return strongSelf && strongSelf->hasRequests();
  };
  auto process =
      ExtensionProcess::create({std::move(std::get<SpawnedProcess>(spawned)), std::move(ourSocket), std::move(ourPipe)}, bundle_.identifier,
                               contextClass_.hostInterface, services_->times, services_->reactor, services_->log, std::move(handlers));
  if (!process) return couldNotBeWatched();
  return process;
}

void LinuxExtension::didStart(std::shared_ptr<ExtensionProcess> process) {
  std::vector<Waiting> ready;
  bool isTooLate = false;
  {
    const std::lock_guard lock(mutex_);
    lifetime_.started(Clock::now());
    ready.swap(waiting_);
    isTooLate = isStopped_;
    if (!isTooLate) process_ = process;
  }
  process->resume();
  if (isTooLate) process->endAtOnce();
  process->watchLiveness();
  endWhenDue();  // retired meanwhile
  for (const Waiting& waiting : ready) waiting.completion(waiting.request, /*error=*/std::nullopt);
}

void LinuxExtension::didNotStart(const QXError& why) {
  std::vector<Waiting> failed;
  {
    const std::lock_guard lock(mutex_);
    lifetime_.startFailed(Clock::now());
    failed.swap(waiting_);
  }
  for (const Waiting& waiting : failed) waiting.completion(/*request=*/std::nullopt, why);
}

bool LinuxExtension::isOver() const {
  const std::lock_guard lock(mutex_);
  return lifetime_.isOver(Clock::now());
}

bool LinuxExtension::hasRequests() const {
  const std::lock_guard lock(mutex_);
  return lifetime_.requests() > 0;
}

void LinuxExtension::processIsLost(ProcessLifetime::Cause cause) {
  const std::lock_guard lock(mutex_);
  lifetime_.lost(cause, Clock::now());
}

void LinuxExtension::processIsGone() {
  ProcessLifetime::Next next{};
  std::shared_ptr<ExtensionProcess> gone;
  {
    const std::lock_guard lock(mutex_);
    next = lifetime_.gone();
    gone.swap(process_);
  }
  if (next == ProcessLifetime::Next::start) startOnSpawner();
}

void LinuxExtension::endWhenDue() {
  std::shared_ptr<ExtensionProcess> idle;
  std::shared_ptr<ExtensionProcess> retired;
  std::vector<Waiting> refused;
  {
    const std::lock_guard lock(mutex_);
    const auto now = Clock::now();
    const std::optional<ProcessLifetime::Time> deadline = lifetime_.deadline();
    if (lifetime_.isOver(now)) {
      lifetime_.ended();
      retired = process_;
      refused.swap(waiting_);
    } else if (deadline && *deadline <= now) {
      lifetime_.endedIdle();
      idle = process_;
    }
    setEndTimer();
  }
  if (idle) idle->end();
  if (retired) retired->endWithItsBundle();
  for (const Waiting& waiting : refused) waiting.completion(/*request=*/std::nullopt, bundleIsGoneError(bundle_.identifier));
}

std::optional<QXDictionary> LinuxExtension::status() const {
  const std::lock_guard lock(mutex_);
  const ProcessLifetime::Phase phase = lifetime_.phase();
  if (lifetime_.isRetired() && phase == ProcessLifetime::Phase::none && lifetime_.requests() == 0) return std::nullopt;
  QXDictionary result{{"state", describe(phase)},
                      {"openRequests", static_cast<std::int64_t>(lifetime_.requests())},
                      {"badLivesInARow", std::int64_t{lifetime_.badLivesInARow()}}};
  if (phase == ProcessLifetime::Phase::running && process_) {
    result.insert_or_assign("processIdentifier", std::int64_t{process_->number()});
  } else if (const auto left = backOffLeft(); left.count() > 0) {
    result.insert_or_assign("state", "backing off");
    result.insert_or_assign("refusedForMilliseconds", std::int64_t{left.count()});
  }
  return result;
}

std::chrono::milliseconds LinuxExtension::backOffLeft() const {
  const auto now = Clock::now();
  return std::chrono::ceil<std::chrono::milliseconds>(lifetime_.refusedUntil(now).value_or(now) - now);
}

QXError LinuxExtension::refusalError() const {
  if (isStopped_) return hostIsStopping();
  return lifetime_.isOver(Clock::now()) ? bundleIsGoneError(bundle_.identifier) : backingOffError();
}

QXError LinuxExtension::backingOffError() const {
  const auto milliseconds = backOffLeft().count();
  return extensionHostError(ExtensionHostErrorCode::backingOff,
                            "The process of " + bundle_.identifier + " ended too soon " + std::to_string(lifetime_.badLivesInARow()) +
                                " times in a row; it can be started again in " + std::to_string(milliseconds) + " ms.");
}

}  // namespace docuvend::linux_platform
