#include <chrono>
#include <set>

#include "tests/support.h"

namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;

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
class WakingClient : public vesk::Client {
 public:
  using vesk::Client::Client;
  using vesk::Client::status_;
  void OnEvent(const sns_client_event_msg& /*msg*/) override {
    { const std::lock_guard<std::mutex> waiting(mutex_); }
    cv_.notify_all();
  }
};

TEST_F(HubTest, SendsAndWaits) {
  hub_.model = make_sensors("1,accel,imu,0");
  std::vector<sns_client_resp_msg_v01> responses;
  const auto wait = [&](uint64_t uid, auto timeout) {
    const auto connection = Connect();
    WakingClient client(connection.get());
    client.status_ = -77;
    return client.SendRequestsAndWait(
        {client.MakeConfigRequest({uid, 0}, 10, false)}, timeout, &responses);
  };
  EXPECT_EQ(wait(1, seconds(1000)), -77);
  EXPECT_EQ(wait(1, seconds::max()), -77);  // beyond the clock's range
  EXPECT_EQ(wait(1, std::chrono::hours::max()), -77);
  EXPECT_EQ(wait(1, seconds(0)), -ETIMEDOUT);
  EXPECT_EQ(wait(1, seconds(-1)), -ETIMEDOUT);
  EXPECT_EQ(wait(1, milliseconds(999)), -ETIMEDOUT);
  // A failure to send comes before everything else.
  EXPECT_EQ(wait(9, seconds(0)), -ENODEV);
  EXPECT_EQ(wait(9, seconds(1000)), -ENODEV);
  ASSERT_EQ(responses.size(), 1u);
  EXPECT_EQ(responses[0].status(), -ENODEV);
  EXPECT_EQ(Calls("(Reg|Send|Unreg)"),
            repeat("RegisterClient SendRequests UnregisterClient ", 8));
}

}  // namespace
