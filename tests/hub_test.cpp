#include <chrono>
#include <mutex>

#include "tests/support.h"

namespace {

TEST(SensorUid, OrdersAsOneUnsignedNumber) {
  const std::set<vesk::SensorUid> uids = {
      {0x8a9b0c1d2e3f4a5b, 0x5f6b2a101c3d4e5f}, {2, 1}, {~0ul, 0}, {0, ~0ul}};
  std::vector<std::string> texts;
  for (const vesk::SensorUid& uid : uids) texts.push_back(uid.str());
  EXPECT_THAT(texts, ElementsAre("00000000-0000-0000-ffff-ffffffffffff",
                                 "00000000-0000-0001-0000-000000000002",
                                 "5f6b2a10-1c3d-4e5f-8a9b-0c1d2e3f4a5b",
                                 "ffffffff-ffff-ffff-0000-000000000000"));
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

TEST_F(HubTest, SendsAndWaits) {
  using std::chrono::seconds;
  constexpr int kStatus = -77;  // the library's, when a delivery ends the wait
  const struct {
    seconds timeout;
    uint64_t uid;
    int result;
  } kRows[] = {
      {seconds(1000), 1, kStatus},
      {seconds::max(), 1, kStatus},  // a time that the clock cannot hold
      {seconds(0), 1, -ETIMEDOUT},
      {seconds(-1), 1, -ETIMEDOUT},
      {seconds(1), 2, -ETIMEDOUT},  // a passive request, which is not served
      {seconds(0), 9, -ENODEV},
      {seconds(1000), 9, -ENODEV},
  };
  for (const auto& row : kRows) {
    Connect();
    WakingClient client(connection_.get());
    client.status_ = kStatus;
    std::vector<sns_client_resp_msg_v01> responses(3);
    EXPECT_EQ(client.SendRequestsAndWait(
                  {client.MakeConfigRequest({row.uid, 0}, 10, row.uid == 2)},
                  row.timeout, &responses),
              row.result);
    ASSERT_EQ(responses.size(), 1u);
    EXPECT_EQ(responses[0].status(), row.uid == 9 ? -ENODEV : 0);
  }
}

}  // namespace
