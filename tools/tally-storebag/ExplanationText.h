// An explanation for people, and its bytes as files.
#pragma once

#include <filesystem>
#include <string>

#include "tally-storebag/Explainer.h"

namespace tallyd::storebagtool {

enum class Acts {
  Message,  ///< The message, and the flush of a batching session.
  All,      ///< The records of the session's start and end, too.
};

/// Every rule's verdict, then everything that leaves the device.
[[nodiscard]] std::string explanationText(const Explanation& explanation, const Occasion& occasion,
                                          Acts acts);

/// One line for each step of the rules.
[[nodiscard]] std::string ruleText(const ReportingStep& step, const ExplainedBackend& backend,
                                   const Occasion& occasion);

/// The rules' effect on fields of the message, user info included; a line each.
[[nodiscard]] std::vector<std::string> filterTexts(const ExplainedBackend& backend, const Occasion& occasion);

/// Writes all that is sent into `folder`, which is made: ACT-BACKEND-N.body, .datagram and .plist hold the
/// bytes as they are, .json the power log's record. Throws std::exception that names the file.
void writeRawFiles(const Explanation& explanation, const std::filesystem::path& folder);

}  // namespace tallyd::storebagtool
