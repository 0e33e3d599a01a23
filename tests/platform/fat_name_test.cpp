// Names for FAT, character by character.

#include <errno.h>
#include <gtest/gtest.h>

#include <climits>
#include <string>

#include "platform/include/mavocore.h"

namespace {

std::string Replaced(const std::string& in) {
    char out[4096];
    if (MAVOStrReplaceFATReservedChar(in.c_str(), out, sizeof out) != 0) return "(failed)";
    return out;
}

struct Replacement {
    char reserved;
    const char* utf8;
};

constexpr Replacement kReplacements[] = {
    {'\x01', "\xEF\x80\x81"}, {'\x02', "\xEF\x80\x82"}, {'\x03', "\xEF\x80\x83"},
    {'\x04', "\xEF\x80\x84"}, {'\x05', "\xEF\x80\x85"}, {'\x06', "\xEF\x80\x86"},
    {'\x07', "\xEF\x80\x87"}, {'\x08', "\xEF\x80\x88"}, {'\x09', "\xEF\x80\x89"},
    {'\x0A', "\xEF\x80\x8A"}, {'\x0B', "\xEF\x80\x8B"}, {'\x0C', "\xEF\x80\x8C"},
    {'\x0D', "\xEF\x80\x8D"}, {'\x0E', "\xEF\x80\x8E"}, {'\x0F', "\xEF\x80\x8F"},
    {'\x10', "\xEF\x80\x90"}, {'\x11', "\xEF\x80\x91"}, {'\x12', "\xEF\x80\x92"},
    {'\x13', "\xEF\x80\x93"}, {'\x14', "\xEF\x80\x94"}, {'\x15', "\xEF\x80\x95"},
    {'\x16', "\xEF\x80\x96"}, {'\x17', "\xEF\x80\x97"}, {'\x18', "\xEF\x80\x98"},
    {'\x19', "\xEF\x80\x99"}, {'\x1A', "\xEF\x80\x9A"}, {'\x1B', "\xEF\x80\x9B"},
    {'\x1C', "\xEF\x80\x9C"}, {'\x1D', "\xEF\x80\x9D"}, {'\x1E', "\xEF\x80\x9E"},
    {'\x1F', "\xEF\x80\x9F"}, {'"', "\xEF\x80\xA0"},    {'*', "\xEF\x80\xA1"},
    {':', "\xEF\x80\xA2"},    {'<', "\xEF\x80\xA3"},    {'>', "\xEF\x80\xA4"},
    {'?', "\xEF\x80\xA5"},    {'\\', "\xEF\x80\xA6"},   {'|', "\xEF\x80\xA7"},
};
static_assert(std::size(kReplacements) == 39);

TEST(FatNameTest, EachOfThe39ReservedCharactersHasItsCounterpart) {
    for (const auto& [reserved, utf8] : kReplacements) {
        SCOPED_TRACE(int{reserved});
        EXPECT_EQ("/v/a" + std::string(utf8) + "b",
                  Replaced("/v/a" + std::string(1, reserved) + "b"));
    }
}

TEST(FatNameTest, EveryOtherByteStays) {
    std::string others;
    for (int byte = 0x20; byte <= 0xFF; ++byte) {
        const char c = static_cast<char>(byte);
        if (c != '/' && std::string("\"*:<>?\\|").find(c) == std::string::npos) others += c;
    }
    EXPECT_EQ(0xFF - 0x1F - 9, static_cast<int>(others.size()));
    EXPECT_EQ("/v/" + others, Replaced("/v/" + others));
}

TEST(FatNameTest, OnlyTheLastComponentChanges) {
    EXPECT_EQ("/v:1/d*r/a\xEF\x80\xA5", Replaced("/v:1/d*r/a?"));
    EXPECT_EQ(":/a", Replaced(":/a"));
    EXPECT_EQ("a\xEF\x80\xA2", Replaced("a:"));
}

TEST(FatNameTest, SlashesAtTheEndBelongToNoComponent) {
    EXPECT_EQ("/v:/a\xEF\x80\xA2//", Replaced("/v:/a://"));
    EXPECT_EQ("/", Replaced("/"));
    EXPECT_EQ("//", Replaced("//"));
    EXPECT_EQ("", Replaced(""));
}

TEST(FatNameTest, AResultThatJustFitsIsWritten) {
    char out[] = {'#', '#', '#', '#', '#', '#', '#', '#'};
    EXPECT_EQ(0, MAVOStrReplaceFATReservedChar("/a:", out, 6));
    EXPECT_EQ(std::string("/a\xEF\x80\xA2\0##", 8), std::string(out, sizeof out));
}

TEST(FatNameTest, NothingIsWrittenWhenTheResultIsTooLong) {
    for (int size : {5, 4, 3, 1, 0, -1, INT_MIN}) {
        SCOPED_TRACE(size);
        char out[] = {'#', '#', '#', '#', '#', '#'};
        errno = 0;
        EXPECT_GT(0, MAVOStrReplaceFATReservedChar("/a:", out, size));
        EXPECT_EQ(ENAMETOOLONG, errno);
        EXPECT_EQ("######", std::string(out, sizeof out));
    }
    char one = '#';
    EXPECT_EQ(0, MAVOStrReplaceFATReservedChar("", &one, 1));
    EXPECT_EQ('\0', one);
}

TEST(FatNameTest, ALongNameTriplesAtMost) {
    EXPECT_EQ(3 * 255, static_cast<int>(Replaced(std::string(255, '?')).size()));
}

TEST(FatNameTest, NullArgumentsAreRefused) {
    char out[8];
    errno = 0;
    EXPECT_GT(0, MAVOStrReplaceFATReservedChar(nullptr, out, sizeof out));
    EXPECT_EQ(EINVAL, errno);
    errno = 0;
    EXPECT_GT(0, MAVOStrReplaceFATReservedChar("a", nullptr, 8));
    EXPECT_EQ(EINVAL, errno);
}

}  // namespace
