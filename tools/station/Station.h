// The whole station: everything that it takes in and gives out, put together.
#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <vector>

#include "platform/system/SystemClock.h"
#include "station/BagFolder.h"
#include "station/DatagramReceiver.h"
#include "station/DirectoryLock.h"
#include "station/EventCollector.h"
#include "station/Feed.h"
#include "station/Journal.h"
#include "station/LogDataReceiver.h"
#include "station/Options.h"
#include "station/PageModel.h"
#include "station/ReceivingRoutes.h"
#include "station/StationIdentity.h"
#include "station/StationPage.h"
#include "station/StationServer.h"
#include "station/StorebagRoutes.h"
#include "station/TerminalView.h"
#include "station/UploadReceiver.h"

namespace tallyd::station {

/// Answers from construction to destruction. The file "station.json" in its folder tells the ports, and is
/// there just as long.
///
/// Threading: one thread.
class Station {
 public:
  /// Borrows the view. Throws an exception that names the file or address at fault.
  Station(const Options& options, TerminalView& view);
  ~Station();
  Station(const Station&) = delete;
  Station& operator=(const Station&) = delete;

  /// Everything so far, as notices.
  void showTotals() const;

 private:
  [[nodiscard]] std::vector<StationServer::RouteGroup> routes();
  void showAddresses(const Options& options) const;
  void writeReadyFile() const;
  void removeReadyFile() const;

  const std::filesystem::path _directory;
  TerminalView& _view;
  const DirectoryLock _lock;
  const StationIdentity _identity;
  const platform::SystemClock _clock;
  Feed _feed;

  Journal _eventJournal;
  Journal _datagramJournal;
  Journal _uploadJournal;
  Journal _logDataJournal;

  BagFolder _bags;
  EventCollector _events;
  UploadReceiver _uploads;
  LogDataReceiver _logData;
  StorebagRoutes _storebagRoutes;
  ReceivingRoutes _receivingRoutes;
  PageModel _pageModel;
  StationPage _page;

  // Last: their threads use the others.
  std::optional<DatagramReceiver> _datagrams;
  std::optional<StationServer> _server;
};

}  // namespace tallyd::station
