// An absolute file URL.
//
// A URL keeps its text as it was given (percent escapes and doubled slashes included), except for the authority: "file:/p",
// "file:///p" and "file://localhost/p" are one URL and read back as "file:///p". Two URLs are equal when their texts are.
#pragma once

#include <compare>
#include <optional>
#include <string>
#include <string_view>

namespace docuvend {

enum class QXURLKind { file, directory };

class QXURL {
 public:
  // None unless the text is a file URL with an absolute path, made of the characters that a URL path may hold, with well-formed
  // percent escapes that decode to neither NUL nor invalid UTF-8, and without query or fragment.
  [[nodiscard]] static std::optional<QXURL> fromString(std::string_view text);

  // `path` is an absolute file-system path in UTF-8; a directory's URL ends in "/".
  [[nodiscard]] static QXURL fileURL(std::string_view path, QXURLKind kind);

  [[nodiscard]] const std::string& absoluteString() const { return text_; }

  // The decoded path, without a final slash (but for the root itself).
  [[nodiscard]] std::string fileSystemPath() const;

  [[nodiscard]] bool hasDirectoryPath() const { return text_.back() == '/'; }

  // Appends one component, escaping it.
  [[nodiscard]] QXURL appendingPathComponent(std::string_view component, QXURLKind kind) const;

  friend auto operator<=>(const QXURL&, const QXURL&) = default;

 private:
  explicit QXURL(std::string text) : text_(std::move(text)) {}

  std::string text_;  // "file:///" and so on, never empty
};

// True when every byte belongs to well-formed UTF-8 (shortest forms, no surrogates, at most U+10FFFF).
[[nodiscard]] bool qxIsValidUTF8(std::string_view text);

}  // namespace docuvend
