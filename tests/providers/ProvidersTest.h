// What the tests of this folder share: a platform of fakes, and extensions that leave their traces in the log, so that the order between
// messages, requests and completions can be read off one list.
#pragma once

#include <gtest/gtest.h>

#include <functional>
#include <memory>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "platform/QXError.h"
#include "providers/DVExtensionDocuvend.h"
#include "tests/support/FakePlatform.h"

namespace docuvend {

using fake_platform::FakeCreatedQueue;
using fake_platform::FakeExtension;
using fake_platform::FakePlatform;
using fake_platform::FakeQueueKind;

inline const std::string kCellar = "com.orvane.cellar";
inline const std::string kAttic = "com.orvane.attic";
inline const std::string kShed = "com.orvane.shed";

// "TYPE: text" for a message of the log or a test's expectation of one, "~ text" for a trace.
class Line {
 public:
  Line(const std::string& line) : entry_{QXLogType::defaultType, line} {
    for (int type = 0; type < 4; ++type) {
      const std::string start = std::string(kTypes[type]).append(": ");
      if (line.starts_with(start)) entry_ = {static_cast<QXLogType>(type), line.substr(start.size())};
    }
  }
  Line(const char* line) : Line(std::string(line)) {}
  explicit Line(fake_platform::FakeLogEntry written) : entry_(std::move(written)) {
    if (isTrace()) entry_ = {QXLogType::defaultType, entry_.text};
  }

  [[nodiscard]] const std::string& text() const { return entry_.text; }

  friend bool operator==(const Line& one, const Line& other) = default;
  friend std::ostream& operator<<(std::ostream& stream, const Line& line) {
    return line.isTrace() ? stream << line.entry_.text : stream << line.entry_;
  }

 private:
  static constexpr const char* kTypes[] = {"default", "info", "debug", "fault"};

  [[nodiscard]] bool isTrace() const { return entry_.text.starts_with("~"); }

  fake_platform::FakeLogEntry entry_;
};

using Lines = std::vector<Line>;
using Texts = std::vector<std::string>;
using Extensions = std::vector<std::shared_ptr<QXExtension>>;

// Writes "~ begin" and "~ cancel N" into the log, and tells `onIdentifier` when it is asked for its identifier and `onCancel` when a
// request is cancelled.
class TracingExtension : public FakeExtension {
 public:
  TracingExtension(FakePlatform& platform, std::optional<std::string> identifier, int version)
      : FakeExtension(std::move(identifier), version), platform_(platform) {
    platform.adopt(*this);
  }

  [[nodiscard]] std::optional<std::string> identifier() const override {
    if (onIdentifier) onIdentifier();
    return FakeExtension::identifier();
  }
  void beginExtensionRequest(BeginCompletion completion) override {
    trace("begin");
    FakeExtension::beginExtensionRequest(std::move(completion));
  }
  void cancelExtensionRequest(const QXUUID& request) override {
    if (onCancel) onCancel();
    trace("cancel " + std::to_string(request.bytes.back()));
    FakeExtension::cancelExtensionRequest(request);
  }

  std::function<void()> onIdentifier;
  std::function<void()> onCancel;

 private:
  void trace(const std::string& what) { platform_.log.defaultLog().write(QXLogType::defaultType, "~ " + what); }

  FakePlatform& platform_;
};

class ProvidersTest : public testing::Test {
 protected:
  // The log so far. Forgets it.
  Lines written() {
    Lines lines;
    for (const auto& entry : platform.log.entries()) lines.emplace_back(entry);
    platform.log.clear();
    return lines;
  }
  void trace(const std::string& what) { platform.log.defaultLog().write(QXLogType::defaultType, "~ " + what); }

  // What holds when a message of that beginning is written: `look` runs inside the write. How often it ran is `looks`.
  void whenWritten(std::string beginning, std::function<void()> look) {
    platform.log.onWrite([this, beginning = std::move(beginning), look = std::move(look)](const fake_platform::FakeLogEntry& entry) {
      if (!entry.text.starts_with(beginning)) return;
      ++looks;
      look();
    });
  }

  // An installed extension; it answers begin requests, and nothing else yet.
  std::shared_ptr<TracingExtension> install(const std::string& identifier, int version = 1) {
    platform.installProviderBundle(identifier);
    return std::make_shared<TracingExtension>(platform, identifier, version);
  }
  std::shared_ptr<TracingExtension> installReady(const std::string& identifier, int version = 1) {
    auto extension = install(identifier, version);
    FakePlatform::succeedSetup(*extension);
    return extension;
  }

  // Discovers exactly these and finishes the pass.
  void discover(Extensions extensions) {
    DVExtensionDocuvend::createInstancesCompletion(/*completion=*/{});
    platform.extensionHost.setExtensions(std::move(extensions));
    platform.queues.runAll();
  }

  static QXURL file(const std::string& path) { return QXURL::fileURL(path, QXURLKind::file); }
  static QXURL directory(const std::string& path) { return QXURL::fileURL(path, QXURLKind::directory); }

  FakePlatform platform;
  int looks = 0;
  const QXError broken = QXError::make("TestDomain", 7, "broken");
  const QXError lost = QXError::make("TestDomain", 8, "lost");
};

}  // namespace docuvend
