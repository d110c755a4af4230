#include "platform/sandbox/FileGrants.h"

#include <sys/stat.h>

#include "SandboxTestSupport.h"

namespace tallyd::platform {
namespace {

std::string contents(const FileDescriptor& file) {
  if (!file) return outcome(-1);
  char bytes[64];
  const ssize_t length = ::read(file.get(), bytes, sizeof bytes);
  return length >= 0 ? std::string(bytes, static_cast<std::size_t>(length)) : outcome(-1);
}

class FileGrantsTest : public testing::Test {
 protected:
  std::vector<FileDescriptor> descriptorsOf(std::string_view name, int flags = O_RDONLY) {
    std::vector<FileDescriptor> descriptors;
    descriptors.emplace_back(::open((_folder.path() / name).c_str(), flags | O_CLOEXEC));
    descriptors.emplace_back(::open(_folder.path().c_str(), O_PATH | O_CLOEXEC));
    return descriptors;
  }
  void SetUp() override {
    writeFile(_folder.path() / "a", "file a");
    writeFile(_folder.path() / "b", "file b");
  }

  const TemporaryFolder _folder;
  FileGrants _grants;
};

TEST_F(FileGrantsTest, OpensAPathThatIsNotThereThroughItsGrant) {
  const auto grant = _grants.offer("tally.file:/not/there", descriptorsOf("a"));
  const auto handle = _grants.consume("tally.file:/not/there");
  ASSERT_NE(handle, Sandbox::kNoExtension);
  EXPECT_EQ(contents(_grants.open("/not/there")), "file a");
  _grants.release(handle);
  EXPECT_EQ(contents(_grants.open("/not/there")), "ENOENT");
}

TEST_F(FileGrantsTest, OpensOnlyThePathOfTheToken) {
  const auto grant = _grants.offer("tally.file:/not/there", descriptorsOf("a"));
  const auto handle = _grants.consume("tally.file:/not/there");
  EXPECT_EQ(contents(_grants.open("/not/ther")), "ENOENT");
  EXPECT_EQ(contents(_grants.open("/not/there/")), "ENOENT");
  EXPECT_EQ(contents(_grants.open("")), "ENOENT");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, AnOfferAloneOpensNothing) {
  const auto grant = _grants.offer("tally.file:/x", descriptorsOf("a"));
  EXPECT_EQ(contents(_grants.open("/x")), "ENOENT");
}

TEST_F(FileGrantsTest, ConsumesNothingThatNobodyOffered) {
  EXPECT_EQ(_grants.consume("tally.file:/x"), Sandbox::kNoExtension);
  _grants.release(Sandbox::kNoExtension);
  auto grant = _grants.offer("tally.file:/x", descriptorsOf("a"));
  grant.reset();
  EXPECT_EQ(_grants.consume("tally.file:/x"), Sandbox::kNoExtension) << "the offer was withdrawn";
}

TEST_F(FileGrantsTest, OneOfferServesSeveralConsumers) {
  const auto grant = _grants.offer("tally.file:/x", descriptorsOf("a"));
  const auto first = _grants.consume("tally.file:/x");
  const auto second = _grants.consume("tally.file:/x");
  EXPECT_NE(first, second);
  _grants.release(first);
  EXPECT_EQ(contents(_grants.open("/x")), "file a");
  _grants.release(second);
  EXPECT_EQ(contents(_grants.open("/x")), "ENOENT");
}

TEST_F(FileGrantsTest, AConsumedGrantOutlivesItsOffer) {
  auto grant = _grants.offer("tally.file:/x", descriptorsOf("a"));
  const auto handle = _grants.consume("tally.file:/x");
  grant.reset();
  EXPECT_EQ(contents(_grants.open("/x")), "file a");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, ReadsFromTheStartEachTime) {
  auto descriptors = descriptorsOf("a");
  ASSERT_EQ(::lseek(descriptors[0].get(), 3, SEEK_SET), 3);
  const auto grant = _grants.offer("tally.file:/x", std::move(descriptors));
  const auto handle = _grants.consume("tally.file:/x");
  EXPECT_EQ(contents(_grants.open("/x")), "file a");
  EXPECT_EQ(contents(_grants.open("/x")), "file a");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, HasAPositionOfItsOwnWhereTheFileCanBeOpenedAnew) {
  auto descriptors = descriptorsOf("a");
  const FileDescriptor clients(::dup(descriptors[0].get()));
  const auto grant = _grants.offer("tally.file:/x", std::move(descriptors));
  const auto handle = _grants.consume("tally.file:/x");
  const FileDescriptor file = _grants.open("/x");
  ASSERT_EQ(::lseek(clients.get(), 0, SEEK_END), 6);
  EXPECT_EQ(contents(file), "file a");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, TheLatestOfEqualTokensWins) {
  const auto a = _grants.offer("tally.file:/x", descriptorsOf("a"));
  const auto b = _grants.offer("tally.file:/x", descriptorsOf("b"));
  const auto handle = _grants.consume("tally.file:/x");
  EXPECT_EQ(contents(_grants.open("/x")), "file b");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, AThreadGetsWhatItOfferedItself) {
  const auto a = _grants.offer("tally.file:/x", descriptorsOf("a"));
  const auto handle = _grants.consume("tally.file:/x");
  std::unique_ptr<Sandbox::Grant> b;
  Sandbox::ExtensionHandle otherHandle = Sandbox::kNoExtension;
  std::string seenByOther;
  std::thread([&] {
    b = _grants.offer("tally.file:/x", descriptorsOf("b"));
    otherHandle = _grants.consume("tally.file:/x");
    seenByOther = contents(_grants.open("/x"));
  }).join();
  EXPECT_EQ(seenByOther, "file b");
  EXPECT_EQ(contents(_grants.open("/x")), "file a");
  _grants.release(handle);
  EXPECT_EQ(contents(_grants.open("/x")), "file b") << "a grant serves any thread that has none of its own";
  _grants.release(otherHandle);
}

TEST_F(FileGrantsTest, RefusesDescriptorsThatCannotBeReadAsFiles) {
  ASSERT_EQ(::mkfifo((_folder.path() / "pipe").c_str(), 0600), 0);
  std::filesystem::create_directory(_folder.path() / "folder");
  const std::pair<const char*, int> cases[] = {{"a", O_WRONLY},
                                               {"a", O_PATH},
                                               {"pipe", O_RDONLY | O_NONBLOCK},
                                               {"folder", O_RDONLY},
                                               {"missing", O_RDONLY}};
  for (const auto& [name, flags] : cases) {
    const auto grant = _grants.offer("tally.file:/x", descriptorsOf(name, flags));
    const auto handle = _grants.consume("tally.file:/x");
    EXPECT_EQ(contents(_grants.open("/x")), "EACCES") << name << " " << flags;
    _grants.release(handle);
  }
}

TEST_F(FileGrantsTest, AGrantWithoutDescriptorsOpensNothing) {
  const auto grant = _grants.offer("tally.file:/x", {});
  const auto handle = _grants.consume("tally.file:/x");
  EXPECT_EQ(contents(_grants.open("/x")), "ENOENT");
  _grants.release(handle);
}

TEST_F(FileGrantsTest, ClosesTheDescriptorsWithTheLastUse) {
  auto descriptors = descriptorsOf("a");
  const int number = descriptors[0].get();
  auto grant = _grants.offer("tally.file:/x", std::move(descriptors));
  const auto handle = _grants.consume("tally.file:/x");
  grant.reset();
  EXPECT_EQ(outcome(::fcntl(number, F_GETFD)), "ok");
  _grants.release(handle);
  EXPECT_EQ(outcome(::fcntl(number, F_GETFD)), "EBADF");
}

TEST_F(FileGrantsTest, ServesManyThreadsAtOnce) {
  std::vector<std::thread> threads;
  std::vector<std::string> seen(8);
  for (std::size_t t = 0; t < seen.size(); ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < 50; ++i) {
        const auto grant = _grants.offer("tally.file:/x", descriptorsOf(t % 2 ? "a" : "b"));
        const auto handle = _grants.consume("tally.file:/x");
        const std::string read = contents(_grants.open("/x"));
        if (read != (t % 2 ? "file a" : "file b")) seen[t] += read;
        _grants.release(handle);
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(seen, std::vector<std::string>(8));
}

}  // namespace
}  // namespace tallyd::platform
