#include <fcntl.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>
#include <string>
#include <vector>

// The program over the real libiio, in a mount namespace where a tree of files
// stands for the kernel's, and a FIFO for the device iio:device0.

namespace {

/// The texts of files, by their paths below the devices.
using Files = std::map<std::string, std::string>;

const std::filesystem::path kTree = "/sys/bus/iio/devices";

// One scan of iio:device0, as the kernel lays it out.
struct Scan {
  std::array<int16_t, 6> values;
  int64_t time;
};

// An accelerometer and gyroscope with a buffer, and what is polled.
const Files kDevices = {
    {"iio:device0/name", "imu6"},
    {"iio:device0/in_accel_x_raw", "1"},
    {"iio:device0/in_accel_y_raw", "1"},
    {"iio:device0/in_accel_z_raw", "1"},
    {"iio:device0/in_accel_x_scale", "0.5"},
    {"iio:device0/in_accel_y_scale", "0.25"},
    {"iio:device0/in_accel_z_scale", "2"},
    {"iio:device0/in_accel_offset", "-1"},
    {"iio:device0/in_accel_scale_available", "0.5 1.0"},
    {"iio:device0/in_anglvel_x_raw", "1"},
    {"iio:device0/in_anglvel_y_raw", "1"},
    {"iio:device0/in_anglvel_z_raw", "1"},
    {"iio:device0/in_mount_matrix", "0, 1, 0; -1, 0, 0; 0, 0, 1"},
    {"iio:device0/sampling_frequency", "25.000000"},
    {"iio:device0/sampling_frequency_available", "12.5 25 50 100"},
    {"iio:device0/current_timestamp_clock", "realtime"},
    {"iio:device0/trigger/current_trigger", ""},
    {"iio:device0/buffer/enable", "0"},
    {"iio:device0/buffer/length", "2"},
    {"iio:device0/buffer/watermark", "1"},
    {"iio:device0/scan_elements/in_timestamp_en", "0"},
    {"iio:device0/scan_elements/in_timestamp_index", "6"},
    {"iio:device0/scan_elements/in_timestamp_type", "le:s64/64>>0"},
    {"iio:device1/name", "als"},
    {"iio:device1/label", "Lid"},
    {"iio:device1/in_illuminance_input", "120.5"},
    {"iio:device1/in_temp0_raw", "2150"},
    {"iio:device1/in_temp0_scale", "10"},
    {"iio:device1/in_temp1_input", "-500"},
    {"iio:device2/name", "als"},
    {"iio:device2/in_pressure_raw", "1000"},
    {"iio:device2/in_pressure_offset", "13.25"},
    {"iio:device2/in_pressure_scale", "0.1"},
    {"trigger0/name", "imu6-dev0"},
};

std::string read_file(const std::filesystem::path& path) {
  std::ifstream file(path);
  return {std::istreambuf_iterator<char>(file), {}};
}

class IioTest : public testing::Test {
 protected:
  void SetUp() override;
  void Put(const Files& files);
  Files Get();
  /// Starts a program; what it writes goes to files.
  pid_t Start(std::vector<std::string> arguments);
  void Expect(pid_t pid, int status, const std::string& out,
              const std::string& err);
  void ReadUntil(const std::string& text);

