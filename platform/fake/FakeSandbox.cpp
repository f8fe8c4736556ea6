#include "platform/fake/FakeSandbox.h"

#include <utility>

namespace docuvend::fake_platform {

void FakeSandbox::refuseIssuing(const std::string& path) {
  const std::lock_guard lock(mutex_);
  refused_.insert(path);
}

void FakeSandbox::setAnswer(int code) {
  const std::lock_guard lock(mutex_);
  answer_ = code;
}

void FakeSandbox::setAnswer(const std::string& path, int code) {
  const std::lock_guard lock(mutex_);
  answers_[path] = code;
}

void FakeSandbox::setZeroTokensAnswer(int code) {
  const std::lock_guard lock(mutex_);
  zeroTokensAnswer_ = code;
}

void FakeSandbox::setInvalidationError(std::optional<QXError> error) {
  const std::lock_guard lock(mutex_);
  invalidationError_ = std::move(error);
}

void FakeSandbox::onInvalidation(std::function<void()> callback) {
  const std::lock_guard lock(mutex_);
  onInvalidation_ = std::move(callback);
}

std::vector<std::string> FakeSandbox::issueCalls() const {
  const std::lock_guard lock(mutex_);
  return issueCalls_;
}

std::vector<FakeSandbox::Check> FakeSandbox::checks() const {
  const std::lock_guard lock(mutex_);
  return checks_;
}

std::vector<std::optional<std::string>> FakeSandbox::invalidations() const {
  const std::lock_guard lock(mutex_);
  return invalidations_;
}

std::optional<std::string> FakeSandbox::issueReadWriteExtension(const std::string& path) {
  const std::lock_guard lock(mutex_);
  issueCalls_.push_back(path);
  if (refused_.contains(path)) return std::nullopt;
  return "token:" + path;
}

std::optional<QXError> FakeSandbox::invalidateReadWriteExtensions(const std::optional<std::string>& directory) {
  std::function<void()> callback;
  {
    const std::lock_guard lock(mutex_);
    invalidations_.push_back(directory);
    callback = onInvalidation_;
  }
  if (callback) callback();
  const std::lock_guard lock(mutex_);
  return invalidationError_;
}

int FakeSandbox::checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) {
  const std::lock_guard lock(mutex_);
  checks_.push_back({token, std::string(operation), path});
  if (token == QXAuditToken{}) return zeroTokensAnswer_;
  if (operation != kQXSandboxFileReadData && operation != kQXSandboxFileWriteData) return kRefused;
  const auto found = answers_.find(path);
  return found == answers_.end() ? answer_ : found->second;
}

}  // namespace docuvend::fake_platform
