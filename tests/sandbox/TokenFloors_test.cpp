#include "platform/linux/sandbox/TokenFloors.h"

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

namespace docuvend::linux_platform {
namespace {

constexpr const char* kHeader = "docuvend-token-floors:2\n";

TEST(TokenFloors, LetEveryNumberThatWasGivenOutPassAtFirst) {
  const TokenFloors floors;
  EXPECT_EQ(floors.number(), 1U);
  EXPECT_TRUE(floors.isGood("/a/b", 1));
  EXPECT_FALSE(floors.isGood("/a/b", 2)) << "it is from a future that this session has not seen";
}

TEST(TokenFloors, CutWhatLiesBelowTheDirectoryAndNothingElse) {
  TokenFloors floors;
  floors.raise("/a/b/");
  EXPECT_EQ(floors.number(), 2U);
  const std::vector<std::pair<const char*, bool>> table = {
      {"/a/b/c", false}, {"/a/b/c/d", false}, {"/a/b/.c", false}, {"/a/b", true}, {"/a/bc", true},
      {"/a/bc/d", true}, {"/a/c", true},      {"/b/c", true},     {"/c", true},   {"/x/a/b/c", true},
  };
  for (const auto& [path, passes] : table) {
    EXPECT_EQ(floors.isGood(path, 1), passes) << path;
    EXPECT_TRUE(floors.isGood(path, 2)) << path;
    EXPECT_FALSE(floors.isGood(path, 3)) << path;
  }
}

TEST(TokenFloors, HoldAPathToTheHighestFloorAboveIt) {
  TokenFloors floors;
  floors.raise("/a/");      // 2
  floors.raise("/a/b/");    // 3
  floors.raise("/a/b/c/");  // 4
  EXPECT_FALSE(floors.isGood("/a/x", 1));
  EXPECT_TRUE(floors.isGood("/a/x", 2));
  EXPECT_FALSE(floors.isGood("/a/b/x", 2));
  EXPECT_TRUE(floors.isGood("/a/b/x", 3));
  EXPECT_FALSE(floors.isGood("/a/b/c/x", 3));
  EXPECT_TRUE(floors.isGood("/a/b/c/x", 4));
  EXPECT_TRUE(floors.isGood("/b", 1));
}

TEST(TokenFloors, RiseWithEachCutOfOneDirectory) {
  TokenFloors floors;
  floors.raise("/a/");
  floors.raise("/a/");
  EXPECT_FALSE(floors.isGood("/a/x", 2));
  EXPECT_TRUE(floors.isGood("/a/x", 3));
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:3\nfloor:3:/a/\n");
}

TEST(TokenFloors, CutEverythingAtTheRoot) {
  TokenFloors floors;
  floors.raise("/a/");
  floors.raise("/");
  for (const char* path : {"/a/x", "/x", "/b/c/d"}) {
    EXPECT_FALSE(floors.isGood(path, 2)) << path;
    EXPECT_TRUE(floors.isGood(path, 3)) << path;
  }
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:3\nfloor:3:/\n");
}

TEST(TokenFloors, ForgetTheFloorsBelowOneThatTakesTheirPlace) {
  TokenFloors floors;
  floors.raise("/a/b/");
  floors.raise("/ab/");
  floors.raise("/a/");
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:4\nfloor:4:/a/\nfloor:3:/ab/\n");
}

TEST(TokenFloors, CollapseIntoOneForEverythingBeyondTheirMaximum) {
  TokenFloors floors;
  for (std::size_t i = 0; i < TokenFloors::kMaximumDirectories; ++i) floors.raise("/" + std::to_string(i) + "/");
  EXPECT_TRUE(floors.isGood("/elsewhere", 1));
  EXPECT_TRUE(floors.isGood("/0/x", 2));
  floors.raise("/0/");
  EXPECT_TRUE(floors.isGood("/elsewhere", 1)) << "one that was there is not one more";
  const TokenNumber before = floors.number();
  floors.raise("/one more/");
  for (const char* path : {"/elsewhere", "/0/x", "/one more/x"}) {
    EXPECT_FALSE(floors.isGood(path, before)) << path;
    EXPECT_TRUE(floors.isGood(path, before + 1)) << path;
  }
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:67\nfloor:67:/\n");
  floors.raise("/0/");
  EXPECT_FALSE(floors.isGood("/0/x", before + 1));
  EXPECT_TRUE(floors.isGood("/1/x", before + 1));
}

TEST(TokenFloors, AreReadBackAsTheyWere) {
  TokenFloors floors;
  EXPECT_EQ(TokenFloors::parsed(floors.printed()), floors);
  std::string everyByte = "/";
  for (int byte = 1; byte < 256; ++byte) everyByte += static_cast<char>(byte);
  const std::string longest = "/" + std::string(kMaximumTokenPathLength - 2, '\x01') + "/";
  for (const std::string& directory : {std::string("/a/"), everyByte + "/", longest}) floors.raise(directory);
  EXPECT_FALSE(floors.isGood(everyByte + "/x", 1));
  EXPECT_EQ(TokenFloors::parsed(floors.printed()), floors);
  floors.raise("/");
  EXPECT_EQ(TokenFloors::parsed(floors.printed()), floors);
}

TEST(TokenFloors, RememberTheirPlacesWhateverIsCut) {
  TokenFloors floors;
  EXPECT_EQ(floors.places(), std::nullopt);
  TokenFloors::Fingerprint places{};
  places.front() = 0xab;
  floors.setPlaces(places);
  floors.raise("/a/");
  EXPECT_EQ(floors.places(), places);
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:2\nplaces:ab" + std::string(62, '0') + "\nfloor:2:/a/\n");
  EXPECT_EQ(TokenFloors::parsed(floors.printed()), floors);
}

TEST(TokenFloors, KeepADirectoryOutThatNoTokenCanLieBelow) {
  TokenFloors floors;
  floors.raise("/" + std::string(kMaximumTokenPathLength - 1, 'a') + "/");
  EXPECT_EQ(floors.printed(), std::string(kHeader) + "number:2\n");
}

TEST(TokenFloors, HaveATextWithinTheirMaximumWhateverIsCut) {
  TokenFloors floors;
  for (std::size_t i = 0; i < TokenFloors::kMaximumDirectories; ++i) {
    floors.raise("/" + std::to_string(100 + i) + std::string(kMaximumTokenPathLength - 5, '\x01') + "/");
  }
  EXPECT_FALSE(floors.isGood("/100" + std::string(kMaximumTokenPathLength - 5, '\x01') + "/x", 1));
  EXPECT_TRUE(floors.isGood("/x", 1));
  EXPECT_LE(floors.printed().size() + TokenFloors::kMaximumDirectories * kMaximumTokenNumberDigits, TokenFloors::kMaximumTextLength);
  EXPECT_EQ(TokenFloors::parsed(floors.printed()), floors);
}

TEST(TokenFloors, AreReadStrictly) {
  const std::string header = kHeader;
  std::string tooMany = header + "number:9\n";
  for (std::size_t i = 0; i <= TokenFloors::kMaximumDirectories; ++i) tooMany += "floor:2:/" + std::to_string(100 + i) + "/\n";
  const std::string places = "places:" + std::string(64, 'a') + "\n";
  const std::vector<std::string> bad = {
      header + places,
      header + places + "number:3\n",
      header + "number:3\n" + places + places,
      header + "number:3\nplaces:\n",
      header + "number:3\nplaces:" + std::string(63, 'a') + "\n",
      header + "number:3\nplaces:" + std::string(65, 'a') + "\n",
      header + "number:3\nplaces:" + std::string(64, 'A') + "\n",
      header + "number:3\nplaces:" + std::string(64, 'a'),
      header + "number:3\nfloor:2:/a/\n" + places,
      "",
      header,
      "docuvend-token-floors:1\nnumber:3\n",
      "docuvend-token-floors:02\nnumber:3\n",
      "docuvend-token-floors:2\r\nnumber:3\n",
      "\n" + header + "number:3\n",
      "number:3\n",
      header + "number:3",
      header + "number:\n",
      header + "number:0\n",
      header + "number:03\n",
      header + "number:+3\n",
      header + "number: 3\n",
      header + "number:3 \n",
      header + "number:1000000000000000000\n",
      header + "Number:3\n",
      header + "number:3\n\n",
      header + "number:3\nnumber:3\n",
      header + "number:3\nfloor:2:/a/",
      header + "number:3\nfloor:2:/a\n",
      header + "number:3\nfloor:2:a/\n",
      header + "number:3\nfloor:2:\n",
      header + "number:3\nfloor:2\n",
      header + "number:3\nfloor::/a/\n",
      header + "number:3\nfloor:0:/a/\n",
      header + "number:3\nfloor:02:/a/\n",
      header + "number:3\nfloor:4:/a/\n",
      header + "number:3\nfloor:2:/a b/\n",
      header + "number:3\nfloor:2:/%41/\n",
      header + "number:3\nfloor:2:/a%2/\n",
      header + "number:3\nfloor:2:/a/ \n",
      header + "number:3\nfloor:2:/a/\nfloor:2:/a/\n",
      header + "number:3\nfloor:2:/a/\nfloor:3:/a/\n",
      header + "number:3\nfloor:2:/b/\nfloor:2:/a/\n",
      header + "number:3\nfloor:2:/a/\n\n",
      header + "number:3\nfloor:2:/a/\nmore\n",
      header + "number:3\nfloor:2:/" + std::string(kMaximumTokenPathLength, 'a') + "/\n",
      tooMany,
  };
  for (const std::string& text : bad) EXPECT_EQ(TokenFloors::parsed(text), std::nullopt) << text;
  for (const std::string& text : {header + "number:3\n", header + "number:3\n" + places, header + "number:3\nfloor:2:/a/\nfloor:3:/b/\n",
                                  header + "number:3\nfloor:3:/\n", tooMany.substr(0, tooMany.rfind("floor"))}) {
    EXPECT_TRUE(TokenFloors::parsed(text)) << text;
  }
}

}  // namespace
}  // namespace docuvend::linux_platform