  int fifo_ = -1;
  int out_ = -1;  // the reading end
  int err_ = -1;
  std::string read_;
};

void IioTest::SetUp() {
  const std::string user = "0 " + std::to_string(getuid()) + " 1";
  constexpr int kSpaces = CLONE_NEWNS | CLONE_NEWNET;
  if (unshare(kSpaces) != 0) {
    if (unshare(CLONE_NEWUSER | kSpaces) != 0) {
      GTEST_SKIP() << "No namespaces: " << std::strerror(errno);
    }
    std::ofstream("/proc/self/uid_map") << user;
  }
  ASSERT_EQ(mount("", "/", "", MS_PRIVATE | MS_REC, ""), 0);
  ASSERT_EQ(mount("tmpfs", "/sys/bus", "tmpfs", 0, ""), 0);
  std::filesystem::create_directory("/sys/bus/dev");
  std::ofstream("/sys/bus/dev/null");
  ASSERT_EQ(mount("/dev/null", "/sys/bus/dev/null", "", MS_BIND, ""), 0);
  ASSERT_EQ(mkfifo("/sys/bus/dev/iio:device0", 0600), 0);
  ASSERT_EQ(mount("/sys/bus/dev", "/dev", "", MS_BIND | MS_REC, ""), 0);
  fifo_ = open("/dev/iio:device0", O_RDWR | O_CLOEXEC);
  ifreq loopback = {.ifr_ifrn = {"lo"}, .ifr_ifru = {}};
  loopback.ifr_flags = IFF_UP;
  ASSERT_EQ(ioctl(socket(AF_INET, SOCK_DGRAM, 0), SIOCSIFFLAGS, &loopback), 0);
  Put(kDevices);
  for (int i = 0; i < 6; ++i) {
    const std::string channel = std::string("iio:device0/scan_elements/in_") +
                                (i < 3 ? "accel_" : "anglvel_") + "xyz"[i % 3];
    Put({{channel + "_en", "0"},
         {channel + "_index", std::to_string(i)},
         {channel + "_type", "le:s16/16>>0"}});
  }
  for (const auto& [values, time] :
       {Scan{{1, 2, 3, 4, 5, 6}, 1'000'000'007},
        Scan{{3, 2, -1, 4, 5, -6}, 1'010'000'009}}) {
    const Scan scan = {values, time};
    ASSERT_EQ(write(fifo_, &scan, sizeof scan), ssize_t{sizeof scan});
  }
}

void IioTest::Put(const Files& files) {
  for (const auto& [path, text] : files) {
    std::filesystem::create_directories((kTree / path).parent_path());
    std::ofstream(kTree / path) << text << '\n';
  }
}

// As a kernel shows them, whatever the end of what was written.
Files IioTest::Get() {
  Files files;
  for (const auto& entry :
       std::filesystem::recursive_directory_iterator(kTree)) {
    if (!entry.is_regular_file()) continue;
    const std::string text = read_file(entry.path());
    files[entry.path()] = text.substr(0, text.find_first_of({"\0\n", 2}));
  }
  return files;
}

pid_t IioTest::Start(std::vector<std::string> arguments) {
  std::array<int, 2> ends;
  EXPECT_EQ(pipe2(ends.data(), O_CLOEXEC), 0);
  out_ = ends[0];
  err_ = memfd_create("err", MFD_CLOEXEC);
  read_.clear();
  const pid_t pid = fork();
  if (pid == 0) {
    dup2(ends[1], STDOUT_FILENO);
    dup2(err_, STDERR_FILENO);
    std::vector<char*> argv;
    for (std::string& argument : arguments) argv.push_back(argument.data());
    argv.push_back(nullptr);
    _exit(execvp(argv[0], argv.data()));
  }
  close(ends[1]);
  return pid;
}

void IioTest::ReadUntil(const std::string& text) {
  std::array<char, 4096> chunk;
  while (read_.find(text) == std::string::npos) {
    const ssize_t size = read(out_, chunk.data(), chunk.size());
    if (size <= 0) return;
    read_.append(chunk.data(), static_cast<size_t>(size));
  }
}

// What depends on the moment is replaced by <n>: the elapsed time, the rates,
// and the times at which something was polled.
void IioTest::Expect(pid_t pid, int status, const std::string& out,
                     const std::string& err) {
  ReadUntil(std::string(1, '\0'));  // to its end
  int ended = 0;
  waitpid(pid, &ended, 0);
  EXPECT_EQ(WIFEXITED(ended) ? WEXITSTATUS(ended) : -WTERMSIG(ended), status);
  static const std::regex kTimes(
      "(\nTime: |samples @ ~)[0-9.]+|((?:TS:|period =) )(?!10[01]?0000)[0-9]+");
  EXPECT_EQ(std::regex_replace(read_, kTimes, "$1$2<n>"), out);
  static const std::regex kLogFile(".*: Failed to open log file\n");
  const auto messages = read_file("/proc/self/fd/" + std::to_string(err_));
  EXPECT_EQ(std::regex_replace(messages, kLogFile, ""), err);
}

const std::vector<std::string> kSession = {FENNICK_PROGRAM, "-v1", "-r60",
                                           "gyro",          "-n2", "accel"};
constexpr char kSessionOut[] =
    R"(Sampling from sensor type gyro.s: imu6 gyro.
Sampling from sensor type accel.s: imu6 accel.
Sensor: gyro.s TS: 1000000007 Data: 4.000000 5.000000 6.000000
Sensor: gyro.s TS: 1010000009 Data: 4.000000 5.000000 -6.000000
Sensor: accel.s TS: 1000000007 Data: 0.000000 0.250000 4.000000
Sensor: accel.s TS: 1010000009 Data: 1.000000 0.250000 -4.000000

Time: <n> seconds
gyro.s 2 samples @ ~<n> Hz, average period = 10000002
accel.s 2 samples @ ~<n> Hz, average period = 10000002

Average:
gyro.s  4.000000 5.000000 0.000000
accel.s  0.500000 0.250000 0.000000

Standard Deviation:
gyro.s  0.000000 0.000000 8.485281
accel.s  0.707107 0.000000 5.656854
)";
constexpr char kSessionErr[] =
    "fennick: warning: Configured gyro.s for 100.0 Hz\n"
    "fennick: warning: Configured accel.s for 100.0 Hz\n";

TEST_F(IioTest, Lists) {
  Expect(Start({FENNICK_PROGRAM, "list"}), 0,
         R"(als (iio:device1)
  ambient_light
  sensor_temperature.1

als (iio:device2)
  pressure

imu6
  accel
  gyro

)",
         "");
  Expect(Start({FENNICK_PROGRAM, "list", "accel", "ambient_light"}), 0,
         R"(1bdc5ee2-efd9-a8b7-9b0f-785125a092cd
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
RESOLUTIONS       [ 0.500000 1.000000 ]
SEL_RESOLUTION    0.500000
STREAM_TYPE       STREAMING

a5954408-a2e9-7df0-f64f-acfe411c3270
TYPE              ambient_light
NAME              als (iio:device1)
DISPLAY_NAME      Lid
AVAILABLE         true
DYNAMIC           false
HW_ID             0
PASSIVE_REQUEST   false
PHYSICAL_SENSOR   true
RATES             [ 1.000000 5.000000 10.000000 25.000000 50.000000 100.000000 ]
STREAM_TYPE       STREAMING

)",
         "");
}

TEST_F(IioTest, CapturesTwoSensorsInOneBuffer) {
  const Files before = Get();
  Expect(Start(kSession), 0, kSessionOut, kSessionErr);
  EXPECT_EQ(Get(), before);
}

TEST_F(IioTest, Polls) {
  struct Row {
    std::string sensor;
    std::string name;
    std::string value;
  };
  for (const auto& [sensor, name, value] : std::vector<Row>{
           {"sensor_temperature", "Lid", "21.500000"},
           {"sensor_temperature.1", "Lid", "-0.500000"},
           {"pressure", "als (iio:device2) pressure", "1013.250000"}}) {
    const std::string label = sensor + ".s";
    const std::string sample = "TS: <n> Data: " + value + '\n';
    Expect(Start({FENNICK_PROGRAM, "-v1", "-n2", "-r1000", sensor}), 0,
           "Sampling from sensor type " + label + ": " + name + ".\n" + sample +
               sample + "\nTime: <n> seconds\n" + label +
               " 2 samples @ ~<n> Hz, average period = <n>\n\nAverage:\n" +
               label + "  " + value + "\n\nStandard Deviation:\n" + label +
               "  0.000000\n",
           "fennick: warning: Configured " + label + " for 100.0 Hz\n");
  }
}

TEST_F(IioTest, LeavesAllAsItWasWhenItIsKilled) {
  const Files before = Get();
  prctl(PR_SET_CHILD_SUBREAPER, 1);  // also of what outlives the program
  const pid_t pid = Start({FENNICK_PROGRAM, "-r60", "accel", "gyro"});
  ReadUntil("TS:");
  EXPECT_NE(Get(), before);
  kill(pid, SIGKILL);
  while (wait(nullptr) != -1) {
  }
  EXPECT_EQ(Get(), before);
}

TEST_F(IioTest, SaysWhatFails) {
  struct Row {
    std::string path;
    std::string text;  // empty: no such file
    std::string sensor;
    int error;
    std::string message;
  };
  const auto none_of = [](const std::string& label, const std::string& name) {
    return "Sampling from sensor type " + label + ".s: " + name +
           ".\n\nTime: <n> seconds\n" + label +
           ".s 0 samples @ ~<n> Hz\n\nAverage:\n\nStandard Deviation:\n";
  };
  for (const auto& [path, text, sensor, error, message] :
       std::vector<Row>{{"iio:device0/buffer/enable", "1", "gyro", EBUSY,
                         "buffer/enable: Device or resource busy"},
                        {"iio:device0/in_accel_offset", "wide", "accel", EINVAL,
                         "in_accel_offset: Invalid argument"},
                        {"../../../../dev/iio:device0", "", "gyro", ENOENT,
                         "buffer: No such file or directory"}}) {
    Put({{path, text}});
    if (text.empty()) std::filesystem::remove(kTree / path);
    const Files before = Get();
    Expect(Start({FENNICK_PROGRAM, "-n2", "-r60", sensor}), 256 - error,
           none_of(sensor, "imu6 " + sensor),
           "fennick: error: iio:device0: " + message + '\n');
    EXPECT_EQ(Get(), before);
    Put(kDevices);
  }
  std::filesystem::remove_all(kTree);
  Expect(Start({FENNICK_PROGRAM, "list"}), 256 - ENOENT, "",
         "fennick: error: Unable to reach the IIO devices: No such file or "
         "directory\n");
  Put({{"iio:device3/name", "without"}});
  Expect(Start({FENNICK_PROGRAM, "list"}), 0, "",
         "fennick: warning: There are no IIO devices with sensors\n");
}

TEST_F(IioTest, IsServedByADaemonUntilThatDies) {
  const pid_t daemon = fork();
  if (daemon == 0) {
    dup2(memfd_create("remarks", 0), STDERR_FILENO);
    _exit(execlp("iiod", "iiod", nullptr));
  }
  setenv("IIOD_REMOTE", "ip:127.0.0.1", 1);
  sockaddr_in address = {AF_INET, htons(30431), {htonl(INADDR_LOOPBACK)}, {}};
  while (connect(socket(AF_INET, SOCK_STREAM, 0),
                 reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
    ASSERT_EQ(waitpid(daemon, nullptr, WNOHANG), 0);
  }
  std::vector<std::string> command = kSession;
  command[4] = "-t1000";
  const pid_t pid = Start(command);
  ReadUntil("-4.0");
  kill(daemon, SIGKILL);
  Expect(pid, 256 - ENOTCONN, kSessionOut,
         std::string(kSessionErr) +
             "fennick: error: iio:device0: buffer: Broken pipe\n");
}

}  // namespace
