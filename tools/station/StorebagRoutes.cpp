#include "station/StorebagRoutes.h"

#include <fmt/format.h>
#include <httplib.h>

#include "station/HTTPStatus.h"

namespace tallyd::station {

namespace {

constexpr const char* kStorebagPath = R"(/(?:storebags|bags)/sorrel/([^/]+))";

}  // namespace

StorebagRoutes::StorebagRoutes(const BagFolder& bags, std::chrono::seconds maxAge, TerminalView& view)
    : _bags(bags), _cacheControl(fmt::format("max-age={}", maxAge.count())), _view(view) {}

void StorebagRoutes::addTo(httplib::Server& server) {
  server.Get(kStorebagPath, [this](const httplib::Request& request, httplib::Response& response) {
    const std::string name = request.matches[1];
    const Answer answer = _bags.storebag(name);
    response.status = answer.status;
    if (answer.status != kOK) {
      response.set_content(answer.body, "text/plain; charset=utf-8");
      _view.showProblem(answer.body.substr(0, answer.body.find('\n')));
      return;
    }
    response.set_header("Cache-Control", _cacheControl);
    response.set_content(answer.body, "application/xml");
    ++_served;
    _view.showNotice(
        fmt::format("served the storebag {} to version {}", name, request.get_param_value("version")));
  });
}

}  // namespace tallyd::station
