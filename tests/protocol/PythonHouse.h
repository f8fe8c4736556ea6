// A house with one provider and one document, and the Python scripts of this folder in it.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "tests/system/house/DaemonHouse.h"

namespace docuvend::tests {

// The provider extension in Python.
inline const std::string kShelf = "com.example.shelf";

// Runs the tests of one class in a script, with further words of the environment; it fails when one of them does, or when there is none.
void expectPythonPasses(const std::string& script, const std::string& testClass, std::vector<std::string> environment);

class PythonHouse : public SystemTest {
 protected:
  // Installs the consumers and a provider with a document in its cloud, and starts the daemon.
  void open(const std::string& provider);

  [[nodiscard]] std::string document() const { return house_.storage(provider_) + "/" + kDocument; }
  [[nodiscard]] std::string original() const { return house_.container(provider_) + "/cloud/" + kDocument; }
  // Runs the tests of a class of one of the client's scripts.
  void expectClientPasses(const std::string& script, const std::string& testClass) const;

 private:
  static constexpr const char* kDocument = "a letter – 1.txt";

  std::string provider_;
};

}  // namespace docuvend::tests
