#include "station/UploadReceiver.h"

#include <gmock/gmock.h>

#include "station/Limits.h"
#include "unit/tools/station/StationFixture.h"

namespace tallyd::station {

using testing::HasSubstr;
using testing::Not;

class UploadReceiverTest : public StationFixture {
 protected:
  Answer upload(UploadReceiver& to, const std::string& bytes, const UploadReceiver::Facts& told) {
    std::optional<IncomingFile> file;
    to.begin(file);
    file->write(bytes);
    return to.finish(*file, told);
  }
  [[nodiscard]] std::size_t filesIn(const std::filesystem::path& directory) const {
    const std::filesystem::directory_iterator files(directory);
    return static_cast<std::size_t>(std::distance(begin(files), end(files)));
  }

  const std::filesystem::path uploads = folder.path() / "uploads";
  Journal journal{folder.path() / "uploads.jsonl", Feed::Kind::Upload, view, feed};
  UploadReceiver receiver{uploads, UploadReceiver::kUsualAnswer, clock, journal, view};
  const UploadReceiver::Facts facts{.uuid = "0123",
                                    .sequence = "42",
                                    .description = "Parlor QPRC log (Uploaded by PHS)",
                                    .filename = "a b.log.gz",
                                    .encoding = "gzip"};
};

TEST(SafeFileNameTest, IsOneVisibleFileOfTheFolder) {
  EXPECT_EQ(safeFileName("a.log"), "a.log");
  EXPECT_EQ(safeFileName("/var/../etc/passwd"), "passwd");
  EXPECT_EQ(safeFileName("../../up"), "up");
  EXPECT_EQ(safeFileName("folder/"), "folder");
  EXPECT_EQ(safeFileName(".."), "_.");
  EXPECT_EQ(safeFileName(".hidden"), "_hidden");
  EXPECT_EQ(safeFileName(""), "file");
  EXPECT_EQ(safeFileName("///"), "file");
  EXPECT_EQ(safeFileName("a b\n$(x)\x1b\\"), "a_b___x___");
  EXPECT_EQ(safeFileName(std::string("a\0b", 3)), "a_b");
  EXPECT_EQ(safeFileName(std::string(1000, 'x')).size(), kMaximumFileNameBytes);
}

TEST(UploadedFileNameTest, IsWithoutTheSuffixOfWhatWasDecoded) {
  EXPECT_EQ(uploadedFileName({.filename = "a.log.gz", .encoding = "gzip"}), "a.log");
  EXPECT_EQ(uploadedFileName({.filename = "a.log.gz", .encoding = "identity"}), "a.log.gz");
  EXPECT_EQ(uploadedFileName({.filename = "a.log", .encoding = "gzip"}), "a.log");
  EXPECT_EQ(uploadedFileName({.filename = ".gz", .encoding = "gzip"}), "file");
  EXPECT_EQ(uploadedFileName({.encoding = "gzip"}), "file");
}

TEST_F(UploadReceiverTest, KeepsShowsAndPublishesAFile) {
  const Answer answer = upload(receiver, "contents", facts);
  EXPECT_EQ(answer.status, 200);
  EXPECT_THAT(answer.body, HasSubstr("success"));
  EXPECT_EQ(readFile(uploads / "20260115T120000.000-a_b.log"), "contents");
  EXPECT_EQ(filesIn(uploads), 1U);
  const auto records = recordsIn(journal.file());
  ASSERT_EQ(records.size(), 1U);
  EXPECT_EQ(records[0].string("uuid"), "0123");
  EXPECT_EQ(records[0].string("sequence"), "42");
  EXPECT_EQ(records[0].string("description"), "Parlor QPRC log (Uploaded by PHS)");
  EXPECT_EQ(records[0].string("filename"), "a b.log.gz");
  EXPECT_EQ(records[0].string("encoding"), "gzip");
  EXPECT_EQ(records[0].integer("bytes"), 8);
  EXPECT_EQ(records[0].string("file"), "uploads/20260115T120000.000-a_b.log");
  EXPECT_EQ(published(), readFile(journal.file()));
  EXPECT_THAT(output.str(), HasSubstr("upload  session 42  \"a b.log.gz\"  8 bytes"));
  EXPECT_EQ(receiver.totals().files, 1U);
  EXPECT_EQ(receiver.totals().bytes, 8U);
}

TEST_F(UploadReceiverTest, ReplacesNoFile) {
  for (const char* bytes : {"one", "two", "three"}) EXPECT_EQ(upload(receiver, bytes, facts).status, 200);
  EXPECT_EQ(readFile(uploads / "20260115T120000.000-a_b.log"), "one");
  EXPECT_EQ(readFile(uploads / "20260115T120000.000-a_b.log.2"), "two");
  EXPECT_EQ(readFile(uploads / "20260115T120000.000-a_b.log.3"), "three");
  EXPECT_EQ(filesIn(uploads), 3U);
}

TEST_F(UploadReceiverTest, AnswersAsItIsTold) {
  UploadReceiver full(uploads, "{\"error\": \"full\"}", clock, journal, view);
  const Answer answer = upload(full, "contents", {.encoding = "identity"});
  EXPECT_EQ(answer.status, 200);
  EXPECT_EQ(answer.body, "{\"error\": \"full\"}");
  const auto records = recordsIn(journal.file());
  ASSERT_EQ(records.size(), 1U);
  EXPECT_TRUE(records[0].find("uuid")->isNull());
}

TEST_F(UploadReceiverTest, LeavesNothingOfAnUploadThatBroke) {
  {
    std::optional<IncomingFile> file;
    receiver.begin(file);
    file->write("half a file");
  }
  EXPECT_EQ(filesIn(uploads), 0U);
}

TEST_F(UploadReceiverTest, NeverAsksToDeleteWhatItDidNotKeep) {
  Journal homeless(folder.path() / "success" / "uploads.jsonl", Feed::Kind::Upload, view, feed);
  UploadReceiver unlucky(uploads, UploadReceiver::kUsualAnswer, clock, homeless, view);
  const Answer answer = upload(unlucky, "contents", facts);
  EXPECT_EQ(answer.status, 500);
  EXPECT_THAT(answer.body, Not(HasSubstr("success")));
  EXPECT_THAT(problems.str(), HasSubstr((folder.path() / "success" / "uploads.jsonl").string()));
  EXPECT_EQ(filesIn(uploads), 0U);
  EXPECT_EQ(unlucky.totals().refused, 1U);
  EXPECT_EQ(unlucky.totals().files, 0U);
}

}  // namespace tallyd::station
