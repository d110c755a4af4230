// Takes uploaded files and keeps them.
#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Clock.h"
#include "station/Answer.h"
#include "station/IncomingFile.h"
#include "station/Journal.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// The daemon deletes a file when the answer has the word "success" in it; no answer to an upload that was
/// not kept has it, whatever the folder is called.
///
/// Threading: any thread.
class UploadReceiver {
 public:
  static constexpr const char* kUsualAnswer = R"({"success": true})";

  /// What the request says about the file.
  struct Facts {
    std::optional<std::string> uuid{};
    std::optional<std::string> sequence{};  ///< The session's ID.
    std::optional<std::string> description{};
    std::optional<std::string> filename{};  ///< With ".gz" at its end, whatever the file is.
    std::string encoding;                   ///< Of the body: "gzip" or "identity".
  };
  struct Totals {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;  ///< Decoded.
    std::uint64_t refused = 0;
  };

  /// Borrows the others.
  /// @param answer  What is answered when a file was kept.
  UploadReceiver(std::filesystem::path folder, std::string answer, const platform::Clock& clock,
                 Journal& journal, TerminalView& view)
      : _folder(std::move(folder)),
        _answer(std::move(answer)),
        _clock(clock),
        _journal(journal),
        _view(view) {}

  /// Makes `file`, where the body goes while it comes; throws std::system_error.
  void begin(std::optional<IncomingFile>& file) const { file.emplace(_folder); }
  /// Keeps a whole file under a name made of the time and the file's own: 200, or 500 and why not.
  [[nodiscard]] Answer finish(IncomingFile& file, const Facts& facts);
  /// Counts and shows an upload that was not taken; the answer to it.
  Answer refuse(int status, const std::string& problem);

  [[nodiscard]] Totals totals() const;

 private:
  [[nodiscard]] Journal::Item itemFor(const IncomingFile& file, const std::string& name,
                                      const Facts& facts) const;

  const std::filesystem::path _folder;
  const std::string _answer;
  const platform::Clock& _clock;
  Journal& _journal;
  TerminalView& _view;
  mutable std::mutex _mutex;  ///< Guards the totals.
  Totals _totals;
};

/// The name of the file that was compressed for sending.
[[nodiscard]] std::string uploadedFileName(const UploadReceiver::Facts& facts);

}  // namespace tallyd::station
