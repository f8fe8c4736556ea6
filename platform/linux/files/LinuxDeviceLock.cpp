#include "platform/linux/files/LinuxDeviceLock.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <string_view>
#include <variant>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/files/FileReplacer.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kGreatestState = 999;
constexpr std::string_view kLocked = "\n0\n";
constexpr std::string_view kUnlocked = "\n1\n";
constexpr std::size_t kMaximumBytes = 6;  // three digits and what follows

bool isDigit(char c) { return c >= '0' && c <= '9'; }

std::optional<LockState> parsed(std::string_view text) {
  if (text.empty() || !isDigit(text.front())) return std::nullopt;
  LockState state;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), state.state);
  const std::string_view rest = text.substr(static_cast<std::size_t>(end - text.data()));
  if (error != std::errc() || state.state > kGreatestState || (rest != kLocked && rest != kUnlocked)) return std::nullopt;
  state.unlockedSinceBoot = rest == kUnlocked;
  return state;
}

}  // namespace

std::optional<LockState> readLockState(const std::string& path) {
  const UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode) || status.st_uid != ::geteuid()) return std::nullopt;
  std::array<char, kMaximumBytes + 1> text{};
  const ssize_t length = ::read(file.get(), text.data(), text.size());
  if (length < 0 || static_cast<std::size_t>(length) > kMaximumBytes) return std::nullopt;
  return parsed({text.data(), static_cast<std::size_t>(length)});
}

std::optional<QXError> writeLockState(const std::string& path, const LockState& state) {
  if (state.state < 0 || state.state > kGreatestState) return QXError::system(EINVAL, "no lock state: " + std::to_string(state.state));
  auto begun = FileReplacer::begin(path);
  if (auto* error = std::get_if<QXError>(&begun)) return std::move(*error);
  auto& replacer = std::get<FileReplacer>(begun);
  const std::string_view rest = state.unlockedSinceBoot ? kUnlocked : kLocked;
  if (auto error = replacer.write(std::to_string(state.state) + std::string(rest))) return error;
  return replacer.commit();
}

}  // namespace docuvend::linux_platform
