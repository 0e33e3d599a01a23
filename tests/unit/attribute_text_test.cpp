// Extended attributes as text. What getfattr and setfattr make of it is looked at in
// tests/tool/save_test.cpp, beside the programs themselves.

#include "format/attribute_text.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using Kind = AttributeTextLine::Kind;

std::string Text(const Bytes& bytes) { return {bytes.begin(), bytes.end()}; }

// "KIND|NAME|VALUE".
std::string Parsed(std::string_view line) {
    const AttributeTextLine parts = ParseAttributeTextLine(line);
    const char* const kind = parts.kind == Kind::kEmpty     ? "empty"
                             : parts.kind == Kind::kObject  ? "object"
                             : parts.kind == Kind::kComment ? "comment"
                                                            : "attribute";
    return std::string(kind) + '|' + std::string(parts.name) + '|' + std::string(parts.value);
}

// What comes out, or "!" and what is wrong. The bytes behind the room that it needs stay as they
// are.
template <class Decode>
std::string Decoded(std::string_view text, Decode decode) {
    Bytes to(text.size() + 8, 0xA5);
    const DecodedText decoded = decode(text, ByteSpan(to).first(text.size()));
    EXPECT_EQ(Repeat(0xA5, 8), Bytes(to.end() - 8, to.end())) << text;
    EXPECT_LE(decoded.size, text.size());
    if (decoded.problem != nullptr) return std::string("!") + decoded.problem;
    to.resize(decoded.size);
    return Text(to);
}
std::string Name(std::string_view text) { return Decoded(text, DecodeTextName); }
std::string Value(std::string_view text) { return Decoded(text, DecodeTextValue); }

std::string Written(TextEncoding encoding, const std::vector<Bytes>& pieces) {
    std::string text;
    TextValueWriter writer(encoding, [&](std::string_view part) { text += part; });
    for (const Bytes& piece : pieces) writer.Write(piece);
    writer.End();
    return text;
}

std::string WrittenName(TextName kind, std::string_view name) {
    std::string text;
    PutTextName(kind, name, [&](std::string_view part) { text += part; });
    return text;
}

Bytes AllBytes() {
    Bytes all;
    for (int byte = 0; byte < 256; ++byte) all.push_back(static_cast<std::uint8_t>(byte));
    return all;
}

// ---- Lines --------------------------------------------------------------------------------------

TEST(AttributeTextTest, ALineIsAnObjectAnAttributeACommentOrEmpty) {
    EXPECT_EQ("empty||", Parsed(""));
    EXPECT_EQ("object|a b|", Parsed("# file: a b"));
    EXPECT_EQ("object|# file: a|", Parsed("# file: # file: a"));
    EXPECT_EQ("object||", Parsed("# file: "));
    EXPECT_EQ("comment||", Parsed("# file:"));
    EXPECT_EQ("comment||", Parsed("#user.a=\"b\""));
    EXPECT_EQ("attribute|user.a|\"b=c\"", Parsed("user.a=\"b=c\""));
    EXPECT_EQ("attribute|user.a|", Parsed("user.a"));
    EXPECT_EQ("attribute||0x00", Parsed("=0x00"));
    EXPECT_EQ("attribute| # file: a|", Parsed(" # file: a"));
}

// ---- Names --------------------------------------------------------------------------------------

TEST(AttributeTextTest, ThreeOctalDigitsStandForAByteOfAName) {
    EXPECT_EQ("a=b\\c\nd", Name("a\\075b\\134c\\012d"));
    EXPECT_EQ("\xFF", Name("\\377"));
    EXPECT_EQ("na\xC3\xAFve \xFF \"x\"", Name("na\xC3\xAFve \xFF \"x\""));
    EXPECT_EQ("\n7", Name("\\0127"));
}

