// What no request reaches: the base class as other handlers use it, and the handler's quoting.
// Linked with the module's own objects.
#include <gtest/gtest.h>
#include <syslog.h>

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <functional>

#include "compress/KAVO.Zantro.Compress.h"
#include "device/base/json_text.h"
#include "device/platform/kavo/request.h"
#include "device/platform/operations.h"
#include "tests/programs.h"

namespace {

std::string last_line;  // of the log, without its file and line

class Handler : public Zantro::FileWebAPI {
 public:
  using FileWebAPI::FileWebAPI;
  using FileWebAPI::ParseErrnoToError;
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

TEST(BaseHandler, LeavesErrorNumbersToThePlatform) {
  const TempFolder temp;
  Device::OpenTrace(temp.Path() + "/trace");
  EXPECT_EQ(Handler::ParseErrnoToError(ENOSPC, "from", "to"), 416);
  EXPECT_NE(ReadFile(temp.Path() + "/trace").find(R"([28,"from","to"])"), std::string::npos);
  Device::StopTracing();
}

TEST(Escape, QuotesForAShellOrAnswersNothing) {
  const auto escape = [](const std::string& text) {
    last_line.clear();
    return Zantro::ZantroCompressHandler::LumoEscape(text.c_str());
  };
  EXPECT_EQ(escape("a b"), "a\\ b");
  EXPECT_EQ(escape("\n\n"), "'\n''\n'");  // just fits: three times its length
  EXPECT_EQ(last_line, "");
  Device::AddFault("KLIBCEncShParam=-1");
  EXPECT_EQ(escape("a b"), "");
  Device::StopTracing();
  EXPECT_EQ(last_line, "Failed to escape string: a b");
}

}  // namespace

extern "C" void syslog(int /*priority*/, const char* format, ...) {
  std::array<char, 256> line{};
  va_list arguments;
  va_start(arguments, format);
  // NOLINTNEXTLINE(clang-analyzer-valist.Uninitialized): it is not
  std::vsnprintf(line.data(), line.size(), format, arguments);
  va_end(arguments);
  last_line = std::strchr(line.data(), ' ') + 1;
}
