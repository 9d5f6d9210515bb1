#include "platform/iio/changes.h"

#include <chrono>

namespace platform {

int Changes::Begin(const iio_device* device, bool waits) {
  const int status = guardian_->Claim(owner_, iio_device_get_id(device), waits);
  has_begun_ = status == 0;
  return status;
}

int Changes::Keep(const Attribute& attribute) {
  std::string text;
  int status = attribute.Read(&text);
  if (status != 0) return status;
  const char* channel = attribute.kind == Attribute::kChannel
                            ? iio_channel_get_id(attribute.channel)
                            : "";
  status =
      guardian_->Remember(owner_, {iio_device_get_id(attribute.device), channel,
                                   attribute.kind, attribute.name, text});
  if (status == 0) kept_.emplace_back(attribute, text);
  return status;
}

int Changes::Set(const Attribute& attribute, const std::string& text) {
  const int status = Keep(attribute);
  if (status != 0 || kept_.back().second == text) return status;
  return attribute.Write(text);
}

void Changes::PutBack() {
  const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(1);
  bool is_done = true;
  for (const auto& [attribute, text] : kept_) {
    const int status = put_back(attribute, text, until);
    if (status != 0) attribute.Report(status);
    is_done = is_done && status == 0;
  }
  if (is_done) guardian_->Forget(owner_);
  GiveUp();
}

void Changes::GiveUp() {
  kept_.clear();
  has_begun_ = false;
}

}  // namespace platform
