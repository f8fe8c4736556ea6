// A home with a run-time directory and the system's bundle directory beside it, all of this test and gone with it; and bundles in them.
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/fake/FakeLog.h"
#include "platform/linux/base/Paths.h"
#include "platform/linux/bundles/BundleScan.h"
#include "platform/linux/files/LinuxPropertyLists.h"

namespace docuvend::linux_platform {

// Short: the paths of sockets lie below it.
class BundleHouse {
 public:
  BundleHouse() {
    ::umask(022);  // others may not write bundles, or they are none
    std::string name = "/tmp/dvlXXXXXX";
    if (::mkdtemp(name.data()) == nullptr) throw std::runtime_error("no temporary directory");
    root_ = name;
    paths.home = root_ + "/home";
    paths.systemBundles = root_ + "/system";
    const std::string share = paths.home + "/.local/share/docuvend";
    paths.userBundles = share + "/bundles";
    paths.containers = share + "/containers";
    paths.groupContainers = share + "/groups";
    paths.runtime = root_ + "/run/docuvend";
    paths.publicSockets = paths.runtime + "/public";
    paths.lockState = paths.runtime + "/lock-state";
    paths.tokenKey = paths.runtime + "/token-key";
    std::filesystem::create_directories(root_ + "/run");
    ::chmod((root_ + "/run").c_str(), 0700);
    std::filesystem::create_directories(paths.home);
  }
  BundleHouse(const BundleHouse&) = delete;
  BundleHouse& operator=(const BundleHouse&) = delete;
  ~BundleHouse() {
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
  }

  [[nodiscard]] const std::string& root() const { return root_; }

  static void write(const std::string& path, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << text;
  }
  static void writeExecutable(const std::string& path, const std::string& text) {
    write(path, text);
    ::chmod(path.c_str(), 0755);
  }
  static std::string propertyList(const std::string& entries) {
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict>" + entries + "</dict></plist>\n";
  }
  static std::string entry(const std::string& key, const std::string& value) { return "<key>" + key + "</key>" + value; }
  static std::string text(const std::string& value) { return "<string>" + value + "</string>"; }
  static std::string array(const std::vector<std::string>& values) {
    std::string result = "<array>";
    for (const auto& value : values) result += text(value);
    return result + "</array>";
  }
  static std::string identityEntries(const std::string& identifier) {
    return entry("QXBundleIdentifier", text(identifier)) + entry("QXBundleExecutable", text("program"));
  }

  // A sound bundle. `more` is added to its Info.plist.
  static void install(const std::string& directory, const std::string& identifier, const std::string& more = {}) {
    write(directory + "/Info.plist", propertyList(identityEntries(identifier) + more));
    writeExecutable(directory + "/program", "#!/bin/sh\n");
  }

  [[nodiscard]] BundleMap scan() { return BundleScan(paths, propertyLists, log.defaultLog()).run().bundles; }

  Paths paths;
  LinuxPropertyLists propertyLists;
  fake_platform::FakeLog log;

 private:
  std::string root_;
};

}  // namespace docuvend::linux_platform
