// The bounds of the readers and the writer: a step that does not fit takes nothing, and a proven offset that is wrong
// ends the process instead of going unnoticed.
#include "bytes.h"

#include <gtest/gtest.h>

#include <array>

namespace {

using four_bytes = std::array<unsigned char, 4>;

TEST(Bytes, StepsThatDoNotFitTakeNothing) {
    const four_bytes bytes = {1, 2, 3, 4};
    qz::byte_reader reader(bytes);
    std::uint8_t first = 0;
    std::uint32_t four = 0;
    EXPECT_TRUE(reader.field(first));
    EXPECT_FALSE(reader.field(four));
    EXPECT_FALSE(reader.skip(4));
    EXPECT_FALSE(reader.skip(SIZE_MAX));
    EXPECT_EQ(reader.left(), 3U);
    EXPECT_TRUE(reader.skip(3));
    EXPECT_FALSE(reader.field(first));
}

TEST(Bytes, WhatDoesNotFitMakesTheWriterFail) {
    four_bytes memory = {};
    qz::byte_writer writer(memory);
    writer.field(std::uint16_t{0xffff});
    EXPECT_FALSE(writer.is_full());
    writer.field(std::uint32_t{0xffffffff});
    EXPECT_EQ(memory, (four_bytes{0xff, 0xff, 0, 0}));
    writer.field(std::uint16_t{0xffff});
    EXPECT_EQ(writer.left(), 0U);
    EXPECT_FALSE(writer.is_full());
}

TEST(Bytes, ProvenOffsetsReachTheLastByte) {
    four_bytes bytes = {1, 2, 3, 4};
    qz::store_field(std::span<unsigned char>(bytes), 3, std::uint8_t{9});
    EXPECT_EQ(qz::load_field<std::uint8_t>(bytes, 3), 9);
}

TEST(BytesDeathTest, WrongOffsetsEndTheProcess) {
    four_bytes bytes = {};
    for (const std::size_t offset : {std::size_t{3}, std::size_t{5}, SIZE_MAX}) {
        EXPECT_DEATH(qz::load_field<std::uint16_t>(bytes, offset), "") << offset;
        EXPECT_DEATH(qz::store_field(std::span<unsigned char>(bytes), offset, std::uint16_t{1}), "")
            << offset;
    }
}

} // namespace
