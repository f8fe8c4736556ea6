// A file takes the place of the one that is meant and of no other, whatever others do between the steps.
#include <cerrno>
#include <optional>
#include <stdexcept>
#include <string>

#include "tests/cellar/BeforeExchange.h"
#include "tests/cellar/CellarHouse.h"

namespace docuvend::cellar {
namespace {

class ReplacementTest : public CellarHouse {
 protected:
  ReplacementTest() {
    fs::create_directories(storage);
    write(path(), "old");
    old = fingerprintAt(path());
    replacement.emplace(storage + "/.new");
    if (!writeAll(replacement->file(), "new", 3)) throw std::runtime_error("no file for a test");
  }

  [[nodiscard]] std::string path() const { return local("a.txt"); }
  // It does not get the place.
  void expectRefused() {
    const auto refused = replacement->commitOver(path(), old);
    ASSERT_TRUE(refused);
    EXPECT_EQ(refused->code, EAGAIN) << refused->description();
  }

  std::optional<Fingerprint> old;
  std::optional<Replacement> replacement;
};

TEST_F(ReplacementTest, TakesThePlaceOfTheFileThatIsMeant) {
  const auto error = replacement->commitOver(path(), old);
  EXPECT_FALSE(error) << error->description();
  EXPECT_EQ(read(path()), "new");
  EXPECT_EQ(names(storage), std::vector<std::string>{"a.txt"});
}

TEST_F(ReplacementTest, AFileThatSomebodyHasPutInThePlaceStays) {
  save("a.txt", "saved");
  expectRefused();
  EXPECT_EQ(read(path()), "saved");
}

TEST_F(ReplacementTest, AFileThatSomebodyHasWrittenStays) {
  write(path(), "written");
  expectRefused();
  EXPECT_EQ(read(path()), "written");
}

TEST_F(ReplacementTest, AFileThatComesWhereNothingWasMeantStays) {
  old.reset();
  expectRefused();
  EXPECT_EQ(read(path()), "old");
}

TEST_F(ReplacementTest, AFileThatSomebodyHasRemovedStaysRemoved) {
  fs::remove(path());
  expectRefused();
  EXPECT_FALSE(fs::exists(path()));
}

TEST_F(ReplacementTest, OfSeveralSavesInTheMiddleTheLastOneStays) {
  const BeforeExchange middle(
      {[this] { save("a.txt", "first"); }, [this] { save("a.txt", "second"); }, [this] { save("a.txt", "third"); }});
  expectRefused();
  EXPECT_EQ(middle.count(), 4U);
  EXPECT_EQ(read(path()), "third");
}

TEST_F(ReplacementTest, ASaveInTheMiddleComesBackThoughItsPlaceIsEmptyThen) {
  const BeforeExchange middle({[this] { save("a.txt", "saved"); }, [this] { fs::rename(path(), local("b.txt")); }});
  expectRefused();
  EXPECT_EQ(read(path()), "saved");
}

}  // namespace
}  // namespace docuvend::cellar
