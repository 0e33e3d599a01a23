// The text of BinHex files. Another program that unpacks such files takes the one that is written
// out.

#include "format/bin_hex.h"

#include <gmock/gmock.h>

#include <string>

#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

const std::string kText =
    "(This file must be converted with BinHex 4.0)\n"
    ":#QaPG(4PFLjdH(3!9%9B9(4dH(4!!3!!!6J!!!!)CJ*NBA4KN!#3\"3#3r`#3,@9\n"
    "ZC!'@G'KP)'C[FQ[aR!:\n";
const Bytes kData = Hex("'data' 90*5 00*300 'end'");
const Bytes kFork = Ascii("the fork");

struct Unpacked {
    bool whole = false;
    BinHexHead head;
    Bytes data;
    Bytes fork;
};

// As much of it as is right.
Unpacked Unpack(ByteView text) {
    Unpacked file;
    BinHexReader reader(text);
    const auto head = reader.ReadHead();
    if (!head) return file;
    file.head = *head;
    // The tests' own texts have no more; what is damaged may tell of any length.
    if (head->data_length > 4096 || head->resource_length > 4096) return file;
    file.data.resize(head->data_length);
    file.fork.resize(head->resource_length);
    file.whole =
        reader.Read(file.data) && reader.EndPart() && reader.Read(file.fork) && reader.EndPart();
    return file;
}
Unpacked Unpack(const std::string& text) { return Unpack(Ascii(text)); }

BinHexHead HeadOf(std::string_view name, std::size_t data_length, std::size_t resource_length) {
    BinHexHead head;
    std::copy(name.begin(), name.end(), head.name_bytes.begin());
    head.name_size = static_cast<std::uint8_t>(name.size());
    const Bytes info = Hex("'TEXTttxt' 40 01");
    std::copy(info.begin(), info.end(), head.finder_info.begin());
    head.data_length = static_cast<std::uint32_t>(data_length);
    head.resource_length = static_cast<std::uint32_t>(resource_length);
    return head;
}

std::string Pack(std::string_view name, const Bytes& data, const Bytes& fork) {
    std::string text;
    BinHexWriter writer([&](char c) { text += c; });
    EXPECT_TRUE(writer.WriteHead(HeadOf(name, data.size(), fork.size())));
    // Where a piece ends is nothing to the text.
    for (const std::uint8_t byte : data) writer.Write({&byte, 1});
    writer.EndPart();
    writer.Write(fork);
    writer.EndPart();
    writer.EndText();
    return text;
}

void ExpectLetter(const Unpacked& file) {
    EXPECT_TRUE(file.whole);
    EXPECT_EQ("letter.txt", file.head.name());
    EXPECT_THAT(file.head.finder_info, ::testing::ElementsAreArray(Hex("'TEXTttxt' 40 01")));
    EXPECT_EQ(kData, file.data);
    EXPECT_EQ(kFork, file.fork);
}

// ---- Reading ------------------------------------------------------------------------------------

TEST(BinHexTest, ATextTellsHeadAndForks) { ExpectLetter(Unpack(kText)); }

TEST(BinHexTest, WhatStandsInFrontAndBehindIsNothing) {
    ExpectLetter(Unpack("From: a:b\n\n(This (This file must: no\n" + kText + "regards: me"));
}

TEST(BinHexTest, LinesMayBeOfAnyLengthAndEndInAnyWay) {
    std::string text;
    for (const char c : kText) text += c == '\n' ? std::string("\r\n \t") : std::string(1, c);
    ExpectLetter(Unpack(text));
    text = kText.substr(0, 46);
    for (const char c : kText.substr(46)) text += std::string(1, c) + "\r";
    ExpectLetter(Unpack(text));
    text = kText;
    text.erase(text.find("\nZC"), 1);
    ExpectLetter(Unpack(text));
}

TEST(BinHexTest, TheLastColonMayBeMissing) {
    ExpectLetter(Unpack(kText.substr(0, kText.rfind(':'))));
}

