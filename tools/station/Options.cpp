#include "station/Options.h"

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <random>

namespace tallyd::station {

namespace {

constexpr int kHighestPort = 65535;
constexpr long kLongestDelayMilliseconds = 60'000;

void declareServers(CLI::App& app, Options& options) {
  app.add_option("--directory", options.directory, "Folder of keys, certificates, bags/ and what comes in")
      ->required()
      ->type_name("DIR");
  app.add_option("--port", options.httpsPort, "HTTPS port; 0 lets the system choose")
      ->check(CLI::Range(0, kHighestPort))
      ->capture_default_str()
      ->type_name("N");
  app.add_option("--http-port", options.httpPort,
                 "Take everything but requests for storebags over plain HTTP too")
      ->check(CLI::Range(0, kHighestPort))
      ->type_name("N");
  app.add_option("--max-age", options.maxAgeSeconds, "Seconds for which a storebag may be reused")
      ->check(CLI::NonNegativeNumber)
      ->capture_default_str()
      ->type_name("S");
  app.add_option("--upload-answer", options.uploadAnswer,
                 "Answer to uploads; without the word \"success\", the daemon keeps its file")
      ->capture_default_str()
      ->type_name("TEXT");
}

/// An option for a share, which is of use only with datagrams.
void declareShare(CLI::App& app, CLI::Option* datagrams, const char* name, Share& share,
                  const char* description) {
  app.add_option_function<std::string>(
         name,
         [name, &share](const std::string& text) {
           const auto parsed = Share::ofPercentage(text);
           if (!parsed) {
             throw CLI::ValidationError(name, fmt::format("{} is not a percentage from 0 to 100", text));
           }
           share = *parsed;
         },
         description)
      ->needs(datagrams)
      ->type_name("PERCENT");
}

void declareDatagrams(CLI::App& app, Options& options) {
  auto* datagrams =
      app.add_option("--datagram-port", options.datagramPort, "Receive datagrams; 0 lets the system choose")
          ->check(CLI::Range(0, kHighestPort))
          ->type_name("N");
  declareShare(app, datagrams, "--lose", options.network.lose, "Lose this share of the datagrams");
  declareShare(app, datagrams, "--lose-acks", options.network.loseAcks,
               "Lose this share of the acknowledgements");
  declareShare(app, datagrams, "--duplicate", options.network.duplicate, "Double this share of both");
  declareShare(app, datagrams, "--reorder", options.network.reorder,
               "Let this share of both be overtaken by the next one");
  app.add_option_function<long>(
         "--delay",
         [&options](long milliseconds) { options.network.delay = std::chrono::milliseconds(milliseconds); },
         "Hold each datagram and each acknowledgement for so many milliseconds")
      ->check(CLI::Range(0L, kLongestDelayMilliseconds))
      ->needs(datagrams)
      ->type_name("MS");
  options.network.seed = std::random_device()();
  app.add_option("--seed", options.network.seed, "Lose and keep as another run with this number did")
      ->needs(datagrams)
      ->type_name("N");
}

}  // namespace

bool Options::losesOnPurpose() const {
  const auto isUsed = [](Share share) { return share != Share(); };
  return isUsed(network.lose) || isUsed(network.loseAcks) || isUsed(network.duplicate) ||
         isUsed(network.reorder) || network.delay.count() > 0;
}

void declareOptions(CLI::App& app, Options& options) {
  app.description("Stands in for the servers that the daemon reports to, during development.");
  app.footer(
      "Example:\n"
      "  tally-station --directory ~/station --datagram-port 5140 --lose 20 --lose-acks 20\n"
      "serves ~/station/bags/playhall.plist as https://127.0.0.1:8443/bags/sorrel/playhall and\n"
      "shows what is posted to https://127.0.0.1:8443/events, uploaded to /upload and /log-data\n"
      "there, and sent to 127.0.0.1:5140, where every fifth datagram and every fifth answer is\n"
      "lost. Give ~/station/ca.pem to the daemon as etc/tally/ca.pem and ~/station/publicKey.der\n"
      "to the client framework.");
  declareServers(app, options);
  declareDatagrams(app, options);
  auto* quiet = app.add_flag("--quiet", options.quiet, "Do not show what comes in");
  app.add_flag("--json", options.json, "Show what comes in as lines of JSON")->excludes(quiet);
}

}  // namespace tallyd::station