TEST(AttributeTextTest, DamagedNamesAreToldFromGoodOnes) {
    constexpr char kEscape[] = "!a backslash in it is not followed by three octal digits";
    for (const char* text : {"\\", "a\\0", "a\\01", "a\\01x", "\\08", "\\\\", "\\400", "\\777"}) {
        EXPECT_EQ(kEscape, Name(text)) << text;
    }
    EXPECT_EQ("!a NUL byte stands in it", Name("a\\000b"));
    EXPECT_EQ("!a NUL byte stands in it", Name(std::string_view("a\0b", 3)));
    EXPECT_EQ("!it is empty", Name(""));
}

TEST(AttributeTextTest, NamesAreWrittenAsGetfattrDoes) {
    EXPECT_EQ("a=b\\134\\012\\015\t\xFF\"", WrittenName(TextName::kPath, "a=b\\\n\r\t\xFF\""));
    EXPECT_EQ("a\\075b\\134\\012\\015\t\xFF\"",
              WrittenName(TextName::kAttribute, "a=b\\\n\r\t\xFF\""));
    std::string all = Text(AllBytes()).substr(1);
    EXPECT_EQ(all, Name(WrittenName(TextName::kPath, all)));
    EXPECT_EQ(all, Name(WrittenName(TextName::kAttribute, all)));
}

// ---- Values -------------------------------------------------------------------------------------

TEST(AttributeTextTest, AValueIsTextHexOrBase64) {
    EXPECT_EQ("blue", Value("\"blue\""));
    EXPECT_EQ("", Value("\"\""));
    EXPECT_EQ("", Value(""));
    EXPECT_EQ("blue", Value("blue"));
    EXPECT_EQ("a\"b\\c\n\1d", Value("\"a\\\"b\\\\c\\012\\1d\""));
    EXPECT_EQ("a\"b", Value("\"a\"b\""));
    EXPECT_EQ(std::string("a\0", 2), Value("\"a\\000\""));
    EXPECT_EQ(std::string("\0\x12\xFF", 3), Value("0x0012fF"));
    EXPECT_EQ("\x12\x34", Value("0X12 34"));
    EXPECT_EQ("", Value("0x"));
    EXPECT_EQ("a", Value("0sYQ=="));
    EXPECT_EQ("ab", Value("0sYWI="));
    EXPECT_EQ("abc", Value("0SYWJj"));
    EXPECT_EQ("abcd", Value("0sYWJj ZA=="));
    EXPECT_EQ("", Value("0s"));
    EXPECT_EQ("0", Value("0"));
}

TEST(AttributeTextTest, DamagedValuesAreToldFromGoodOnes) {
    for (const char* text : {"\"", "\"blue", "\"blue\\\"", "\"\\\""}) {
        EXPECT_EQ("!its value has no closing quote", Value(text)) << text;
    }
    for (const char* text : {"\"\\q\"", "\"\\8\"", "\\", "blue\\", "\"\\400\"", "\"\\777\""}) {
        EXPECT_EQ("!a backslash in its value begins no escape", Value(text)) << text;
    }
    EXPECT_EQ("!its value has an odd number of hexadecimal digits", Value("0x123"));
    EXPECT_EQ("!its value has a character that is no hexadecimal digit", Value("0x1g"));
    for (const char* text : {"0sY", "0sYQ", "0sYQ=", "0sYQ===", "0sY===", "0sYQ==YQ==", "0sYR==",
                             "0sYWJ=", "0s=", "0s====", "0sY!==", "0sYW=j"}) {
        EXPECT_EQ("!its value is no base64", Value(text)) << text;
    }
    EXPECT_EQ("!a NUL byte stands in it", Value(std::string_view("\"a\0b\"", 5)));
}

