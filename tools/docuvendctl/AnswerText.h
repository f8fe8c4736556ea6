// An answer as text: for scripts, for a terminal, as JSON. Functions of values; a file's bytes are no text and go past them (Printer.h).
#pragma once

#include <cstddef>
#include <string>

#include "platform/QXError.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

// For scripts, and stable. A list is one line for each row, its values with tabs between them; a record is one line for each field, its
// name, a tab, its value or values. So that a value can forge neither line nor column, backslash, tab, line feed and carriage return in
// it are written "\\", "\t", "\n" and "\r". A line's text and a page stay as they are. Nothing is left out or cut.
[[nodiscard]] std::string plainText(const Answer& answer);

// For a person: columns aligned below their names, shortened with an ellipsis where the terminal is too narrow; a record's values whole.
// Whatever would steer the terminal is made visible.
[[nodiscard]] std::string terminalText(const Answer& answer, std::size_t width);

// One JSON object, for a list an array of objects, in one line.
[[nodiscard]] std::string jsonText(const Answer& answer);
// {"error":{"domain":...,"code":...,"description":...}}
[[nodiscard]] std::string jsonText(const QXError& error);
// The text with quotes.
[[nodiscard]] std::string jsonString(const std::string& text);

// A record whose every value is a text or a list of texts: what lies in dictionaries gets their keys before its own, with dots between.
// An array of values becomes a list with one nameless column.
[[nodiscard]] Record flattened(const Record& record);
// A value that is no container, as people read it.
[[nodiscard]] std::string scalarText(const QXValue& value);

}  // namespace docuvend::ctl
