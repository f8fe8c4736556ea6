#include "tests/protocol/PythonHouse.h"

#include <filesystem>

namespace docuvend::tests {
namespace {

// The one that confined processes see, too.
constexpr const char* kPython = "/usr/bin/python3";
constexpr std::size_t kDocumentLength = 100'000;

}  // namespace

void expectPythonPasses(const std::string& script, const std::string& testClass, std::vector<std::string> environment) {
  Process process({{kPython, "-B", std::string(DOCUVEND_SCRIPTS) + "/" + script, "--verbose", testClass}, std::move(environment), {}});
  const Ending& ended = process.wait();
  EXPECT_EQ(ended.status, 0) << ended.errors << ended.output;
  EXPECT_NE(ended.errors.find(" ... ok\n"), std::string::npos) << "no test was run: " << ended.errors;
}

void PythonHouse::open(const std::string& provider) {
  provider_ = provider;
  for (const auto& bundle : {kEditor, kPicker, kStranger, provider}) house_.install(bundle);
  const std::filesystem::path cloud = std::filesystem::path(original()).parent_path();
  std::filesystem::create_directories(cloud);
  std::filesystem::permissions(house_.container(provider), std::filesystem::perms::owner_all);
  writeFile(original(), std::string(kDocumentLength, 'x') + "\n");
  house_.startDaemon();
}

void PythonHouse::expectClientPasses(const std::string& script, const std::string& testClass) const {
  auto environment = house_.environment();
  for (const std::string& entry : {"TEST_PROVIDER=" + provider_, "TEST_DOCUMENT=" + document(), "TEST_ORIGINAL=" + original()}) {
    environment.push_back(entry);
  }
  expectPythonPasses(script, testClass, std::move(environment));
}

}  // namespace docuvend::tests
