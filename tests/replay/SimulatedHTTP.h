// The servers behind the daemon's HTTP client: storebags, collectors, uploads.
#pragma once

#include <map>
#include <string>

#include "platform/HTTPClient.h"
#include "replay/PostWatch.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// Answers as the weather has it, counts what it was given, and watches over when storebags are fetched.
class SimulatedHTTP : public platform::HTTPClient {
 public:
  /// Borrows both.
  SimulatedHTTP(Surroundings& surroundings, PostWatch& posts) : _world(surroundings), _posts(posts) {}

  platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& request) override;
  void sendAsynchronousRequest(platform::HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                               Completion completion) override;

 private:
  /// The last attempt to fetch one storebag, as it must appear to the daemon.
  struct Attempt {
    platform::TimePoint ended;
    bool failed;
    int maxAgeSeconds;
  };

  platform::HTTPResult storebag(const std::string& url);
  void checkFetch(const std::string& name);
  platform::HTTPResult envelope(const std::string& name, Attempt& attempt);
  platform::HTTPResult failedFetch(const std::string& name);
  platform::HTTPResult fatalFetch(const std::string& name);
  platform::HTTPResult upload(const platform::HTTPRequest& request);
  platform::HTTPResult logData(const platform::HTTPRequest& request);
  platform::HTTPResult postResult(const std::string& url);
  platform::HTTPResult refusedPost();

  Surroundings& _world;
  PostWatch& _posts;
  std::map<std::string, Attempt> _attempts;
};

}  // namespace tallyd::replay
