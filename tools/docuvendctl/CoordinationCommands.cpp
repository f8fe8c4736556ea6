#include <unistd.h>

#include <cerrno>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/UniqueDescriptor.h"
#include "tools/docuvendctl/CommandTable.h"
#include "tools/docuvendctl/Copy.h"
#include "tools/docuvendctl/Operands.h"
#include "tools/docuvendctl/WholeFile.h"

namespace docuvend::ctl {
namespace {

using linux_platform::UniqueDescriptor;

Result<Answer> read(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto begun = consumer.coordinateReading(std::get<QXURL>(url), {.progress = call.progress});
  if (auto* error = std::get_if<QXError>(&begun)) return *error;
  auto access = std::make_shared<CoordinatedAccess>(std::get<CoordinatedAccess>(std::move(begun)));
  auto file = openWholeFile(access->url().fileSystemPath());
  if (auto* error = std::get_if<QXError>(&file)) return *error;
  return Answer(Contents{access->url(), std::get<QXDescriptor>(std::move(file)), std::move(access)});
}

// What is to be written is read before the turn at the file is asked for: it may come from somebody who is reading that file.
Result<Answer> write(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto made = temporaryFile();
  if (auto* error = std::get_if<QXError>(&made)) return *error;
  const auto& contents = std::get<UniqueDescriptor>(made);
  if (auto failure = copyAll(STDIN_FILENO, contents.get())) return *failure;
  if (::lseek(contents.get(), 0, SEEK_SET) != 0) return QXError::system(errno, "cannot read the temporary file");

  auto begun = consumer.coordinateWriting(std::get<QXURL>(url), {.progress = call.progress});
  if (auto* error = std::get_if<QXError>(&begun)) return *error;
  auto& access = std::get<CoordinatedAccess>(begun);
  if (auto failure = replaceWholeFile(access, contents.get())) return *failure;
  if (auto failure = access.end()) {
    return makeConsumerError(ConsumerErrorCode::notTold, "The file is written, but its provider could not be told.", failure);
  }
  return Answer(Nothing{});
}

// A confined program is told of neither process nor bundle; else a bundle that is not told is none.
std::vector<QXValue> rowOf(const FileHolder& holder) {
  std::vector<QXValue> row{nameOf(holder.kind), nameOf(holder.state), QXValue(), QXValue(), holder.isOwnProcess};
  if (!holder.processIdentifier) return row;
  row[2] = *holder.processIdentifier;
  row[3] = holder.bundleIdentifier ? holder.bundleIdentifier->value : std::string();
  return row;
}

Result<Answer> holders(Consumer& consumer, const Call& call) {
  auto url = parseURL(call.operands[0]);
  if (auto* error = std::get_if<QXError>(&url)) return *error;
  auto found = consumer.holders(std::get<QXURL>(url));
  if (auto* error = std::get_if<QXError>(&found)) return *error;
  List list{{"kind", "state", "pid", "bundle", "own"}, {}};
  for (const FileHolder& holder : std::get<std::vector<FileHolder>>(found)) list.rows.push_back(rowOf(holder));
  return Answer(std::move(list));
}

}  // namespace

CommandGroup coordinationCommands() {
  return {
      "Files of any program, by turns",
      {
          {"read",
           "URL",
           {},
           "print a file while nobody writes it",
           "Waits for its turn and, where the file belongs to a provider, for the contents; shows on a terminal how far these are. The "
           "turn\n"
           "lasts until all is printed. With --json prints: url, base64 (the file's bytes).\n",
           read},
          {"write",
           "URL",
           {},
           "replace a file by the standard input while nobody reads or writes it",
           "Reads all of its input first, into a temporary file in $TMPDIR, and waits for its turn then. All or nothing: who opens the "
           "file\n"
           "without waiting for a turn sees the old contents or the new. The provider hears of it. A file that is there keeps its\n"
           "permissions; a symbolic link or a directory is refused. Prints nothing.\n",
           write},
          {"holders",
           "URL",
           {},
           "list who has a file, and who waits for it",
           "Who has it comes first, then who waits, in their order.\n"
           "Columns: kind (reading or writing), state (holding, waiting, or providing while the provider brings the contents), pid and\n"
           "bundle (not told inside a confinement; bundle is empty where there is none), own (it is this program's).\n",
           holders},
      }};
}

}  // namespace docuvend::ctl
