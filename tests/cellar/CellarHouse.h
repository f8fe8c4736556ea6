// A cellar in this process, over a throw-away container and cloud.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "examples/cellar/CellarProvider.h"

namespace docuvend::cellar {

namespace fs = std::filesystem;

class CellarHouse : public ::testing::Test {
 protected:
  CellarHouse() {
    std::string pattern = (fs::temp_directory_path() / "cellar-XXXXXX").string();
    if (mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory for a test");
    root = fs::canonical(pattern).string();
    container = root + "/containers/com.orvane.cellar";
    cloud = container + "/cloud";
    storage = root + "/groups/" + kGroup + "/Docuvend Storage";
    fs::create_directories(cloud);
    fs::create_directories(root + "/groups/" + kGroup);
    setenv("HOME", container.c_str(), 1);
    restart();
  }
  ~CellarHouse() override {
    std::error_code ignored;
    fs::remove_all(root, ignored);
  }

  void restart() { provider = std::make_unique<CellarProvider>(); }

  static void write(const std::string& path, const std::string& text) { std::ofstream(path, std::ios::trunc) << text; }
  static std::string read(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }
  // As a program saves: a hidden sibling, renamed over the file.
  void save(const std::string& name, const std::string& text) const {
    write(storage + "/." + name, text);
    fs::rename(storage + "/." + name, storage + "/" + name);
  }
  static bool hasNoBlocks(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 && status.st_blocks == 0;
  }
  static std::int64_t nanoseconds(const timespec& time) { return time.tv_sec * 1'000'000'000 + time.tv_nsec; }
  static std::int64_t modified(const std::string& path) {
    struct stat status {};
    return stat(path.c_str(), &status) == 0 ? nanoseconds(status.st_mtim) : -1;
  }
  static void setModified(const std::string& path, std::int64_t time) {
    const timespec times[2] = {{0, UTIME_OMIT}, {time / 1'000'000'000, time % 1'000'000'000}};
    ASSERT_EQ(utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
  }
  static std::int64_t coarseClock() {
    timespec now{};
    clock_gettime(CLOCK_REALTIME_COARSE, &now);
    return nanoseconds(now);
  }
  [[nodiscard]] std::string local(const std::string& name) const { return storage + "/" + name; }
  [[nodiscard]] QXURL url(const std::string& name) const { return QXURL::fileURL(local(name), QXURLKind::file); }
  [[nodiscard]] std::string identifier(const std::string& name) const {
    const auto result = provider->identifierForItem(url(name));
    const auto* identifier = std::get_if<ItemID>(&result);
    return identifier != nullptr ? identifier->value : "";
  }
  void setUp() const {
    const auto error = provider->performInitialSetup();
    ASSERT_FALSE(error) << error->description();
  }
  void start(const std::string& name) const {
    const auto error = provider->startProviding(url(name));
    ASSERT_FALSE(error) << error->description();
  }
  void change(const std::string& name) const {
    const auto error = provider->itemChanged(url(name));
    ASSERT_FALSE(error) << error->description();
  }
  [[nodiscard]] std::vector<std::string> names(const std::string& directory) const {
    std::vector<std::string> result;
    for (const auto& entry : fs::directory_iterator(directory)) result.push_back(entry.path().filename().string());
    std::sort(result.begin(), result.end());
    return result;
  }
  static bool isKind(const Provider::Failure& error, CellarErrorCode code) {
    return error && error->domain == kErrorDomain && error->code == static_cast<std::int64_t>(code);
  }

  std::string root;
  std::string container;
  std::string cloud;
  std::string storage;
  std::unique_ptr<CellarProvider> provider;
};

}  // namespace docuvend::cellar
