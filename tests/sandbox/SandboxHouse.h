// A home with two group containers, for tests of the sandbox: files on the real file system, bundles and peers that the test makes up.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <map>
#include <memory>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/linux/bundles/Bundle.h"
#include "platform/linux/identity/PeerIdentity.h"
#include "platform/linux/sandbox/LinuxSandbox.h"

namespace docuvend::linux_platform::testing {

// For a wait that comes to its end in the test.
inline constexpr std::chrono::milliseconds kNotLong{50};

class TemporaryDirectory {
 public:
  TemporaryDirectory() {
    std::string name = (std::filesystem::temp_directory_path() / "docuvend-sandbox-XXXXXX").string();
    if (::mkdtemp(name.data()) == nullptr) std::abort();
    path_ = std::filesystem::canonical(name).string();
  }
  TemporaryDirectory(const TemporaryDirectory&) = delete;
  TemporaryDirectory& operator=(const TemporaryDirectory&) = delete;
  ~TemporaryDirectory() {
    std::error_code ignored;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(path_, ignored)) {
      if (entry.is_directory(ignored) && !entry.is_symlink(ignored)) {
        std::filesystem::permissions(entry.path(), std::filesystem::perms::owner_all, ignored);
      }
    }
    std::filesystem::remove_all(path_, ignored);
  }

  [[nodiscard]] const std::string& path() const { return path_; }

 private:
  std::string path_;
};

inline void write(const std::string& path, const std::string& text) {
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file << text;
  ASSERT_TRUE(file.flush()) << path;
}

inline std::string read(const std::string& path) {
  std::ostringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

// What the redemption came to, when it has.
inline std::variant<UniqueDescriptor, QXError> redeem(LinuxSandbox& sandbox, const QXAuditToken& caller, const std::string& token,
                                                      TokenUse use) {
  const auto answer = std::make_shared<std::promise<std::variant<UniqueDescriptor, QXError>>>();
  auto result = answer->get_future();
  sandbox.redeem(caller, token, use, [answer](auto redeemed) { answer->set_value(std::move(redeemed)); });
  return result.get();
}

// What the replacement came to, when it has.
inline std::optional<QXError> replaceItem(LinuxSandbox& sandbox, const QXAuditToken& caller, const std::string& item,
                                          const std::string& sibling) {
  const auto answer = std::make_shared<std::promise<std::optional<QXError>>>();
  auto result = answer->get_future();
  sandbox.replaceItem(caller, item, sibling, [answer](std::optional<QXError> error) { answer->set_value(std::move(error)); });
  return result.get();
}

// With the files of the tokens' session in the directory.
inline Paths pathsIn(const std::string& directory) {
  Paths paths;
  paths.tokenKey = directory + "/token-key";
  paths.tokenFloors = directory + "/token-floors";
  return paths;
}

class MadeUpBundles final : public BundleRegistry {
 public:
  void put(Bundle bundle) { bundles_[bundle.identifier] = std::move(bundle); }
  void remove(const std::string& identifier) { bundles_.erase(identifier); }
  void tellOfChange() const {
    for (const auto& callback : callbacks_) callback();
  }

  std::optional<Bundle> find(const std::string& identifier) override {
    const auto found = bundles_.find(identifier);
    if (found == bundles_.end()) return std::nullopt;
    return found->second;
  }
  std::vector<Bundle> all() override {
    std::vector<Bundle> list;
    for (const auto& [identifier, bundle] : bundles_) list.push_back(bundle);
    return list;
  }
  void onChange(std::function<void()> callback) override { callbacks_.push_back(std::move(callback)); }

 private:
  std::map<std::string, Bundle> bundles_;
  std::vector<std::function<void()>> callbacks_;
};

class MadeUpPeers final : public PeerDirectory {
 public:
  // With the pidfd of the process.
  QXAuditToken add(PeerIdentity peer) {
    if (!peer.pidfd) peer.pidfd = UniqueDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, peer.pid, 0)));
    return addAsItIs(std::move(peer));
  }
  QXAuditToken addAsItIs(PeerIdentity peer) {
    peer.token.bytes[0] = ++count_;
    const QXAuditToken token = peer.token;
    peers_[token] = std::make_shared<const PeerIdentity>(std::move(peer));
    return token;
  }

  std::shared_ptr<const PeerIdentity> identify(int) override { return std::make_shared<const PeerIdentity>(); }
  std::shared_ptr<const PeerIdentity> declare(const PeerIdentity&, const std::string&) override { return nullptr; }
  bool isCurrent(const PeerIdentity&) override { return true; }
  std::shared_ptr<const PeerIdentity> find(const QXAuditToken& token) override {
    const auto found = peers_.find(token);
    return found == peers_.end() ? nullptr : found->second;
  }

 private:
  std::map<QXAuditToken, std::shared_ptr<const PeerIdentity>> peers_;
  std::uint8_t count_ = 0;
};

class SandboxHouse : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_NE(::geteuid(), 0U) << "run this as an unprivileged user: root passes checks that users do not";
    for (const auto* directory : {&storage, &otherGroup, &editorContainer, &outside}) std::filesystem::create_directories(*directory);
    write(document, "contents");
    write(outside + "/secret.txt", "secret");

    Bundle provider;
    provider.identifier = "com.example.cellar.provider";
    provider.groups = {{"com.example.cellar", group}};
    provider.container = home + "/containers/com.example.cellar.provider";
    bundles.put(provider);
    Bundle other;
    other.identifier = "com.example.other";
    other.groups = {{"com.example.other", otherGroup}};
    other.container = home + "/containers/com.example.other";
    bundles.put(other);
    Bundle editor;
    editor.identifier = "com.example.editor";
    editor.container = editorContainer;
    bundles.put(editor);
  }

  // This process, seen as a peer.
  [[nodiscard]] static PeerIdentity thisProcess(Standing standing) {
    PeerIdentity peer;
    peer.pid = ::getpid();
    peer.uid = ::geteuid();
    peer.standing = standing;
    return peer;
  }
  [[nodiscard]] static PeerIdentity confined(const std::string& bundle, const std::string& instance) {
    PeerIdentity peer = thisProcess(Standing::confined);
    peer.bundleIdentifier = bundle;
    peer.instance = instance;
    return peer;
  }

  // The session of this house, as each start of the daemon finds it.
  [[nodiscard]] std::unique_ptr<TokenSession> loadedSession(
      std::chrono::milliseconds longestWaitForUses = TokenSession::kLongestWaitForUses) {
    auto session = TokenSession::load(paths, log.defaultLog(), longestWaitForUses);
    if (auto* loaded = std::get_if<std::unique_ptr<TokenSession>>(&session)) return std::move(*loaded);
    throw std::runtime_error(std::get<QXError>(session).description());
  }

  const TemporaryDirectory directory;
  const std::string home = directory.path() + "/home";
  const std::string group = home + "/groups/com.example.cellar";
  const std::string storage = group + "/Docuvend Storage";
  const std::string document = storage + "/report.txt";
  const std::string sibling = storage + "/.report.txt";
  const std::string otherGroup = home + "/groups/com.example.other";
  const std::string editorContainer = home + "/containers/com.example.editor";
  const std::string outside = home + "/outside";
  const Paths paths = pathsIn(directory.path());
  fake_platform::FakeLog log;
  MadeUpBundles bundles;
  MadeUpPeers peers;
};

}  // namespace docuvend::linux_platform::testing
