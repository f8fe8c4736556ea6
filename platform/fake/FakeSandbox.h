// The sandbox in memory.
//
// Differs from the real one: a token is "token:" and the path, whatever lies at the path; the answer to a check is what the test has
// set, whatever the operation, except that the zero token (until a test says otherwise) and any operation but reading and writing are
// refused as the platform refuses them. Taking tokens back is recorded and changes nothing: nobody redeems them here. May be used from any
// thread.
#pragma once

#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/sandbox.h"

namespace docuvend::fake_platform {

class FakeSandbox final : public QXSandbox {
 public:
  static constexpr int kAllowed = 0;
  static constexpr int kRefused = 1;

  struct Check {
    QXAuditToken token;
    std::string operation;
    std::string path;
    friend bool operator==(const Check&, const Check&) = default;
  };

  // From now on no token is issued for the path.
  void refuseIssuing(const std::string& path);
  // What every check answers that nothing else was set for; at first kRefused.
  void setAnswer(int code);
  // What a check of that path answers.
  void setAnswer(const std::string& path, int code);
  // What every check for the zero token answers, instead of kRefused.
  void setZeroTokensAnswer(int code);

  // What taking back answers from now on.
  void setInvalidationError(std::optional<QXError> error);
  // Called each time that extensions are taken back, inside the call.
  void onInvalidation(std::function<void()> callback);

  // The paths that tokens were asked for, in order, refused ones included.
  [[nodiscard]] std::vector<std::string> issueCalls() const;
  // What was checked, in order.
  [[nodiscard]] std::vector<Check> checks() const;
  // The directories that tokens were taken back below, in order, failures included; none stands for all tokens.
  [[nodiscard]] std::vector<std::optional<std::string>> invalidations() const;

  std::optional<std::string> issueReadWriteExtension(const std::string& path) override;
  std::optional<QXError> invalidateReadWriteExtensions(const std::optional<std::string>& directory) override;
  int checkWithoutReport(const QXAuditToken& token, std::string_view operation, const std::string& path) override;

 private:
  mutable std::mutex mutex_;
  // Guarded by mutex_.
  std::set<std::string> refused_;
  std::map<std::string, int> answers_;
  int answer_ = kRefused;
  int zeroTokensAnswer_ = kRefused;
  std::vector<std::string> issueCalls_;
  std::vector<Check> checks_;
  std::vector<std::optional<std::string>> invalidations_;
  std::optional<QXError> invalidationError_;
  std::function<void()> onInvalidation_;
};

}  // namespace docuvend::fake_platform
