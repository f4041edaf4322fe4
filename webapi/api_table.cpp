// The module's contact surface: the table from which the host learns what is served here, the
// function that hands it out, and the entry that every row names.
#include "platform/kavo/api_table.h"

#include "compress/KAVO.Zantro.Compress.h"

namespace {

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

extern KAVO::ApiRow gTable[];
// The versions differ inside the methods only.
KAVO::ApiRow gTable[] = {
    {kApiName, 1, "start", CompressAPIEntry},  {kApiName, 1, "status", CompressAPIEntry},
    {kApiName, 1, "stop", CompressAPIEntry},   {kApiName, 2, "start", CompressAPIEntry},
    {kApiName, 2, "status", CompressAPIEntry}, {kApiName, 2, "stop", CompressAPIEntry},
    {kApiName, 3, "start", CompressAPIEntry},  {kApiName, 3, "status", CompressAPIEntry},
    {kApiName, 3, "stop", CompressAPIEntry},   {nullptr, 0, nullptr, nullptr},
};

void* GetAPITable() { return gTable; }
}
