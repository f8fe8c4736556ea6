// A log whose output a test can read: a pipe for standard error, a datagram socket for the journal.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "platform/linux/log/LinuxLog.h"

namespace docuvend::linux_platform {

class StreamReader {
 public:
  StreamReader() {
    std::array<int, 2> ends{-1, -1};
    EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    readEnd = UniqueDescriptor(ends[0]);
    writeEnd = UniqueDescriptor(ends[1]);
    EXPECT_EQ(::fcntl(readEnd.get(), F_SETFL, O_NONBLOCK), 0);
  }

  // Everything written since the last call.
  [[nodiscard]] std::string read() const {
    std::string text;
    std::array<char, 65536> buffer{};
    for (ssize_t count = 0; (count = ::read(readEnd.get(), buffer.data(), buffer.size())) > 0;) {
      text.append(buffer.data(), static_cast<std::size_t>(count));
    }
    return text;
  }

  [[nodiscard]] std::string deviceAndInode() const {
    struct stat status {};
    EXPECT_EQ(::fstat(writeEnd.get(), &status), 0);
    return std::to_string(status.st_dev) + ":" + std::to_string(status.st_ino);
  }

  UniqueDescriptor readEnd;
  UniqueDescriptor writeEnd;
};

class JournalReader {
 public:
  JournalReader() : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
    std::string pattern = (std::getenv("TMPDIR") != nullptr ? std::string(std::getenv("TMPDIR")) : std::string("/tmp")) + "/dvlog.XXXXXX";
    EXPECT_NE(::mkdtemp(pattern.data()), nullptr);
    directory_ = pattern;
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    EXPECT_LT(path().size(), sizeof address.sun_path);
    std::memcpy(address.sun_path, path().c_str(), path().size());
    EXPECT_EQ(::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  }
  ~JournalReader() {
    ::unlink(path().c_str());
    ::rmdir(directory_.c_str());
  }
  JournalReader(const JournalReader&) = delete;
  JournalReader& operator=(const JournalReader&) = delete;

  [[nodiscard]] std::string path() const { return directory_ + "/socket"; }

  // The datagrams since the last call.
  [[nodiscard]] std::vector<std::string> read() const {
    std::vector<std::string> entries;
    std::array<char, 65536> buffer{};
    for (ssize_t count = 0; (count = ::recv(socket_.get(), buffer.data(), buffer.size(), 0)) >= 0;) {
      entries.emplace_back(buffer.data(), static_cast<std::size_t>(count));
    }
    return entries;
  }

 private:
  UniqueDescriptor socket_;
  std::string directory_;
};

}  // namespace docuvend::linux_platform
