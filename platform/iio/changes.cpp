#include "platform/iio/changes.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstring>

namespace platform {

// By names, as the guardian has a context of its own.
struct Changes::Record {
  std::atomic<bool> in_force;  // else free
  int owner;
  Attribute::Kind kind;
  std::array<char, 64> device;
  std::array<char, 64> channel;
  std::array<char, 64> name;
  std::array<char, 128> found;

  bool Is(const Attribute& attribute) const;
  int Restore(const iio_context* context, bool silently) const;
};

namespace {

constexpr int kRecords = 512;

// The records are all zero before, so that the text stays terminated.
template <size_t size>
void copy(const std::string& text, std::array<char, size>* out) {
  out->fill('\0');
  text.copy(out->data(), size - 1);
}

std::string channel_id(const Attribute& attribute) {
  return attribute.kind == Attribute::kChannel
             ? iio_channel_get_id(attribute.channel)
             : "";
}

}  // namespace

bool Changes::Record::Is(const Attribute& attribute) const {
  return in_force && kind == attribute.kind && attribute.name == name.data() &&
         channel_id(attribute) == channel.data() &&
         std::strcmp(iio_device_get_id(attribute.device), device.data()) == 0;
}

int Changes::Record::Restore(const iio_context* context, bool silently) const {
  iio_device* its_device = iio_context_find_device(context, device.data());
  if (its_device == nullptr) return -ENODEV;
  const Attribute attribute = {
      kind, its_device,
      kind == Attribute::kChannel
          ? iio_device_find_channel(its_device, channel.data(), false)
          : nullptr,
      name.data()};
  std::string present;
  if (attribute.Read(&present) == 0 && present == found.data()) return 0;
  const int status = attribute.Write(found.data());
  return status == 0 || silently ? status : attribute.Report(status);
}

int Changes::Open() {
  const size_t size = sizeof(Record) * kRecords;
  void* shared = mmap(nullptr, size, PROT_READ | PROT_WRITE,
                      MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  std::array<int, 2> ends;
  if (shared == MAP_FAILED || pipe2(ends.data(), O_CLOEXEC) != 0) return -errno;
  records_ = static_cast<Record*>(shared);
  life_line_ = ends[1];
  guardian_ = fork();
  if (guardian_ == 0) Guard(records_, ends[0]);
  const int error = errno;
  close(ends[0]);
  return guardian_ == -1 ? -error : 0;
}

// Keeps nothing of the other process open, and out of the way of the signals
// that its terminal sends.
void Changes::Guard(Record* records, int life_line) {
  setsid();
  signal(SIGPIPE, SIG_IGN);
  const int nowhere = open("/dev/null", O_RDWR);
  for (const int fd : {0, 1, 2}) dup2(nowhere, fd);
  dup2(life_line, 3);
  close_range(4, ~0U, 0);
  char none = 0;
  while (read(3, &none, 1) == -1 && errno == EINTR) {
  }
  const auto in_force = [](const Record& record) {
    return record.in_force.load();
  };
  if (std::any_of(records, records + kRecords, in_force)) {
    const iio_context* context = iio_create_default_context();
    for (int i = 0; context != nullptr && i < kRecords; ++i) {
      if (records[i].in_force) records[i].Restore(context, true);
    }
  }
  _exit(0);
}

Changes::~Changes() {
  if (life_line_ != -1) close(life_line_);
  if (guardian_ != -1) waitpid(guardian_, nullptr, 0);
  if (records_ != nullptr) munmap(records_, sizeof(Record) * kRecords);
}

bool Changes::Keep(int owner, const Attribute& attribute) {
  Record* const end = records_ + kRecords;
  const auto is_it = [&](const Record& r) { return r.Is(attribute); };
  if (std::any_of(records_, end, is_it)) return true;
  Record* const record = std::find_if(
      records_, end, [](const Record& r) { return !r.in_force.load(); });
  std::string text;
  if (record == end || attribute.Read(&text) != 0) return false;
  record->owner = owner;
  record->kind = attribute.kind;
  copy(iio_device_get_id(attribute.device), &record->device);
  copy(channel_id(attribute), &record->channel);
  copy(attribute.name, &record->name);
  copy(text, &record->found);
  record->in_force = true;
  return true;
}

int Changes::Set(int owner, const Attribute& attribute,
                 const std::string& text) {
  std::string present;
  int status = attribute.Read(&present);
  if (status == 0 && present == text) return 0;
  if (status == 0 && !Keep(owner, attribute)) status = -ENOSPC;
  if (status == 0) status = attribute.Write(text);
  return status == 0 ? 0 : attribute.Report(status);
}

void Changes::Restore(int owner, const iio_context* context, bool silently) {
  for (Record* record = records_; record != records_ + kRecords; ++record) {
    if (!record->in_force || record->owner != owner) continue;
    record->Restore(context, silently);
    record->in_force = false;
  }
}

}  // namespace platform
