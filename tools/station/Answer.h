// What the station answers to a request.
#pragma once

#include <string>

namespace tallyd::station {

struct Answer {
  int status;        ///< An HTTP status code.
  std::string body;  ///< What was asked for, or what is wrong.
};

}  // namespace tallyd::station
