#include "platform/linux/files/PropertyListParser.h"

#include <expat.h>

#include <climits>
#include <optional>
#include <string>
#include <utility>

#include "platform/linux/files/PropertyListBuilder.h"
#include "platform/linux/files/property_list_scalars.h"

namespace docuvend::linux_platform {
namespace {

static_assert(kPropertyListMaximumBytes <= INT_MAX, "the XML reader counts in int");

enum class Piece { more, last };

struct FreeParser {
  void operator()(XML_Parser parser) const { XML_ParserFree(parser); }
};

}  // namespace

QXError noPropertyListError(std::string description) {
  return QXError::make(kQXGeneralErrorDomain, kNoPropertyListError, std::move(description));
}

// The XML reader's callbacks, which hand everything on to the builder. The first refusal stops the reader; it may still call back once or
// twice after that, so every callback looks.
class PropertyListParser::Reader {
 public:
  Reader() : parser_(XML_ParserCreate(/*encoding=*/nullptr)) {
    if (!parser_) {
      refusal_ = "no memory for the XML reader";
      return;
    }
    XML_SetUserData(parser_.get(), this);
    XML_SetElementHandler(parser_.get(), onStart, onEnd);
    XML_SetCharacterDataHandler(parser_.get(), onText);
    XML_SetStartDoctypeDeclHandler(parser_.get(), onDocumentType);
    XML_SetSkippedEntityHandler(parser_.get(), onSkippedEntity);
  }

  bool parse(std::string_view text, Piece piece) {
    if (refusal_) return false;
    bytes_ += text.size();
    if (bytes_ > kPropertyListMaximumBytes) {
      refusal_ = "the text is too long";
      return false;
    }
    const auto status = XML_Parse(parser_.get(), text.data(), static_cast<int>(text.size()), piece == Piece::last ? XML_TRUE : XML_FALSE);
    if (status == XML_STATUS_OK) return true;
    if (!refusal_) refuse(XML_ErrorString(XML_GetErrorCode(parser_.get())));
    return false;
  }

  std::variant<QXValue, QXError> finish() {
    if (!parse({}, Piece::last)) return noPropertyListError("Not a property list: " + *refusal_ + ".");
    return *builder_.takeValue();
  }

 private:
  static void XMLCALL onStart(void* self, const XML_Char* name, const XML_Char** attributes) {
    auto& reader = *static_cast<Reader*>(self);
    reader.take(name, &PropertyListBuilder::beginElement);
    for (; *attributes != nullptr && !reader.refusal_; attributes += 2) {
      if (const auto refusal = reader.builder_.attribute(attributes[0], attributes[1])) reader.refuse(*refusal);
    }
  }
  static void XMLCALL onEnd(void* self, const XML_Char*) {
    auto& reader = *static_cast<Reader*>(self);
    if (reader.refusal_) return;
    if (const auto refusal = reader.builder_.endElement()) reader.refuse(*refusal);
  }
  static void XMLCALL onText(void* self, const XML_Char* text, int length) {
    static_cast<Reader*>(self)->take({text, static_cast<std::size_t>(length)}, &PropertyListBuilder::text);
  }
  static void XMLCALL onDocumentType(void* self, const XML_Char*, const XML_Char*, const XML_Char*, int hasInternalSubset) {
    if (hasInternalSubset != 0) static_cast<Reader*>(self)->refuse("the document type has declarations of its own");
  }
  // A document type that names further declarations makes unknown entities legal XML; they are still unknown.
  static void XMLCALL onSkippedEntity(void* self, const XML_Char* name, int) {
    static_cast<Reader*>(self)->refuse("the entity \"" + std::string(name) + "\" is not known");
  }

  void take(std::string_view text, PropertyListBuilder::Refusal (PropertyListBuilder::*step)(std::string_view)) {
    if (refusal_) return;
    if (const auto refusal = (builder_.*step)(text)) refuse(*refusal);
  }

  void refuse(const std::string& why) {
    if (refusal_) return;
    refusal_ = "line " + std::to_string(XML_GetCurrentLineNumber(parser_.get())) + ": " + why;
    XML_StopParser(parser_.get(), /*resumable=*/XML_FALSE);
  }

  std::unique_ptr<std::remove_pointer_t<XML_Parser>, FreeParser> parser_;
  PropertyListBuilder builder_;
  std::size_t bytes_ = 0;
  std::optional<std::string> refusal_;
};

PropertyListParser::PropertyListParser() : reader_(std::make_unique<Reader>()) {}
PropertyListParser::~PropertyListParser() = default;

bool PropertyListParser::feed(std::string_view text) { return reader_->parse(text, Piece::more); }

std::variant<QXValue, QXError> PropertyListParser::finish() { return reader_->finish(); }

}  // namespace docuvend::linux_platform
