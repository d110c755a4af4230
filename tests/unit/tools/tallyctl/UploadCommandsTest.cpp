#include <sys/stat.h>
#include <unistd.h>

#include "ToolTest.h"

namespace tallyd::tallyctl {
namespace {

namespace fs = std::filesystem;

/// The working folder is the process's own.
class WorkingFolder {
 public:
  explicit WorkingFolder(const fs::path& path) : _before(fs::current_path()) { fs::current_path(path); }
  ~WorkingFolder() { fs::current_path(_before); }
  WorkingFolder(const WorkingFolder&) = delete;
  WorkingFolder& operator=(const WorkingFolder&) = delete;

 private:
  const fs::path _before;
};

/// The administrator reads every file; for as long as this lives the process is a user that does not.
class WithoutRights {
 public:
  WithoutRights() {
    if (_before == 0 && ::seteuid(kNobody) != 0) throw std::runtime_error("cannot become another user");
  }
  ~WithoutRights() {
    if (_before == 0 && ::seteuid(_before) != 0) std::abort();
  }
  WithoutRights(const WithoutRights&) = delete;
  WithoutRights& operator=(const WithoutRights&) = delete;

 private:
  static constexpr uid_t kNobody = 65534;
  const uid_t _before = ::geteuid();
};

class UploadCommandsTest : public ToolTest {
 protected:
  UploadCommandsTest() {
    _daemon.script.upload = [] { return true; };
    writeFile(_file, std::string(1536, 'x'));
  }

  [[nodiscard]] std::string uploadedURL() const {
    const auto calls = _daemon.callsOf(Method::UploadFileAtPath);
    return calls.empty() ? "none" : std::string(calls[0].arguments[0].string().value_or(""));
  }

