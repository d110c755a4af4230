// The requests by which the daemon hands something in.
#pragma once

#include "station/EventCollector.h"
#include "station/LogDataReceiver.h"
#include "station/UploadReceiver.h"

namespace httplib {
class Server;
}

namespace tallyd::station {

///  - POST /events and below: a post of events.
///  - POST /upload: a file, with its facts in the query.
///  - POST /log-data: an archive of log data.
///
/// All plain or with Content-Encoding gzip; 400 for what can't be read, 413 for what is too large, 415 for
/// another encoding, 500 for what can't be kept, with the reason in the body.
///
/// Threading: any thread. Must outlive the servers.
class ReceivingRoutes {
 public:
  /// Borrows the others.
  ReceivingRoutes(EventCollector& events, UploadReceiver& uploads, LogDataReceiver& logData)
      : _events(events), _uploads(uploads), _logData(logData) {}

  void addTo(httplib::Server& server);

 private:
  EventCollector& _events;
  UploadReceiver& _uploads;
  LogDataReceiver& _logData;
};

}  // namespace tallyd::station
