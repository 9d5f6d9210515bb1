#include "platform/iio/guardian.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <map>
#include <thread>

namespace platform {
namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;
using std::chrono::seconds;

// Messages are texts with a zero byte behind each: an owner, who is done; or
// the owner, the device that it claims, and for how many seconds it may wait
// for that; or an owner and a setting. Each is answered by a status.

std::vector<std::string> split(const std::string& message) {
  std::vector<std::string> texts;
  for (size_t begin = 0; begin < message.size();) {
    texts.emplace_back(message.c_str() + begin);
    begin += texts.back().size() + 1;
  }
  return texts;
}

// Takes the next message, however long. False if the other process has ended.
bool receive(int line, std::string* message) {
  ssize_t size = 0;
  do {
    size = recv(line, nullptr, 0, MSG_PEEK | MSG_TRUNC);
  } while (size == -1 && errno == EINTR);
  if (size <= 0) return false;
  message->resize(static_cast<size_t>(size));
  return recv(line, message->data(), message->size(), 0) == size;
}

// A socket that has this name as its address, which is no file; -1 while
// another process has one. The kernel frees the name with the socket.
int take_name(const std::string& name) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path + 1, sizeof address.sun_path - 1,
                "fennick-%zx", std::hash<std::string>()(name));
  const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  if (bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0) {
    return fd;
  }
  close(fd);
  return -1;
}

// What the guardian's process does. Until it has put back what was changed of a
// device it has the device's name, so that no other run takes the changes for
// what it found.
class Watch {
 public:
  explicit Watch(int line) : line_(line) {}

  // Returns when the other process has ended.
  void Keep();
  void PutBack() const;

 private:
  struct Claimed {
    std::string device;
    std::vector<Setting> settings;  // in the order of the changes
  };

  int Claim(int owner, const std::string& device, seconds patience);
  void Forget(int owner);

  int line_;
  std::map<int, Claimed> owners_;
  std::map<std::string, int> names_;  // of the devices; with their sockets
};

void Watch::Keep() {
  std::string message;
  while (receive(line_, &message)) {
    const std::vector<std::string> texts = split(message);
    const int owner = std::atoi(texts[0].c_str());
    int status = 0;
    if (texts.size() == 1) {
      Forget(owner);
    } else if (texts.size() == 3) {
      status = Claim(owner, texts[1], seconds(std::atoi(texts[2].c_str())));
    } else {
      const auto kind = static_cast<Attribute::Kind>(atoi(texts[3].c_str()));
      owners_[owner].settings.push_back(
          {texts[1], texts[2], kind, texts[4], texts[5]});
    }
    send(line_, &status, sizeof status, 0);
  }
}

int Watch::Claim(int owner, const std::string& device, seconds patience) {
  if (names_.count(device) == 0) {
    const char* const machine = std::getenv("IIOD_REMOTE");
    const std::string name =
        machine != nullptr ? machine + (' ' + device) : device;
    const auto until = Clock::now() + patience;
    int fd = take_name(name);
    while (fd == -1 && Clock::now() < until) {
      std::this_thread::sleep_for(milliseconds(10));
      fd = take_name(name);
    }
    if (fd == -1) return -EBUSY;
    names_[device] = fd;
  }
  owners_[owner].device = device;
  return 0;
}

void Watch::Forget(int owner) {
  const std::string device = owners_.at(owner).device;
  owners_.erase(owner);
  for (const auto& [other, claimed] : owners_) {
    if (claimed.device == device) return;
  }
  close(names_.at(device));
  names_.erase(device);
}

void Watch::PutBack() const {
  if (owners_.empty()) return;
  const iio_context* context = iio_create_default_context();
  if (context == nullptr) return;
  const auto until = Clock::now() + seconds(5);
  for (const auto& [owner, claimed] : owners_) {
    for (const Setting& setting : claimed.settings) {
      const auto attribute = setting.FindIn(context);
      if (attribute.has_value()) put_back(*attribute, setting.text, until);
    }
  }
}

// Keeps nothing of the other process open, least of all its end of the line,
// and out of the way of signals that are sent to all of a name or a terminal.
[[noreturn]] void run_guardian(int line) {
  setsid();
  for (const int each : {SIGPIPE, SIGTERM}) signal(each, SIG_IGN);
  const int nowhere = open("/dev/null", O_RDWR);
  for (const int fd : {0, 1, 2}) dup2(nowhere, fd);
  dup2(line, 3);
  closefrom(4);
  Watch watch(3);
  watch.Keep();
  watch.PutBack();
  _exit(0);
}

}  // namespace

std::optional<Attribute> Setting::FindIn(const iio_context* context) const {
  iio_device* its_device = iio_context_find_device(context, device.c_str());
  if (its_device == nullptr) return std::nullopt;
  iio_channel* its_channel = nullptr;
  if (kind == Attribute::kChannel) {
    its_channel = iio_device_find_channel(its_device, channel.c_str(), false);
    if (its_channel == nullptr) return std::nullopt;
  }
  return Attribute{kind, its_device, its_channel, name};
}

int put_back(const Attribute& attribute, const std::string& text,
             Clock::time_point until) {
  for (;;) {
    std::string present;
    if (attribute.Read(&present) == 0 && present == text) return 0;
    const int status = attribute.Write(text);
    if (status != -EBUSY || Clock::now() >= until) return status;
    std::this_thread::sleep_for(milliseconds(10));
  }
}

int Guardian::Start() {
  std::array<int, 2> ends;
  if (socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()) != 0) {
    return -errno;
  }
  process_ = fork();
  if (process_ == 0) run_guardian(ends[1]);
  const int error = errno;
  close(ends[1]);
  line_ = ends[0];
  return process_ == -1 ? -error : 0;
}

Guardian::~Guardian() {
  if (line_ != -1) close(line_);
  if (process_ != -1 && owners_.empty()) waitpid(process_, nullptr, 0);
}

int Guardian::Ask(const std::vector<std::string>& texts) {
  std::string message;
  for (const std::string& text : texts) message += text + '\0';
  int status = 0;
  if (send(line_, message.data(), message.size(), MSG_NOSIGNAL) == -1 ||
      recv(line_, &status, sizeof status, 0) != sizeof status) {
    return -EPIPE;
  }
  return status;
}

int Guardian::Claim(int owner, const std::string& device, bool waits) {
  // Longer than it takes another guardian to put back what it can.
  const int status = Ask({std::to_string(owner), device, waits ? "3" : "0"});
  if (status == 0) owners_.insert(owner);
  return status;
}

int Guardian::Remember(int owner, const Setting& setting) {
  return Ask({std::to_string(owner), setting.device, setting.channel,
              std::to_string(setting.kind), setting.name, setting.text});
}

void Guardian::Forget(int owner) {
  owners_.erase(owner);
  Ask({std::to_string(owner)});
}

}  // namespace platform
