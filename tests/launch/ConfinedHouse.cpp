#include "tests/launch/ConfinedHouse.h"

#include <signal.h>
#include <sys/wait.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <sstream>

namespace docuvend::linux_platform {

RunningProcess::RunningProcess(RunningProcess&& other) noexcept
    : pid_(std::exchange(other.pid_, -1)), output_(std::move(other.output_)), status_(other.status_) {}

RunningProcess::~RunningProcess() {
  if (pid_ <= 0 || status_) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(pid_, nullptr, 0);
}

std::string RunningProcess::output() { return readAll(output_.get()); }

int RunningProcess::status() {
  if (!status_) {
    int status = 0;
    ::waitpid(pid_, &status, 0);
    status_ = exitStatus(status);
  }
  return *status_;
}

Bundle ConfinedHouse::installProbe(const std::string& identifier, const std::string& more) {
  const std::string directory = paths.userBundles + "/" + identifier;
  install(directory, identifier, more);
  std::filesystem::copy_file(std::string(DOCUVEND_BIN) + "/docuvend-launch-probe", directory + "/program",
                             std::filesystem::copy_options::overwrite_existing);
  return scan().at(identifier);
}

namespace {

LaunchPlan planOrThrow(std::variant<LaunchPlan, QXError> result) {
  if (const auto* error = std::get_if<QXError>(&result)) throw std::runtime_error(error->description());
  return std::get<LaunchPlan>(std::move(result));
}

}  // namespace

LaunchPlan ConfinedHouse::plan(const Bundle& bundle, const std::vector<std::string>& attempts) {
  return planOrThrow(planLaunch(bundle, attempts, LaunchKind::application, std::nullopt, paths));
}

LaunchPlan ConfinedHouse::planExtension(const Bundle& bundle, const std::vector<std::string>& attempts, UniqueDescriptor socket) {
  return planOrThrow(planLaunch(bundle, attempts, LaunchKind::extension, std::move(socket), paths));
}

RunningProcess ConfinedHouse::start(LaunchPlan plan, int standardInput) {
  return startChild(
      [&plan] {
        std::fprintf(stderr, "%s\n", execute(std::move(plan)).description().c_str());
        return 1;
      },
      standardInput);
}

Outcomes ConfinedHouse::outcomes(RunningProcess process) {
  Outcomes result;
  std::istringstream lines(process.output());
  for (std::string line; std::getline(lines, line);) {
    const auto colon = line.rfind(": ");
    if (colon != std::string::npos) result[line.substr(0, colon)] = line.substr(colon + 2);
  }
  result["status"] = std::to_string(process.status());
  return result;
}

Outcomes ConfinedHouse::runUnconfined(const std::vector<std::string>& attempts, int standardInput) const {
  std::vector<std::string> words = {std::string(DOCUVEND_BIN) + "/docuvend-launch-probe"};
  words.insert(words.end(), attempts.begin(), attempts.end());
  return outcomes(startChild(
      [this, &words] {
        std::vector<char*> arguments;
        for (auto& word : words) arguments.push_back(word.data());
        arguments.push_back(nullptr);
        if (::chdir(root().c_str()) == 0) ::execv(arguments[0], arguments.data());
        return 1;
      },
      standardInput));
}

Outcomes ConfinedHouse::run(const Bundle& bundle, const std::vector<std::string>& attempts, int standardInput) {
  return outcomes(start(plan(bundle, attempts), standardInput));
}

void ConfinedTest::SetUp() { ASSERT_NE(::geteuid(), 0U) << "root cannot be confined; run this test as an unprivileged user"; }

std::string readAll(int descriptor) {
  std::string text;
  std::array<char, 4096> bytes{};
  for (;;) {
    const ssize_t count = ::read(descriptor, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) return text;
    text.append(bytes.data(), static_cast<std::size_t>(count));
  }
}

int exitStatus(int waitStatus) { return WIFEXITED(waitStatus) ? WEXITSTATUS(waitStatus) : 128 + WTERMSIG(waitStatus); }

}  // namespace docuvend::linux_platform
