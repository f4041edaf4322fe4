// What no request reaches: the base class as other handlers use it, and the handler's quoting.
// Linked with the module's own objects.
#include <gtest/gtest.h>

#include <functional>

#include "compress/KAVO.Zantro.Compress.h"
#include "device/base/json_text.h"
#include "device/platform/kavo/request.h"
#include "device/platform/operations.h"

namespace {

class Handler : public Zantro::FileWebAPI {
 public:
  using FileWebAPI::FileWebAPI;
  using FileWebAPI::SetError;
  using FileWebAPI::SetFileError;
  using FileWebAPI::SetResponse;

  std::function<void(Handler&)> process;

 protected:
  void Process() override { process(*this); }
};

// The outcome that a handler with this body, or the module's own, hands to the host.
std::string OutcomeOf(const std::function<void(Handler&)>& process,
                      const std::string& method = "") {
  Device::AddFault("LumoLibUGIDSet=0");
  Device::Request request;
  request.method = method;
  KAVO::APIRequest::State request_state{request};
  KAVO::APIResponse::State response_state;
  KAVO::APIRequest api_request{&request_state};
  KAVO::APIResponse api_response{&response_state};
  if (process) {
    Handler handler(&api_request, &api_response);
    handler.process = process;
    handler.Run();
    EXPECT_EQ(handler.GetError(), response_state.outcome.code);
  } else {
    Zantro::ZantroCompressHandler(&api_request, &api_response).Run();
  }
  Device::StopTracing();
  return std::to_string(response_state.outcome.code) + " " +
         Device::ToText(response_state.outcome.data);
}

TEST(BaseHandler, HandsOnWhatWasRecordedLast) {
  EXPECT_EQ(OutcomeOf([](Handler& handler) {
              handler.SetError(407, "why");
              handler.SetResponse("data");
            }),
            R"(0 "data")");
  EXPECT_EQ(OutcomeOf([](Handler& handler) {
              handler.SetResponse("data");
              handler.SetError(401);
            }),
            "401 null");
  EXPECT_EQ(OutcomeOf([](Handler& handler) { handler.SetFileError(1300, "/photo/a", 402); }),
            R"(1300 [{"code":402,"path":"/photo/a"}])");
}

TEST(CompressHandler, ComparesMethodNamesExactly) {
  for (const char* method : {"START", "Stop", "status ", ""}) {
    EXPECT_EQ(OutcomeOf(nullptr, method), "101 null") << method;
  }
}

TEST(Escape, QuotesForAShellOrAnswersNothing) {
  const auto escape = Zantro::ZantroCompressHandler::LumoEscape;
  EXPECT_EQ(escape("a b"), "a\\ b");
  EXPECT_EQ(escape("\n\n"), "'\n''\n'");  // just fits: three times its length
  Device::AddFault("KLIBCEncShParam=-1");
  EXPECT_EQ(escape("a b"), "");
  Device::StopTracing();
}

}  // namespace
