// An adaptor that throws wherever it can.

#include <stdexcept>
#include <string>

#include "framework/PithAdaptor.h"

namespace {

int instance = 0;

void* create() { return &instance; }
void destroy(void* /*self*/) { throw 5; }
void sendMessage(void* /*self*/, uint16_t method, uint16_t, const void*, size_t) {
  throw std::runtime_error("no room for method " + std::to_string(method));
}

}  // namespace

const PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION, create, destroy, sendMessage};
