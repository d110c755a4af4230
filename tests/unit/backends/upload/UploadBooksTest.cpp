// A file ends in exactly one place of the books, also when memory runs out on its way.

#include <gtest/gtest.h>

#include <fstream>
#include <thread>

#include "backends/upload/UploadBackend.h"
#include "fakes/FakePlatform.h"
#include "support/Account.h"
#include "support/FailingAllocation.h"

namespace tallyd {
namespace {

TEST(UploadBooksTest, AFileIsSentOrDroppedWhicheverAllocationFails) {
  fakes::FakePlatform fake;
  const std::string path = (fake.folder.path() / "a file").string();
  std::ofstream(path) << "its text";
  const auto backend = UploadBackend::initWithName(
      fake.platform, "upload_server", platform::Dictionary{{"post_url", "http://upload.example/"}}, "Kasten");
  int number = 0;
  bool sent = false;
  for (bool failed = true; failed;) {
    const auto account = std::make_shared<Account>();
    backend->setAccount(account);
    {
      const test::OneFailingAllocation failing(std::this_thread::get_id(), ++number);
      sent = backend->uploadFileAtPath(path, "tally.file:token");
      failed = failing.hasFailed();
    }
    const AccountCounts counts = account->counts();
    EXPECT_EQ(counts.accepted, 1U) << "allocation " << number;
    EXPECT_EQ(counts.inFlight, 0U) << "allocation " << number;
    EXPECT_TRUE(counts.isBalanced()) << "allocation " << number;
    EXPECT_EQ(counts.sent, sent ? 1U : 0U) << "allocation " << number;
  }
  EXPECT_TRUE(sent);
  EXPECT_GT(number, 5);
}

}  // namespace
}  // namespace tallyd