TEST(BinHexTest, ATextWithoutItsLineIsNone) {
    EXPECT_FALSE(Unpack(kText.substr(1)).whole);
    EXPECT_FALSE(Unpack(kText.substr(46)).whole);
    EXPECT_FALSE(Unpack(std::string()).whole);
}

TEST(BinHexTest, ARunRepeatsAByteThatIsThere) {
    const std::string line = "(This file must be converted with BinHex 4.0)\n:";
    std::uint8_t byte = 0;
    const Bytes run_first = Ascii(line + "N!8:");  // 90 05
    EXPECT_FALSE(BinHexReader(run_first).Read({&byte, 1}));

    const Bytes run_of_one = Ascii(line + "0T!\"0R`:");  // 36 90 01 36 7C
    BinHexReader reader(run_of_one);
    Bytes read(3);
    EXPECT_TRUE(reader.Read(read));
    EXPECT_EQ(Hex("36 36 7C"), read);
}

TEST(BinHexTest, EveryLostCharacterIsNoticed) {
    const std::string whole = kText.substr(0, kText.rfind(':'));
    for (std::size_t size = 0; size < whole.size(); ++size) {
        ASSERT_FALSE(Unpack(whole.substr(0, size)).whole) << size;
    }
    for (std::size_t at = 46; at < whole.size(); ++at) {
        if (whole[at] == '\n') continue;
        ASSERT_FALSE(Unpack(std::string(whole).erase(at, 1)).whole) << at;
    }
}

TEST(BinHexTest, EveryOtherCharacterIsNoticed) {
    std::size_t unnoticed = 0;
    ForEachDamage(Ascii(kText), [&](const Bytes& text) {
        if (text.size() < kText.size()) return;
        const Unpacked file = Unpack(text);
        if (!file.whole) return;
        ++unnoticed;
        ASSERT_EQ("letter.txt", file.head.name());
        ASSERT_EQ(kData, file.data);
        ASSERT_EQ(kFork, file.fork);
    });
    // "4.0)" and the ends of lines may be anything that is no digit, and the rest behind the end.
    EXPECT_GT(unnoticed, 4 * 255U);
}

TEST(BinHexTest, ANameHas1To63Bytes) {
    EXPECT_EQ(std::string(63, 'n'), Unpack(Pack(std::string(63, 'n'), {}, {})).head.name());
    std::string text;
    BinHexWriter writer([&](char c) { text += c; });
    BinHexHead head = HeadOf("n", 0, 0);
    head.name_size = 0;
    EXPECT_FALSE(writer.WriteHead(head));
    head.name_size = 64;
    EXPECT_FALSE(writer.WriteHead(head));
    EXPECT_EQ("", text);
}

// ---- Writing ------------------------------------------------------------------------------------

TEST(BinHexTest, AFileIsThisText) { EXPECT_EQ(kText, Pack("letter.txt", kData, kFork)); }

TEST(BinHexTest, WhateverIsWrittenComesBack) {
    for (const std::uint8_t byte : Hex("00 90 FF")) {
        for (const std::size_t length :
             {0U, 1U, 2U, 3U, 4U, 5U, 254U, 255U, 256U, 257U, 511U, 513U}) {
            SCOPED_TRACE(length);
            const Bytes data = Hex("01") + Bytes(length, byte);
            const Bytes fork = Bytes(length, byte) + Hex("90 02");
            const Unpacked file = Unpack(Pack("n", data, fork));
            ASSERT_TRUE(file.whole);
            ASSERT_EQ(data, file.data);
            ASSERT_EQ(fork, file.fork);
        }
    }
}

TEST(BinHexTest, LinesHave64Characters) {
    Bytes data;
    for (unsigned i = 0; i < 500; ++i) data.push_back(static_cast<std::uint8_t>(i * 7));
    const std::string text = Pack("n", data, {});
    std::size_t at = text.find('\n') + 1;
    EXPECT_EQ(':', text[at]);
    for (; text.size() - at > 65; at += 65) EXPECT_EQ('\n', text[at + 64]);
    EXPECT_EQ(":\n", text.substr(text.size() - 2));
}

}  // namespace
}  // namespace mavoea::test
