// The cellar's bundle, installed and run as Docuvend runs it: found on disk, confined, asked over its connection.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/bundles/InstalledBundles.h"
#include "platform/linux/extension_host/LinuxExtensionHost.h"
#include "tests/bundles/BundleHouse.h"
#include "tests/extension_host/support/RealExtensions.h"

namespace docuvend::linux_platform {
namespace {

namespace fs = std::filesystem;

constexpr const char* kCellar = "com.orvane.cellar";
constexpr const char* kDocumentGroup = "com.orvane.cellar.documents";

class CellarTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!RealExtensions::mayRun()) GTEST_FAIL();
    fs::create_directories(house_.paths.userBundles);
    fs::copy(std::string(DOCUVEND_BUNDLES) + "/" + kCellar, house_.paths.userBundles + "/" + kCellar);
    fs::create_directories(cloud());
    bundles_ = std::make_unique<InstalledBundles>(house_.paths, propertyLists_, log_.defaultLog());
    host_ = std::make_unique<LinuxExtensionHost>(*bundles_, house_.paths, reactor_, log_.defaultLog());
    match_ = host_->beginMatching({{std::string(kQXExtensionPointName), kPoint}}, {hostInterface_, vendorInterface_},
                                  [this](Reports::Set set, const std::optional<QXError>&) { reports_.add(std::move(set)); });
    const auto set = reports_.await(0);
    ASSERT_TRUE(set && set->size() == 1);
    extension_ = set->front();
  }
  void TearDown() override {
    match_.reset();
    host_.reset();
  }

  [[nodiscard]] std::string container() const { return house_.paths.containers + "/" + kCellar; }
  [[nodiscard]] std::string cloud() const { return container() + "/cloud"; }
  [[nodiscard]] std::string local(const std::string& name) const {
    return house_.paths.groupContainers + "/" + kDocumentGroup + "/Docuvend Storage/" + name;
  }
  static std::string read(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
  }

  // None: the operation succeeded. Setup has its error in third place, the placeholder in second, the others in first.
  [[nodiscard]] std::optional<QXError> ask(const char* operation, QXArray arguments, std::size_t errorPosition = 0) const {
    const auto answer = await(Conversation(extension_).send(operation, std::move(arguments)));
    if (!answer) return QXError::make("Test", 0, "no answer");
    if (answer->error) return answer->error;
    const auto* error = answer->values[errorPosition].as<QXError>();
    return error != nullptr ? std::optional(*error) : std::nullopt;
  }
  [[nodiscard]] std::optional<QXError> setUp() const { return ask("_performInitialSetupWithCompletion:", {}, 2); }
  [[nodiscard]] QXURL url(const std::string& name) const { return QXURL::fileURL(local(name), QXURLKind::file); }
  [[nodiscard]] std::string identifier(const std::string& name) const {
    const auto answer = await(Conversation(extension_).send("_identifierForItemAtURL:completion:", {url(name)}));
    const auto* text = answer && !answer->error ? answer->values[1].as<std::string>() : nullptr;
    return text != nullptr ? *text : "";
  }

  BundleHouse house_;
  fake_platform::FakeLog log_;
  LinuxPropertyLists propertyLists_;
  std::unique_ptr<InstalledBundles> bundles_;
  Reactor reactor_{2};
  QXRpcInterface hostInterface_ = qxInterfaceOf<_QXDocuvendHostProtocol>();
  QXRpcInterface vendorInterface_ = qxInterfaceOf<_QXDocuvendVendor>();
  std::unique_ptr<LinuxExtensionHost> host_;
  Reports reports_;
  std::unique_ptr<QXExtensionMatch> match_;
  std::shared_ptr<QXExtension> extension_;
};

TEST_F(CellarTest, ItsBundleIsWhatDocuvendLooksFor) {
  EXPECT_EQ(extension_->identifier(), kCellar);
  const auto bundle = bundles_->find(kCellar);
  ASSERT_TRUE(bundle);
  const auto* extension = qxFind<QXDictionary>(bundle->info, "QXExtension");
  ASSERT_NE(extension, nullptr);
  const auto* group = qxFind<std::string>(*extension, "QXExtensionDocuvendDocumentGroup");
  ASSERT_NE(group, nullptr);
  EXPECT_TRUE(bundle->groups.contains(*group));
}

TEST_F(CellarTest, ADocumentsWayThereAndBack) {
  std::ofstream(cloud() + "/letter.txt") << std::string(50'000, 'x') << "end";
  ASSERT_FALSE(setUp());
  struct stat status {};
  ASSERT_EQ(stat(local("letter.txt").c_str(), &status), 0);
  EXPECT_EQ(status.st_size, 50'003);
  EXPECT_EQ(status.st_blocks, 0);
  const std::string before = identifier("letter.txt");
  EXPECT_EQ(before.size(), 32U);

  ASSERT_FALSE(ask("_startProvidingItemAtURL:completion:", {url("letter.txt")}));
  EXPECT_EQ(read(local("letter.txt")), read(cloud() + "/letter.txt"));

  std::ofstream(local(".letter.txt")) << "answered";
  fs::rename(local(".letter.txt"), local("letter.txt"));
  ASSERT_FALSE(ask("_itemChangedAtURL:completion:", {url("letter.txt")}));
  EXPECT_EQ(read(cloud() + "/letter.txt"), "answered");
  EXPECT_EQ(identifier("letter.txt"), before);

  ASSERT_FALSE(ask("_stopProvidingItemAtURL:completion:", {url("letter.txt")}));
  EXPECT_EQ(read(local("letter.txt")), std::string(8, '\0'));
  ASSERT_FALSE(ask("_providePlaceholderAtURL:completion:", {url("letter.txt")}, 1));
}

TEST_F(CellarTest, ACrashInTheMiddleIsAnErrorAndTheNextTryWorks) {
  const std::string text(50'000, 'x');
  std::ofstream(cloud() + "/letter.txt") << text;
  ASSERT_FALSE(setUp());
  std::ofstream(container() + "/crash-once") << "";
  EXPECT_TRUE(ask("_startProvidingItemAtURL:completion:", {url("letter.txt")}));
  EXPECT_EQ(read(local("letter.txt")), std::string(text.size(), '\0'));
  EXPECT_FALSE(fs::exists(container() + "/crash-once"));
  const auto error = ask("_startProvidingItemAtURL:completion:", {url("letter.txt")});
  ASSERT_FALSE(error) << error->description();
  EXPECT_EQ(read(local("letter.txt")), text);
}

TEST_F(CellarTest, AURLOutsideItsDirectoryIsAnErrorOfTheProvider) {
  ASSERT_FALSE(setUp());
  const auto error = ask("_startProvidingItemAtURL:completion:", {QXURL::fileURL("/etc/passwd", QXURLKind::file)});
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, "CellarErrorDomain");
}

}  // namespace
}  // namespace docuvend::linux_platform
