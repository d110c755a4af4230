#include "tallyctl/MessageSource.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <system_error>
#include <vector>

#include "InputFile.h"
#include "tallyctl/LineReader.h"

namespace tallyd::tallyctl {
namespace {

using Status = LineReader::Status;

std::string faultOf(const std::optional<std::variant<Message, MessageSource::Fault>>& next) {
  const auto* fault = next ? std::get_if<MessageSource::Fault>(&*next) : nullptr;
  return fault ? fault->place + ": " + fault->text : "no fault";
}

TEST(LineReaderTest, GivesEachLineWithoutItsLineFeed) {
  const InputFile input("one\n\ntwo\r\nthree");
  LineReader reader(input.descriptor());
  std::vector<std::string> lines;
  for (std::string line; reader.next(line) == Status::Line;) lines.push_back(line);
  EXPECT_EQ(lines, (std::vector<std::string>{"one", "", "two\r", "three"}));
  EXPECT_EQ(reader.lineNumber(), 4U);
  EXPECT_EQ(reader.bytesRead(), 15U);
}

TEST(LineReaderTest, HasNoLineInAnEmptyFile) {
  const InputFile input("");
  LineReader reader(input.descriptor());
  std::string line;
  EXPECT_EQ(reader.next(line), Status::End);
  EXPECT_EQ(reader.lineNumber(), 0U);
}

TEST(LineReaderTest, PassesOverALineThatIsTooLong) {
  const InputFile input("12345\n123456\n1\n");
  LineReader reader(input.descriptor(), 5);
  std::string line;
  EXPECT_EQ(reader.next(line), Status::Line);
  EXPECT_EQ(line, "12345");
  EXPECT_EQ(reader.next(line), Status::TooLong);
  EXPECT_EQ(reader.next(line), Status::Line);
  EXPECT_EQ(line, "1");
  EXPECT_EQ(reader.next(line), Status::End);
}

TEST(LineReaderTest, JoinsLinesThatAreLongerThanItsBuffer) {
  const std::string longLine(300'000, 'x');
  const InputFile input(longLine + "\nshort\n");
  LineReader reader(input.descriptor());
  std::string line;
  EXPECT_EQ(reader.next(line), Status::Line);
  EXPECT_EQ(line, longLine);
  EXPECT_EQ(reader.next(line), Status::Line);
  EXPECT_EQ(line, "short");
}

TEST(MessageSourceTest, GivesMessagesAndNamesTheLinesThatAreNone) {
  const InputFile input(
      "{\"category\":1,\"type\":2}\n"
      "\n"
      "  \t\r\n"
      "{\"category\":1}\n"
      "{\"category\":3,\"type\":4}\r\n");
  MessageSource source(input.path(), -1);
  EXPECT_EQ(std::get<Message>(source.next().value()), (Message{1, 2, std::nullopt}));
  EXPECT_EQ(source.lineNumber(), 1U);
  EXPECT_EQ(faultOf(source.next()), input.path().string() + ":4: \"type\" is missing");
  EXPECT_EQ(std::get<Message>(source.next().value()), (Message{3, 4, std::nullopt}));
  EXPECT_EQ(source.placeOf(source.lineNumber()), input.path().string() + ":5");
  EXPECT_FALSE(source.next());
  EXPECT_EQ(source.share(), 1.0);
}

TEST(MessageSourceTest, ReadsTheStandardInputForADash) {
  const InputFile input("{\"category\":1,\"type\":2}\nno message\n");
  MessageSource source("-", input.descriptor());
  EXPECT_EQ(std::get<Message>(source.next().value()), (Message{1, 2, std::nullopt}));
  EXPECT_TRUE(faultOf(source.next()).starts_with("standard input:2: Invalid value."));
}

TEST(MessageSourceTest, DoesNotKnowHowMuchOfAPipeIsRead) {
  int ends[2];
  ASSERT_EQ(::pipe(ends), 0);
  const platform::FileDescriptor readEnd(ends[0]);
  platform::FileDescriptor writeEnd(ends[1]);
  const std::string_view line = "{\"category\":1,\"type\":2}\n";
  ASSERT_EQ(::write(writeEnd.get(), line.data(), line.size()), static_cast<ssize_t>(line.size()));
  writeEnd = {};
  MessageSource source("-", readEnd.get());
  EXPECT_TRUE(source.next());
  EXPECT_FALSE(source.share());
  EXPECT_FALSE(source.next());
}

TEST(MessageSourceTest, NamesTheFileThatItCannotOpen) {
  try {
    MessageSource source("/nonexistent/messages", -1);
    FAIL() << "opened";
  } catch (const std::system_error& error) {
    EXPECT_STREQ(error.what(), "/nonexistent/messages: No such file or directory");
  }
}

TEST(MessageSourceTest, RefusesAFolderBeforeItReads) {
  const fakes::TemporaryFolder folder;
  try {
    MessageSource source(folder.path(), -1);
    FAIL() << "took a folder";
  } catch (const std::system_error& error) {
    EXPECT_EQ(error.what(), folder.path().string() + ": Is a directory");
  }
}

TEST(MessageSourceTest, NamesTheLineFromWhichItCannotReadOn) {
  const fakes::TemporaryFolder folder;
  const auto path = folder.path() / "written";
  const platform::FileDescriptor writeOnly(::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  MessageSource source("-", writeOnly.get());
  try {
    source.next();
    FAIL() << "read what is open for writing";
  } catch (const std::system_error& error) {
    EXPECT_STREQ(error.what(), "standard input:1: Bad file descriptor");
  }
}

TEST(MessageSourceTest, NamesLineAndKeyOfARepeatedKey) {
  const InputFile input("\n{\"category\":1,\"type\":2,\"payload\":{\"a\":1,\"a\":2}}\n");
  MessageSource source(input.path(), -1);
  EXPECT_EQ(faultOf(source.next()), input.path().string() + ":2: the key \"a\" comes twice");
}

}  // namespace
}  // namespace tallyd::tallyctl
