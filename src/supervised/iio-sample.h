// One sample of a converter's buffer, as the kernel describes its layout.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

struct IioSampleType {
  char endian = 0;         // 'b': big-endian, otherwise little-endian
  char sign = 0;           // 'u' or 's'
  unsigned int bits = 0;   // significant ones
  unsigned int size = 0;   // of storage, in bits
  unsigned int bytes = 0;  // of storage
  unsigned int shift = 0;  // to the right, before the significant bits are taken
};

inline constexpr std::size_t kIioSampleBytes = 4;
using IioSample = std::array<std::uint8_t, kIioSampleBytes>;

// Reads "le:u12/16>>4"; without the shift at the end it is 0. Nothing for a text of another form,
// and unless a sample takes up space.
std::optional<IioSampleType> iio_parse_sample_type(const std::string &text);

// `value` shifted to the right. Distances come from documents and from the kernel: below 0 counts
// as 0, and nothing is left beyond the width.
std::uint32_t iio_shift_right(std::uint32_t value, std::int64_t distance);

// The number that the first `type.bytes` bytes hold, shifted to the right once more by `shift`.
// Widths other than 1 to 4 bytes hold 0.
std::uint32_t iio_decode_sample(const IioSampleType &type, const IioSample &sample, int shift);
