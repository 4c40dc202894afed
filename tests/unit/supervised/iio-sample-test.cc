// The layout of a converter's samples.
#include "supervised/iio-sample.h"

#include <gtest/gtest.h>

namespace {

std::uint32_t decode(const char *type, IioSample bytes, int shift = 0) {
  const auto parsed = iio_parse_sample_type(type);
  EXPECT_TRUE(parsed) << type;
  return parsed ? iio_decode_sample(*parsed, bytes, shift) : 0;
}

TEST(IioSampleType, IsReadFieldByField) {
  const auto type = iio_parse_sample_type("be:s10/24>>6");
  ASSERT_TRUE(type);
  EXPECT_EQ(type->endian, 'b');
  EXPECT_EQ(type->sign, 's');
  EXPECT_EQ(type->bits, 10U);
  EXPECT_EQ(type->size, 24U);
  EXPECT_EQ(type->bytes, 3U);
  EXPECT_EQ(type->shift, 6U);
}

TEST(IioSampleType, MayGoWithoutAShift) {
  for (const char *text : {"le:u12/16", "le:u12/16>>", "le:u12/16X2>>4"}) {
    const auto type = iio_parse_sample_type(text);
    ASSERT_TRUE(type) << text;
    EXPECT_EQ(type->bits, 12U);
    EXPECT_EQ(type->bytes, 2U);
    EXPECT_EQ(type->shift, 0U);
  }
}

TEST(IioSampleType, IsRefusedInAnotherFormAndWithoutASize) {
  for (const char *text :
       {"", "garbage", "le", "leu12/16>>4", "le:u", "le:u12", "le:u/16>>4", "le:u12/0>>4"}) {
    EXPECT_FALSE(iio_parse_sample_type(text)) << text;
  }
}

TEST(IioSample, OneByte) {
  EXPECT_EQ(decode("le:u8/8>>0", {0xA5, 1, 2, 3}), 0xA5U);
  EXPECT_EQ(decode("be:u8/8>>0", {0xA5, 1, 2, 3}), 0xA5U);
}

TEST(IioSample, TwoBytes) {
  EXPECT_EQ(decode("be:u12/16>>4", {0xAB, 0xCD}), 0xABCU);
  EXPECT_EQ(decode("le:u12/16>>4", {0xCD, 0xAB}), 0xABCU);
  EXPECT_EQ(decode("le:u10/16>>0", {0xFF, 0x03}), 0x3FFU);
  EXPECT_EQ(decode("le:u10/16>>0", {0xFF, 0x03}, 2), 0xFFU);
  EXPECT_EQ(decode("be:u16/16", {0xAB, 0xCD}), 0xABCDU);
}

TEST(IioSample, ThreeBytes) {
  EXPECT_EQ(decode("be:u24/24>>0", {0x12, 0x34, 0x56}), 0x123456U);
  EXPECT_EQ(decode("le:u24/24>>0", {0x12, 0x34, 0x56}), 0x563412U);
}

TEST(IioSample, FourBytes) {
  EXPECT_EQ(decode("be:u32/32>>0", {0x12, 0x34, 0x56, 0x78}), 0x12345678U);
  EXPECT_EQ(decode("le:u32/32>>0", {0x12, 0x34, 0x56, 0x78}), 0x78563412U);
  EXPECT_EQ(decode("le:u32/32>>0", {0xFF, 0xFF, 0xFF, 0xFF}), 0xFFFFFFFFU);
}

TEST(IioSample, OtherWidthsHoldNothing) {
  EXPECT_EQ(decode("le:u40/40>>0", {0xFF, 0xFF, 0xFF, 0xFF}), 0U);
  EXPECT_EQ(decode("le:u4/4>>0", {0xFF, 0xFF, 0xFF, 0xFF}), 0U);
}

TEST(IioSample, WhatLiesBeyondTheSignificantBitsIsNoise) {
  EXPECT_EQ(decode("le:u10/16>>0", {0xFF, 0xFF}), 0x3FFU);
  EXPECT_EQ(decode("le:u0/16>>0", {0xFF, 0xFF}), 0U);
}

TEST(IioSample, TheTopSignificantBitIsTheSign) {
  EXPECT_EQ(decode("le:s12/16>>0", {0xFF, 0x0F}), 0xFFFFFFFFU);
  EXPECT_EQ(decode("le:s12/16>>0", {0xFF, 0x07}), 0x7FFU);
  EXPECT_EQ(decode("be:s12/16>>4", {0x80, 0x0F}), 0xFFFFF800U);
}

TEST(IioSample, ShiftsBeyondTheWidthLeaveNothing) {
  EXPECT_EQ(decode("le:u32/32>>32", {0xFF, 0xFF, 0xFF, 0xFF}), 0U);
  EXPECT_EQ(decode("le:u32/32>>4000000000", {0xFF, 0xFF, 0xFF, 0xFF}), 0U);
  EXPECT_EQ(decode("le:u8/8>>0", {0xFF}, 40), 0U);
  EXPECT_EQ(decode("le:u8/8>>0", {0xFF}, -40), 0xFFU);
}

}  // namespace
