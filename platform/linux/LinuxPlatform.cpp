#include "platform/linux/LinuxPlatform.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "platform/QXLogMessage.h"
#include "platform/linux/LinuxStatus.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/InstalledBundles.h"
#include "platform/linux/coordination/FileAccesses.h"
#include "platform/linux/coordination/FileCoordinationListenerDelegate.h"
#include "platform/linux/coordination/LinuxFileCoordinator.h"
#include "platform/linux/coordination/Remnants.h"
#include "platform/linux/extension_host/LinuxExtensionHost.h"
#include "platform/linux/extension_host/Matching.h"
#include "platform/linux/files/LinuxDeviceLock.h"
#include "platform/linux/files/LinuxFileSystem.h"
#include "platform/linux/files/LinuxNotificationCenter.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "platform/linux/identity/LinuxApplicationRegistry.h"
#include "platform/linux/identity/LinuxPeerDirectory.h"
#include "platform/linux/log/LinuxLog.h"
#include "platform/linux/queue/LinuxQueues.h"
#include "platform/linux/rpc/ActivatedSockets.h"
#include "platform/linux/rpc/LinuxRpcService.h"
#include "platform/linux/sandbox/LinuxSandbox.h"
#include "platform/linux/sandbox/SandboxListenerDelegate.h"
#include "platform/linux/wire/FileCoordinationProtocol.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/linux/wire/SandboxProtocol.h"
#include "platform/provider_extension.h"

namespace docuvend::linux_platform {
namespace {

constexpr const char* kProgramName = "docuvendd";
constexpr const char* kClientServiceName = "com.orvane.Docuvend";
constexpr const char* kAdministrationServiceName = "com.orvane.Administration";
// What anybody may ask the client service for.
constexpr const char* kWakeUp = "wakeUpCompletion:";
constexpr const char* kEndAccess = "endAccess:completionHandler:";
// A thread that serves a request may wait for a disk, or look for a name in a directory that is held up: of one bundle one at a time. What
// has to be made or renamed in such a directory has threads of its own. So many bundles must be held up at once before nobody is served.
constexpr unsigned kFewestReactorThreads = 16;
// What this process and the extensions make is the user's alone, whatever a login leaves to others.
constexpr mode_t kOwnerOnlyMask = 077;
constexpr const char* kNoThread = "cannot begin a thread";

// Confined processes see the public directory and nothing beside it. That the administration is not for them does not rest on this.
NamedServices namedServices(const Paths& paths) {
  NamedServices services;
  for (const char* name : {kClientServiceName, kSandboxServiceName, kFileCoordinationServiceName}) {
    services.emplace(name, NamedService{paths.publicSockets + "/" + name, Audience::everyone});
  }
  // Documents lie there and nowhere else.
  services[kClientServiceName].straightBelow = paths.groupContainers;
  services[kClientServiceName].operationsForNobody = {kWakeUp};
  // Those who wait for its turn may be all that a bundle may have waiting.
  services[kFileCoordinationServiceName].releasing = {kEndAccess};
  services.emplace(kAdministrationServiceName, NamedService{paths.runtime + "/" + kAdministrationServiceName, Audience::unconfinedPeers});
  return services;
}

// Held for the life of the process: the sockets, the list and the token key have one owner.
std::variant<UniqueDescriptor, QXError> takePlatformLock(const Paths& paths) {
  const std::string path = paths.runtime + "/lock";
  UniqueDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
  if (!file) return QXError::system(errno, "cannot open " + path);
  if (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
    return QXError::system(errno, errno == EWOULDBLOCK ? "another docuvendd of this user is running" : "cannot lock " + path);
  }
  return file;
}

// Every connection takes descriptors, and a login gives a process far fewer than it may have. Nothing here puts them into sets of a fixed
// size, which is what the low number is for; an extension's own limit is set where it is launched.
void takeAllDescriptors() {
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  static_cast<void>(::setrlimit(RLIMIT_NOFILE, &limit));  // with fewer, clients are refused sooner
}

std::vector<InstalledStorage> installedStorages(BundleRegistry& bundles) {
  std::vector<InstalledStorage> storages;
  for (const Bundle& bundle : bundles.all()) {
    if (!hasAttributes(bundle, {{std::string(kQXExtensionPointName), std::string(kQXProviderExtensionPoint)}})) continue;
    const auto* extension = qxFind<QXDictionary>(bundle.info, kQXExtensionDictionaryKey);
    const auto* group = extension == nullptr ? nullptr : qxFind<std::string>(*extension, kQXProviderDocumentGroupKey);
    const auto container = group == nullptr ? bundle.groups.end() : bundle.groups.find(*group);
    if (container == bundle.groups.end()) continue;
    const QXURL directory = QXURL::fileURL(container->second, QXURLKind::directory);
    storages.push_back({bundle.identifier, directory.appendingPathComponent(kQXProvidedItemsDirectoryName, QXURLKind::directory)});
  }
  return storages;
}

}  // namespace

struct LinuxPlatform::Services {
  Services(Paths found, UniqueDescriptor lock)
      : paths(std::move(found)),
        platformLock(std::move(lock)),
        rpc(reactor, peers, log.defaultLog(), namedServices(paths), std::move(activatedSockets)) {}

