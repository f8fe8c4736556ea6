#include "tests/system/house/DaemonHouse.h"
#include "platform/linux/wire/ConnectToSocket.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string_view>
#include <thread>

#include "platform/QXLogMessage.h"
#include "platform/fake/AssertedMessages.h"

namespace docuvend::tests {
namespace {

namespace fs = std::filesystem;
using linux_platform::UniqueDescriptor;

constexpr int kStatusOfSignal = 128;

std::string program(const std::string& name) { return std::string(DOCUVEND_BIN) + "/" + name; }

// The thread sanitizer goes on after its report by itself; the daemon is to end there, so that its end is seen.
std::string threadSanitizerOptions() {
  const char* given = std::getenv("TSAN_OPTIONS");
  return "TSAN_OPTIONS=" + (given == nullptr ? std::string() : std::string(given) + ":") + "halt_on_error=1";
}

// Process number to parent's, of all that can be seen.
std::map<pid_t, pid_t> parents() {
  std::map<pid_t, pid_t> result;
  for (const auto& entry : fs::directory_iterator("/proc")) {
    const std::string name = entry.path().filename();
    if (!std::all_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; })) continue;
    const std::string stat = contentsOf(entry.path() / "stat");
    const std::size_t afterName = stat.rfind(')');
    if (afterName == std::string::npos) continue;  // it has ended meanwhile
    char state = 0;
    pid_t parent = 0;
    std::istringstream(stat.substr(afterName + 1)) >> state >> parent;
    result.emplace(static_cast<pid_t>(std::stol(name)), parent);
  }
  return result;
}

void closeToOthers(const fs::path& path) {
  fs::permissions(path, fs::perms::group_write | fs::perms::others_write, fs::perm_options::remove);
}

}  // namespace

