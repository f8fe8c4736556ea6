// docuvend-message-catalogue CATALOGUE ROOT FILE...: writes the catalogue of the messages in those source files, named below the root.
#include <cstdlib>
#include <exception>
#include <fstream>
#include <iostream>
#include <iterator>
#include <span>
#include <stdexcept>
#include <string>

#include "tests/messages/catalogue/Catalogue.h"
#include "tests/messages/catalogue/MessageScanner.h"

namespace {

void addFile(docuvend::tests::Catalogue& catalogue, const std::string& root, const std::string& file) {
  std::ifstream stream(root + "/" + file, std::ios::binary);
  const std::string source{std::istreambuf_iterator<char>(stream), {}};
  if (source.empty()) throw std::invalid_argument("nothing to read");
  for (const auto& message : docuvend::tests::messagesIn(source)) catalogue.add(file + ":" + std::to_string(message.line), message.text);
}

}  // namespace

int main(int count, char** words) {
  const std::span arguments(words, static_cast<std::size_t>(count));
  if (count < 4) return EXIT_FAILURE;
  docuvend::tests::Catalogue catalogue;
  for (const char* file : arguments.subspan(3)) {
    try {
      addFile(catalogue, arguments[2], file);
    } catch (const std::exception& problem) {
      std::cerr << file << ": " << problem.what() << "\n";
      return EXIT_FAILURE;
    }
  }
  std::ofstream output(arguments[1]);
  catalogue.write(output);
  return output.flush() ? EXIT_SUCCESS : EXIT_FAILURE;
}
