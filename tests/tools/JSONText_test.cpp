#include "tools/docuvendctl/JSONText.h"

#include <gtest/gtest.h>

#include <nlohmann/json.hpp>
#include <string>
#include <vector>

#include "tests/tools/Answers.h"

namespace docuvend::ctl {
namespace {

TEST(JSONText, EveryAnswerIsOneLineOfOneValue) {
  const std::vector<std::pair<Answer, std::string>> table = {
      {Nothing{}, "{}"},
      {Line{"string", "docuvend:p/\"\n"}, R"({"string":"docuvend:p/\"\n"})"},
      {Page{"help", "a\nb\n"}, R"({"help":"a\nb\n"})"},
      {kEmpty, "[]"},
      {kGrants, R"([{"provider":"org.p","item":"1","consumer":"org.c"},{"provider":"org.provider","item":"22","consumer":"org.cc"}])"},
      {kRecord, R"({"url":"file:///x%20y","token":"docuvend-token:1"})"},
      {Record{}, "{}"},
      {Record{{{"bundle", QXValue("b")}, {"grants", kEmpty}, {"unknown", QXValue()}}}, R"({"bundle":"b","grants":[],"unknown":null})"},
      {Record{{{"a", kNested}}}, R"({"a":{"empty":[],"list":["one",2,{"key":"value"}],"number":3}})"},
      {List{{"v"}, {{true}, {-7}, {1.5}, {QXValue()}}}, R"([{"v":true},{"v":-7},{"v":1.5},{"v":null}])"},
      {Line{"string", "\xff"}, "{\"string\":\"\ufffd\"}"},
      {Record{{{"data", QXValue(QXData::fromText("ab"))}}}, R"({"data":"<2 bytes>"})"},
  };
  for (const auto& [answer, expected] : table) {
    EXPECT_EQ(jsonText(answer), expected + "\n");
    EXPECT_FALSE(nlohmann::json::parse(jsonText(answer), nullptr, /*allow_exceptions=*/false).is_discarded()) << expected;
  }
}

TEST(JSONText, AnErrorIsAnObjectWithDomainCodeAndDescription) {
  EXPECT_EQ(jsonText(QXError::make("D", 7, "no \"x\"")),
            "{\"error\":{\"domain\":\"D\",\"code\":7,\"description\":\"D 7: no \\\"x\\\"\"}}\n");
}

TEST(JSONText, AStringIsQuoted) { EXPECT_EQ(jsonString("a\"\\\n"), R"("a\"\\\n")"); }

}  // namespace
}  // namespace docuvend::ctl