  const fs::path _file = fs::canonical(_folder.path()) / "a.log";
};

TEST_F(UploadCommandsTest, UploadSendsTheFileThroughASessionAndSaysThatItWasSent) {
  EXPECT_EQ(run({"upload", "--session-id", "9", _file.string()}), kSucceeded);
  EXPECT_TRUE(_out.starts_with("sent " + _file.string() + ", 1.5 KiB, in ")) << _out;
  EXPECT_TRUE(_out.ends_with(" s; the file is still there\n")) << _out;
  EXPECT_EQ(_err, "");
  EXPECT_EQ(uploadedURL(), "file://" + _file.string());
  EXPECT_EQ(_daemon.callsOf(Method::UploadFileAtPath)[0].arguments[1], Value("tally.file:" + _file.string()));
  const Value info = Dictionary{{"SessionID", 9}, {"ClientType", 5}};
  EXPECT_EQ(_daemon.callsOf(Method::SetSessionInfo)[0].arguments[0], Value(Array{info}));
  EXPECT_EQ(_daemon.callsOf(Method::StartConfig).size(), 1U);
}

TEST_F(UploadCommandsTest, UploadTellsWhenTheFileWasRemoved) {
  _daemon.script.upload = [this] { return fs::remove(_file); };
  EXPECT_EQ(run({"upload", _file.string()}), kSucceeded);
  EXPECT_TRUE(_out.ends_with(" s; the file was removed\n")) << _out;
}

TEST_F(UploadCommandsTest, UploadFailsWhenTheDaemonDidNotSendTheFile) {
  _daemon.script.upload = nullptr;
  EXPECT_EQ(run({"upload", _file.string()}), kFailed);
  EXPECT_EQ(_out, "");
  EXPECT_EQ(_err,
            "tallyctl: " + _file.string() + ": the daemon did not send it; the daemon's log says why\n");
}

TEST_F(UploadCommandsTest, UploadPrintsItsResultAsAnObject) {
  EXPECT_EQ(run({"--json", "upload", _file.string()}), kSucceeded);
  ASSERT_EQ(objects().size(), 1U);
  Dictionary result = objects()[0];
  EXPECT_GE(result.real("seconds").value_or(-1), 0);
  result.remove("seconds");
  EXPECT_EQ(result,
            (Dictionary{{"ok", true}, {"file", _file.string()}, {"bytes", 1536}, {"removed", false}}));
  _daemon.script.upload = nullptr;
  EXPECT_EQ(run({"--json", "upload", _file.string()}), kFailed);
  ASSERT_EQ(objects().size(), 1U);
  EXPECT_FALSE(objects()[0].boolean("ok"));
  EXPECT_TRUE(objects()[0].contains("error"));
}

TEST_F(UploadCommandsTest, UploadMakesARelativePathAbsolute) {
  writeFile(_folder.path() / "sub/b c.log", "text");
  const WorkingFolder inFolder(_folder.path() / "sub");
  EXPECT_EQ(run({"upload", "../sub/b c.log"}), kSucceeded);
  EXPECT_EQ(uploadedURL(), "file://" + fs::canonical(_folder.path()).string() + "/sub/b%20c.log");
}

TEST_F(UploadCommandsTest, UploadSaysWhatItCannotUploadBeforeItConnects) {
  const auto at = [this](const char* name) { return (_folder.path() / name).string(); };
  const auto complaint = [this](const std::string& file) {
    EXPECT_EQ(run({"upload", file}), kFailed);
    return _err;
  };
  fs::create_symlink(_file, at("link"));
  ASSERT_EQ(::mkfifo(at("pipe").c_str(), 0600), 0);
  writeFile(at("empty"), "");
  EXPECT_EQ(complaint(_folder.path()),
            "tallyctl: " + _folder.path().string() + ": is a directory; only regular files are uploaded\n");
  EXPECT_EQ(complaint(at("link")),
            "tallyctl: " + at("link") + ": is a symbolic link; only regular files are uploaded\n");
  EXPECT_EQ(complaint(at("pipe")),
            "tallyctl: " + at("pipe") + ": is a pipe; only regular files are uploaded\n");
  EXPECT_EQ(complaint(_socket.string()),
            "tallyctl: " + _socket.string() + ": is a socket; only regular files are uploaded\n");
  EXPECT_EQ(complaint("/dev/null"), "tallyctl: /dev/null: is a device; only regular files are uploaded\n");
  EXPECT_EQ(complaint(at("empty")), "tallyctl: " + at("empty") + ": is empty; there is nothing to upload\n");
  EXPECT_EQ(complaint(at("none")), "tallyctl: " + at("none") + ": No such file or directory\n");
  EXPECT_EQ(complaint("a.log/"), "tallyctl: a.log/: No such file or directory\n");
  EXPECT_TRUE(_daemon.calls().empty());
}

TEST_F(UploadCommandsTest, UploadNamesAFileThatMayNotBeRead) {
  fs::permissions(_folder.path(), fs::perms(0755));
  fs::permissions(_file, fs::perms::none);
  const WithoutRights nobody;
  EXPECT_EQ(run({"upload", _file.string()}), kFailed);
  EXPECT_EQ(_err, "tallyctl: " + _file.string() + ": Permission denied\n");
  EXPECT_TRUE(_daemon.calls().empty());
}

TEST_F(UploadCommandsTest, NeedAStorebag) {
  constexpr const char* kComplaint =
      "tallyctl: the daemon has no storebag for client type 7: messages reach no backend\n";
  _daemon.script.states = std::nullopt;
  EXPECT_EQ(run({"upload-log", "--client-type", "7", "-"}, "[1]"), kFailed);
  EXPECT_EQ(_err, kComplaint);
  EXPECT_TRUE(_daemon.callsOf(Method::UploadLogData).empty());
  EXPECT_EQ(run({"upload", "--client-type", "7", _file.string()}), kFailed);
  EXPECT_EQ(_err, kComplaint);
  EXPECT_EQ(uploadedURL(), "none");
}

TEST_F(UploadCommandsTest, UploadGivesUpAfterTheTimeout) {
  _daemon.script.repliesToUploads = false;
  EXPECT_EQ(run({"--timeout", "0.1", "upload", _file.string()}), kFailed);
  EXPECT_TRUE(_err.starts_with("tallyctl: " + _socket.string() + ": the upload failed: ")) << _err;
}

TEST_F(UploadCommandsTest, ShowProgressOnATerminalAndEraseItAtTheEnd) {
  _progress = Console::Progress::Shown;
  EXPECT_EQ(run({"upload", _file.string()}), kSucceeded);
  EXPECT_TRUE(_err.starts_with("uploading a.log, 1.5 KiB, 0 s")) << _err;
  EXPECT_TRUE(_err.ends_with("\r\x1B[K")) << _err;
  EXPECT_EQ(run({"upload-log", "-"}, "[1]\n[2]\n"), kSucceeded);
  EXPECT_TRUE(_err.starts_with("uploading 2 log data elements, 8 B, 0 s")) << _err;
}

TEST_F(UploadCommandsTest, UploadLogSendsTheElementsOfAllFiles) {
  writeFile(_file, "{ key = value; }");
  EXPECT_EQ(run({"upload-log", "-", _file.string()}, "{\"a\":1}\n2\n"), kSucceeded);
  EXPECT_TRUE(_out.starts_with("uploaded 3 log data elements, 26 B, in ")) << _out;
  EXPECT_EQ(_daemon.callsOf(Method::UploadLogData)[0].arguments,
            (std::vector<Value>{Array{Dictionary{{"a", 1}}, 2, Dictionary{{"key", "value"}}}}));
}

TEST_F(UploadCommandsTest, UploadLogFailsWithTheDaemonsError) {
  _daemon.script.upload = nullptr;
  EXPECT_EQ(run({"upload-log", "-"}, "[1]"), kFailed);
  EXPECT_EQ(_err, "tallyctl: the daemon did not upload the log data; the daemon's log says why\n");
  _daemon.script.uploadLogError = "no post URL";
  EXPECT_EQ(run({"--json", "upload-log", "-"}, "[1]"), kFailed);
  EXPECT_EQ(_err, "tallyctl: no post URL\n");
  Dictionary result = objects().at(0);
  result.remove("seconds");
  EXPECT_EQ(result, (Dictionary{{"ok", false}, {"elements", 1}, {"bytes", 3}, {"error", "no post URL"}}));
}

TEST_F(UploadCommandsTest, UploadLogNamesFileAndLineBeforeItConnects) {
  EXPECT_EQ(run({"upload-log", "-"}, "1\n{\"a\":1,\"a\":2}\n"), kFailed);
  EXPECT_EQ(_err, "tallyctl: standard input:2: the key \"a\" comes twice\n");
  EXPECT_TRUE(_daemon.calls().empty());
}

}  // namespace
}  // namespace tallyd::tallyctl
