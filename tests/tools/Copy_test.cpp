#include "tools/docuvendctl/Copy.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <string>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"

namespace docuvend::ctl {
namespace {

using linux_platform::UniqueDescriptor;

UniqueDescriptor fileWith(const std::string& contents) {
  UniqueDescriptor file(::memfd_create("file", MFD_CLOEXEC));
  EXPECT_EQ(::pwrite(file.get(), contents.data(), contents.size(), 0), static_cast<ssize_t>(contents.size()));
  return file;
}

std::string contentsOf(const UniqueDescriptor& file) {
  std::string text(static_cast<std::size_t>(::lseek(file.get(), 0, SEEK_END)), '\0');
  EXPECT_EQ(::pread(file.get(), text.data(), text.size(), 0), static_cast<ssize_t>(text.size()));
  return text;
}

TEST(Copy, AFileIsCopiedByteForByteWhateverItsSize) {
  for (const std::size_t size : {0U, 1U, 49'151U, 49'152U, 49'153U, 500'000U}) {
    std::string bytes(size, '\0');
    for (std::size_t i = 0; i < size; ++i) bytes[i] = static_cast<char>(i * 31 >> 3U);
    const auto from = fileWith(bytes);
    const auto to = fileWith("");
    EXPECT_EQ(copyAll(from.get(), to.get()), std::nullopt);
    EXPECT_EQ(contentsOf(to), bytes) << size;
  }
}

TEST(Copy, Base64IsThatOfTheStandard) {
  const std::vector<std::pair<std::string, std::string>> table = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"foob", "Zm9vYg=="},
      {"fooba", "Zm9vYmE="},
      {"foobar", "Zm9vYmFy"},
      {std::string(1, '\0'), "AA=="},
      {"\xff\xff\xff", "////"},
      {"\xfb\xef\xbe", "++++"},
  };
  for (const auto& [bytes, text] : table) {
    const auto from = fileWith(bytes);
    const auto to = fileWith("");
    EXPECT_EQ(copyAllAsBase64(from.get(), to.get()), std::nullopt);
    EXPECT_EQ(contentsOf(to), text);
  }
}

TEST(Copy, Base64HasPaddingAtTheEndOnlyAlsoWhenBytesTrickle) {
  int ends[2] = {-1, -1};
  // Each reading gives one packet.
  ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends), 0);
  const UniqueDescriptor from(ends[0]);
  UniqueDescriptor into(ends[1]);
  for (int i = 0; i < 7; ++i) ASSERT_EQ(::write(into.get(), "f", 1), 1);
  into.reset();
  const auto to = fileWith("");
  EXPECT_EQ(copyAllAsBase64(from.get(), to.get()), std::nullopt);
  EXPECT_EQ(contentsOf(to), "ZmZmZmZmZg==");
}

TEST(Copy, Base64OfALargeFileIsOneText) {
  const auto from = fileWith(std::string(100'000, 'f'));
  const auto to = fileWith("");
  EXPECT_EQ(copyAllAsBase64(from.get(), to.get()), std::nullopt);
  std::string expected;
  for (int i = 0; i < 33'333; ++i) expected += "ZmZm";
  EXPECT_EQ(contentsOf(to), expected + "Zg==");
}

TEST(Copy, AFailureSaysOnWhichSideItWas) {
  const auto file = fileWith("x");
  const UniqueDescriptor directory(::open("/", O_RDONLY | O_CLOEXEC));
  const UniqueDescriptor full(::open("/dev/full", O_WRONLY | O_CLOEXEC));
  EXPECT_EQ(copyAll(directory.get(), file.get()), QXError::system(EISDIR, "cannot read"));
  EXPECT_EQ(copyAll(file.get(), full.get()), QXError::system(ENOSPC, "cannot write"));
  EXPECT_EQ(writeAll(full.get(), "x"), QXError::system(ENOSPC, "cannot write"));
  EXPECT_EQ(writeAll(full.get(), ""), std::nullopt);
}

}  // namespace
}  // namespace docuvend::ctl
