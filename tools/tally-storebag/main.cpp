#include <chrono>
#include <iostream>

#include "tally-storebag/Tool.h"

int main(int argumentCount, char** arguments) {
  using namespace tallyd::storebagtool;
  return runTool(argumentCount, arguments,
                 {.version = TALLYD_VERSION,
                  .out = std::cout,
                  .err = std::cerr,
                  .now = std::chrono::system_clock::now()});
}
