#include "tally-storebag/Options.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include "tally-storebag/ExplainArguments.h"
#include "tally-storebag/OptionTexts.h"

namespace tallyd::storebagtool {

namespace {

struct NewArguments {
  std::string file;
  void addTo(CLI::App& command) {
    command.footer(kNewFooter);
    command
        .add_option("file", file, "Where it goes, if not to the standard output; a file that is there stays")
        ->type_name("FILE");
  }
  [[nodiscard]] NewOptions result() const {
    return {file.empty() || file == kStandardStream ? std::nullopt
                                                    : std::optional<std::filesystem::path>(file)};
  }
};

struct KeygenArguments {
  std::string folder;
  KeygenOptions options;
  CLI::Option* folderOption = nullptr;
  CLI::Option* privateOption = nullptr;
  CLI::Option* publicOption = nullptr;

  void addTo(CLI::App& command) {
    command.footer(kKeygenFooter);
    folderOption =
        command.add_option("dir", folder, "Folder for both; made when it is missing")->type_name("DIR");
    privateOption =
        command.add_option("--private", options.privateKey, "The private key, PEM")->type_name("FILE");
    publicOption =
        command.add_option("--public", options.publicKey, "The public key, DER")->type_name("FILE");
    privateOption->needs(publicOption)->excludes(folderOption);
    publicOption->needs(privateOption)->excludes(folderOption);
    command.add_option("--bits", options.bits, "Length of the RSA key")
        ->type_name("N")
        ->check(CLI::Range(2048, 8192).description(""))
        ->capture_default_str();
    command.add_flag("--force", options.force, "Replace files that are there");
  }
  [[nodiscard]] KeygenOptions result() const {
    KeygenOptions result = options;
    if (!folderOption->empty()) {
      result.privateKey = std::filesystem::path(folder) / "privateKey.pem";
      result.publicKey = std::filesystem::path(folder) / "publicKey.der";
    } else if (privateOption->empty()) {
      throw CLI::RequiredError("DIR, or --private and --public");
    }
    return result;
  }
};

struct SignArguments {
  SignOptions options;
  std::string format = "xml";
  void addTo(CLI::App& command) {
    command.footer(kSignFooter);
    command.add_option("bag", options.bag, "The bag")->type_name("BAG")->required();
    command.add_option("--key", options.key, "The private key, PEM")->type_name("FILE")->required();
    command.add_option("-o,--output", options.out, "The envelope")->type_name("FILE")->required();
    command.add_option("--format", format, "How the bag is written in its envelope: xml or binary")
        ->type_name("FORMAT")
        ->check(CLI::IsMember({"xml", "binary"}).description(""))
        ->capture_default_str();
  }
  [[nodiscard]] SignOptions result() const {
    SignOptions result = options;
    using platform::PropertyListFormat;
    result.format = format == "xml" ? PropertyListFormat::XML : PropertyListFormat::Binary;
    return result;
  }
};

struct VerifyArguments {
  VerifyOptions options;
  void addTo(CLI::App& command) {
    command.footer(kVerifyFooter);
    command.add_option("envelope", options.envelope, "The envelope")->type_name("ENVELOPE")->required();
    command.add_option("--public-key", options.publicKey, "The public key, DER")
        ->type_name("FILE")
        ->required();
  }
};

struct ShowArguments {
  std::string file;
  std::string format = "xml";
  void addTo(CLI::App& command) {
    command.footer(kShowFooter);
    command.add_option("file", file, "Bag or envelope")->type_name("FILE")->required();
    command.add_option("--format", format, "xml or json")
        ->type_name("FORMAT")
        ->check(CLI::IsMember({"xml", "json"}).description(""))
        ->capture_default_str();
  }
  [[nodiscard]] ShowOptions result() const { return {file, format == "json"}; }
};

struct LintArguments {
  LintOptions options;
  void addTo(CLI::App& command) {
    command.footer(kLintFooter);
    command.add_option("file", options.file, "Bag or envelope")->type_name("FILE")->required();
    command.add_flag("--json", options.json, "One JSON array of all findings");
  }
};

struct KeysArguments {
  KeysOptions options;
  void addTo(CLI::App& command) {
    command.footer(kKeysFooter);
    command.add_flag("--json", options.json, "One JSON array of all keys");
  }
};

struct DiffArguments {
  DiffOptions options;
  void addTo(CLI::App& command) {
    command.footer(kDiffFooter);
    command.add_option("old", options.before, "Bag or envelope")->type_name("OLD")->required();
    command.add_option("new", options.after, "Bag or envelope")->type_name("NEW")->required();
  }
};

/// The whole command line; declared once, read once.
class CommandLine {
 public:
  CommandLine(const std::string& version, platform::TimePoint now)
      : _app(kAppText, "tally-storebag"), _explain(now) {
    _app.set_version_flag("--version", "tally-storebag " + version);
    _app.footer(kAppFooter);
    _app.failure_message([](const CLI::App* app, const CLI::Error& error) {
      return "tally-storebag: " + CLI::FailureMessage::simple(app, error);
    });
    _app.require_subcommand(1);
    _new.addTo(*_app.add_subcommand("new", kNewText));
    _keygen.addTo(*_app.add_subcommand("keygen", kKeygenText));
    _lint.addTo(*_app.add_subcommand("lint", kLintText));
    _sign.addTo(*_app.add_subcommand("sign", kSignText));
    _verify.addTo(*_app.add_subcommand("verify", kVerifyText));
    _show.addTo(*_app.add_subcommand("show", kShowText));
    _explain.addTo(*_app.add_subcommand("explain", kExplainText)->footer(kExplainFooter));
    _diff.addTo(*_app.add_subcommand("diff", kDiffText));
    _keys.addTo(*_app.add_subcommand("keys", kKeysText));
  }

  CLI::App& app() { return _app; }

  [[nodiscard]] Options result() const {
    if (_app.got_subcommand("new")) return _new.result();
    if (_app.got_subcommand("keygen")) return _keygen.result();
    if (_app.got_subcommand("lint")) return _lint.options;
    if (_app.got_subcommand("sign")) return _sign.result();
    if (_app.got_subcommand("verify")) return _verify.options;
    if (_app.got_subcommand("show")) return _show.result();
    if (_app.got_subcommand("explain")) return _explain.result();
    if (_app.got_subcommand("diff")) return _diff.options;
    return _keys.options;
  }

 private:
  CLI::App _app;
  NewArguments _new;
  KeygenArguments _keygen;
  LintArguments _lint;
  SignArguments _sign;
  VerifyArguments _verify;
  ShowArguments _show;
  ExplainArguments _explain;
  DiffArguments _diff;
  KeysArguments _keys;
};

}  // namespace

ParsedOptions parseOptions(int argumentCount, const char* const* arguments, const std::string& version,
                           platform::TimePoint now, std::ostream& out, std::ostream& err) {
  CommandLine line(version, now);
  try {
    line.app().parse(argumentCount, arguments);
    return {line.result()};
  } catch (const CLI::ParseError& error) {
    return {std::nullopt, line.app().exit(error, out, err) == 0 ? kSucceeded : kWrongUsage};
  }
}

}  // namespace tallyd::storebagtool
