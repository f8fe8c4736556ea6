// What every adapter of property lists does, the fake included.

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>

#include "platform/fake/FakePropertyLists.h"
#include "platform/linux/files/LinuxPropertyLists.h"
#include "tests/files/TemporaryDirectory.h"

namespace docuvend {
namespace {

class FakeFiles {
 public:
  FakeFiles() { fileSystem_.addDirectory("/lists"); }

  QXPropertyLists& lists() { return lists_; }
  static std::string path(const std::string& name) { return "/lists/" + name; }
  void makeDirectory(const std::string& path) { fileSystem_.addDirectory(path); }
  void makeUnreadable(const std::string& path) { lists_.setCorrupt(path); }
  bool exists(const std::string& path) { return fileSystem_.exists(path); }

 private:
  fake_platform::FakeFileSystem fileSystem_;
  fake_platform::FakePropertyLists lists_{fileSystem_};
};

class LinuxFiles {
 public:
  QXPropertyLists& lists() { return lists_; }
  [[nodiscard]] std::string path(const std::string& name) const { return directory_.path(name); }
  static void makeDirectory(const std::string& path) { std::filesystem::create_directory(path); }
  static void makeUnreadable(const std::string& path) { test::writeText(path, "no list"); }
  static bool exists(const std::string& path) { return std::filesystem::exists(path); }

 private:
  test::TemporaryDirectory directory_;
  linux_platform::LinuxPropertyLists lists_;
};

template <class Files>
class PropertyListsBehavior : public ::testing::Test {
 protected:
  QXPropertyLists& lists() { return files_.lists(); }

  QXPropertyLists::ReadResult readFile(const std::string& path) {
    const auto stream = lists().openStream(path);
    if (!stream) {
      ADD_FAILURE() << "no stream on " << path;
      return {};
    }
    return lists().read(*stream);
  }

  Files files_;
  const std::string path_ = files_.path("list");
};

using Adapters = ::testing::Types<FakeFiles, LinuxFiles>;
TYPED_TEST_SUITE(PropertyListsBehavior, Adapters);

TYPED_TEST(PropertyListsBehavior, WhatIsWrittenReadsBack) {
  const QXDictionary dictionary = {{"p", QXDictionary{{"c", QXDictionary{{"AllowedItemIDs", QXArray{"1", "\r<&>"}}}}}},
                                   {"others", QXArray{true, 1, 0.5, QXData{{1, 2}}}}};
  ASSERT_TRUE(this->lists().writeXMLAtomically(dictionary, this->path_));
  EXPECT_TRUE(this->files_.exists(this->path_));
  const auto result = this->readFile(this->path_);
  EXPECT_EQ(result.value, QXValue(dictionary));
  EXPECT_FALSE(result.error);
}

TYPED_TEST(PropertyListsBehavior, AMissingFileMakesNoStream) { EXPECT_EQ(this->lists().openStream(this->path_), nullptr); }

TYPED_TEST(PropertyListsBehavior, ADirectoryCannotBeRead) {
  this->files_.makeDirectory(this->path_);
  const auto stream = this->lists().openStream(this->path_);
  ASSERT_TRUE(stream);
  EXPECT_TRUE(stream->bad());
  const auto result = this->lists().read(*stream);
  EXPECT_FALSE(result.value);
  EXPECT_TRUE(result.error);
}

TYPED_TEST(PropertyListsBehavior, ALaterWriteReplacesTheEarlierOne) {
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}, {"b", 1}}, this->path_));
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 2}}, this->path_));
  EXPECT_EQ(this->readFile(this->path_).value, QXValue(QXDictionary{{"a", 2}}));
  EXPECT_FALSE(this->files_.exists(this->path_ + ".unreadable-1"));
}

