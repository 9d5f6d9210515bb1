#include <gtest/gtest.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>

#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <string>

// The program over the real libiio, in a mount namespace where a tree of files
// stands for the kernel's, and a FIFO for the device iio:device0.

namespace {

// The texts of files, by their paths below the devices.
using Files = std::map<std::string, std::string>;

constexpr char kNamespace[] = R"(set -e
mount --make-rprivate /
mount -t tmpfs tmpfs /sys/bus
mkdir /sys/bus/dev
mknod /sys/bus/dev/null c 1 3
mkfifo /sys/bus/dev/iio:device0
mount --rbind /sys/bus/dev /dev
ip link set lo up)";

// An accelerometer and gyroscope with a buffer, and a thermometer without.
const Files kDevices = {
    {"iio:device0/name", "imu6"},
    {"iio:device0/in_accel_x_scale", "0.5"},
    {"iio:device0/in_accel_z_scale", "2"},
    {"iio:device0/in_accel_offset", "-1"},
    {"iio:device0/in_mount_matrix", "0, 1, 0; -1, 0, 0; 0, 0, 1"},
    {"iio:device0/sampling_frequency", "25.000000"},
    {"iio:device0/sampling_frequency_available", "12.5 25 50 100"},
    {"iio:device0/current_timestamp_clock", "realtime"},
    {"iio:device0/trigger/current_trigger", ""},
    {"iio:device0/buffer/enable", "0"},
    {"iio:device0/buffer/length", "2"},
    {"iio:device0/buffer/watermark", "1"},
    {"iio:device1/label", "Lid"},
    {"iio:device1/in_temp0_raw", "21500"},
    {"trigger0/name", "imu6-dev0"},
};

// As iio:device0 lays it out.
struct Scan {
  std::array<int16_t, 3> values;
  int64_t time;
};

void put(const Files& files) {
  for (const auto& [path, text] : files) {
    const auto file = std::filesystem::path("/sys/bus/iio/devices") / path;
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file) << text << '\0';
  }
}

Files read_all() {
  Files files;
  using Tree = std::filesystem::recursive_directory_iterator;
  for (const auto& entry : Tree("/sys/bus/iio/devices")) {
    std::ifstream file(entry.path());
    std::getline(file, files[entry.path()], '\0');
  }
  return files;
}

class IioTest : public testing::Test {
 protected:
  void SetUp() override {
    if (unshare(CLONE_NEWNS | CLONE_NEWNET) != 0) {
      GTEST_SKIP() << "No namespaces: " << std::strerror(errno);
    }
    ASSERT_EQ(std::system(kNamespace), 0);
    put(kDevices);
    constexpr std::array kChannels = {"accel_x", "accel_z", "anglvel_x",
                                      "timestamp"};
    for (size_t i = 0; i < kChannels.size(); ++i) {
      const std::string name = std::string("in_") + kChannels[i];
      const std::string element = "iio:device0/scan_elements/" + name;
      put({{"iio:device0/" + name + "_raw", "1"},
           {element + "_en", "0"},
           {element + "_index", std::to_string(i)},
           {element + "_type", i < 3 ? "le:s16/16>>0" : "le:s64/64>>0"}});
    }
    constexpr std::array<Scan, 2> kScans = {
        {{{1, 3, 4}, 1'000'000'007}, {{3, -1, -4}, 1'010'000'009}}};
    fifo_.open("/dev/iio:device0");  // for both, which does not wait
    fifo_.write(reinterpret_cast<const char*>(&kScans), sizeof kScans).flush();
  }

  void Start(const std::string& arguments) {
    const std::string shell = "echo $$ >/sys/bus/tool; exec " FENNICK_PROGRAM;
    output_ = popen((shell + ' ' + arguments + " 2>&1").c_str(), "re");
  }

  void ReadUntil(const std::string& text) {
    for (int next = 0; next != EOF && !read_.ends_with(text);) {
      next = std::getc(output_);
      if (next != EOF) read_ += static_cast<char>(next);
    }
  }

  // What depends on the moment, such as the time of a poll, is <n>; whether
  // there is a log file is left out.
  void Expect(int status, const std::string& output) {
    static const std::regex kMoment(
        "(Time: |@ ~|period = |TS: (?=[0-9]{11}))[0-9.]+");
    static const std::regex kLogFile(".*: Failed to open log file\n");
    ReadUntil("its end");
    EXPECT_EQ(pclose(output_), status);
    read_ = std::regex_replace(read_, kLogFile, "");
    EXPECT_EQ(std::regex_replace(read_, kMoment, "$1<n>"), output);
  }

