// An application that tries what it must not be able to do. It does what its words say, one thing after another, and prints a line for
// each. The same program does the honest version, where that is allowed. Relative paths begin in its container.
//
// An extension is started without words: then they are the lines of the file "acts" in its container, and "done" is its last line.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>

#include "tests/attacks/attacker/Acts.h"
#include "tests/attacks/attacker/Requests.h"

namespace docuvend::attacker {

std::string outcome(long result) { return result >= 0 ? "ok" : ::strerrorname_np(errno); }

namespace {

// Acts of one word would be told apart by nobody: that is this program's own defect.
void add(Acts& acts, Acts more) {
  acts.merge(more);
  if (more.empty()) return;
  std::cerr << "attacker: two acts of one word: " << more.begin()->first << "\n";
  std::_Exit(EXIT_FAILURE);
}

std::vector<std::string> linesOf(const char* path) {
  std::vector<std::string> lines;
  std::ifstream file(path);
  for (std::string line; std::getline(file, line);) lines.push_back(line);
  return lines;
}

}  // namespace
}  // namespace docuvend::attacker

// Asked by a build with a sanitizer. This program may end where there is no /proc, without which leaks cannot be looked for.
extern "C" const char* __asan_default_options() { return "detect_leaks=0"; }

int main(int count, char** arguments) {
  using namespace docuvend::attacker;
  Acts acts = identityActs();
  add(acts, requestActs());
  add(acts, fileActs());
  add(acts, surroundingsActs());
  add(acts, pressureActs());
  add(acts, floodActs());
  add(acts, burdenActs());
  add(acts, pretenceActs());
  add(acts, mountActs());
  add(acts, sharedThingsActs());
  add(acts, untakenActs());
  const bool isExtension = count == 1;
  Words words(isExtension ? linesOf("acts") : std::vector<std::string>(arguments + 1, arguments + count));
  while (!words.isAtEnd()) {
    const std::string word = words.next();
    const auto act = acts.find(word);
    if (act == acts.end()) {
      std::cerr << "attacker: no such act: " << word << "\n";
      return 2;
    }
    std::cout << act->second(words) << std::endl;
  }
  if (isExtension) std::cout << "done" << std::endl;
  return 0;
}
