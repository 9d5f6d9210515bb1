#include <chrono>
#include <functional>
#include <set>

#include "tests/support.h"

namespace {

using std::chrono::seconds;
using testing::ElementsAre;

TEST(SensorUid, TextForm) {
  const struct {
    vesk::SensorUid uid;
    const char* text;
  } kCases[] = {
      {{0, 0}, "00000000-0000-0000-0000-000000000000"},
      {{2, 1}, "00000000-0000-0001-0000-000000000002"},
      {{~0ul, ~0ul}, "ffffffff-ffff-ffff-ffff-ffffffffffff"},
      {{0x8a9b0c1d2e3f4a5b, 0x5f6b2a101c3d4e5f},
       "5f6b2a10-1c3d-4e5f-8a9b-0c1d2e3f4a5b"},
  };
  for (const auto& c : kCases) EXPECT_EQ(c.uid.str(), c.text);
}

TEST(SensorUid, OrdersAsOneUnsignedNumber) {
  const std::set<vesk::SensorUid> uids = {
      {0, ~0ul}, {0, 1}, {~0ul, 0}, {1, 0}, {1, 1}};
  std::vector<std::string> texts;
  for (const vesk::SensorUid& uid : uids) texts.push_back(uid.str());
  EXPECT_THAT(texts, ElementsAre("00000000-0000-0000-0000-000000000001",
                                 "00000000-0000-0000-ffff-ffffffffffff",
                                 "00000000-0000-0001-0000-000000000000",
                                 "00000000-0000-0001-0000-000000000001",
                                 "ffffffff-ffff-ffff-0000-000000000000"));
}

// A client that a delivery wakes, before or while it waits.
class WakingClient : public vesk::Client {
 public:
  using vesk::Client::Client;
  using vesk::Client::status_;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    { const std::lock_guard<std::mutex> waiting(mutex_); }
    cv_.notify_all();
  }
};

class SendAndWait : public HubTest {
 protected:
  SendAndWait() {
    hub_.model = {make_sensor(1, "accel", "imu", 0)};
    hub_.clock = &clock_;
  }
  std::vector<std::string> Requests(WakingClient* client, uint64_t uid) {
    return {client->MakeConfigRequest({uid, 0}, 10, false)};
  }
  platform::SimulatedClock clock_;
};

TEST_F(SendAndWait, EndsWithTheStatusOrAtOnce) {
  const auto connection = Connect();
  const auto kForever = std::chrono::hours::max();
  const struct {
    uint64_t uid;
    std::function<int(WakingClient*, const std::vector<std::string>&)> wait;
    int result;
  } kCases[] = {
      // Woken by the first sample: the client's status.
      {1,
       [](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, seconds(1000), nullptr);
       },
       -77},
      // A timeout beyond the clock's range.
      {1,
       [&](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, kForever, nullptr);
       },
       -77},
      {1,
       [](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, seconds(0), nullptr);
       },
       -ETIMEDOUT},
      {1,
       [](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, std::chrono::milliseconds(999),
                                       nullptr);
       },
       -ETIMEDOUT},
      // A failure to send comes before everything else.
      {9,
       [](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, seconds(0), nullptr);
       },
       -ENODEV},
      {9,
       [](auto* c, auto& r) {
         return c->SendRequestsAndWait(r, seconds(1000), nullptr);
       },
       -ENODEV},
  };
  for (const auto& c : kCases) {
    WakingClient client(connection.get());
    client.status_ = -77;
    EXPECT_EQ(c.wait(&client, Requests(&client, c.uid)), c.result);
  }
}

TEST_F(SendAndWait, RunsOutAfterTheTimeout) {
  const auto connection = Connect();
  WakingClient client(connection.get());
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(client.SendRequestsAndWait({}, seconds(1), nullptr), -ETIMEDOUT);
  EXPECT_GE(std::chrono::steady_clock::now() - start, seconds(1));
}

TEST_F(SendAndWait, ReplacesTheResponses) {
  const auto connection = Connect();
  WakingClient client(connection.get());
  std::vector<sns_client_resp_msg_v01> responses(5);
  const auto requests = Requests(&client, 1);
  client.SendRequestsAndWait(requests, seconds(0), &responses);
  EXPECT_EQ(responses.size(), 1u);
  EXPECT_THAT(
      Calls({"Reg", "Send", "Unreg"}),
      ElementsAre("RegisterClient", "SendRequests", "UnregisterClient"));
}

}  // namespace
