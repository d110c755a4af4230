// The real daemon on a root of its own, with real servers on the loopback interface.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "fakes/TemporaryFolder.h"
#include "framework/TallyConnection.h"
#include "integration/WatchedProcess.h"
#include "platform/Root.h"
#include "support/LoopbackServer.h"

namespace tallyd::test {

/// Signs and serves storebags over HTTPS, as an operator's server does.
class StorebagServer {
 public:
  StorebagServer();

  /// What the server answers for the storebag `name`: a bag with this section under "release".
  void serve(const std::string& name, const platform::Dictionary& section, const std::string& cacheControl);
  /// The whole bag, as it is.
  void serveBag(const std::string& name, const platform::Value& bag, const std::string& cacheControl);
  /// Anything at all; may block.
  void serveWith(const std::string& name, LoopbackServer::Handler handler);

  [[nodiscard]] ServedResponse signedBag(const platform::Value& bag, const std::string& cacheControl) const;
  [[nodiscard]] std::string baseURL() const;
  [[nodiscard]] static std::string publicKeyDER();
  [[nodiscard]] const std::string& authorityPEM() const { return _authority.certificatePEM(); }
  [[nodiscard]] const signing::CertificateAuthority& authority() const { return _authority; }
  [[nodiscard]] LoopbackServer& http() { return *_server; }

 private:
  ServedResponse answer(const ReceivedRequest& request);

  signing::CertificateAuthority _authority;
  std::mutex _mutex;
  std::map<std::string, LoopbackServer::Handler> _handlers;
  std::unique_ptr<LoopbackServer> _server;
};

/// A root with everything that the daemon reads, made for one storebag server.
class TestRoot {
 public:
  explicit TestRoot(const StorebagServer& server);

  [[nodiscard]] const platform::Root& root() const { return _root; }
  [[nodiscard]] std::filesystem::path under(const std::string& path) const { return _root.under(path); }
  [[nodiscard]] std::filesystem::path socket() const;
  void write(const std::string& path, const std::string& bytes) const;
  void setPreferences(const std::string& suite, const platform::Dictionary& values) const;
  void setDevice(const platform::Dictionary& answers) const;
  [[nodiscard]] std::string read(const std::string& path) const;
  /// The message log's lines, each without its time stamp.
  [[nodiscard]] std::vector<std::string> messageLog() const;

 private:
  fakes::TemporaryFolder _folder;
  platform::Root _root;
};

/// The daemon, started and ready when the constructor returns.
class TestDaemon {
 public:
  struct Options {
    std::vector<std::string> arguments{};
    std::map<std::string, std::string> environment{};
    std::optional<int> descriptorLimit{};
    int passedSocket = -1;
    std::map<int, std::size_t> limits{};  ///< As WatchedProcess takes them.
    std::optional<mode_t> umask{};
  };

  explicit TestDaemon(const TestRoot& root) : TestDaemon(root, Options()) {}
  TestDaemon(const TestRoot& root, const Options& options);

  /// The program's path.
  static std::string program();

  WatchedProcess& process() { return *_process; }
  [[nodiscard]] std::unique_ptr<TallyConnection> connect() const;

 private:
  const TestRoot& _root;
  std::unique_ptr<WatchedProcess> _process;
};

/// The events of all posts that `server` received, and the posts' documents.
[[nodiscard]] std::vector<platform::Dictionary> receivedDocuments(const LoopbackServer& server);
[[nodiscard]] std::vector<platform::Dictionary> receivedEvents(const LoopbackServer& server);

/// Session info of a client of type `clientType`.
[[nodiscard]] platform::Dictionary sessionInfo(std::uint32_t sessionID, std::int32_t clientType = 5,
                                               const platform::Dictionary& more = {});

/// A storebag with one "splunk" backend that takes every client and device.
[[nodiscard]] platform::Dictionary storebagWithHTTPSPost();

}  // namespace tallyd::test
