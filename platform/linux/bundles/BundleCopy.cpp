// Everything is opened relative to a directory that is open, and examined after it was opened, so that names that change meanwhile lead
// nowhere else. Links are copied as they are; where they lead is asked of the kernel when the copy is whole, below the copy, because what a
// relative link means depends on the links on its way.
#include "platform/linux/bundles/BundleCopy.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <memory>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/bundles/BundleErrors.h"
#include "platform/linux/bundles/OpenInBundle.h"

namespace docuvend::linux_platform {
namespace {

constexpr mode_t kDirectoryMode = 0755;
constexpr mode_t kFileMode = 0644;
constexpr mode_t kExecutableBits = S_IXUSR | S_IXGRP | S_IXOTH;
constexpr std::size_t kCopiedAtOnce = 1UL << 16U;

using Failure = std::optional<QXError>;

class Copy {
 public:
  Copy(const UniqueDescriptor& root, const BundleLimits& limits) : root_(root), limits_(limits) {}

  Failure copyDirectory(int source, int target, const std::string& place, int depth) {
    if (depth > limits_.depth) return tooLarge("its directories are nested too deeply");
    auto names = namesIn(source);
    if (auto* error = std::get_if<QXError>(&names)) return std::move(*error);
    for (const std::string& name : std::get<std::vector<std::string>>(names)) {
      if (auto error = copyEntry(source, target, name, place + name, depth)) return error;
    }
    if (::fchmod(target, kDirectoryMode) != 0 || ::fsync(target) != 0) return failure(place);
    return std::nullopt;
  }

  // After everything was copied.
  Failure examineLinks() {
    for (const std::string& place : links_) {
      if (openInBundle(root_.get(), place, LinksOnTheWay::thatStayInside)) continue;
      if (errno == EXDEV) return forbidden(place, "is a link that leads out");
      if (errno == ENOENT || errno == ENOTDIR || errno == ELOOP) return forbidden(place, "is a link that leads nowhere");
      return failure(place);
    }
    return std::nullopt;
  }

 private:
  static Failure failure(const std::string& place) { return QXError::system(errno, "cannot copy \"" + place + "\""); }
  static Failure tooLarge(const std::string& what) {
    return bundleError(BundleErrorCode::tooLarge, "The bundle is too large: " + what + ".");
  }
  static Failure forbidden(const std::string& place, const std::string& what) {
    return bundleError(BundleErrorCode::forbidden, "A bundle may not hold this: \"" + place + "\" " + what + ".");
  }

  std::variant<std::vector<std::string>, QXError> namesIn(int directory) {
    // A descriptor of its own: the stream moves and closes it.
    UniqueDescriptor reading(::openat(directory, ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::unique_ptr<DIR, int (*)(DIR*)> stream(reading ? ::fdopendir(reading.get()) : nullptr, &::closedir);
    if (!stream) return QXError::system(errno, "cannot read a directory of the bundle");
    (void)reading.release();
    std::vector<std::string> result;
    errno = 0;
    for (const dirent* entry = ::readdir(stream.get()); entry != nullptr; entry = ::readdir(stream.get())) {
      const std::string_view name = static_cast<const char*>(entry->d_name);
      if (name == "." || name == "..") continue;
      if (++entries_ > limits_.entries) return *tooLarge("it has too many files");
      result.emplace_back(name);
    }
    if (errno != 0) return QXError::system(errno, "cannot read a directory of the bundle");
    return result;
  }

  Failure copyEntry(int source, int target, const std::string& name, const std::string& place, int depth) {
    struct stat status {};
    if (::fstatat(source, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return failure(place);
    if (S_ISLNK(status.st_mode)) return copyLink(source, target, name, place);
    if (S_ISDIR(status.st_mode)) return copySubdirectory(source, target, name, place, depth);
    if (S_ISREG(status.st_mode)) return copyFile(source, target, name, place);
    return forbidden(place, "is neither a file nor a directory");
  }

  Failure copyLink(int source, int target, const std::string& name, const std::string& place) {
    std::array<char, PATH_MAX> text{};
    const ssize_t length = ::readlinkat(source, name.c_str(), text.data(), text.size() - 1);
    if (length < 0 || ::symlinkat(text.data(), target, name.c_str()) != 0) return failure(place);
    links_.push_back(place);
    return std::nullopt;
  }

  Failure copySubdirectory(int source, int target, const std::string& name, const std::string& place, int depth) {
    const UniqueDescriptor from(::openat(source, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!from || ::mkdirat(target, name.c_str(), S_IRWXU) != 0) return failure(place);
    const UniqueDescriptor to(::openat(target, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!to) return failure(place);
    return copyDirectory(from.get(), to.get(), place + "/", depth + 1);
  }

  Failure copyFile(int source, int target, const std::string& name, const std::string& place) {
    const UniqueDescriptor from(::openat(source, name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status {};
    if (!from || ::fstat(from.get(), &status) != 0) return failure(place);
    if (!S_ISREG(status.st_mode)) return forbidden(place, "is neither a file nor a directory");
    if ((status.st_mode & (S_ISUID | S_ISGID)) != 0) return forbidden(place, "has a set-id bit");
    const auto length = static_cast<std::uint64_t>(status.st_size);
    if (length > limits_.bytes - bytes_) return tooLarge("its files have too many bytes");
    bytes_ += length;
    const UniqueDescriptor to(::openat(target, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!to) return failure(place);
    if (auto error = copyBytes(from.get(), to.get(), length, place)) return error;
    const mode_t mode = kFileMode | ((status.st_mode & kExecutableBits) != 0 ? kExecutableBits : 0);
    if (::fchmod(to.get(), mode) != 0 || ::fsync(to.get()) != 0) return failure(place);
    return std::nullopt;
  }

  Failure copyBytes(int from, int to, std::uint64_t length, const std::string& place) {
    while (length > 0) {
      const ssize_t count = ::read(from, buffer_.data(), std::min<std::uint64_t>(length, buffer_.size()));
      if (count < 0 && errno == EINTR) continue;
      if (count < 0) return failure(place);
      if (count == 0) return std::nullopt;
      length -= static_cast<std::uint64_t>(count);
      for (ssize_t written = 0; written < count;) {
        const ssize_t more = ::write(to, buffer_.data() + written, static_cast<std::size_t>(count - written));
        if (more < 0 && errno != EINTR) return failure(place);
        if (more > 0) written += more;
      }
    }
    return std::nullopt;
  }

  const UniqueDescriptor& root_;
  const BundleLimits& limits_;
  std::vector<std::string> links_;
  std::size_t entries_ = 0;
  std::uint64_t bytes_ = 0;  // at most the limit
  std::vector<char> buffer_ = std::vector<char>(kCopiedAtOnce);
};

}  // namespace

std::optional<QXError> copyBundle(const UniqueDescriptor& source, const UniqueDescriptor& target, const BundleLimits& limits) {
  Copy copy(target, limits);
  if (auto error = copy.copyDirectory(source.get(), target.get(), /*place=*/{}, /*depth=*/1)) return error;
  return copy.examineLinks();
}

}  // namespace docuvend::linux_platform
