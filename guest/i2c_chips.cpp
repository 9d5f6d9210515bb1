#include <fcntl.h>
#include <linux/i2c-dev.h>
#include <linux/i2c.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <initializer_list>

// Fills the registers of the chips that i2c-stub emulates on the bus
// /dev/i2c-0, for the kernel's drivers to find.

namespace {

int bus = -1;

bool is_good = true;

void transfer(int address, int reg, uint32_t size, i2c_smbus_data* data) {
  i2c_smbus_ioctl_data call = {I2C_SMBUS_WRITE, static_cast<uint8_t>(reg), size,
                               data};
  if (ioctl(bus, I2C_SLAVE_FORCE, address) == 0 &&
      ioctl(bus, I2C_SMBUS, &call) == 0) {
    return;
  }
  std::perror("/dev/i2c-0");
  is_good = false;
}

// Sets registers of one byte each, from `reg` on.
void set_bytes(int address, int reg, std::initializer_list<int> bytes) {
  for (const int byte : bytes) {
    i2c_smbus_data data = {};
    data.byte = static_cast<uint8_t>(byte);
    transfer(address, reg++, I2C_SMBUS_BYTE_DATA, &data);
  }
}

void set_word(int address, int reg, int word) {
  i2c_smbus_data data = {};
  data.word = static_cast<uint16_t>(word);
  transfer(address, reg, I2C_SMBUS_WORD_DATA, &data);
}

}  // namespace

int main() {
  bus = open("/dev/i2c-0", O_RDWR | O_CLOEXEC);

  // bmp280, with the example of its data sheet: the number of the chip, its
  // calibration and a reading, which stand for 1006.53 hPa and 25.08 degrees.
  set_bytes(0x76, 0xd0, {0x58});
  set_bytes(0x76, 0x88, {0x70, 0x6b, 0x43, 0x67, 0x18, 0xfc, 0x7d, 0x8e,
                         0x43, 0xd6, 0xd0, 0x0b, 0x27, 0x0b, 0x8c, 0x00,
                         0xf9, 0xff, 0x8c, 0x3c, 0xf8, 0xc6, 0x70, 0x17});
  set_bytes(0x76, 0xf7, {0x65, 0x5a, 0xc0, 0x7e, 0xed, 0x00});

  // kxcjk1013, an accelerometer: x, y and z.
  set_word(0x0f, 0x06, 0x0400);
  set_word(0x0f, 0x08, 0xfc00);
  set_word(0x0f, 0x0a, 0x4000);

  // ads1015, a converter: a voltage, the same in all channels. Its high byte
  // comes first.
  set_word(0x48, 0x00, 0x4006);

  // tsl2563, a light sensor: visible light, and infrared.
  set_word(0x29, 0xac, 200);
  set_word(0x29, 0xae, 20);
  return is_good ? 0 : 1;
}