TYPED_TEST(PropertyListsBehavior, AFileThatIsKeptBesideStaysWhenItIsWritten) {
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
  ASSERT_TRUE(this->lists().keepBeside(this->path_));
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 2}}, this->path_));
  const auto stream = this->lists().openStream(this->path_ + ".unreadable-1");
  ASSERT_TRUE(stream);
  EXPECT_EQ(this->lists().read(*stream).value, QXValue(QXDictionary{{"a", 1}}));
}

TYPED_TEST(PropertyListsBehavior, AFileThatIsNotThereCannotBeKeptBeside) { EXPECT_FALSE(this->lists().keepBeside(this->path_)); }

TYPED_TEST(PropertyListsBehavior, AStreamThatWasOpenReadsTheOldFile) {
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
  const auto stream = this->lists().openStream(this->path_);
  ASSERT_NE(stream, nullptr);
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 2}}, this->path_));
  EXPECT_EQ(this->lists().read(*stream).value, QXValue(QXDictionary{{"a", 1}}));
}

TYPED_TEST(PropertyListsBehavior, AnUnreadableFileIsAnErrorAndStaysAsItIs) {
  this->files_.makeUnreadable(this->path_);
  for (int i = 0; i < 2; ++i) {
    const auto result = this->readFile(this->path_);
    EXPECT_FALSE(result.value);
    ASSERT_TRUE(result.error);
    EXPECT_EQ(result.error->domain, kQXGeneralErrorDomain);
    EXPECT_NE(result.error->code, kQXFileReadNoSuchFileError);
  }
  EXPECT_FALSE(this->files_.exists(this->path_ + ".unreadable-1"));
}

TYPED_TEST(PropertyListsBehavior, AnUnreadableFileIsKeptBesideWhenItIsFirstOverwritten) {
  this->files_.makeUnreadable(this->path_);
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
  EXPECT_EQ(this->readFile(this->path_).value, QXValue(QXDictionary{{"a", 1}}));
  EXPECT_TRUE(this->readFile(this->path_ + ".unreadable-1").error);
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 2}}, this->path_));
  EXPECT_FALSE(this->files_.exists(this->path_ + ".unreadable-2"));
}

TYPED_TEST(PropertyListsBehavior, EveryUnreadableFileIsKept) {
  for (const char* number : {"1", "2", "3"}) {
    this->files_.makeUnreadable(this->path_);
    ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
    EXPECT_TRUE(this->files_.exists(this->path_ + ".unreadable-" + number)) << number;
  }
}

TYPED_TEST(PropertyListsBehavior, WhatAListCannotCarryIsNotWritten) {
  ASSERT_TRUE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
  for (const QXValue& value : {QXValue(), QXValue("\x01"), QXValue("\xFF"), QXValue("\xEF\xBF\xBF"), QXValue(QXUUID{}), QXValue(1e308 * 10),
                               QXValue(QXArray{QXURL::fileURL("/a", QXURLKind::file)}), QXValue(QXDictionary{{"\x02", true}})}) {
    EXPECT_FALSE(this->lists().writeXMLAtomically({{"b", value}}, this->path_)) << value.description();
  }
  EXPECT_EQ(this->readFile(this->path_).value, QXValue(QXDictionary{{"a", 1}}));
}

TYPED_TEST(PropertyListsBehavior, NothingIsWrittenInAMissingDirectory) {
  EXPECT_FALSE(this->lists().writeXMLAtomically({{"a", 1}}, this->files_.path("missing/list")));
  EXPECT_FALSE(this->files_.exists(this->files_.path("missing")));
}

TYPED_TEST(PropertyListsBehavior, ADirectoryIsNotOverwritten) {
  this->files_.makeDirectory(this->path_);
  EXPECT_FALSE(this->lists().writeXMLAtomically({{"a", 1}}, this->path_));
  EXPECT_TRUE(this->files_.exists(this->path_));
  EXPECT_FALSE(this->files_.exists(this->path_ + ".unreadable-1"));
}

}  // namespace
}  // namespace docuvend
