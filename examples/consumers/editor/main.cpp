// A confined application in miniature: it opens documents by the strings that it has kept, and saves them.
//
//   editor open PATH            tries to open a file by its path, as any program would
//   editor show STRING          prints a document
//   editor append STRING TEXT   adds a line to a document and saves it, all or nothing; of several at once none loses the others' lines
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <iostream>
#include <string>

#include "sdk/Consumer.h"

namespace {

using namespace docuvend;

const ProviderID kProvider{"com.orvane.cellar"};

int fail(const QXError& error) {
  std::cerr << "editor: " << error.description() << "\n";
  return 1;
}

int openByPath(const std::string& path) {
  const int file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (file < 0) {
    std::cerr << "editor: " << path << ": " << std::strerror(errno) << "\n";
    return 1;
  }
  ::close(file);
  std::cout << "opened " << path << "\n";
  return 0;
}

Result<std::string> readAll(const QXDescriptor& file) {
  std::string contents;
  std::array<char, 4096> buffer{};
  for (;;) {
    const ssize_t count = ::read(file.number, buffer.data(), buffer.size());
    if (count < 0) return QXError::system(errno, "cannot read the document");
    if (count == 0) return contents;
    contents.append(buffer.data(), static_cast<std::size_t>(count));
  }
}

Failure writeAll(const QXDescriptor& file, std::string_view contents) {
  while (!contents.empty()) {
    const ssize_t count = ::write(file.number, contents.data(), contents.size());
    if (count < 0) return QXError::system(errno, "cannot write the document");
    contents.remove_prefix(static_cast<std::size_t>(count));
  }
  return std::nullopt;
}

Result<std::string> contentsOf(Consumer& daemon, const Document& document) {
  auto file = daemon.open(document, kProvider, Access::read);
  if (auto* error = std::get_if<QXError>(&file)) return *error;
  return readAll(std::get<QXDescriptor>(file));
}

int show(Consumer& daemon, const Document& document) {
  auto contents = contentsOf(daemon, document);
  if (auto* error = std::get_if<QXError>(&contents)) return fail(*error);
  std::cout << std::get<std::string>(contents);
  return 0;
}

Failure addLine(Consumer& daemon, const Document& document, const std::string& text) {
  auto contents = contentsOf(daemon, document);
  if (auto* error = std::get_if<QXError>(&contents)) return *error;
  const std::string changed = std::get<std::string>(contents) + text + "\n";
  if (auto failure = daemon.replace(document, [&changed](const QXDescriptor& file) { return writeAll(file, changed); })) return failure;
  std::cout << "saved " << changed.size() << " bytes\n";
  return std::nullopt;
}

// Reading and saving are one turn: who comes meanwhile reads what was saved.
int append(Consumer& daemon, const Document& document, const std::string& text) {
  auto writing = daemon.coordinateWriting(document);
  if (auto* error = std::get_if<QXError>(&writing)) return fail(*error);
  if (auto failure = addLine(daemon, document, text)) return fail(*failure);
  if (auto failure = std::get<CoordinatedAccess>(writing).end()) return fail(*failure);
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  const std::string verb = count > 1 ? arguments[1] : "";
  if (verb == "open" && count == 3) return openByPath(arguments[2]);
  if (!(verb == "show" && count == 3) && !(verb == "append" && count == 4)) {
    std::cerr << "usage: editor open PATH | show STRING | append STRING TEXT\n";
    return 2;
  }
  auto connected = Consumer::connect({});
  if (auto* error = std::get_if<QXError>(&connected)) return fail(*error);
  Consumer& daemon = *std::get<std::unique_ptr<Consumer>>(connected);
  auto resolved = daemon.documentURL(arguments[2]);
  if (auto* error = std::get_if<QXError>(&resolved)) return fail(*error);
  const Document& document = std::get<Document>(resolved);
  return verb == "show" ? show(daemon, document) : append(daemon, document, arguments[3]);
}
