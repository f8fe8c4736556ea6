// The key file appears whole or not at all: it is written under a name that nobody else uses and then renamed to its own name, which fails
// when somebody was faster. The loser forgets its bytes and reads the winner's. A rename, unlike a link, never shows the file with
// two names, so a reader may insist on one.

#include "platform/linux/sandbox/TokenKey.h"

#include <fcntl.h>
#include <sodium.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/files/FileReplacer.h"

namespace docuvend::linux_platform {
namespace {

constexpr int kTries = 8;  // each costs a file that vanished or appeared in between
constexpr std::size_t kNameBytes = 12;
constexpr unsigned kPermissionBits = 07777;
constexpr unsigned kOwnerReadWrite = 0600;

static_assert(TokenKey::kLength == crypto_auth_KEYBYTES);
static_assert(TokenKey::kTagLength == crypto_auth_BYTES);

// Everything here begins with this; without random bytes there is nothing to go on with.
void prepareLibrary() {
  static const bool ready = sodium_init() >= 0;
  if (!ready) std::abort();
}

const unsigned char* unsignedBytes(std::string_view text) { return reinterpret_cast<const unsigned char*>(text.data()); }

bool transfersAll(ssize_t transferred) { return transferred == static_cast<ssize_t>(TokenKey::kLength); }

// A file that is gone with its object unless it was renamed.
class TemporaryFile {
 public:
  explicit TemporaryFile(std::string path)
      : path_(std::move(path)), file_(::open(path_.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, kOwnerReadWrite)) {}
  TemporaryFile(const TemporaryFile&) = delete;
  TemporaryFile& operator=(const TemporaryFile&) = delete;
  ~TemporaryFile() {
    if (file_ && !renamed_) ::unlink(path_.c_str());
  }

  [[nodiscard]] int get() const { return file_.get(); }
  [[nodiscard]] explicit operator bool() const { return static_cast<bool>(file_); }
  [[nodiscard]] bool renameUnlessThere(const std::string& target) {
    renamed_ = ::renameat2(AT_FDCWD, path_.c_str(), AT_FDCWD, target.c_str(), RENAME_NOREPLACE) == 0;
    return renamed_;
  }

 private:
  std::string path_;
  UniqueDescriptor file_;
  bool renamed_ = false;
};

}  // namespace

void fillWithRandom(std::uint8_t* bytes, std::size_t count) {
  prepareLibrary();
  randombytes_buf(bytes, count);
}

TokenKey TokenKey::random() {
  TokenKey key;
  fillWithRandom(key.bytes_.data(), key.bytes_.size());
  return key;
}

TokenKey::~TokenKey() { sodium_memzero(bytes_.data(), bytes_.size()); }

std::variant<TokenKey, QXError> TokenKey::loadOrCreate(const std::string& path) {
  prepareLibrary();
  for (int attempt = 0; attempt < kTries; ++attempt) {
    auto loaded = load(path);
    const auto* error = std::get_if<QXError>(&loaded);
    if (error == nullptr || error->code != ENOENT) return loaded;
    if (const int failure = create(path); failure != 0 && failure != EEXIST) return QXError::system(failure, "cannot create " + path);
  }
  return QXError::system(EAGAIN, "cannot keep " + path);
}

std::variant<TokenKey, QXError> TokenKey::load(const std::string& path) {
  // Never waits, whatever somebody put there.
  const UniqueDescriptor file(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  if (!file) return QXError::system(errno, "cannot open " + path);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return QXError::system(errno, "cannot examine " + path);
  if (!S_ISREG(status.st_mode)) return QXError::system(EINVAL, path + " is not a regular file");
  if (status.st_uid != ::geteuid()) return QXError::system(EPERM, path + " belongs to another user");
  if ((status.st_mode & kPermissionBits) != kOwnerReadWrite) return QXError::system(EPERM, path + " must have mode 600");
  if (status.st_nlink != 1) return QXError::system(EPERM, path + " must have one link");
  if (status.st_size != static_cast<off_t>(kLength)) return QXError::system(EINVAL, path + " has not the length of a key");
  TokenKey key;
  if (!transfersAll(::pread(file.get(), key.bytes_.data(), kLength, 0))) return QXError::system(EIO, "cannot read " + path);
  return key;
}

int TokenKey::create(const std::string& path) {
  std::array<std::uint8_t, kNameBytes> suffix{};
  fillWithRandom(suffix.data(), suffix.size());
  std::array<char, 2 * kNameBytes + 1> hex{};
  sodium_bin2hex(hex.data(), hex.size(), suffix.data(), suffix.size());

  TemporaryFile temporary(path + "." + hex.data());
  if (!temporary) return errno;
  const TokenKey key = random();
  if (::fchmod(temporary.get(), kOwnerReadWrite) != 0) return errno;
  if (!transfersAll(::pwrite(temporary.get(), key.bytes_.data(), kLength, 0))) return EIO;
  if (::fsync(temporary.get()) != 0) return errno;
  return temporary.renameUnlessThere(path) ? 0 : errno;
}

std::variant<TokenKey, QXError> TokenKey::renew(const std::string& path) {
  TokenKey key = random();
  auto begun = FileReplacer::begin(path);
  if (auto* error = std::get_if<QXError>(&begun)) return std::move(*error);
  auto& replacer = std::get<FileReplacer>(begun);
  if (::fchmod(replacer.descriptor(), kOwnerReadWrite) != 0) return QXError::system(errno, "cannot renew " + path);
  if (auto error = replacer.write({reinterpret_cast<const char*>(key.bytes_.data()), kLength})) return *std::move(error);
  if (auto error = replacer.commit()) return *std::move(error);
  return key;
}

TokenKey::Tag TokenKey::authenticate(std::string_view text) const {
  Tag tag{};
  crypto_auth(tag.data(), unsignedBytes(text), text.size(), bytes_.data());
  return tag;
}

bool TokenKey::verifies(std::string_view text, const Tag& tag) const {
  return crypto_auth_verify(tag.data(), unsignedBytes(text), text.size(), bytes_.data()) == 0;
}

}  // namespace docuvend::linux_platform
