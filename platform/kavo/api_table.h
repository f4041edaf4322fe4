// The table by which a module tells the host what it serves. The host loads the module, calls its
// exported function `GetAPITable`, which takes nothing and returns the address of the first row as
// void*, and calls a row's handler once per request.
#pragma once

#include <cstdint>

namespace KAVO {

class APIRequest;
class APIResponse;

// Four machine words; a row of zeros ends the table.
struct ApiRow {
  const char* api;
  std::intptr_t version;
  const char* method;
  void (*handler)(APIRequest*, APIResponse*);
};
static_assert(sizeof(ApiRow) == 4 * sizeof(void*));

}  // namespace KAVO
