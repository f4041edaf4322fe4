// Requests over HTTP behind the front end: whose turn it is, and what they may take.
#include "device/host/web_request.h"

#include <sqlite3.h>
#include <sys/socket.h>

#include "device/base/child_process.h"
#include "device/base/file_io.h"
#include "device/base/json_text.h"
#include "device/host/request_queue.h"
#include "device/host/sessions.h"
#include "device/host/wire.h"
#include "tests/device_fixture.h"

namespace {

using WebRequestTest = DeviceTest;

TEST(RequestQueueTest, KeepsRoomForOthers) {
  Device::RequestQueue queue;
  pid_t last = 0;
  const auto add = [&](const std::string& client, bool is_stream = false) {
    return queue.Add({client, client + "'s session", is_stream}, [&] { return ++last; });
  };
  for (int count = 0; count < 8 + 128; ++count) {
    EXPECT_TRUE(add("alice")) << count;
  }
  EXPECT_FALSE(add("alice"));
  EXPECT_EQ(last, 8);
  EXPECT_TRUE(add("bob"));
  EXPECT_EQ(last, 9);
  queue.TakeEnd(1);
  EXPECT_EQ(last, 10);
  EXPECT_TRUE(add("alice"));
  for (int client = 0; last < 1 + 128 - 16; ++client) {
    EXPECT_TRUE(add("other " + std::to_string(client / 8)));
  }
  EXPECT_TRUE(add("bob"));  // who has one: it waits
  EXPECT_EQ(last, 113);
  EXPECT_TRUE(add("carol"));
  EXPECT_EQ(last, 114);
  for (int count = 0; count < 16; ++count) {
    EXPECT_TRUE(add("alice", true));
  }
  EXPECT_FALSE(add("alice", true));
  EXPECT_TRUE(add("bob", true));
  EXPECT_TRUE(queue.HasStream("bob's session"));
  EXPECT_FALSE(queue.HasStream("carol's session"));
}

TEST_F(WebRequestTest, ALockedStoreIsSaidSoon) {
  const std::string session = Device::SignIn("alice");
  Ask("status", "none");  // makes the store
  sqlite3* database = nullptr;
  ASSERT_EQ(sqlite3_open(At("users/alice/store.db").c_str(), &database), SQLITE_OK);
  ASSERT_EQ(sqlite3_exec(database, "BEGIN IMMEDIATE", nullptr, nullptr, nullptr), SQLITE_OK);
  int ends[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
  Device::FileDescriptor stream(ends[0]);
  Device::FileDescriptor other(ends[1]);
  Device::ChildProcess process = Device::ChildProcess::Run([&] {
    stream.Close();
    Device::ServeWebRequest(
        *launcher_, std::move(other),
        Device::JsonObject({{"kind", "call"}, {"session", session}, {"type", ""}}));
    return 0;
  });
  other.Close();
  Json::Value call = Device::JsonObject({{"api", "KAVO.Zantro.Compress"},
                                         {"method", "start"},
                                         {"version", 3},
                                         {"params", JobParams({"/photo/a"}, "/photo/z.zip")}});
  ASSERT_EQ(Device::ReceiveAnswerHead(stream.Get())->status, 100);
  EXPECT_EQ(Device::ReadFrame(stream.Get()), "");
  Device::WriteFrame(stream.Get(), Device::ToText(call));
  Device::WriteFrame(stream.Get(), "");
  EXPECT_EQ(Device::ReceiveAnswerHead(stream.Get())->status, 503);
  process.Wait();
  sqlite3_close(database);
}

}  // namespace
