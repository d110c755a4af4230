#include "framework/c/Options.h"

#include "framework/c/Boundary.h"

using tallyd::TallyConnectionOptions;
using tallyd::TallyReconnect;
using tallyd::c::ArgumentError;
using tallyd::c::object;
using tallyd::c::required;
using tallyd::c::status;

namespace {

TallyConnectionOptions::Milliseconds duration(int64_t milliseconds) {
  if (milliseconds < 0) throw ArgumentError("a time is negative");
  return TallyConnectionOptions::Milliseconds(milliseconds);
}

template <class Change>
tally_status change(tally_options* options, Change&& work) {
  return status([&] {
    work(required(options, "the options").options);
    return tally_status{TALLY_OK};
  });
}

}  // namespace

tally_options* tally_options_new(void) {
  return object([] { return new tally_options; });
}

void tally_options_free(tally_options* options) { delete options; }

tally_status tally_options_set_socket_path(tally_options* options, const char* path) {
  return change(options, [&](auto& all) { all.socketPath = &required(path, "the path"); });
}

tally_status tally_options_set_timeout(tally_options* options, int64_t milliseconds) {
  return change(options, [&](auto& all) { all.timeout = duration(milliseconds); });
}

tally_status tally_options_set_close_timeout(tally_options* options, int64_t milliseconds) {
  return change(options, [&](auto& all) { all.closeTimeout = duration(milliseconds); });
}

tally_status tally_options_set_reconnect(tally_options* options, int reconnect) {
  return change(options, [&](auto& all) {
    if (reconnect != TALLY_NEVER_RECONNECT && reconnect != TALLY_RECONNECT_WHEN_LOST)
      throw ArgumentError("no such way to reconnect");
    all.reconnect = reconnect == TALLY_NEVER_RECONNECT ? TallyReconnect::Never : TallyReconnect::WhenLost;
  });
}

tally_status tally_options_set_pauses(tally_options* options, int64_t first, int64_t maximum) {
  return change(options, [&](auto& all) {
    all.maximumPause = duration(maximum);
    all.firstPause = duration(first);
  });
}

tally_status tally_options_set_maximum_calls(tally_options* options, size_t calls) {
  return change(options, [&](auto& all) { all.maximumCalls = calls; });
}
