#include "platform/xml_text.h"

#include <gtest/gtest.h>

#include <string>

namespace docuvend {
namespace {

TEST(XMLText, IsUTF8WithoutTheCharactersThatXMLCannotCarry) {
  for (const std::string& text : {std::string(), std::string("plain & <marked>"), std::string("\t\n\r"), std::string("\x7F"),
                                  std::string("\xE2\x80\xAE\xF0\x9F\x98\x80"), std::string("\xEF\xBF\xBD")}) {
    EXPECT_TRUE(qxIsXMLText(text)) << text;
  }
  for (const std::string& text :
       {std::string("\0", 1), std::string("\x01"), std::string("a\x1B[31m"), std::string("\x1F"), std::string("\xEF\xBF\xBE"),
        std::string("a\xEF\xBF\xBF"), std::string("\xFF"), std::string("\xED\xA0\x80")}) {
    EXPECT_FALSE(qxIsXMLText(text)) << text;
  }
}

}  // namespace
}  // namespace docuvend