DaemonHouse::DaemonHouse() : daemonWords_{program("docuvendd")} {
  std::string pattern = (fs::temp_directory_path() / "dvXXXXXX").string();
  if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
  root_ = fs::canonical(pattern).string();
  ::umask(022);  // others may not write bundles, or they are none
  home_ = root_ + "/h";
  for (const std::string& directory : {home_, runtime()}) {
    fs::create_directory(directory);
    fs::permissions(directory, fs::perms::owner_all);
  }
  fs::create_directories(bundles());
  logDescriptor_.reset(::open(logFile().c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
  if (!logDescriptor_ || ::prctl(PR_SET_CHILD_SUBREAPER, 1) != 0) throw std::runtime_error("no house for a test");
}

DaemonHouse::~DaemonHouse() {
  endDaemon(SIGTERM);
  expectNothingLeft();
  // In a build with sanitizers: what they say of the daemon and of its extensions.
  EXPECT_EQ(loggedContaining("Sanitizer: ") + loggedContaining("runtime error: "), 0);
  if (::testing::Test::HasFailure()) std::cerr << "--- the daemon's log\n" << contentsOf(logFile()) << "---\n";
  std::error_code ignored;
  fs::remove_all(root_, ignored);
}

void DaemonHouse::expectNothingLeft() const {
  eventually("every process of the daemon has ended", [] {
    for (;;) {
      const pid_t ended = ::waitpid(-1, nullptr, WNOHANG);
      if (ended == 0) return false;
      if (ended < 0 && errno != EINTR) return true;
    }
  });
}

void DaemonHouse::install(const std::string& identifier) const {
  const fs::path copy = fs::path(bundles()) / ("." + identifier);
  fs::copy(fs::path(DOCUVEND_BUNDLES) / identifier, copy, fs::copy_options::recursive);
  closeToOthers(copy);  // whatever the build's mask was
  for (const auto& entry : fs::recursive_directory_iterator(copy)) closeToOthers(entry.path());
  fs::rename(copy, fs::path(bundles()) / identifier);
}

void DaemonHouse::install(const std::string& directory, const std::string& programName, const std::string& info,
                          const std::string& entitlements) const {
  const std::string place = bundles() + "/." + directory;
  fs::create_directory(place);
  fs::copy_file(program(programName), place + "/" + programName);
  closeToOthers(place + "/" + programName);
  writeFile(place + "/Info.plist", propertyList(stringEntry("QXBundleExecutable", programName) + info));
  writeFile(place + "/Entitlements.plist", propertyList(entitlements));
  fs::rename(place, bundles() + "/" + directory);
}

void DaemonHouse::installTrickster() const {
  const std::string group = kTrickster + ".documents";
  install(kTrickster, "docuvend-trickster",
          stringEntry("QXBundleIdentifier", kTrickster) + "<key>QXGroups</key><array><string>" + group +
              "</string></array><key>QXExtension</key><dict>" + stringEntry("QXExtensionPointName", "com.orvane.docuvend-nonui") +
              stringEntry("QXExtensionDocuvendDocumentGroup", group) + "</dict>",
          {});
}

std::string DaemonHouse::putInCloud(const std::string& name, const std::string& contents) const {
  const fs::path cloud = fs::path(cloudFile(name)).parent_path();
  fs::create_directories(cloud);
  fs::permissions(container(kCellar), fs::perms::owner_all);
  writeFile(cloudFile(name), contents);
  return document(name);
}

std::vector<std::string> DaemonHouse::environment() const {
  std::vector<std::string> result = {"PATH=/usr/bin:/bin", "HOME=" + home_, "XDG_RUNTIME_DIR=" + runtime(), threadSanitizerOptions()};
  for (const char* name : {"ASAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS"}) {
    if (const char* value = std::getenv(name)) result.push_back(std::string(name) + "=" + value);
  }
  result.insert(result.end(), additions_.begin(), additions_.end());
  return result;
}

UniqueDescriptor DaemonHouse::launchDaemon(const std::string& logSetting, const std::string& socketPath) {
  Command command{daemonWords_, environment(), {}, logDescriptor_.get()};
  command.environment.push_back("DOCUVEND_LOG=" + logSetting);
  daemon_ = std::make_unique<Process>(command);
  UniqueDescriptor socket;
  eventually("the daemon can be reached", [this, &socket, &socketPath] {
    auto connected = linux_platform::connectToSocket(socketPath);
    if (auto* reached = std::get_if<UniqueDescriptor>(&connected)) socket = std::move(*reached);
    return socket || !daemon_->isRunning();
  });
  return socket;
}

void DaemonHouse::startDaemonWithoutWaiting(const std::string& logSetting) {
  (void)launchDaemon(logSetting, publicSocket(kDVServiceName));  // the last of its services
  ASSERT_TRUE(daemon_->isRunning()) << "the daemon ended at its start";
}

void DaemonHouse::startDaemon(const std::string& logSetting) {
  auto socket = launchDaemon(logSetting, publicSocket(kDVServiceName));
  ASSERT_TRUE(daemon_->isRunning()) << "the daemon ended at its start";
  companion_ = std::make_unique<Client>(std::move(socket));
  ASSERT_EQ(companion_->ask<&DVDaemon::wakeUpCompletion>().index(), 0U);
}

Ending DaemonHouse::runDaemon(const std::vector<std::string>& environment) const {
  return Process({{program("docuvendd")}, environment, {}}).wait();
}

void DaemonHouse::endDaemon(int signal) {
  if (!daemon_) return;
  companion_.reset();
  daemon_->signal(signal);
  const int status = daemon_->wait().status;
  EXPECT_EQ(status, kStatusOfSignal + signal) << "the daemon had ended before";
  daemon_.reset();
}

void DaemonHouse::killDaemon() { endDaemon(SIGKILL); }

std::unique_ptr<Client> DaemonHouse::client(const std::optional<std::string>& bundle, const char* service) const {
  return std::make_unique<Client>(publicSocket(service), bundle);
}

bool DaemonHouse::answers() const {
  const auto answer = client()->ask<&DVDaemon::wakeUpCompletion>();
  if (const auto* error = std::get_if<QXError>(&answer)) {
    ADD_FAILURE() << error->description();
    return false;
  }
  return true;
}

Ending DaemonHouse::ctl(const std::vector<std::string>& arguments, const std::string& input) const {
  Command command{{program("docuvendctl")}, environment(), input};
  command.words.insert(command.words.end(), arguments.begin(), arguments.end());
  return Process(command).wait();
}

Ending DaemonHouse::confined(const std::string& bundle, const std::vector<std::string>& arguments, const std::string& input) const {
  Command command{{program("docuvend-run"), bundle}, environment(), input};
  command.words.insert(command.words.end(), arguments.begin(), arguments.end());
  return Process(command).wait();
}

std::string DaemonHouse::granted(const std::string& path, const std::string& consumer) const {
  const Ending grant = confined(kPicker, {"grant", path, kCellar, consumer});
  EXPECT_EQ(grant.status, 0) << grant.errors;
  return bookmark(path);
}

std::string DaemonHouse::bookmark(const std::string& path) const {
  Ending named = ctl({"bookmark", path});
  EXPECT_EQ(named.status, 0) << named.errors;
  if (!named.output.empty()) named.output.pop_back();  // the line's end
  return named.output;
}

std::vector<std::string> DaemonHouse::log() const {
  std::vector<std::string> result;
  std::istringstream lines(contentsOf(logFile()));
  for (std::string line; std::getline(lines, line);) {
    const std::size_t prefix = line.find("]: ");
    result.push_back(prefix == std::string::npos ? line : line.substr(prefix + 3));
  }
  return result;
}

namespace {

template <class Match>
int count(const std::vector<std::string>& lines, Match match) {
  return static_cast<int>(std::count_if(lines.begin(), lines.end(), match));
}

}  // namespace

int DaemonHouse::logged(const std::string& text) const {
  const int times = count(log(), [&text](const std::string& line) { return line == text; });
  if (const auto type = qxTypeOfLevel(text); type && times > 0) fake_platform::noteAsserted({*type, text});
  return times;
}

int DaemonHouse::loggedBeginning(const std::string& text) const {
  return count(log(), [&text](const std::string& line) { return line.starts_with(text); });
}

int DaemonHouse::loggedContaining(const std::string& text) const {
  return count(log(), [&text](const std::string& line) { return line.find(text) != std::string::npos; });
}

bool DaemonHouse::awaitLog(const std::string& part, int times) const {
  return eventually("the log says: " + part, [this, &part, times] { return loggedContaining(part) >= times; });
}

std::vector<pid_t> DaemonHouse::processesOf(const std::string& programName) const {
  const auto all = parents();
  const auto descends = [&all, daemon = daemon_->pid()](pid_t process) {
    for (auto found = all.find(process); found != all.end(); found = all.find(found->second)) {
      if (found->second == daemon) return true;
    }
    return false;
  };
  std::vector<pid_t> result;
  for (const auto& [process, parent] : all) {
    std::string command = contentsOf("/proc/" + std::to_string(process) + "/cmdline");
    command.resize(std::min(command.size(), command.find('\0')));
    if (command.ends_with("/" + programName) && descends(process)) result.push_back(process);
  }
  return result;
}

void SystemTest::SetUp() { ASSERT_NE(::geteuid(), 0U) << "the daemon refuses root; run this test as an unprivileged user"; }

std::string stringEntry(const std::string& key, const std::string& value) { return "<key>" + key + "</key><string>" + value + "</string>"; }

std::string trueEntry(const std::string& key) { return "<key>" + key + "</key><true/>"; }

std::string propertyList(const std::string& entries) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>" + entries + "</dict>\n</plist>\n";
}

void writeFile(const std::string& path, const std::string& contents) {
  std::ofstream file(path, std::ios::binary);
  file << contents;
  file.close();
  if (!file) throw std::runtime_error("cannot write " + path);
}

}  // namespace docuvend::tests
