#include "backends/upload/UploadBackend.h"

#include <unistd.h>

#include <new>

#include "backends/RequestBooking.h"
#include "backends/upload/UploadFile.h"
#include "backends/upload/UploadURL.h"
#include "platform/HTTPClient.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/Sandbox.h"
#include "platform/SerialQueue.h"
#include "platform/UTF8.h"
#include "support/GzipCompression.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

constexpr std::string_view kSuccess = "success";

/// A consumed token; released with this object.
class SandboxExtension {
 public:
  SandboxExtension(platform::Sandbox& sandbox, std::string_view token)
      : _sandbox(sandbox), _handle(sandbox.sandbox_extension_consume(token)) {}
  ~SandboxExtension() { _sandbox.sandbox_extension_release(_handle); }
  SandboxExtension(const SandboxExtension&) = delete;
  SandboxExtension& operator=(const SandboxExtension&) = delete;

 private:
  platform::Sandbox& _sandbox;
  const platform::Sandbox::ExtensionHandle _handle;
};

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::initWithName(const platform::Platform& platform,
                                                           std::string_view name, const Payload& profile,
                                                           const std::optional<std::string>& productFamily) {
  const auto uploadURL = profile ? profile->string("post_url") : std::nullopt;
  if (!uploadURL) {
    asl_log(platform.log, LogLevel::Error, "Tally(UploadBackend): can't resolve upload post URL.");
    return nullptr;
  }
  return std::shared_ptr<UploadBackend>(
      new UploadBackend(platform, name, profile, productFamily, *uploadURL));
}

UploadBackend::UploadBackend(const platform::Platform& platform, std::string_view name,
                             const Payload& profile, const std::optional<std::string>& productFamily,
                             std::string_view uploadURL)
    : TallyBackend(platform, name, profile, productFamily), _uploadURL(uploadURL) {
  if (const auto url = profile->string("display_url")) _displayURL = std::string(*url);
}

bool UploadBackend::uploadFileAtPath(std::string_view path, std::string_view extensionToken) {
  asl_log(_platform.log, LogLevel::Debug, "Tally(uploadFileAtPath): Uploading file {}", path);
  _account->start();
  try {
    if (upload(std::string(path), extensionToken)) return true;
  } catch (const std::bad_alloc&) {
    asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): Out of memory for {}", path);
  }
  _account->drop(DropReason::NotUploadable);
  return false;
}

bool UploadBackend::upload(const std::string& path, std::string_view extensionToken) const {
  if (!_uploadURL) return false;
  const SandboxExtension extension(_platform.sandbox, extensionToken);
  auto body = compressedFile(path);
  if (!body) return false;
  const std::string url = uploadURLForFile(*_uploadURL, _udid ? _udid : "(null)", _sessionID, path);
  if (!hasURLCharactersOnly(url)) {
    asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): Unable to create URL request");
    return false;
  }
  post(path, url, std::move(*body));
  return true;
}

std::optional<std::string> UploadBackend::compressedFile(const std::string& path) const {
  // A large file keeps the thread for seconds.
  const auto blocking = _platform.queues.blockingCall();
  const auto contents = fileContents(path);
  return contents ? gzipDeflate(*contents, _platform.log) : std::nullopt;
}

std::optional<std::string> UploadBackend::fileContents(const std::string& path) const {
  const UploadFile file = UploadFile::open(_platform.sandbox, path);
  if (!file.isRegular) {
    asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): Only upload a regular file.");
    return std::nullopt;
  }
  if (file.bytes > kMaximumFileBytes) {
    asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): {} is too large to upload, {} bytes",
            path, file.bytes);
    return std::nullopt;
  }
  std::string contents = file.contents();
  if (contents.empty()) {
    asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): Input file is empty");
    return std::nullopt;
  }
  return contents;
}

void UploadBackend::post(const std::string& path, const std::string& url, std::string body) const {
  platform::HTTPRequest request;
  request.url = url;
  request.method = "POST";
  request.headers = {{"Content-Type", "application/octet-stream"}, {"Content-Encoding", "gzip"}};
  request.body = platform::Data(std::move(body));
  const platform::HTTPResult result = _platform.http.sendSynchronousRequest(request);
  _account->show("upload", [&](TapLine& line) {
    line.add("url", url).add("file", path).add("bytes", std::uint64_t{request.body.size()});
    addResult(line, result);
  });
  if (result.response) {
    _account->finish(1, answerOf(result));
    return takeAnswer(path, result.data.bytes());
  }
  _account->drop(DropReason::UploadFailed);
  asl_log(_platform.log, LogLevel::Error, "Tally(uploadFileAtPath): post {}",
          result.error ? std::string_view(*result.error) : "(null)");
}

void UploadBackend::takeAnswer(const std::string& path, std::string_view answer) const {
  const bool isText = platform::isUTF8(answer);
  asl_log(_platform.log, LogLevel::Debug, "Tally(uploadFileAtPath): sending to |{}|, Json output: {}",
          *_uploadURL, isText ? answer : "(null)");
  if (isText && answer.find(kSuccess) != std::string_view::npos) ::unlink(path.c_str());
}

}  // namespace tallyd