TEST(AttributeTextTest, ValuesAreWrittenAsGetfattrDoes) {
    const Bytes bytes = Hex("'a' 00 0A 0D 5C 22 09 FF");
    EXPECT_EQ("\"a\\000\\012\\015\\\\\\\"\t\xFF\"", Written(TextEncoding::kText, {bytes}));
    EXPECT_EQ("0x61000a0d5c2209ff", Written(TextEncoding::kHex, {bytes}));
    EXPECT_EQ("0sYQAKDVwiCf8=", Written(TextEncoding::kBase64, {bytes}));
    EXPECT_EQ("\"\"", Written(TextEncoding::kText, {}));
    EXPECT_EQ("0x", Written(TextEncoding::kHex, {}));
    EXPECT_EQ("0s", Written(TextEncoding::kBase64, {}));
}

TEST(AttributeTextTest, WhatIsWrittenInAnyPiecesComesBack) {
    const Bytes all = AllBytes();
    for (const auto encoding : {TextEncoding::kText, TextEncoding::kHex, TextEncoding::kBase64}) {
        for (std::size_t size = 0; size <= all.size(); ++size) {
            const Bytes first(all.begin(), all.begin() + static_cast<std::ptrdiff_t>(size));
            const Bytes last(all.begin() + static_cast<std::ptrdiff_t>(size), all.end());
            EXPECT_EQ(Text(first), Value(Written(encoding, {first})));
            EXPECT_EQ(Text(all), Value(Written(encoding, {first, last})));
        }
    }
}

// A value that has lost its end is damaged, or is one of which nobody can tell.
TEST(AttributeTextTest, EachTruncationOfAValueIsDamageOrAShorterOne) {
    const Bytes all = AllBytes();
    const std::string text = Written(TextEncoding::kText, {all});
    for (std::size_t size = 1; size < text.size(); ++size) {
        const std::string_view cut = std::string_view(text).substr(0, size);
        if (Value(cut).starts_with('!')) continue;
        ADD_FAILURE() << cut;
    }
    const std::string hex = Written(TextEncoding::kHex, {all});
    for (std::size_t size = 2; size < hex.size(); ++size) {
        const std::string value = Value(std::string_view(hex).substr(0, size));
        EXPECT_EQ(size % 2 != 0, value.starts_with('!'));
    }
    const std::string base64 = Written(TextEncoding::kBase64, {all});
    for (std::size_t size = 2; size < base64.size(); ++size) {
        const std::string value = Value(std::string_view(base64).substr(0, size));
        EXPECT_EQ(size % 4 != 2, value.starts_with('!')) << size;
    }
}

TEST(AttributeTextTest, OnlyATextWithBothQuotesIsWholeWithoutALinesEnd) {
    EXPECT_TRUE(IsWholeTextValue("\"\""));
    EXPECT_TRUE(IsWholeTextValue("\"blue\""));
    for (const char* text : {"", "\"", "\"blue", "blue", "0x00", "0sYQ=="}) {
        EXPECT_FALSE(IsWholeTextValue(text)) << text;
    }
}

TEST(AttributeTextTest, OneByteOfEightMayBeUnprintableInAText) {
    const auto best = [](const std::vector<Bytes>& pieces) {
        TextChoice choice;
        for (const Bytes& piece : pieces) choice.Add(piece);
        return choice.Best();
    };
    EXPECT_EQ(TextEncoding::kText, best({}));
    EXPECT_EQ(TextEncoding::kText, best({Ascii("blue")}));
    EXPECT_EQ(TextEncoding::kText, best({Hex("0A 'abcdefg'")}));
    EXPECT_EQ(TextEncoding::kText, best({Hex("0A"), Ascii("abcdefg")}));
    EXPECT_EQ(TextEncoding::kBase64, best({Hex("0A 'abcdef'")}));
    EXPECT_EQ(TextEncoding::kBase64, best({Hex("FF")}));
    // getfattr would leave it out.
    EXPECT_EQ(TextEncoding::kBase64, best({Ascii("a long text of letters"), Hex("00")}));
    EXPECT_EQ(TextEncoding::kText, best({Ascii("a long text of letters"), {}}));
}

}  // namespace
}  // namespace mavoea::test
