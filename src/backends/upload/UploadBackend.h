// Uploads whole files, gzipped, to the upload server.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "backends/TallyBackend.h"

namespace tallyd {

/// Posts a file in one synchronous request and deletes it when the server's answer has the word "success" in
/// it, whatever its status. Messages and flushes pass it by.
///
/// Books: files; one is sent when the server has answered, with whatever status.
///
/// Keeps nothing between uploads. During one it holds the file and its compressed copy, during the request
/// the copy alone. Threading: the session's queue; an upload counts as blocking from its first read on.
class UploadBackend final : public TallyBackend {
 public:
  /// Larger files are not uploaded: zlib counts in 32 bits, and the compressed copy may be a little larger.
  static constexpr std::uint64_t kMaximumFileBytes = 4'000'000'000;

  /// Null without an upload URL in the profile (one error line).
  [[nodiscard]] static std::shared_ptr<UploadBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily);

  [[nodiscard]] std::string_view kind() const override { return "upload"; }

  /// True when a request was sent, whatever became of it. An answer that is no UTF-8 has no words in it.
  bool uploadFileAtPath(std::string_view path, std::string_view extensionToken) override;

  [[nodiscard]] const std::optional<std::string>& uploadURL() const { return _uploadURL; }
  void setUploadURL(std::optional<std::string> url) { _uploadURL = std::move(url); }

 private:
  UploadBackend(const platform::Platform& platform, std::string_view name, const Payload& profile,
                const std::optional<std::string>& productFamily, std::string_view uploadURL);

  /// True when it was sent, and is booked. Throws std::bad_alloc before that only.
  bool upload(const std::string& path, std::string_view extensionToken) const;
  [[nodiscard]] std::optional<std::string> compressedFile(const std::string& path) const;
  [[nodiscard]] std::optional<std::string> fileContents(const std::string& path) const;
  void post(const std::string& path, const std::string& url, std::string body) const;
  void takeAnswer(const std::string& path, std::string_view answer) const;

  std::optional<std::string> _uploadURL;
};

}  // namespace tallyd
