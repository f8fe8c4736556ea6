#include "tools/docuvendctl/WholeFile.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "tests/sdk/ScriptedDaemon.h"
#include "tests/support/Eventually.h"

namespace docuvend::ctl {
namespace {

using linux_platform::UniqueDescriptor;

// Files of a directory of the test's own, to which accesses are had from scripted services.
class WholeFileTest : public tests::ConsumerTest {
 protected:
  WholeFileTest() {
    std::filesystem::create_directory(directory_);
    startServices();
  }

  [[nodiscard]] std::string path(const std::string& name) const { return directory_ + "/" + name; }
  [[nodiscard]] std::vector<std::string> names() const {
    std::vector<std::string> result;
    for (const auto& entry : std::filesystem::directory_iterator(directory_)) result.push_back(entry.path().filename());
    return result;
  }
  void put(const std::string& name, const std::string& contents, mode_t mode = 0600) const {
    const UniqueDescriptor file(::open(path(name).c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    ASSERT_EQ(::write(file.get(), contents.data(), contents.size()), static_cast<ssize_t>(contents.size()));
    ASSERT_EQ(::fchmod(file.get(), mode), 0);
  }
  [[nodiscard]] std::string contentsOf(const std::string& name) const {
    const UniqueDescriptor file(::open(path(name).c_str(), O_RDONLY | O_CLOEXEC));
    return contentsOf(file.get());
  }
  static std::string contentsOf(int file) {
    std::string text(100, '\0');
    const ssize_t count = ::read(file, text.data(), text.size());
    text.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    return text;
  }
  [[nodiscard]] mode_t modeOf(const std::string& name) const {
    struct stat status {};
    EXPECT_EQ(::lstat(path(name).c_str(), &status), 0);
    return status.st_mode & 07777;
  }
  CoordinatedAccess accessTo(const std::string& name) {
    auto begun = consumer().coordinateWriting(QXURL::fileURL(path(name), QXURLKind::file));
    return std::get<CoordinatedAccess>(std::move(begun));
  }
  // A symbolic link, a directory and something else, and why each is refused.
  void makeOthers() const {
    put("file", "old");
    ASSERT_EQ(::symlink("file", path("link").c_str()), 0);
    ASSERT_EQ(::symlink("nothing", path("dangling").c_str()), 0);
    ASSERT_EQ(::mkdir(path("directory").c_str(), 0700), 0);
    ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
  }
  const std::vector<std::pair<std::string, int>> others_ = {{"link", ELOOP}, {"dangling", ELOOP}, {"directory", EISDIR}, {"pipe", EINVAL}};
  static auto system(int errnoValue) { return std::pair(std::string(kQXSystemErrorDomain), std::int64_t{errnoValue}); }
  static UniqueDescriptor newContents() {
    UniqueDescriptor file(::memfd_create("contents", MFD_CLOEXEC));
    EXPECT_EQ(::pwrite(file.get(), "new", 3, 0), 3);
    return file;
  }

  const std::string directory_ = root_ + "/files";
};

TEST_F(WholeFileTest, ARegularFileIsOpened) {
  put("file", "contents");
  const auto opened = openWholeFile(path("file"));
  ASSERT_EQ(errorIn(opened), std::nullopt);
  EXPECT_EQ(contentsOf(std::get<QXDescriptor>(opened).number), "contents");
}

TEST_F(WholeFileTest, WhatIsNoRegularFileIsNotOpened) {
  makeOthers();
  for (const auto& [name, error] : others_) EXPECT_EQ(errorIn(openWholeFile(path(name))), system(error)) << name;
  EXPECT_EQ(errorIn(openWholeFile(path("nothing"))), system(ENOENT));
}

TEST_F(WholeFileTest, AFileIsReplacedAndKeepsItsPermissions) {
  for (const mode_t mode : {0600U, 0444U, 0755U, 0666U}) {
    put("file", "old and longer", 0600);
    ASSERT_EQ(::chmod(path("file").c_str(), mode), 0);
    const UniqueDescriptor before(::open(path("file").c_str(), O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(replaceWholeFile(accessTo("file"), newContents().get()), std::nullopt);
    EXPECT_EQ(contentsOf("file"), "new");
    EXPECT_EQ(contentsOf(before.get()), "old and longer") << "who has it open sees it as it was";
    EXPECT_EQ(modeOf("file"), mode);
    ASSERT_EQ(::chmod(path("file").c_str(), 0600), 0);
  }
  EXPECT_EQ(names(), std::vector<std::string>{"file"});
}

TEST_F(WholeFileTest, AFileThatIsNotThereIsMadeAsTheProcessMakesFiles) {
  const mode_t before = ::umask(027);
  EXPECT_EQ(replaceWholeFile(accessTo("file"), newContents().get()), std::nullopt);
  EXPECT_EQ(::umask(before), 027U) << "the mask is as it was";
  EXPECT_EQ(contentsOf("file"), "new");
  EXPECT_EQ(modeOf("file"), 0640U);
}

TEST_F(WholeFileTest, WhatIsNoRegularFileIsNotReplaced) {
  makeOthers();
  const auto all = names();
  for (const auto& [name, error] : others_) {
    EXPECT_EQ(errorIn(replaceWholeFile(accessTo(name), newContents().get())), system(error)) << name;
  }
  EXPECT_EQ(contentsOf("file"), "old");
  EXPECT_EQ(names(), all);
}

TEST_F(WholeFileTest, WhereThereIsNoDirectoryNothingIsMade) {
  EXPECT_EQ(errorIn(replaceWholeFile(accessTo("nowhere/file"), newContents().get())), system(ENOENT));
}

TEST_F(WholeFileTest, ContentsThatCannotBeReadReplaceNothing) {
  put("file", "old");
  const UniqueDescriptor unreadable(::open(path("file").c_str(), O_WRONLY | O_CLOEXEC));
  EXPECT_EQ(errorIn(replaceWholeFile(accessTo("file"), unreadable.get())), system(EBADF));
  EXPECT_EQ(contentsOf("file"), "old");
  EXPECT_EQ(names(), std::vector<std::string>{"file"});
}

TEST_F(WholeFileTest, WhoHasLostTheTurnReplacesNothing) {
  put("file", "old");
  const auto access = accessTo("file");
  stopServices();
  tests::eventually("the loss is known", [&access] { return !access.isHeld(); });
  EXPECT_EQ(errorIn(replaceWholeFile(access, newContents().get())), own(ConsumerErrorCode::connectionLost));
  EXPECT_EQ(contentsOf("file"), "old");
  EXPECT_EQ(names(), std::vector<std::string>{"file"});
}

TEST_F(WholeFileTest, ATemporaryFileHasNoNameAndLiesWhereTheEnvironmentSays) {
  const std::string here = std::filesystem::canonical(directory_);
  ASSERT_EQ(::setenv("TMPDIR", directory_.c_str(), 1), 0);
  const auto made = temporaryFile();
  ASSERT_EQ(errorIn(made), std::nullopt);
  const int file = std::get<UniqueDescriptor>(made).get();
  EXPECT_TRUE(names().empty());
  struct stat ofFile {};
  struct stat ofDirectory {};
  ASSERT_EQ(::fstat(file, &ofFile), 0);
  ASSERT_EQ(::stat(directory_.c_str(), &ofDirectory), 0);
  EXPECT_EQ(ofFile.st_dev, ofDirectory.st_dev);
  EXPECT_EQ(ofFile.st_nlink, 0U);
  EXPECT_EQ(ofFile.st_mode & 07777, 0600U);
  EXPECT_NE(::fcntl(file, F_GETFD) & FD_CLOEXEC, 0);
  ASSERT_EQ(::write(file, "text", 4), 4);
  ASSERT_EQ(::lseek(file, 0, SEEK_SET), 0);
  EXPECT_EQ(contentsOf(file), "text");
  EXPECT_EQ(std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(file)).parent_path(), here);
  ASSERT_EQ(::setenv("TMPDIR", path("nothing").c_str(), 1), 0);
  EXPECT_EQ(errorIn(temporaryFile()), system(ENOENT));
}

}  // namespace
}  // namespace docuvend::ctl
