#include "platform/linux/files/LinuxPropertyLists.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <ostream>
#include <set>
#include <sstream>
#include <string>

#include "platform/linux/files/PropertyListParser.h"
#include "platform/linux/files/PropertyListWriter.h"
#include "tests/files/TemporaryDirectory.h"
#include "tests/files/system_calls.h"

namespace docuvend::linux_platform {
namespace {

using test::CallFailure;
using test::FailureSpan;
using test::readText;
using test::SystemCalls;
using test::TemporaryDirectory;
using test::writeText;

constexpr const char* kUnreadable = "<plist version=\"1.0\"><dict><key>half";

class LinuxPropertyListsTest : public ::testing::Test {
 protected:
  TemporaryDirectory directory_;
  const std::string path_ = directory_.path("list");
  LinuxPropertyLists lists_;
};

TEST_F(LinuxPropertyListsTest, WhatIsThereAndCannotBeOpenedOrIsNoFileCannotBeRead) {
  ASSERT_EQ(::mkfifo(path_.c_str(), 0600), 0);
  const std::string locked = directory_.path("locked");
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, locked));
  ASSERT_EQ(::chmod(locked.c_str(), 0), 0);
  const std::string loop = directory_.path("loop");
  std::filesystem::create_symlink("loop", loop);
  for (const std::string& path : {path_, std::string("/dev/zero"), locked, loop}) {
    const auto stream = lists_.openStream(path);
    ASSERT_NE(stream, nullptr) << path;
    EXPECT_TRUE(stream->bad()) << path;
    const auto result = lists_.read(*stream);
    EXPECT_FALSE(result.value) << path;
    ASSERT_TRUE(result.error) << path;
    EXPECT_EQ(result.error->texts.at("description"), "The file cannot be read.") << path;
  }
}

TEST_F(LinuxPropertyListsTest, WhereNothingIsOrNothingCanBeOpenedThereIsNoStream) {
  EXPECT_EQ(lists_.openStream(path_ + "/below"), nullptr);
  std::filesystem::create_symlink("nowhere", directory_.path("dangling"));
  EXPECT_EQ(lists_.openStream(directory_.path("dangling")), nullptr);
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, path_));
  EXPECT_EQ(lists_.openStream(path_ + "/below"), nullptr);
  rlimit usual{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &usual), 0);
  rlimit none = usual;
  none.rlim_cur = 0;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
  EXPECT_EQ(lists_.openStream(path_), nullptr);
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &usual), 0);
}

TEST_F(LinuxPropertyListsTest, AStreamFollowsALinkToAFile) {
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, directory_.path("target")));
  std::filesystem::create_symlink("target", path_);
  const auto stream = lists_.openStream(path_);
  ASSERT_NE(stream, nullptr);
  EXPECT_EQ(lists_.read(*stream).value, QXValue(QXDictionary{{"a", 1}}));
}

TEST_F(LinuxPropertyListsTest, ReadsFromAnyStream) {
  std::istringstream stream("<plist version=\"1.0\"><string>x</string></plist>");
  const auto result = lists_.read(stream);
  EXPECT_EQ(result.value, QXValue("x"));
  EXPECT_FALSE(result.error);
}

TEST_F(LinuxPropertyListsTest, AFailingReadIsNotTakenForTheEndOfTheFile) {
  writeText(path_, *propertyListXML({{"a", std::string(100000, 'x')}}));
  const auto stream = lists_.openStream(path_);
  ASSERT_NE(stream, nullptr);
  SystemCalls calls({.number = 3, .span = FailureSpan::forGood, .error = EIO});
  const auto result = lists_.read(*stream);
  EXPECT_TRUE(calls.hasFailed());
  EXPECT_FALSE(result.value);
  ASSERT_TRUE(result.error);
  EXPECT_EQ(result.error->texts.at("description"), "The file cannot be read.");
}

TEST_F(LinuxPropertyListsTest, WrittenFilesBelongToTheOwnerAlone) {
  ASSERT_TRUE(lists_.writeXMLAtomically({}, path_));
  struct stat status {};
  ASSERT_EQ(::stat(path_.c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
  EXPECT_EQ(directory_.names(), std::set<std::string>{"list"});
}

TEST_F(LinuxPropertyListsTest, AFileWrittenByThisObjectIsNotReadAgainBeforeTheNextWrite) {
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, path_));
  SystemCalls calls;
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 2}}, path_));
  EXPECT_EQ(std::count(calls.names().begin(), calls.names().end(), "read"), 0);
}

