// The commands that upload something and wait until the daemon is done with it.
#include <fmt/format.h>

#include "tallyctl/ByteText.h"
#include "tallyctl/LogData.h"
#include "tallyctl/Session.h"
#include "tallyctl/StatesText.h"
#include "tallyctl/Tool.h"
#include "tallyctl/UploadFile.h"
#include "tallyctl/Waiting.h"

namespace tallyd::tallyctl {

using platform::Dictionary;
using platform::Value;

namespace {

/// Without backends there is nothing that could upload.
void startForUpload(Session& session, const SessionOptions& options) {
  const auto states =
      session.start(options, options.sessionID.value_or(randomSessionID()), userInfo(options));
  if (!states) throw Failure(noStorebagText(options.clientType));
}

Value rounded(Stopwatch::Seconds time) {
  return static_cast<double>(std::chrono::round<std::chrono::milliseconds>(time).count()) / 1000;
}

/// The daemon removes what the server has confirmed.
bool isGone(const std::filesystem::path& path) {
  std::error_code ignored;
  return std::filesystem::symlink_status(path, ignored).type() == std::filesystem::file_type::not_found;
}

int finishUpload(const UploadFile& file, Stopwatch::Seconds time, bool sent, Console& console) {
  const std::string path = file.path.string();
  Dictionary result{{"ok", sent}, {"file", path}, {"bytes", Value(file.bytes)}, {"seconds", rounded(time)}};
  if (!sent) {
    const std::string error = path + ": the daemon did not send it; the daemon's log says why";
    console.complain(error);
    result.set("error", error);
    if (console.isJSON()) console.printObject(result);
    return kFailed;
  }
  const bool removed = isGone(file.path);
  result.set("removed", removed);
  console.tell(fmt::format("sent {}, {}, in {:.1f} s; the file {}", path, byteText(file.bytes), time.count(),
                           removed ? "was removed" : "is still there"),
               result);
  return kSucceeded;
}

}  // namespace

int runCommand(const ConnectionOptions& connection, const UploadOptions& options, const Surroundings&,
               Console& console) {
  const UploadFile file = UploadFile::find(options.file);
  Session session(connection);
  startForUpload(session, options.session);
  const Stopwatch watch;
  const auto subject = fmt::format("uploading {}, {}", file.path.filename().string(), byteText(file.bytes));
  const bool sent = session.answer(
      "the upload", awaitAnswer<bool>(connection.timeout, subject, console, [&](auto completion) {
        session.connection().uploadFile(file.path, std::move(completion));
      }));
  return finishUpload(file, watch.elapsed(), sent, console);
}

int runCommand(const ConnectionOptions& connection, const UploadLogOptions& options,
               const Surroundings& surroundings, Console& console) {
  using Result = TallyConnection::UploadLogDataResult;
  const LogData data = readLogData(options.files, surroundings.standardInput);
  Session session(connection);
  startForUpload(session, options.session);
  const Stopwatch watch;
  const auto what = fmt::format("{} log data elements, {}", data.elements.size(), byteText(data.bytes));
  const auto answer = session.answer(
      "the upload",
      awaitAnswer<Result>(connection.timeout, "uploading " + what, console, [&](auto completion) {
        session.connection().uploadLogData(data.elements, std::move(completion));
      }));
  const auto time = watch.elapsed();
  Dictionary result{{"ok", answer.uploaded},
                    {"elements", Value(std::uint64_t{data.elements.size()})},
                    {"bytes", Value(std::uint64_t{data.bytes})},
                    {"seconds", rounded(time)}};
  if (answer.uploaded) {
    console.tell(fmt::format("uploaded {}, in {:.1f} s", what, time.count()), result);
    return kSucceeded;
  }
  const std::string error =
      answer.error.value_or("the daemon did not upload the log data; the daemon's log says why");
  console.complain(error);
  result.set("error", error);
  if (console.isJSON()) console.printObject(result);
  return kFailed;
}

}  // namespace tallyd::tallyctl
