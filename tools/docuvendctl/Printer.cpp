#include "tools/docuvendctl/Printer.h"

#include <unistd.h>

#include <string>

#include "platform/linux/log/LogText.h"
#include "tools/docuvendctl/Copy.h"
#include "tools/docuvendctl/JSONText.h"
#include "tools/docuvendctl/Outcome.h"
#include "tools/docuvendctl/PlainText.h"
#include "tools/docuvendctl/Terminal.h"
#include "tools/docuvendctl/TerminalText.h"

namespace docuvend::ctl {
namespace {

Failure printBytes(const Contents& contents, OutputForm form) {
  if (form != OutputForm::json) return copyAll(contents.file.number, STDOUT_FILENO);
  const std::string beginning = "{\"url\":" + jsonString(contents.url.absoluteString()) + ",\"base64\":\"";
  if (auto failure = writeAll(STDOUT_FILENO, beginning)) return failure;
  if (auto failure = copyAllAsBase64(contents.file.number, STDOUT_FILENO)) return failure;
  return writeAll(STDOUT_FILENO, "\"}\n");
}

Failure printContents(const Contents& contents, OutputForm form) {
  if (auto failure = printBytes(contents, form)) return failure;
  return contents.access ? contents.access->end() : std::nullopt;
}

}  // namespace

Printer Printer::standard(bool isJSONWanted) {
  if (isJSONWanted) return Printer(OutputForm::json);
  return Printer(isTerminal(STDOUT_FILENO) ? OutputForm::terminal : OutputForm::plain);
}

Failure Printer::print(const Answer& answer) const {
  if (const auto* contents = std::get_if<Contents>(&answer)) return printContents(*contents, form_);
  switch (form_) {
    case OutputForm::json:
      return writeAll(STDOUT_FILENO, jsonText(answer));
    case OutputForm::terminal:
      return writeAll(STDOUT_FILENO, terminalText(answer, terminalWidth(STDOUT_FILENO)));
    case OutputForm::plain:
      break;
  }
  return writeAll(STDOUT_FILENO, plainText(answer));
}

void Printer::complain(const QXError& error) const {
  std::string line;
  if (form_ == OutputForm::json) {
    line = jsonText(error);
  } else {
    line = "docuvendctl: " + linux_platform::visibleLogText(messageOf(error)) + "\n";
  }
  // There is nobody left to tell.
  (void)writeAll(STDERR_FILENO, line);
}

}  // namespace docuvend::ctl
