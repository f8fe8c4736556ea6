#include "tools/docuvendctl/Run.h"

#include <unistd.h>

#include <memory>
#include <variant>

#include "tools/docuvendctl/CommandLine.h"
#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/ConnectionOptions.h"
#include "tools/docuvendctl/Printer.h"
#include "tools/docuvendctl/ProgressLine.h"
#include "tools/docuvendctl/Terminal.h"

namespace docuvend::ctl {
namespace {

// Brings each kind of command together with whom it needs.
class Runner {
 public:
  explicit Runner(const CommandLine& line) : line_(line) {}

  Result<Answer> operator()(LocalCommand command) const { return command(line_.call); }

  Result<Answer> operator()(AdministratorCommand command) const {
    auto connected = Administrator::connect(administratorOptions(line_.call.deadline));
    if (auto* error = std::get_if<QXError>(&connected)) return *error;
    return command(*std::get<std::unique_ptr<Administrator>>(connected), line_.call);
  }

  Result<Answer> operator()(ConsumerCommand command) const {
    auto connected = Consumer::connect(consumerOptions(line_.actAs, line_.call.deadline));
    if (auto* error = std::get_if<QXError>(&connected)) return *error;
    return command(*std::get<std::unique_ptr<Consumer>>(connected), line_.call);
  }

 private:
  const CommandLine& line_;
};

ExitStatus fail(const Printer& printer, const QXError& error) {
  printer.complain(error);
  return statusOf(error);
}

}  // namespace

ExitStatus run(const std::vector<std::string>& words) {
  auto parsed = parseCommandLine(words, CommandTable::all());
  if (const auto* wrong = std::get_if<UsageError>(&parsed)) {
    return fail(Printer::standard(wrong->isJSONWanted), makeControlError(ControlErrorCode::usage, wrong->text));
  }
  auto& line = std::get<CommandLine>(parsed);
  const Printer printer = Printer::standard(line.isJSONWanted);

  ProgressLine progress(STDERR_FILENO);
  if (!line.isJSONWanted && isTerminal(STDERR_FILENO)) {
    line.call.progress = [&progress](const Progress& now) { progress.show(now); };
  }
  const auto answer = std::visit(Runner(line), line.command->run);
  progress.clear();

  if (const auto* error = std::get_if<QXError>(&answer)) return fail(printer, *error);
  if (const auto failure = printer.print(std::get<Answer>(answer))) return fail(printer, *failure);
  const auto* report = std::get_if<Report>(&std::get<Answer>(answer));
  return report == nullptr ? ExitStatus::done : report->status;
}

}  // namespace docuvend::ctl
