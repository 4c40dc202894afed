// Reading one sample of a 12-bit converter on an SPI bus, through the kernel's spidev interface.
#pragma once

#include <cstdint>
#include <optional>

// Sends the converter its address byte and a zero byte, then reads two bytes, as one message with
// the clock, word size and delays that the device is set to. Gives the sample, 0 to 4095, or
// nothing with errno. Blocks for some microseconds, allocates nothing. Any thread.
std::optional<std::int32_t> spi_read_sample(int fd, std::uint8_t address);
