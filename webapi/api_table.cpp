// The module's contact surface: the table from which the host learns what is served here, the
// function that hands it out, and the entry that every row names.
#include <cstdint>

#include "compress/KAVO.Zantro.Compress.h"
#include "platform/kavo/api_host.h"

namespace {

// The host reads rows by this layout: four machine words each, the last row all zero.
struct ApiRow {
  const char* api;
  std::intptr_t version;
  const char* method;
  void (*handler)(KAVO::APIRequest*, KAVO::APIResponse*);
};
static_assert(sizeof(ApiRow) == 4 * sizeof(void*));

constexpr char kApiName[] = "KAVO.Zantro.Compress";

// One handler per call. An exception that leaves Run destroys it and passes on to the host.
void CompressAPIEntry(KAVO::APIRequest* request, KAVO::APIResponse* response) {
  // A handler frees its task but leaves the pointer standing; a request that fails before it has a
  // task would free the previous one's again.
  pTask = nullptr;
  Zantro::ZantroCompressHandler handler(request, response);
  handler.Run();
}

}  // namespace

extern "C" {

extern ApiRow gTable[];
// The versions differ inside the methods only.
ApiRow gTable[] = {
    {kApiName, 1, "start", CompressAPIEntry},  {kApiName, 1, "status", CompressAPIEntry},
    {kApiName, 1, "stop", CompressAPIEntry},   {kApiName, 2, "start", CompressAPIEntry},
    {kApiName, 2, "status", CompressAPIEntry}, {kApiName, 2, "stop", CompressAPIEntry},
    {kApiName, 3, "start", CompressAPIEntry},  {kApiName, 3, "status", CompressAPIEntry},
    {kApiName, 3, "stop", CompressAPIEntry},   {nullptr, 0, nullptr, nullptr},
};

void* GetAPITable() { return gTable; }
}
