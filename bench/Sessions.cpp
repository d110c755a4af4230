#include "Sessions.h"

#include <stdexcept>

#include "Datagrams.h"
#include "Events.h"
#include "Measure.h"
#include "ZlibFloor.h"

namespace tallyd::bench {

Sessions::Sessions(const Settings& settings, const SessionSetup& setup)
    : _collector(signedStorebag(setup.backends), setup.answers),
      _daemon(settings, _collector.url(""), setup.logging),
      _recording(recordClient(setup.posting)),
      _clients(ReplayingClient::crowd(setup.count, _daemon.socket(), _recording)) {
  for (ReplayingClient& client : _clients) start(client, setup);
  _collector.waitForPosts(setup.count * postersIn(setup.backends));
  (void)_collector.takePosts();
}

void Sessions::start(ReplayingClient& client, const SessionSetup& setup) const {
  client.call(_recording.setSessionInfo);
  const std::string reporting = client.call(_recording.startConfig);
  for (const auto& [name, backend] : setup.backends) {
    if (reporting.find(name) == std::string::npos) throw std::runtime_error(name + " does not report");
  }
  if (setup.posting == Posting::Batched) client.send(_recording.flushMessages);
}

double Sessions::processorSeconds() const { return processorSecondsOf(_daemon.id()); }

std::vector<std::string> Sessions::takeDocuments() {
  std::vector<std::string> documents;
  for (const std::string& body : _collector.takePosts()) documents.push_back(documentInBody(body));
  return documents;
}

void Sessions::sendPaced(std::size_t count, std::size_t flushEvery,
                         const std::function<void(std::size_t events)>& afterWindow) {
  ReplayingClient& client = _clients.front();
  for (std::size_t sent = 0; sent < count; sent += DatagramReceiver::kWindow) {
    client.sendEvents(sent, DatagramReceiver::kWindow, flushEvery);
    client.call(_recording.fetchDisplayURL);
    afterWindow(DatagramReceiver::kWindow);
  }
}

void checkDocuments(const std::vector<std::string>& documents, std::size_t events, std::size_t copies) {
  EventCheck check(events, copies);
  for (const std::string& document : documents) check.addDocument(document);
  check.finish();
}

}  // namespace tallyd::bench
