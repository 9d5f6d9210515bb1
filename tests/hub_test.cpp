#include <chrono>
#include <set>

#include "tests/support.h"

namespace {

TEST(SensorUid, OrdersAsOneUnsignedNumber) {
  const std::set<vesk::SensorUid> uids = {
      {0x8a9b0c1d2e3f4a5b, 0x5f6b2a101c3d4e5f}, {2, 1}, {~0ul, 0}, {0, ~0ul}};
  std::string texts;
  for (const vesk::SensorUid& uid : uids) texts += uid.str() + '\n';
  EXPECT_EQ(texts,
            "00000000-0000-0000-ffff-ffffffffffff\n"
            "00000000-0000-0001-0000-000000000002\n"
            "5f6b2a10-1c3d-4e5f-8a9b-0c1d2e3f4a5b\n"
            "ffffffff-ffff-ffff-0000-000000000000\n");
}

// A client that a delivery wakes once it waits.
struct WakingClient : vesk::Client {
  using vesk::Client::Client;
  using vesk::Client::status_;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    { const std::lock_guard<std::mutex> waiting(mutex_); }
    cv_.notify_all();
  }
};

// For a time that the clock cannot hold, too. A failure to send, -ENODEV, comes
// before everything else, also before -ETIMEDOUT.
TEST_F(HubTest, SendsAndWaits) {
  for (const auto& [timeout, uid, result] : table<3>(R"(
1000;9223372036854775807 | 1 | -77
0;-1                     | 1 | -110
0;1000                   | 9 | -19
)")) {
    Connect();
    WakingClient client(connection_.get());
    client.status_ = -77;
    const std::vector<std::string> requests = {
        client.MakeConfigRequest({std::stoul(uid), 0}, 10, false)};
    EXPECT_EQ(client.SendRequests(requests, nullptr), -EPERM);
    calls_.clear();
    std::vector<sns_client_resp_msg_v01> responses(3);
    const std::chrono::seconds limit(std::stol(timeout));
    EXPECT_EQ(client.SendRequestsAndWait(requests, limit, &responses),
              std::stoi(result));
    ASSERT_EQ(responses.size(), 1u);
    EXPECT_EQ(responses[0].status(), uid == "9" ? -ENODEV : 0);
    EXPECT_EQ(calls_, "RegisterClient SendRequests UnregisterClient ");
  }
}

}  // namespace