TEST_F(LinuxPropertyListsTest, AFileSpoiledAfterItWasWrittenIsKeptToo) {
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, path_));
  writeText(path_, kUnreadable);
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 2}}, path_));
  EXPECT_EQ(readText(directory_.path("list.unreadable-1")), kUnreadable);
}

TEST_F(LinuxPropertyListsTest, ADanglingLinkIsKeptBeside) {
  std::filesystem::create_symlink("nowhere", path_);
  ASSERT_TRUE(lists_.writeXMLAtomically({{"a", 1}}, path_));
  EXPECT_TRUE(std::filesystem::is_regular_file(path_));
  EXPECT_EQ(std::filesystem::read_symlink(directory_.path("list.unreadable-1")), "nowhere");
}

// What is at the path before the write whose system calls fail one after the other.
struct Before {
  std::string name;
  std::string text;  // empty: nothing

  friend std::ostream& operator<<(std::ostream& stream, const Before& before) { return stream << before.name; }
};

class LinuxPropertyListsFaults : public ::testing::TestWithParam<Before> {
 protected:
  static const QXDictionary& newList() {
    static const QXDictionary kList = {{"new", "list"}};
    return kList;
  }

  // Writes once with that failure; false when it never came.
  static bool writeWith(const CallFailure& failure) {
    const std::string old = GetParam().text;
    const TemporaryDirectory directory;
    const std::string path = directory.path("list");
    if (!old.empty()) writeText(path, old);
    LinuxPropertyLists lists;
    bool written = false;
    std::string trace;
    bool failed = false;
    {
      SystemCalls calls(failure);
      written = lists.writeXMLAtomically(newList(), path);
      failed = calls.hasFailed();
      for (const std::string& name : calls.names()) trace += " " + name;
    }
    SCOPED_TRACE("failing call " + std::to_string(failure.number) + ", error " + std::to_string(failure.error) + ":" + trace);
    checkAfterwards(directory, old, written);
    if (!failed) {
      EXPECT_TRUE(written);
    }
    return failed;
  }

  static void checkAfterwards(const TemporaryDirectory& directory, const std::string& old, bool written) {
    const std::string now = *propertyListXML(newList());
    const std::string path = directory.path("list");
    const bool isThere = std::filesystem::exists(path);
    std::string kept;
    for (const std::string& name : directory.names()) {
      if (name == "list") continue;
      EXPECT_TRUE(name == "list.unreadable-1" || name == "list.unreadable-2") << name;
      kept = readText(directory.path(name));
      EXPECT_EQ(kept, old);
    }
    if (written) {
      EXPECT_EQ(readText(path), now);
      if (old == kUnreadable) {
        EXPECT_EQ(kept, old);
      }
    } else if (isThere) {
      EXPECT_TRUE(readText(path) == old || readText(path) == now) << readText(path);
    } else {
      EXPECT_TRUE(old.empty() || (old == kUnreadable && kept == old));
    }
  }
};

TEST_P(LinuxPropertyListsFaults, TheFileIsTheOldOneOrTheNewOneWhicheverCallFails) {
  constexpr std::size_t kMostCalls = 100;
  for (const FailureSpan span : {FailureSpan::once, FailureSpan::forGood}) {
    for (const int error : {EIO, ENOSPC, EINTR, EPERM, EEXIST}) {
      // An interrupted call that is interrupted for ever would be repeated for ever.
      if (span == FailureSpan::forGood && error == EINTR) continue;
      std::size_t number = 1;
      while (number < kMostCalls && writeWith({number, span, error})) ++number;
      EXPECT_GT(number, 7U);
      EXPECT_LT(number, kMostCalls);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(Before, LinuxPropertyListsFaults,
                         ::testing::Values(Before{"Nothing", ""}, Before{"AList", *propertyListXML({{"old", "list"}})},
                                           Before{"AnUnreadableFile", kUnreadable}),
                         [](const auto& info) { return info.param.name; });

}  // namespace
}  // namespace docuvend::linux_platform
