// What survives a crash
//
// The new file's content is forced to disk before it gets the old one's name, so the name never stands for a half-written file; the
// directory is forced to disk after that, so a caller who was told "done" finds the new file after a power cut. Everything happens in one
// open directory: it may be renamed meanwhile, and the replacement still is where the old file was. A process that is killed in between
// leaves its temporary file behind, which nothing ever reads.

#include "platform/linux/files/FileReplacer.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>

namespace docuvend::linux_platform {
namespace {

constexpr int kNameAttempts = 16;   // new names to try for the temporary file
constexpr int kKeptNumbers = 1000;  // old files that are kept beside
constexpr mode_t kOwnerOnly = 0600;

QXError failure(const std::string& what) { return QXError::system(errno, what); }

std::optional<std::string> unpredictableName() {
  std::array<std::uint8_t, 16> random{};
  if (::getrandom(random.data(), random.size(), 0) != static_cast<ssize_t>(random.size())) return std::nullopt;
  std::string name = ".docuvend-";
  for (const std::uint8_t byte : random) {
    static constexpr std::string_view kDigits = "0123456789abcdef";
    name += kDigits[byte >> 4U];
    name += kDigits[byte & 15U];
  }
  return name;
}

// Whether a failed link says that this file system or file cannot have a second name, rather than that something is wrong.
bool linksAreUnsupported(int error) { return error == EPERM || error == EOPNOTSUPP || error == ENOSYS || error == EMLINK; }

// Moves the old file aside without replacing another one. A directory stays: it could not be replaced by a file anyway.
int moveOld(int directory, const std::string& from, const std::string& to) {
  struct stat status {};
  if (::fstatat(directory, from.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return -1;
  if (S_ISDIR(status.st_mode)) {
    errno = EISDIR;
    return -1;
  }
  return ::renameat2(directory, from.c_str(), directory, to.c_str(), RENAME_NOREPLACE);
}

}  // namespace

std::variant<FileReplacer, QXError> FileReplacer::begin(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  if (slash == std::string::npos || slash + 1 == path.size()) return QXError::system(EINVAL, "cannot replace \"" + path + "\"");
  UniqueDescriptor directory(::open(path.substr(0, slash + 1).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory) return failure("cannot open the directory of " + path);
  FileReplacer replacer(path, std::move(directory));
  if (auto error = replacer.createTemporary()) return *std::move(error);
  return replacer;
}

FileReplacer::FileReplacer(std::string path, UniqueDescriptor directory)
    : path_(std::move(path)), name_(path_.substr(path_.rfind('/') + 1)), directory_(std::move(directory)) {}

FileReplacer::FileReplacer(FileReplacer&& other) noexcept
    : path_(std::move(other.path_)),
      name_(std::move(other.name_)),
      directory_(std::move(other.directory_)),
      file_(std::move(other.file_)),
      temporary_(std::exchange(other.temporary_, {})) {}

FileReplacer::~FileReplacer() {
  if (!temporary_.empty()) ::unlinkat(directory_.get(), temporary_.c_str(), 0);
}

std::optional<QXError> FileReplacer::createTemporary() {
  for (int attempt = 0; attempt < kNameAttempts; ++attempt) {
    const auto name = unpredictableName();
    if (!name) return failure("no random bytes for a temporary file");
    file_.reset(::openat(directory_.get(), name->c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kOwnerOnly));
    if (file_) {
      temporary_ = *name;
      return std::nullopt;
    }
    if (errno != EEXIST) break;
  }
  return failure("cannot create a temporary file beside " + path_);
}

std::optional<QXError> FileReplacer::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(file_.get(), bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return failure("cannot write the new " + path_);
    bytes.remove_prefix(static_cast<std::size_t>(written));
  }
  return std::nullopt;
}

std::optional<QXError> FileReplacer::keepOld(std::string_view suffix) {
  const int directory = directory_.get();
  for (int number = 1; number <= kKeptNumbers; ++number) {
    const std::string kept = name_ + std::string(suffix) + std::to_string(number);
    int result = ::linkat(directory, name_.c_str(), directory, kept.c_str(), 0);
    if (result != 0 && linksAreUnsupported(errno)) result = moveOld(directory, name_, kept);
    if (result == 0) return syncDirectory();
    if (errno != EEXIST) break;
  }
  return failure("cannot keep the old " + path_);
}

std::optional<QXError> FileReplacer::commit() {
  if (::fsync(file_.get()) != 0) return failure("cannot force the new " + path_ + " to disk");
  if (::renameat(directory_.get(), temporary_.c_str(), directory_.get(), name_.c_str()) != 0) return failure("cannot replace " + path_);
  temporary_.clear();
  return syncDirectory();
}

std::optional<QXError> FileReplacer::syncDirectory() const {
  if (::fsync(directory_.get()) != 0) return failure("cannot force the directory of " + path_ + " to disk");
  return std::nullopt;
}

}  // namespace docuvend::linux_platform
