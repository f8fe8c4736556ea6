#include "platform/linux/coordination/ApplicationLines.h"

#include <gtest/gtest.h>

#include <memory>

#include "tests/coordination/RecordingProvider.h"
#include "tests/coordination/Turns.h"

namespace docuvend::linux_platform {
namespace {

using testing::fileNamed;
using testing::RecordingProvider;

const Application kEditor = "com.example.editor";
const Application kOther = "com.example.other";

struct ApplicationLinesTest : ::testing::Test {
  // One begins and stays under way; so many more may.
  void fill(const Application& application) {
    lines.enter(provider, application, fileNamed("a long work of " + application.value_or("nobody")));
    ASSERT_TRUE(lines.begin(provider, application));
  }

  const FileKey f = fileNamed("f");
  const FileKey g = fileNamed("g");
  const FileKey h = fileNamed("h");
  const ApplicationLines::Provider provider = std::make_shared<RecordingProvider>();
  ApplicationLines lines{1};
};

TEST_F(ApplicationLinesTest, HaveNobodyAtFirst) {
  EXPECT_FALSE(lines.begin(provider, kEditor));
  EXPECT_TRUE(lines.isEmpty());
}

TEST_F(ApplicationLinesTest, BeginWhatCameFirstWhenThereIsRoom) {
  lines.enter(provider, kEditor, f);
  lines.enter(provider, kEditor, g);
  lines.enter(provider, kEditor, f);
  EXPECT_EQ(lines.begin(provider, kEditor), f);
  EXPECT_FALSE(lines.begin(provider, kEditor));
  lines.end(provider, kEditor);
  EXPECT_EQ(lines.begin(provider, kEditor), g);
  lines.end(provider, kEditor);
  EXPECT_FALSE(lines.begin(provider, kEditor)) << "it stood in the line once";
  EXPECT_TRUE(lines.isEmpty());
}

TEST_F(ApplicationLinesTest, HaveTheirRoomForEachApplicationAndObject) {
  const ApplicationLines::Provider other = std::make_shared<RecordingProvider>();
  fill(kEditor);
  lines.enter(provider, kEditor, f);
  lines.enter(provider, /*application=*/{}, g);
  lines.enter(other, kEditor, f);
  EXPECT_FALSE(lines.begin(provider, kEditor));
  EXPECT_EQ(lines.begin(provider, /*application=*/{}), g);
  EXPECT_EQ(lines.begin(other, kEditor), f);
  lines.end(provider, kEditor);
  EXPECT_EQ(lines.begin(provider, kEditor), f) << "the other object's is another one";
}

TEST_F(ApplicationLinesTest, BeginAFileOfSeveralOnceWhereThereIsRoomFirst) {
  fill(kEditor);
  fill(kOther);
  for (const FileKey& file : {f, g}) {
    lines.enter(provider, kEditor, file);
    lines.enter(provider, kOther, file);
  }
  lines.end(provider, kOther);
  EXPECT_EQ(lines.begin(provider, kOther), f);
  lines.end(provider, kEditor);
  EXPECT_EQ(lines.begin(provider, kEditor), g);
  lines.end(provider, kEditor);
  EXPECT_FALSE(lines.begin(provider, kEditor));
  lines.end(provider, kOther);
  EXPECT_FALSE(lines.begin(provider, kOther));
  EXPECT_TRUE(lines.isEmpty());
}

TEST_F(ApplicationLinesTest, AreLeftByWhoeverGivesUp) {
  fill(kEditor);
  fill(kOther);
  for (const FileKey& file : {f, g, h}) {
    lines.enter(provider, kEditor, file);
    lines.enter(provider, kOther, file);
  }
  lines.leave(provider, kEditor, f);
  lines.leave(provider, kEditor, f);
  lines.leave(provider, /*application=*/{}, g);
  lines.leaveAll(provider, g);
  lines.leaveAll(provider, g);
  lines.end(provider, kEditor);
  EXPECT_EQ(lines.begin(provider, kEditor), h);
  lines.end(provider, kOther);
  EXPECT_EQ(lines.begin(provider, kOther), f) << "of these it is still wanted";
  lines.leave(provider, kOther, f);
  lines.end(provider, kEditor);
  lines.end(provider, kOther);
  EXPECT_TRUE(lines.isEmpty());
  lines.enter(provider, kEditor, f);
  lines.leave(provider, kEditor, f);
  EXPECT_TRUE(lines.isEmpty());
}

}  // namespace
}  // namespace docuvend::linux_platform
