// Puts answers and failures out, in the form that was asked for: JSON, else columns for a terminal, else plain text for scripts.
#pragma once

#include "sdk/Result.h"
#include "tools/docuvendctl/Answer.h"

namespace docuvend::ctl {

enum class OutputForm { plain, terminal, json };

class Printer {
 public:
  explicit Printer(OutputForm form) : form_(form) {}
  // By what standard output is.
  [[nodiscard]] static Printer standard(bool isJSONWanted);

  [[nodiscard]] OutputForm form() const { return form_; }
  // On the standard output. The contents of a file are its bytes as they are; in JSON an object with their Base64 text, which is cut short
  // by an error in the middle.
  [[nodiscard]] Failure print(const Answer& answer) const;
  // One line on the standard error.
  void complain(const QXError& error) const;

 private:
  const OutputForm form_;
};

}  // namespace docuvend::ctl
