// The real daemon over real bundles, in a home and a run-time directory made for one test. Never as root: a sandbox made by root is none.
//
// The house is the reaper of everything that its processes leave behind. When it goes it ends the daemon and waits until nothing of it is
// left; what is left, or a daemon that ended before it was told to, fails the test.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "service/DVAdministration.h"
#include "tests/support/Eventually.h"
#include "tests/system/house/Client.h"
#include "tests/system/house/Process.h"

namespace docuvend::tests {

inline const std::string kCellar = "com.orvane.cellar";
inline const std::string kEditor = "com.orvane.editor";
inline const std::string kPicker = "com.orvane.picker";
inline const std::string kStranger = "com.orvane.stranger";
// The provider of provider/main.cpp, which does what an item's name says.
inline const std::string kTrickster = "com.orvane.trickster";

class DaemonHouse {
 public:
  DaemonHouse();
  ~DaemonHouse();
  DaemonHouse(const DaemonHouse&) = delete;
  DaemonHouse& operator=(const DaemonHouse&) = delete;

  // Installs a bundle of this build.
  void install(const std::string& identifier) const;
  // Installs a bundle of any program of this build; the texts are what stands between "<dict>" and "</dict>".
  void install(const std::string& directory, const std::string& program, const std::string& info, const std::string& entitlements) const;
  void installTrickster() const;

  [[nodiscard]] const std::string& home() const { return home_; }
  [[nodiscard]] std::string bundles() const { return share() + "/bundles"; }
  [[nodiscard]] std::string container(const std::string& bundle) const { return share() + "/containers/" + bundle; }
  [[nodiscard]] std::string accessControlFile() const { return home_ + "/Library/Docuvend/AccessControl.plist"; }
  // What the file says, empty when there is none.
  [[nodiscard]] std::string accessControl() const { return contentsOf(accessControlFile()); }
  [[nodiscard]] std::string runtime() const { return root_ + "/r"; }
  // Where the administration is.
  [[nodiscard]] std::string administrationSocket() const { return runtime() + "/docuvend/" + kDVAdministrationServiceName; }
  [[nodiscard]] std::string publicSocket(const std::string& service) const { return runtime() + "/docuvend/public/" + service; }

  // Puts a document of the cellar in its cloud; where it will lie once it is provided.
  std::string putInCloud(const std::string& name, const std::string& contents) const;
  [[nodiscard]] std::string cloudFile(const std::string& name) const { return container(kCellar) + "/cloud/" + name; }
  [[nodiscard]] std::string storage(const std::string& provider) const {
    return share() + "/groups/" + provider + ".documents/Docuvend Storage";
  }
  [[nodiscard]] std::string document(const std::string& name) const { return storage(kCellar) + "/" + name; }

  // Starts the daemon and waits until it answers. The connection on which it did stays open as long as the daemon runs.
  void startDaemon(const std::string& logSetting = "debug");
  // The same, but waits only until its administration can be reached: clients may still wait for the providers then.
  void startDaemonWithoutWaiting(const std::string& logSetting = "debug");
  // The program and the arguments of every daemon that is started from now on.
  void setDaemonWords(std::vector<std::string> words) { daemonWords_ = std::move(words); }
  // Starts another one, for its failure.
  [[nodiscard]] Ending runDaemon(const std::vector<std::string>& environment) const;
  void killDaemon();
  [[nodiscard]] Process& daemon() { return *daemon_; }

  // A new connection that acts for an installed bundle, or for none.
  [[nodiscard]] std::unique_ptr<Client> client(const std::optional<std::string>& bundle = std::nullopt,
                                               const char* service = kDVServiceName) const;
  // The daemon answers a new client.
  [[nodiscard]] bool answers() const;

  // docuvendctl, unconfined and confined as a bundle's executable; the latter's program is the bundle's own.
  Ending ctl(const std::vector<std::string>& arguments, const std::string& input = {}) const;
  Ending confined(const std::string& bundle, const std::vector<std::string>& arguments, const std::string& input = {}) const;
  [[nodiscard]] std::vector<std::string> environment() const;
  // "NAME=value", for every program that is started from now on.
  void addToEnvironment(std::string entry) { additions_.push_back(std::move(entry)); }

  // Has the picker, confined, grant a consumer a document of the cellar; its bookmarkable string.
  std::string granted(const std::string& path, const std::string& consumer) const;
  // The string alone.
  std::string bookmark(const std::string& path) const;

  // The messages of all daemons so far, without what stands before them.
  [[nodiscard]] std::vector<std::string> log() const;
  // How many messages are that text (which asserts it, AssertedMessages.h); those that begin with it; those that contain it.
  [[nodiscard]] int logged(const std::string& text) const;
  [[nodiscard]] int loggedBeginning(const std::string& text) const;
  [[nodiscard]] int loggedContaining(const std::string& text) const;
  // Waits for such a message.
  bool awaitLog(const std::string& part, int count = 1) const;

  // The processes of that program among the daemon's descendants.
  [[nodiscard]] std::vector<pid_t> processesOf(const std::string& program) const;

 private:
  // Starts the daemon; a connection to the socket when it can be reached.
  [[nodiscard]] linux_platform::UniqueDescriptor launchDaemon(const std::string& logSetting, const std::string& socketPath);
  [[nodiscard]] std::string share() const { return home_ + "/.local/share/docuvend"; }
  [[nodiscard]] std::string logFile() const { return root_ + "/log"; }
  void endDaemon(int signal);
  void expectNothingLeft() const;

  std::string root_;
  std::string home_;
  std::vector<std::string> additions_;  // to the environment
  std::vector<std::string> daemonWords_;
  linux_platform::UniqueDescriptor logDescriptor_;
  std::unique_ptr<Process> daemon_;
  std::unique_ptr<Client> companion_;
};

// A test that means nothing when root runs it says so instead.
class SystemTest : public ::testing::Test {
 protected:
  void SetUp() override;
  DaemonHouse house_;
};

// The description of a property list's value: a key with a string, with true.
[[nodiscard]] std::string stringEntry(const std::string& key, const std::string& value);
[[nodiscard]] std::string trueEntry(const std::string& key);
[[nodiscard]] std::string propertyList(const std::string& entries);
void writeFile(const std::string& path, const std::string& contents);

}  // namespace docuvend::tests
