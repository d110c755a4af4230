// The longer texts of tally-storebag's --help.
#pragma once

namespace tallyd::storebagtool {

inline constexpr const char* kAppText =
    "Writes storebags: makes, checks, signs and explains them with the daemon's own code.";
inline constexpr const char* kAppFooter = R"(
Example, from nothing to a served storebag:
  tally-storebag keygen keys
  tally-storebag new playhall.plist
  tally-storebag lint playhall.plist
  tally-storebag sign playhall.plist --key keys/privateKey.pem -o playhall

Files may be XML, binary or ASCII property lists; - is the standard input or output. Nothing is sent anywhere.
Exit status: 0 done; 1 it failed or something was found; 2 wrong usage.
"tally-storebag COMMAND --help" shows an example of each command. See tally-storebag(1).)";

inline constexpr const char* kNewText = "Writes a commented bag to start from";
inline constexpr const char* kNewFooter = "\nExample:\n  tally-storebag new playhall.plist";

inline constexpr const char* kKeygenText = "Makes the key pair that bags are signed with";
inline constexpr const char* kKeygenFooter = R"(
DIR gets privateKey.pem, for its owner only, and publicKey.der, which belongs into the framework's
Resources. What is there already stays, unless --force is given.

Example:
  tally-storebag keygen keys)";

inline constexpr const char* kSignText = "Signs a bag";
inline constexpr const char* kSignFooter = R"(
The same bag and key always make the same envelope. What lint finds wrong is said and does not stop it.

Example:
  tally-storebag sign playhall.plist --key keys/privateKey.pem -o playhall)";

inline constexpr const char* kVerifyText = "Checks an envelope as the daemon does";
inline constexpr const char* kVerifyFooter =
    "\nExample:\n  tally-storebag verify playhall --public-key keys/publicKey.der";

inline constexpr const char* kShowText = "Shows a bag, bare or in its envelope";
inline constexpr const char* kShowFooter = "\nExample:\n  tally-storebag show --format json playhall";

inline constexpr const char* kLintText = "Finds what the daemon ignores, misreads or stumbles over";
inline constexpr const char* kLintFooter = R"(
A line for each finding: severity, place in the bag, what is there, and its effect. Notes alone are no failure.

Example:
  tally-storebag lint playhall.plist)";

inline constexpr const char* kKeysText = "Lists every key that the daemon reads in a bag";
inline constexpr const char* kKeysFooter = "\nExample:\n  tally-storebag keys --json";

inline constexpr const char* kExplainText = "Shows what a message would make leave the device, and why";
inline constexpr const char* kExplainFooter = R"(
Runs the daemon's session and backends on a device as described, and shows each rule's verdict and the very
bytes that would leave it. Nothing leaves this host.

Example:
  tally-storebag explain playhall.plist --require-user-info --client-name demo --country DE
      --consent yes --category 1 --type 0 rtt=12.5 token=secret)";

inline constexpr const char* kDiffText = "Shows what starts or stops leaving devices";
inline constexpr const char* kDiffFooter = R"(
Each line begins with + where exposure grows, - where it shrinks, and = elsewhere. The exit status is 1 when
exposure grows, 0 when it stays or only shrinks, 2 when a bag can't be read.

Example:
  tally-storebag diff playhall.old.plist playhall.plist)";

}  // namespace tallyd::storebagtool
