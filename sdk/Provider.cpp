#include "sdk/Provider.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <mutex>
#include <utility>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/base/confinement.h"
#include "platform/linux/wire/Endpoint.h"
#include "platform/linux/wire/Reactor.h"
#include "platform/rpc_protocol.h"
#include "providers/_QXDocuvendVendor.h"
#include "sdk/ProviderWork.h"

namespace docuvend {
namespace {

constexpr unsigned kReactorThreads = 1;
constexpr std::chrono::milliseconds kLastOperations{1'000};
constexpr int kUsageStatus = 64;
constexpr int kNoThreadStatus = 71;

constexpr const char* kErrorDomain = "DVProviderErrorDomain";
constexpr std::int64_t kMissingArgument = 1;

QXError missingArgument(const char* name) {
  return QXError::make(kErrorDomain, kMissingArgument, std::string("The request has no ") + name + ".");
}

// Hands each request to the provider on a thread of its own, and the result to the request's completion.
class VendorService : public _QXDocuvendVendor {
 public:
  VendorService(Provider& provider, ProviderWork& work) : provider_(provider), work_(work) {}

  void _performInitialSetupWithCompletion(SetupReply completion) override {
    work_.performQuick([&provider = provider_, completion = std::move(completion)] {
      auto error = provider.performInitialSetup();
      if (completion) completion(/*string=*/std::nullopt, /*url=*/std::nullopt, std::move(error));
    });
  }

  void _providePlaceholderAtURL(std::optional<QXURL> url, PlaceholderReply completion) override {
    forItem<&Provider::providePlaceholder>(std::move(url), [completion = std::move(completion)](std::optional<QXError> error) {
      if (completion) completion(/*url=*/std::nullopt, std::move(error));
    });
  }

  void _startProvidingItemAtURL(std::optional<QXURL> url, ErrorReply completion) override {
    forItem<&Provider::startProviding>(std::move(url), std::move(completion));
  }
  void _itemChangedAtURL(std::optional<QXURL> url, ErrorReply completion) override {
    forItem<&Provider::itemChanged>(std::move(url), std::move(completion));
  }
  void _stopProvidingItemAtURL(std::optional<QXURL> url, ErrorReply completion) override {
    forItem<&Provider::stopProviding>(std::move(url), std::move(completion));
  }

  void _identifierForItemAtURL(std::optional<QXURL> url, IdentifierReply completion) override {
    if (!url) {
      if (completion) completion(missingArgument("item URL"), /*identifier=*/std::nullopt);
      return;
    }
    work_.performQuick([&provider = provider_, url = std::move(*url), completion = std::move(completion)] {
      answer(provider.identifierForItem(url), completion);
    });
  }

  void _URLForItemIdentifier(std::optional<ItemID> identifier, URLReply completion) override {
    if (!identifier) {
      if (completion) completion(missingArgument("item identifier"), /*url=*/std::nullopt);
      return;
    }
    work_.performQuick([&provider = provider_, identifier = std::move(*identifier), completion = std::move(completion)] {
      answer(provider.itemURL(identifier), completion);
    });
  }

 private:
  template <class T>
  static void answer(Provider::Result<T> result, const std::function<void(std::optional<QXError>, std::optional<T>)>& completion) {
    if (!completion) return;
    if (auto* error = std::get_if<QXError>(&result)) {
      completion(std::move(*error), std::nullopt);
    } else {
      completion(/*error=*/std::nullopt, std::move(std::get<T>(result)));
    }
  }

  template <Provider::Failure (Provider::*Operation)(const QXURL&)>
  void forItem(std::optional<QXURL> url, ErrorReply completion) {
    if (!url) {
      if (completion) completion(missingArgument("item URL"));
      return;
    }
    // One item has one key, however its URL is spelled.
    const std::string key = url->fileSystemPath();
    work_.performForItem(key, [&provider = provider_, url = std::move(*url), completion = std::move(completion)] {
      auto error = (provider.*Operation)(url);
      if (completion) completion(std::move(error));
    });
  }

  Provider& provider_;
  ProviderWork& work_;
};

// Tells the main thread that the connection is over.
struct ConnectionEnd {
  void signal() {
    const std::lock_guard lock(mutex);
    isOver = true;
    changed.notify_one();
  }
  void wait() {
    std::unique_lock lock(mutex);
    changed.wait(lock, [this] { return isOver; });
  }

  std::mutex mutex;
  std::condition_variable changed;
  bool isOver = false;
};

bool isInheritedSocket(int number) {
  struct stat status {};
  return fstat(number, &status) == 0 && S_ISSOCK(status.st_mode) && fcntl(number, F_SETFD, FD_CLOEXEC) == 0 &&
         fcntl(number, F_SETFL, O_NONBLOCK) == 0;
}

}  // namespace

int runProvider(Provider& provider) {
  if (!isInheritedSocket(linux_platform::kExtensionSocketNumber)) {
    std::fputs("This is a provider extension: Docuvend starts it, with a connection as descriptor 3.\n", stderr);
    return kUsageStatus;
  }
  linux_platform::UniqueDescriptor socket(linux_platform::kExtensionSocketNumber);

  auto work = std::make_unique<ProviderWork>();
  const auto end = std::make_shared<ConnectionEnd>();
  {
    linux_platform::Reactor reactor(kReactorThreads);
    if (!reactor.isRunning()) {
      std::fputs("The system gives no thread to talk to Docuvend.\n", stderr);
      return kNoThreadStatus;
    }
    linux_platform::Endpoint::Handlers handlers;
    handlers.onClose = [end](const QXError&) { end->signal(); };
    const auto endpoint = linux_platform::Endpoint::create(reactor, std::move(socket), linux_platform::Hello{}, std::move(handlers));
    endpoint->setExportedInterface(qxInterfaceOf<_QXDocuvendVendor>());
    endpoint->setExportedObject(std::make_shared<QXRpcExport<_QXDocuvendVendor>>(std::make_shared<VendorService>(provider, *work)));
    endpoint->resume();
    end->wait();
    if (!work->finish(kLastOperations)) std::_Exit(0);
  }
  return 0;
}

std::optional<std::string> providerContainer() {
  const char* home = std::getenv("HOME");
  if (home == nullptr || home[0] != '/') return std::nullopt;
  return std::string(home);
}

std::optional<std::string> providerGroupContainer(const std::string& group) {
  const auto container = providerContainer();
  if (!container || group.empty() || group.find('/') != std::string::npos) return std::nullopt;
  // HOME is .../containers/IDENTIFIER, and groups lie in .../groups/GROUP.
  const std::size_t identifier = container->rfind('/');
  const std::size_t containers = container->rfind('/', identifier - 1);
  if (identifier == 0 || containers == std::string::npos) return std::nullopt;
  return container->substr(0, containers) + "/groups/" + group;
}

}  // namespace docuvend
