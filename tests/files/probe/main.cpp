// relationship_probe DIRECTORY ITEM...: prints one line, for each item its relationship to the directory as a number, or minus the
// error's code.

#include <iostream>
#include <variant>

#include "platform/linux/files/LinuxFileSystem.h"

int main(int count, char** arguments) {
  using namespace docuvend;
  linux_platform::LinuxFileSystem fileSystem{linux_platform::Paths{}};
  for (int i = 2; i < count; ++i) {
    const auto answer =
        fileSystem.relationship(QXURL::fileURL(arguments[1], QXURLKind::directory), QXURL::fileURL(arguments[i], QXURLKind::file));
    const auto* error = std::get_if<QXError>(&answer);
    std::cout << (i > 2 ? " " : "") << (error != nullptr ? -error->code : static_cast<int>(std::get<QXRelationship>(answer)));
  }
  std::cout << std::endl;
}