  // In the order in which they lean on each other.
  const Paths paths;
  const UniqueDescriptor platformLock;
  LinuxLog log{LinuxLogOptions::fromEnvironment(kProgramName)};
  std::vector<ActivatedSocket> activatedSockets = takeActivatedSockets(log.defaultLog());  // before anything has threads; given to `rpc`
  LinuxQueues& queues = LinuxQueues::processWide();
  LinuxFileSystem fileSystem{paths};
  LinuxPropertyLists propertyLists;
  LinuxDeviceLock deviceLock{paths};
  LinuxNotificationCenter notificationCenter{queues.mainRunLoop()};
  Reactor reactor{std::max(kFewestReactorThreads, std::thread::hardware_concurrency())};
  InstalledBundles bundles{paths, propertyLists, log.defaultLog()};
  LinuxPeerDirectory peers{bundles, log.defaultLog()};
  LinuxApplicationRegistry applicationRegistry{bundles, peers};
  LinuxRpcService rpc;
  LinuxExtensionHost extensionHost{bundles, paths, reactor, log.defaultLog()};
  LinuxStatus status{rpc, extensionHost};
  Remnants remnants{fileSystem, QXURL::fileURL(paths.groupContainers, QXURLKind::directory)};
  LinuxFileCoordinator fileCoordinator{fileSystem,
                                       {[this] { return installedStorages(bundles); }, &KeyedFile::isInPlace,
                                        [this](const KeyedFile& file) { return remnants.hasPlaceholder(file); }, &log.defaultLog()}};
  FileAccesses fileAccesses{fileCoordinator};

  const std::shared_ptr<QXQueue> storages = queues.serialQueue("com.orvane.docuvend.coordination.storages");
  const std::shared_ptr<QXQueue> settling = queues.serialQueue("com.orvane.docuvend.sandbox.settling");
  std::unique_ptr<LinuxSandbox> sandbox;  // made in `create`, never null after it

  // Made in `publish`.
  std::shared_ptr<SandboxListenerDelegate> sandboxDelegate;
  std::shared_ptr<FileCoordinationListenerDelegate> coordinationDelegate;
  std::shared_ptr<QXRpcListener> sandboxListener;
  std::shared_ptr<QXRpcListener> coordinationListener;

  void publish() {
    // Nothing of this goes before the process does. Nothing here waits for what anybody does to his files, or who is removed would be
    // served meanwhile.
    bundles.onChange([this] { followInstalledBundles(); });
    bundles.onChange([this] { rpc.endOutdatedConnections(); });
    bundles.onChange([this] { storages->async([this] { fileCoordinator.installedStoragesChanged(); }); });
    sandboxDelegate = std::make_shared<SandboxListenerDelegate>(*sandbox, log.defaultLog());
    coordinationDelegate = std::make_shared<FileCoordinationListenerDelegate>(
        FileCoordinationServicer::Surroundings{fileCoordinator, fileAccesses, *sandbox, peers});
    sandboxListener = listen(kSandboxServiceName, sandboxDelegate);
    coordinationListener = listen(kFileCoordinationServiceName, coordinationDelegate);
  }

  void logProtections() {
    for (const std::string& sentence : status.protections()) qxLog(log.defaultLog(), "[NOTICE] %@", sentence);
  }

 private:
  // On the thread that looks for bundles, so that none leaves and comes back unseen. That must not wait for who acts on an old token.
  void followInstalledBundles() {
    const auto error = sandbox->followInstalledBundles();
    settling->async([this] { sandbox->settleInstalledBundles(); });
    if (!error) return;
    qxLog(log.defaultLog(), "[ERROR] The tokens for a container that a bundle has left may be good again after a restart: %@", *error);
  }
  std::shared_ptr<QXRpcListener> listen(const char* name, const std::shared_ptr<QXRpcListenerDelegate>& delegate) {
    auto listener = rpc.listenerForService(name);
    listener->setDelegate(delegate);
    listener->resume();
    return listener;
  }
};

// Every thread that the daemon cannot do without begins here: later there may be none to be had.
std::variant<std::unique_ptr<LinuxPlatform>, QXError> LinuxPlatform::create() try {
  if (::geteuid() == 0) return QXError::system(EPERM, "a sandbox made by root keeps too much; run as an ordinary user");
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return QXError::system(errno, "cannot give up new privileges");
  ::umask(kOwnerOnlyMask);
  takeAllDescriptors();
  auto found = Paths::fromEnvironment();
  if (auto* error = std::get_if<QXError>(&found)) return *error;
  auto& paths = std::get<Paths>(found);
  if (auto error = prepareRuntimeDirectories(paths)) return *error;
  auto lock = takePlatformLock(paths);
  if (auto* error = std::get_if<QXError>(&lock)) return *error;

  auto services = std::make_unique<Services>(std::move(paths), std::get<UniqueDescriptor>(std::move(lock)));
  if (!services->reactor.isRunning()) return QXError::system(EAGAIN, kNoThread);
  auto sandbox = LinuxSandbox::create(services->paths, services->bundles, services->peers, services->log.defaultLog());
  if (auto* error = std::get_if<QXError>(&sandbox)) return *error;
  services->sandbox = std::get<std::unique_ptr<LinuxSandbox>>(std::move(sandbox));
  return std::unique_ptr<LinuxPlatform>(new LinuxPlatform(std::move(services)));
} catch (const std::system_error& error) {
  return QXError::system(error.code().value(), kNoThread);
}

LinuxPlatform::LinuxPlatform(std::unique_ptr<Services> services) : services_(std::move(services)) {}
LinuxPlatform::~LinuxPlatform() = default;

void LinuxPlatform::publishServices() {
  services_->logProtections();
  services_->publish();
}

QXPlatform LinuxPlatform::seam() {
  Services& all = *services_;
  return {all.queues,
          all.log,
          all.rpc,
          all.applicationRegistry,
          *all.sandbox,
          all.extensionHost,
          all.fileCoordinator,
          all.deviceLock,
          all.notificationCenter,
          all.fileSystem,
          all.propertyLists,
          all.status};
}

}  // namespace docuvend::linux_platform
