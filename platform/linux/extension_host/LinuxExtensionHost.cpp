// One thread looks at the installed bundles when the registry says that something changed, or when a match begins. First it retires every
// extension whose bundle is not what it was, whichever match made it and whether or not that is still there: a slow handler must not keep
// the process of a bundle that is gone. Then it looks at all matches: each compares what is installed with the set that it reported last,
// takes over the objects of what is still the same, and reports only if an object came or went. Changes that arrive meanwhile make it look
// again; two that arrive together make it look once.
#include "platform/linux/extension_host/LinuxExtensionHost.h"

#include <algorithm>
#include <condition_variable>
#include <mutex>
#include <optional>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include "platform/linux/extension_host/LinuxExtension.h"
#include "platform/linux/extension_host/Matching.h"

namespace docuvend::linux_platform {
namespace {

using Extensions = std::vector<std::shared_ptr<LinuxExtension>>;

struct MatchState {
  QXExtensionHost::Attributes attributes;
  QXExtensionContextClass contextClass;
  QXExtensionHost::MatchHandler handler;
  std::optional<Extensions> reported;  // only on the matching thread; absent before the first report
};

}  // namespace

struct LinuxExtensionHost::State {
  State(BundleRegistry& registry, const Paths& paths, Reactor& reactor, QXLogHandle& log, const ExtensionTimes& times)
      : bundles(registry), services(std::make_shared<ExtensionServices>(paths, reactor, log, times)) {}

  void look() {
    {
      const std::lock_guard lock(mutex);
      mustLook = true;
    }
    changed.notify_one();
  }

  // The matching thread.
  void run();
  void retireOutdated(const std::vector<Bundle>& installed);
  void update(MatchState& match, const std::vector<Bundle>& installed);

  BundleRegistry& bundles;
  const std::shared_ptr<ExtensionServices> services;

  void keep(const std::shared_ptr<LinuxExtension>& extension);
  // Those that were kept and are not gone, in this order.
  Extensions extensions();

  std::mutex mutex;  // guards the four below
  std::vector<std::weak_ptr<LinuxExtension>> made;
  bool mustLook = false;
  bool isStopped = false;
  std::vector<std::weak_ptr<MatchState>> matches;
  std::condition_variable changed;
  std::thread thread;
};

class LinuxExtensionHost::Match : public QXExtensionMatch {
 public:
  explicit Match(std::shared_ptr<MatchState> state) : state_(std::move(state)) {}

 private:
  std::shared_ptr<MatchState> state_;
};

void LinuxExtensionHost::State::run() {
  for (;;) {
    std::vector<std::weak_ptr<MatchState>> present;
    {
      std::unique_lock lock(mutex);
      changed.wait(lock, [this] { return isStopped || mustLook; });
      if (isStopped) return;
      mustLook = false;
      std::erase_if(matches, [](const std::weak_ptr<MatchState>& match) { return match.expired(); });
      present = matches;
    }
    const std::vector<Bundle> installed = bundles.all();
    retireOutdated(installed);
    for (const auto& weak : present) {
      if (const auto match = weak.lock()) update(*match, installed);
    }
  }
}

void LinuxExtensionHost::State::keep(const std::shared_ptr<LinuxExtension>& extension) {
  const std::lock_guard lock(mutex);
  std::erase_if(made, [](const std::weak_ptr<LinuxExtension>& other) { return other.expired(); });
  made.emplace_back(extension);
}

Extensions LinuxExtensionHost::State::extensions() {
  const std::lock_guard lock(mutex);
  Extensions result;
  for (const auto& weak : made) {
    if (auto extension = weak.lock()) result.push_back(std::move(extension));
  }
  return result;
}

void LinuxExtensionHost::State::retireOutdated(const std::vector<Bundle>& installed) {
  for (const auto& extension : extensions()) {
    const Bundle& before = extension->bundle();
    const auto now = std::find_if(installed.begin(), installed.end(),
                                  [&before](const Bundle& bundle) { return bundle.identifier == before.identifier; });
    if (now == installed.end()) {
      extension->retire(LinuxExtension::Retirement::atOnce);
    } else if (!isSameInstallation(before, *now)) {
      extension->retire(isSuccessor(before, *now) ? LinuxExtension::Retirement::afterGrace : LinuxExtension::Retirement::atOnce);
    }
  }
}

void LinuxExtensionHost::State::update(MatchState& match, const std::vector<Bundle>& installed) {
  Extensions leftovers = match.reported.value_or(Extensions{});
  Extensions present;
  bool isChanged = !match.reported;
  for (const Bundle& bundle : installed) {
    if (!hasAttributes(bundle, match.attributes)) continue;
    const auto same = std::find_if(leftovers.begin(), leftovers.end(), [&bundle](const std::shared_ptr<LinuxExtension>& extension) {
      return isSameInstallation(extension->bundle(), bundle);
    });
    if (same == leftovers.end()) {
      present.push_back(LinuxExtension::create(bundle, match.contextClass, services));
      keep(present.back());
      isChanged = true;
    } else {
      present.push_back(std::move(*same));
      leftovers.erase(same);
    }
  }
  if (!isChanged && leftovers.empty()) return;
  match.reported = present;
  match.handler(std::vector<std::shared_ptr<QXExtension>>(present.begin(), present.end()), /*error=*/std::nullopt);
}

LinuxExtensionHost::LinuxExtensionHost(BundleRegistry& bundles, const Paths& paths, Reactor& reactor, QXLogHandle& log,
                                       const ExtensionTimes& times)
    : state_(std::make_shared<State>(bundles, paths, reactor, log, times)) {
  // The host ends the thread before it lets go of the state.
  try {
    state_->thread = std::thread([state = state_.get()] { state->run(); });
  } catch (const std::system_error&) {
    state_->services->spawner.stop();
    throw;
  }
  bundles.onChange([weak = std::weak_ptr(state_)] {
    if (const auto strongState = weak.lock()) strongState->look();
  });
}

LinuxExtensionHost::~LinuxExtensionHost() {
  {
    const std::lock_guard lock(state_->mutex);
    state_->isStopped = true;
  }
  state_->changed.notify_one();
  state_->thread.join();
  for (const auto& extension : state_->extensions()) extension->stop();
  // Last, because processes die with its thread, and then nobody hears why.
  state_->services->spawner.stop();
}

std::unique_ptr<QXExtensionMatch> LinuxExtensionHost::beginMatching(Attributes attributes, QXExtensionContextClass contextClass,
                                                                    MatchHandler handler) {
  auto match = std::make_shared<MatchState>(MatchState{std::move(attributes), contextClass, std::move(handler), std::nullopt});
  {
    const std::lock_guard lock(state_->mutex);
    state_->matches.push_back(match);
  }
  state_->look();
  return std::make_unique<Match>(std::move(match));
}

QXDictionary LinuxExtensionHost::status() const {
  QXDictionary result;
  for (const auto& extension : state_->extensions()) {
    if (auto status = extension->status()) result.insert_or_assign(extension->bundle().identifier, *std::move(status));
  }
  return result;
}

}  // namespace docuvend::linux_platform
