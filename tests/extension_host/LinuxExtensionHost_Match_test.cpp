// What a match reports when more changes than its handler can take.
#include <gtest/gtest.h>

#include <future>

#include "tests/extension_host/support/RealExtensions.h"

namespace docuvend::linux_platform {
namespace {

// A match whose handler holds its first call until it is let go. No process is started for it.
class SlowMatch {
 public:
  explicit SlowMatch(RealExtensions& real)
      : match_(real.host().beginMatching({}, {host_, vendor_}, [this](Reports::Set set, const std::optional<QXError>&) {
          const bool isFirst = reports_.count() == 0;
          reports_.add(std::move(set));
          if (isFirst) letGo_.get_future().wait();
        })) {}

  void letGo() { letGo_.set_value(); }
  Reports& reports() { return reports_; }
  // The identifiers of a report.
  std::vector<std::string> identifiers(std::size_t report) {
    std::vector<std::string> result;
    for (const auto& extension : reports_.await(report).value_or(Reports::Set{})) result.push_back(extension->identifier().value_or(""));
    return result;
  }

 private:
  const QXRpcInterface host_ = qxInterfaceOf<_QXDocuvendHostProtocol>();
  const QXRpcInterface vendor_ = qxInterfaceOf<_QXDocuvendVendor>();
  std::promise<void> letGo_;
  Reports reports_;
  std::unique_ptr<QXExtensionMatch> match_;
};

using Identifiers = std::vector<std::string>;

TEST(LinuxExtensionHostMatch, WhatChangesWhileAHandlerRunsIsOneReportOfTheLatestSet) {
  RealExtensions real;
  const Bundle a = real.makeBundle("com.orvane.a");
  const Bundle b = real.makeBundle("com.orvane.b");
  SlowMatch match(real);
  EXPECT_EQ(match.identifiers(0), Identifiers{});
  for (int i = 0; i < 100; ++i) real.install(i % 2 == 0 ? std::vector<Bundle>{a} : std::vector<Bundle>{a, b});
  match.letGo();
  EXPECT_EQ(match.identifiers(1), (Identifiers{"com.orvane.a", "com.orvane.b"}));
  Reports later;
  const auto laterMatch = real.match(later);
  ASSERT_TRUE(later.await(0));
  EXPECT_EQ(match.reports().count(), 2U);
}

TEST(LinuxExtensionHostMatch, WhatCameAndWentWhileAHandlerRanIsNotReported) {
  RealExtensions real;
  SlowMatch match(real);
  EXPECT_EQ(match.identifiers(0), Identifiers{});
  real.install({real.makeBundle("com.orvane.a")});
  real.install({});
  match.letGo();
  Reports later;
  const auto laterMatch = real.match(later);
  ASSERT_TRUE(later.await(0));
  EXPECT_EQ(match.reports().count(), 1U);
}

}  // namespace
}  // namespace docuvend::linux_platform
