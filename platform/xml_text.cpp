#include "platform/xml_text.h"

#include <algorithm>

#include "platform/QXURL.h"

namespace docuvend {
namespace {

// As bytes: two characters that are none.
constexpr std::string_view kNoCharacter = "\xEF\xBF\xBE";
constexpr std::string_view kNoCharacterEither = "\xEF\xBF\xBF";

bool isUncarriedControl(char c) { return static_cast<unsigned char>(c) < ' ' && c != '\t' && c != '\n' && c != '\r'; }

}  // namespace

bool qxIsXMLText(std::string_view text) {
  if (!qxIsValidUTF8(text)) return false;
  if (text.find(kNoCharacter) != std::string_view::npos || text.find(kNoCharacterEither) != std::string_view::npos) return false;
  return std::none_of(text.begin(), text.end(), isUncarriedControl);
}

}  // namespace docuvend
