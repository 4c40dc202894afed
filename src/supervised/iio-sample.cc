#include "supervised/iio-sample.h"

#include <cstdio>

namespace {

constexpr unsigned int kWidth = 32;
constexpr unsigned int kBitsPerByte = 8;

std::uint32_t assemble(const IioSampleType &type, const IioSample &sample) {
  if (type.bytes > sample.size()) {
    return 0;
  }
  std::uint32_t value = 0;
  for (unsigned int i = 0; i < type.bytes; ++i) {
    const unsigned int next = type.endian == 'b' ? i : type.bytes - 1 - i;
    value = value << kBitsPerByte | sample.at(next);
  }
  return value;
}

std::uint32_t extract_significant(const IioSampleType &type, std::uint32_t value) {
  if (type.bits >= kWidth) {
    return value;
  }
  const std::uint32_t mask = (1U << type.bits) - 1;
  value &= mask;
  const bool negative = type.sign == 's' && type.bits > 0 && (value >> (type.bits - 1)) != 0;
  return negative ? value | ~mask : value;
}

}  // namespace

std::optional<IioSampleType> iio_parse_sample_type(const std::string &text) {
  constexpr int all_but_shift = 4;
  IioSampleType type;
  const int fields = std::sscanf(text.c_str(), "%ce:%c%u/%u>>%u", &type.endian, &type.sign,
                                 &type.bits, &type.size, &type.shift);
  // A text that ends before the size describes no sample, and one that takes up no space could not
  // be told from the end of the file. Neither is worth the daemon's end, as an unusable converter
  // is.
  if (fields < all_but_shift || type.size == 0) {
    return std::nullopt;
  }
  type.bytes = type.size / kBitsPerByte;
  return type;
}

std::uint32_t iio_shift_right(std::uint32_t value, std::int64_t distance) {
  if (distance <= 0) {
    return value;
  }
  return distance < kWidth ? value >> distance : 0;
}

std::uint32_t iio_decode_sample(const IioSampleType &type, const IioSample &sample, int shift) {
  const std::uint32_t stored = iio_shift_right(assemble(type, sample), type.shift);
  return iio_shift_right(extract_significant(type, stored), shift);
}