  std::fstream fifo_;
  FILE* output_ = nullptr;
  std::string read_;
};

const std::string kSession =
    R"(Sampling from sensor type gyro.s: imu6 gyro.
Sampling from sensor type accel.s: imu6 accel.
fennick: warning: Configured gyro.s for 100.0 Hz
fennick: warning: Configured accel.s for 100.0 Hz
Sensor: gyro.s TS: 1000000007 Data: 4.000000
Sensor: gyro.s TS: 1010000009 Data: -4.000000
Sensor: accel.s TS: 1000000007 Data: 0.000000 4.000000
Sensor: accel.s TS: 1010000009 Data: 1.000000 -4.000000
)";
const std::string kSummary = R"(
Time: <n> seconds
gyro.s 2 samples @ ~<n> Hz, average period = <n>
accel.s 2 samples @ ~<n> Hz, average period = <n>

Average:
gyro.s  0.000000
accel.s  0.500000 0.000000

Standard Deviation:
gyro.s  5.656854
accel.s  0.707107 5.656854
)";

TEST_F(IioTest, ListsWhatTheKernelSays) {
  Start("list accel");
  Expect(0, R"(1bdc5ee2-efd9-a8b7-9b0f-785125a092cd
TYPE              accel
NAME              imu6
DISPLAY_NAME      imu6 accel
AVAILABLE         true
DYNAMIC           false
HW_ID             0
PASSIVE_REQUEST   false
PHYSICAL_SENSOR   true
PLACEMENT         [ 0.000000 1.000000 0.000000 -1.000000 0.000000 0.000000 0.000000 0.000000 1.000000 0.000000 0.000000 0.000000 ]
RATES             [ 12.500000 25.000000 50.000000 100.000000 ]
SEL_RESOLUTION    0.500000
STREAM_TYPE       STREAMING

)");
}

TEST_F(IioTest, CapturesAndLeavesAllAsItWas) {
  const Files before = read_all();
  Start("-r60 gyro -n2 accel");
  Expect(0, kSession + kSummary);
  EXPECT_EQ(read_all(), before);
}

TEST_F(IioTest, LeavesAllAsItWasAlsoWhenItIsKilled) {
  const Files before = read_all();
  prctl(PR_SET_CHILD_SUBREAPER, 1);  // of whatever outlives the program
  Start("-r60 gyro accel");
  ReadUntil("Data: 1.000000 -4.000000\n");
  EXPECT_NE(read_all(), before);
  std::system("kill -9 $(cat /sys/bus/tool)");
  Expect(W_EXITCODE(0, SIGKILL), kSession);
  while (wait(nullptr) != -1) {
  }
  EXPECT_EQ(read_all(), before);
}

TEST_F(IioTest, PollsWhatHasNoBuffer) {
  Start("-n1 -r1000 sensor_temperature");
  Expect(0, R"(Sampling from sensor type sensor_temperature.s: Lid.
fennick: warning: Configured sensor_temperature.s for 100.0 Hz
TS: <n> Data: 21.500000

Time: <n> seconds
sensor_temperature.s 1 samples @ ~<n> Hz

Average:
sensor_temperature.s  21.500000

Standard Deviation:
)");
}

TEST_F(IioTest, SaysWhatFailsAndLeavesAllAsItWas) {
  put({{"iio:device0/in_accel_z_scale", "wide"}});
  const Files before = read_all();
  Start("-n2 -r60 accel");
  Expect(W_EXITCODE(256 - EINVAL, 0),
         R"(Sampling from sensor type accel.s: imu6 accel.
fennick: error: iio:device0: in_accel_z_scale: Invalid argument

Time: <n> seconds
accel.s 0 samples @ ~<n> Hz

Average:

Standard Deviation:
)");
  EXPECT_EQ(read_all(), before);
}

TEST_F(IioTest, IsServedByADaemonUntilThatDies) {
  std::system("iiod 2>/dev/null & echo $! >/sys/bus/daemon");
  setenv("IIOD_REMOTE", "ip:127.0.0.1", 1);
  std::system("timeout 60 sh -c 'until iio_info; do :; done' >/dev/null 2>&1");
  Start("-t1000 -r60 gyro accel");
  ReadUntil("Data: 1.000000 -4.000000\n");
  std::system("kill -9 $(cat /sys/bus/daemon)");
  Expect(W_EXITCODE(256 - ENOTCONN, 0),
         kSession + "fennick: error: iio:device0: buffer: Broken pipe\n" +
             kSummary);
}

}  // namespace
