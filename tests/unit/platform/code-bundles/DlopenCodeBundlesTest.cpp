#include "platform/code-bundles/DlopenCodeBundles.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "adaptors/SampleAdaptors.h"
#include "fakes/FakeLog.h"
#include "fakes/TemporaryFolder.h"
#include "framework/PithAdaptor.h"

namespace tallyd::platform {
namespace {

namespace fs = std::filesystem;
using test::installBundle;
using test::writeBundleInfo;

class DlopenCodeBundlesTest : public testing::Test {
 protected:
  [[nodiscard]] const void* adaptorClass() { return bundles.load(bundle)->symbol("PithAdaptor"); }
  void expectOneWarning(const std::string& executable, const std::string& reason) {
    const auto lines = log.lines();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].level, LogLevel::Warning);
    EXPECT_TRUE(lines[0].text.starts_with("Can't load code bundle " + (bundle / executable).string() + ": "))
        << lines[0].text;
    EXPECT_NE(lines[0].text.find(reason), std::string::npos) << lines[0].text;
  }

  fakes::TemporaryFolder folder;
  fs::path bundle = folder.path() / "Fennel.framework";
  fakes::FakeLog log;
  DlopenCodeBundles bundles{log};
};

TEST_F(DlopenCodeBundlesTest, LoadsTheExecutableThatTheInformationNames) {
  installBundle(bundle, "RecordingAdaptor", "some.library");
  installBundle(bundle, "NoAdaptor", "Fennel.so");
  writeBundleInfo(bundle, "some.library");
  const auto* found = static_cast<const PithAdaptorClass*>(adaptorClass());
  ASSERT_NE(found, nullptr);
  EXPECT_EQ(found->structureVersion, 1U);
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(DlopenCodeBundlesTest, ElseLoadsTheLibraryOfTheBundlesName) {
  installBundle(bundle, "RecordingAdaptor", "Fennel.so");
  EXPECT_NE(adaptorClass(), nullptr);
  EXPECT_NE(bundles.load(bundle / "")->symbol("PithAdaptor"), nullptr);
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(DlopenCodeBundlesTest, TakesNoExecutableFromAnotherFolder) {
  installBundle(bundle, "RecordingAdaptor", "Fennel.so");
  installBundle(folder.path() / "Other.framework", "NoAdaptor", "Other.so");
  for (const std::string name : {"../Other.framework/Other.so", "", ".", "..", "/etc/passwd"}) {
    writeBundleInfo(bundle, name);
    EXPECT_NE(adaptorClass(), nullptr) << name;
  }
}

TEST_F(DlopenCodeBundlesTest, FindsNothingInALibraryWithoutTheSymbol) {
  installBundle(bundle, "NoAdaptor", "Fennel.so");
  const auto loaded = bundles.load(bundle);
  EXPECT_EQ(loaded->symbol("PithAdaptor"), nullptr);
  EXPECT_NE(loaded->symbol("tallydTestAnswer"), nullptr);
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(DlopenCodeBundlesTest, KeepsTheBundlesSymbolsApart) {
  installBundle(bundle, "RecordingAdaptor", "Fennel.so");
  const fs::path other = folder.path() / "Other.framework";
  installBundle(other, "MutedAdaptor", "Other.so");
  const void* first = adaptorClass();
  const void* second = bundles.load(other)->symbol("PithAdaptor");
  EXPECT_NE(first, second);
}

TEST_F(DlopenCodeBundlesTest, KeepsALibraryLoadedForGood) {
  installBundle(bundle, "RecordingAdaptor", "Fennel.so");
  const auto* found = static_cast<const PithAdaptorClass*>(adaptorClass());  // The bundle object is gone.
  ASSERT_NE(found, nullptr);
  void* instance = found->create();
  EXPECT_NE(instance, nullptr);
  found->destroy(instance);
}

TEST_F(DlopenCodeBundlesTest, LoadsAgainWhatIsLoaded) {
  installBundle(bundle, "RecordingAdaptor", "Fennel.so");
  EXPECT_EQ(adaptorClass(), adaptorClass());
}

TEST_F(DlopenCodeBundlesTest, SaysWhyAMissingBundleIsNotLoaded) {
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("Fennel.so", "No such file or directory");
}

TEST_F(DlopenCodeBundlesTest, RefusesAFileThatIsNoLibrary) {
  fs::create_directories(bundle);
  std::ofstream(bundle / "Fennel.so") << "not a library";
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("Fennel.so", "file too short");
}

TEST_F(DlopenCodeBundlesTest, RefusesALibraryThatWasCutOff) {
  fs::create_directories(bundle);
  std::ifstream whole(test::sampleLibrary("RecordingAdaptor"), std::ios::binary);
  std::string start(80, '\0');
  whole.read(start.data(), static_cast<std::streamsize>(start.size()));
  std::ofstream(bundle / "Fennel.so", std::ios::binary) << start;
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("Fennel.so", "");
}

TEST_F(DlopenCodeBundlesTest, RefusesALibraryThatLacksAFunction) {
  installBundle(bundle, "UnresolvedAdaptor", "Fennel.so");
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("Fennel.so", "tallydTestMissingFunction");
}

TEST_F(DlopenCodeBundlesTest, WaitsForNoPipeAndLoadsNoFolder) {
  fs::create_directories(bundle);
  ASSERT_EQ(::mkfifo((bundle / "Fennel.so").c_str(), 0600), 0);
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("Fennel.so", "not a regular file");
  log.clear();
  fs::create_directories(bundle / "folder.so");
  writeBundleInfo(bundle, "folder.so");
  EXPECT_EQ(adaptorClass(), nullptr);
  expectOneWarning("folder.so", "not a regular file");
}

}  // namespace
}  // namespace tallyd::platform
