// A look at a name and a rename over it are two steps, and whoever saves between them would lose what was saved. So names are exchanged,
// and only then the file that came out is looked at: it has a name that nobody else uses, so it stays what it is. If it is not the one that
// was meant, the names are exchanged back, which is again two steps: what comes out must be the file that was put there. If it is not,
// somebody has saved meanwhile, and the newer file goes back to the place in the same way.
#include "examples/cellar/Files.h"

#include <dirent.h>
#include <fcntl.h>
#include <stdio.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <utility>

namespace docuvend::cellar {
namespace {

constexpr mode_t kDirectoryMode = 0700;
constexpr mode_t kFileMode = 0600;
constexpr std::int64_t kNanoseconds = 1'000'000'000;
// The fraction of a second in a placeholder's time.
constexpr std::int64_t kPlaceholderFraction = 314'159'265;
// Far more than a tick of any kernel's clock.
constexpr int kLooksAtTheClock = 100;
constexpr timespec kBetweenLooks{0, 1'000'000};

std::int64_t nanoseconds(const statx_timestamp& time) { return time.tv_sec * kNanoseconds + time.tv_nsec; }

std::int64_t fractionOf(std::int64_t time) { return ((time % kNanoseconds) + kNanoseconds) % kNanoseconds; }

std::optional<Fingerprint> examine(int directory, const char* name, int flags) {
  struct statx status {};
  if (statx(directory, name, flags | AT_SYMLINK_NOFOLLOW, STATX_BASIC_STATS | STATX_BTIME, &status) != 0) return std::nullopt;
  if (!S_ISREG(status.stx_mode)) return std::nullopt;
  return Fingerprint{{status.stx_ino, nanoseconds(status.stx_btime)}, status.stx_size, nanoseconds(status.stx_mtime)};
}

std::optional<FileKey> keyIn(const std::optional<Fingerprint>& fingerprint) {
  return fingerprint ? std::optional(fingerprint->key) : std::nullopt;
}

bool exchangeNames(const std::string& a, const std::string& b) {
  return renameat2(AT_FDCWD, a.c_str(), AT_FDCWD, b.c_str(), RENAME_EXCHANGE) == 0;
}

std::optional<QXError> syncDirectoryOf(const std::string& path) {
  const UniqueDescriptor directory(open(path.substr(0, path.rfind('/')).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directory || fsync(directory.get()) != 0) return systemError("cannot write the directory of " + path);
  return std::nullopt;
}

QXError cannotPut(const std::string& path) { return systemError("cannot put a file at " + path); }

QXError isAnother(const std::string& path) { return QXError::system(EAGAIN, "another file lies at " + path); }

}  // namespace

QXError systemError(const std::string& what) { return QXError::system(errno, what); }

UniqueDescriptor openForReading(const std::string& path) {
  return UniqueDescriptor(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
}

std::vector<Entry> listFiles(const std::string& directory) {
  std::vector<Entry> result;
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(directory.c_str()), &closedir);
  if (!stream) return result;
  while (const dirent* entry = readdir(stream.get())) {
    if (entry->d_name[0] == '.') continue;
    if (const auto fingerprint = examine(dirfd(stream.get()), entry->d_name, 0)) result.push_back({entry->d_name, *fingerprint});
  }
  std::sort(result.begin(), result.end(), [](const Entry& a, const Entry& b) { return a.name < b.name; });
  return result;
}

std::optional<Fingerprint> fingerprintOf(const UniqueDescriptor& file) { return examine(file.get(), "", AT_EMPTY_PATH); }

std::optional<Fingerprint> fingerprintAt(const std::string& path) { return examine(AT_FDCWD, path.c_str(), 0); }

bool Fingerprint::isPlaceholder() const { return fractionOf(modified) == kPlaceholderFraction; }

bool setModified(const UniqueDescriptor& file, std::int64_t modified) {
  const std::int64_t fraction = fractionOf(modified);
  const timespec times[2] = {{0, UTIME_OMIT}, {(modified - fraction) / kNanoseconds, fraction}};
  return futimens(file.get(), times) == 0;
}

void awaitLaterTime(const Fingerprint& file) {
  for (int i = 0; i < kLooksAtTheClock; ++i) {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);  // what the kernel takes a change's time from
    if (now.tv_sec * kNanoseconds + now.tv_nsec > file.modified) return;
    nanosleep(&kBetweenLooks, nullptr);
  }
}

std::optional<QXError> ensureDirectory(const std::string& path) {
  if (mkdir(path.c_str(), kDirectoryMode) == 0 || errno == EEXIST) return std::nullopt;
  return systemError("cannot make " + path);
}

Replacement::Replacement(std::string temporary)
    : temporary_(std::move(temporary)), file_(open(temporary_.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC, kFileMode)) {}

Replacement::~Replacement() {
  if (file_ && !temporary_.empty()) unlink(temporary_.c_str());
}

std::optional<QXError> Replacement::becomePlaceholder(std::uint64_t size, std::int64_t modified) {
  const bool isMade = file_ && ftruncate(file_.get(), static_cast<off_t>(size)) == 0 &&
                      setModified(file_, modified - fractionOf(modified) + kPlaceholderFraction);
  if (!isMade) return systemError("cannot make a placeholder");
  if (auto error = sync()) return error;
  // A file system that keeps whole seconds would make every placeholder a document of zeros.
  const auto made = fingerprintOf(file_);
  if (!made || !made->isPlaceholder()) return QXError::system(ENOTSUP, "the file system does not keep a placeholder's time");
  return std::nullopt;
}

std::optional<QXError> Replacement::sync() const {
  if (fsync(file_.get()) != 0) return systemError("cannot write " + temporary_);
  return std::nullopt;
}

std::optional<QXError> Replacement::commit(const std::string& path) {
  if (rename(temporary_.c_str(), path.c_str()) != 0) return cannotPut(path);
  temporary_.clear();
  return syncDirectoryOf(path);
}

std::optional<QXError> Replacement::commitOver(const std::string& path, const std::optional<Fingerprint>& expected) {
  if (expected) {
    if (auto error = exchange(path, *expected)) return error;
    removeReplaced();
  } else {
    if (!renameOverNothing(temporary_, path)) return errno == EEXIST ? isAnother(path) : cannotPut(path);
    temporary_.clear();
  }
  return syncDirectoryOf(path);
}

std::optional<QXError> Replacement::exchange(const std::string& path, const Fingerprint& expected) {
  if (!exchangeNames(temporary_, path)) return errno == ENOENT ? isAnother(path) : cannotPut(path);
  if (fingerprintAt(temporary_) == expected) return std::nullopt;
  if (auto error = putBack(path)) return error;
  return isAnother(path);
}

std::optional<QXError> Replacement::putBack(const std::string& path) {
  auto inPlace = keyIn(fingerprintOf(file_));
  auto held = keyIn(fingerprintAt(temporary_));
  for (;;) {
    if (exchangeNames(temporary_, path)) {
      const auto out = keyIn(fingerprintAt(temporary_));
      if (out == inPlace) return std::nullopt;
      inPlace = std::exchange(held, out);
      continue;
    }
    // Somebody has renamed or removed what was put in the place.
    const bool isBack = errno == ENOENT && renameOverNothing(temporary_, path);
    if (!isBack && errno == EEXIST) continue;
    auto error = isBack ? std::nullopt : std::optional(cannotPut(path));
    temporary_.clear();  // on an error too: what lies there may be somebody's only copy
    return error;
  }
}

void Replacement::removeReplaced() { unlink(std::exchange(temporary_, {}).c_str()); }

bool renameOverNothing(const std::string& from, const std::string& to) {
  return renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0;
}

void removeHiddenFiles(const std::string& directory, std::string_view suffix) {
  const std::unique_ptr<DIR, int (*)(DIR*)> stream(opendir(directory.c_str()), &closedir);
  if (!stream) return;
  while (const dirent* entry = readdir(stream.get())) {
    const std::string_view name = entry->d_name;
    if (name.starts_with('.') && name.ends_with(suffix)) unlinkat(dirfd(stream.get()), entry->d_name, 0);
  }
}

bool writeAll(const UniqueDescriptor& file, const char* bytes, std::size_t count) {
  while (count > 0) {
    const ssize_t written = write(file.get(), bytes, count);
    if (written < 0 && errno == EINTR) continue;
    if (written <= 0) return false;
    bytes += written;
    count -= static_cast<std::size_t>(written);
  }
  return true;
}

}  // namespace docuvend::cellar
