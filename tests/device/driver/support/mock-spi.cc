#include "support/mock-spi.h"

#include <array>
#include <cstdio>

#include "support/files.h"
#include "support/wait.h"

namespace {

constexpr int kBus = 7;
constexpr std::size_t kText = 32;

std::string name(int device) {
  return std::to_string(kBus) + "." + std::to_string(device);
}

std::string attribute(int device, const char *file) {
  return "/sys/bus/spi/devices/spi" + name(device) + "/" + file;
}

}  // namespace

std::string MockSpi::node(int device) {
  return "/dev/spidev" + name(device);
}

// The high eight bits come first, the low four in the upper half of the second byte.
void MockSpi::set_sample(int device, unsigned int command, unsigned int sample) {
  std::array<char, kText> text{};
  std::snprintf(text.data(), text.size(), "%x %x %x", command, sample >> 4, (sample & 0xF) << 4);
  write_text(attribute(device, "reply"), text.data());
}

void MockSpi::set_error(int device, int error) {
  write_text(attribute(device, "error"), std::to_string(error));
}

std::string MockSpi::last_message(int device) {
  return read_text(attribute(device, "message")).value_or("(none)");
}

int MockSpi::messages(int device) {
  return static_cast<int>(read_number(attribute(device, "messages")));
}

bool MockSpi::next_messages(int device, int count) {
  const int last = messages(device) + count;
  return wait_until([&] { return messages(device) >= last; });
}
