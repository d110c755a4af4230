// What the station is asked for on its command line.
#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include "station/DatagramExchange.h"
#include "station/TerminalView.h"
#include "station/UploadReceiver.h"

namespace CLI {
class App;
}

namespace tallyd::station {

struct Options {
  std::filesystem::path directory;
  int httpsPort = 8443;
  std::optional<int> httpPort;      ///< Nothing: no plain HTTP.
  std::optional<int> datagramPort;  ///< Nothing: no datagrams.
  long maxAgeSeconds = 60;
  std::string uploadAnswer = UploadReceiver::kUsualAnswer;
  BadNetwork network;
  bool quiet = false;
  bool json = false;

  [[nodiscard]] TerminalView::Records records() const {
    if (quiet) return TerminalView::Records::Hidden;
    return json ? TerminalView::Records::JSON : TerminalView::Records::Readable;
  }
  /// Whether the network is to be a bad one.
  [[nodiscard]] bool losesOnPurpose() const;
};

/// Declares all options, which write to `options` when `app` parses; both must live until then.
void declareOptions(CLI::App& app, Options& options);

}  // namespace tallyd::station
