// The address of an upload, which carries all that is said about the file.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace tallyd {

/// "ENDPOINT?uuid=…&sequence=…&description=…&filename=…&raw=true". The file name is the last component of
/// `path` with ".gz" appended, percent-escaped; the endpoint and the device ID stand as they are.
[[nodiscard]] std::string uploadURLForFile(std::string_view endpoint, std::string_view deviceID,
                                           std::uint32_t sessionID, std::string_view path);

/// `text` with every byte but the unreserved characters (RFC 3986, section 2.3) as "%" and two digits.
[[nodiscard]] std::string percentEscaped(std::string_view text);

/// Whether `text` is written with a URL's characters only (RFC 3986, section 2), its escapes whole.
[[nodiscard]] bool hasURLCharactersOnly(std::string_view text);

/// What stands behind the last slash of `path`, slashes at its end left aside.
[[nodiscard]] std::string_view lastPathComponent(std::string_view path);

}  // namespace tallyd
