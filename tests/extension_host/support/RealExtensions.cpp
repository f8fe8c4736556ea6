#include "tests/extension_host/support/RealExtensions.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <thread>
#include <utility>

namespace docuvend::linux_platform {

std::optional<Bundle> InstalledByTest::find(const std::string& identifier) {
  const std::lock_guard lock(mutex_);
  for (const Bundle& bundle : bundles_) {
    if (bundle.identifier == identifier) return bundle;
  }
  return std::nullopt;
}

std::vector<Bundle> InstalledByTest::all() {
  const std::lock_guard lock(mutex_);
  return bundles_;
}

void InstalledByTest::onChange(std::function<void()> callback) {
  const std::lock_guard lock(mutex_);
  callbacks_.push_back(std::move(callback));
}

void InstalledByTest::set(std::vector<Bundle> bundles) {
  std::vector<std::function<void()>> callbacks;
  {
    const std::lock_guard lock(mutex_);
    bundles_ = std::move(bundles);
    callbacks = callbacks_;
  }
  for (const auto& callback : callbacks) callback();
}

void Reports::add(Set set) {
  const std::lock_guard lock(mutex_);
  sets_.push_back(std::move(set));
  // With the lock: whoever waits may let go of this object as soon as it can take it.
  changed_.notify_all();
}

std::optional<Reports::Set> Reports::await(std::size_t number) {
  std::unique_lock lock(mutex_);
  if (!changed_.wait_for(lock, kPatience, [this, number] { return sets_.size() > number; })) {
    ADD_FAILURE() << "report " << number << " did not come";
    return std::nullopt;
  }
  return sets_[number];
}

std::size_t Reports::count() {
  const std::lock_guard lock(mutex_);
  return sets_.size();
}

RealExtensions::RealExtensions(const ExtensionTimes& times) {
  std::string pattern = (std::filesystem::temp_directory_path() / "docuvend-XXXXXX").string();
  if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
  home_ = std::filesystem::canonical(pattern).string();
  paths_.home = home_;
  paths_.systemBundles = home_ + "/none";
  paths_.userBundles = home_ + "/bundles";
  paths_.containers = home_ + "/containers";
  paths_.groupContainers = home_ + "/groups";
  paths_.runtime = home_ + "/run";
  paths_.publicSockets = home_ + "/run/public";
  host_ = std::make_unique<LinuxExtensionHost>(registry_, paths_, reactor_, log_.defaultLog(), times);
}

RealExtensions::~RealExtensions() {
  match_.reset();
  host_.reset();
  std::error_code ignored;
  std::filesystem::remove_all(home_, ignored);
}

bool RealExtensions::mayRun() {
  if (geteuid() != 0) return true;
  ADD_FAILURE() << "confined processes are not started by root: run this test as a user";
  return false;
}

Bundle RealExtensions::makeBundle(const std::string& identifier, const std::string& program) {
  Bundle bundle;
  bundle.identifier = identifier;
  bundle.directory = paths_.userBundles + "/" + identifier;
  bundle.executable = bundle.directory + "/" + program;
  bundle.info.emplace("QXExtension", QXDictionary{{std::string(kQXExtensionPointName), kPoint}});
  bundle.container = paths_.containers + "/" + identifier;
  bundle.version = "1";
  if (!std::filesystem::exists(bundle.executable)) {
    std::filesystem::create_directories(bundle.directory);
    std::filesystem::copy_file(std::string(DOCUVEND_BIN) + "/" + program, bundle.executable);
  }
  return bundle;
}

std::unique_ptr<QXExtensionMatch> RealExtensions::match(Reports& reports) {
  return host_->beginMatching({{std::string(kQXExtensionPointName), kPoint}}, {hostInterface_, vendorInterface_},
                              [&reports](Reports::Set set, const std::optional<QXError>&) { reports.add(std::move(set)); });
}

Reports::Set RealExtensions::extensions(std::vector<Bundle> bundles) {
  install(std::move(bundles));
  match_ = match(reports_);
  return reports_.await(0).value_or(Reports::Set{});
}

std::shared_ptr<QXExtension> RealExtensions::extension(const std::string& identifier) {
  const Reports::Set set = extensions({makeBundle(identifier)});
  return set.empty() ? nullptr : set.front();
}

void RealExtensions::release(const std::string& identifier) const {
  std::ofstream(paths_.containers + "/" + identifier + "/release") << "now";
}

QXDictionary RealExtensions::status(const std::string& identifier) const {
  const QXDictionary all = host_->status();
  const auto* found = qxFind<QXDictionary>(all, identifier);
  return found != nullptr ? *found : QXDictionary{};
}

bool RealExtensions::awaitLog(const std::string& text) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (std::chrono::steady_clock::now() < deadline) {
    for (const std::string& line : log_.texts()) {
      if (line.find(text) != std::string::npos) return true;
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  ADD_FAILURE() << "not in the log: " << text;
  return false;
}

std::optional<Begun> begin(QXExtension& extension) {
  auto promise = std::make_shared<std::promise<Begun>>();
  auto future = promise->get_future();
  extension.beginExtensionRequest([promise](std::optional<QXUUID> request, std::optional<QXError> error) {
    promise->set_value({request, std::move(error)});
  });
  return await(std::move(future));
}

Conversation::Conversation(std::shared_ptr<QXExtension> extension) : extension_(std::move(extension)) {
  const auto begun = begin(*extension_);
  if (!begun || !begun->request) {
    error_ = begun ? begun->error : QXError::make("Test", 0, "no answer");
    return;
  }
  request_ = *begun->request;
  context_ = extension_->extensionContextForRequest(request_);
  if (!context_) error_ = QXError::make("Test", 0, "no context");
}

Conversation::~Conversation() { extension_->cancelExtensionRequest(request_); }

std::shared_ptr<QXRpcConnection> Conversation::connection() const { return context_ ? context_->auxiliaryConnection() : nullptr; }

std::future<Answer> Conversation::send(const char* operationName, QXArray arguments) const {
  const auto promise = std::make_shared<std::promise<Answer>>();
  auto future = promise->get_future();
  if (error_) {
    promise->set_value({{}, error_});
    return future;
  }
  const QXRpcInterface vendor = qxInterfaceOf<_QXDocuvendVendor>();
  const auto index = vendor.indexOf(operationName);
  if (!index) throw std::logic_error(operationName);
  // Of a reply and an error exactly one comes: the promise would throw at a second.
  connection()
      ->remoteObjectProxy([promise](const QXError& error) {
        promise->set_value({{}, error});
      })
      ->send(vendor.operations()[*index], std::move(arguments), [promise](QXArray values) {
        promise->set_value({std::move(values), {}});
      });
  return future;
}

std::future<Answer> Conversation::identify(const std::string& name) const {
  return send("_identifierForItemAtURL:completion:", {QXURL::fileURL("/" + name, QXURLKind::file)});
}

std::future<Answer> Conversation::start(const std::string& name) const {
  return send("_startProvidingItemAtURL:completion:", {QXURL::fileURL("/" + name, QXURLKind::file)});
}

std::future<Answer> Conversation::locate(const std::string& identifier) const {
  return send("_URLForItemIdentifier:completion:", {identifier});
}

std::string Conversation::identifier(const std::string& name) const {
  const auto answer = await(identify(name));
  if (!answer) return "no answer";
  if (answer->error) return answer->error->description();
  if (const auto* error = answer->values[0].as<QXError>()) return error->description();
  const auto* text = answer->values[1].as<std::string>();
  return text != nullptr ? *text : "no identifier";
}

}  // namespace docuvend::linux_platform
