// Names and values of the extended attributes in which Samba keeps named streams. What smbd makes
// of a client's names was seen on disk.

#include "format/samba_stream.h"

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include "tests/support/damage.h"
#include "tests/support/temp_dir.h"

namespace mavoea::test {
namespace {

using ::testing::ElementsAreArray;

std::string Text(const Bytes& bytes) { return {bytes.begin(), bytes.end()}; }

// "NAME" or "NAME#EXTENT"; "none".
std::string Decoded(std::string_view attribute) {
    const auto stream = DecodeStreamAttribute(attribute);
    if (!stream) return "none";
    std::string text(stream->name.text());
    if (stream->extent != 0) text += "#" + std::to_string(stream->extent);
    return text;
}

std::string Encoded(std::string_view name) {
    const auto attribute = EncodeStreamAttribute(name);
    return attribute ? std::string(attribute->text()) : "none";
}

// ---- Names --------------------------------------------------------------------------------------

TEST(SambaStreamTest, AStreamsNameStandsBetweenPrefixAndType) {
    EXPECT_EQ("a", Decoded("user.DosStream.a:$DATA"));
    EXPECT_EQ("com.apple.metadata", Decoded("user.DosStream.com.apple.metadata:$DATA"));
    EXPECT_EQ("user.DosStream.a:$DATA", Encoded("a"));
    EXPECT_EQ("user.DosStream.com.apple.metadata:$DATA", Encoded("com.apple.metadata"));
}

TEST(SambaStreamTest, AnyOtherAttributeHoldsNoStream) {
    for (const char* attribute :
         {"", "user.DosStream.", "user.DosStream.:$DATA", "user.DosStream.a",
          "user.DosStream.a:$data", "user.DosStream.a:$DATA ", "user.DosStreama:$DATA",
          "user.dosstream.a:$DATA", "a:$DATA", "user.DOSATTRIB", "trusted.DosStream.a:$DATA"}) {
        SCOPED_TRACE(attribute);
        EXPECT_EQ("none", Decoded(attribute));
    }
}

TEST(SambaStreamTest, AnExtentsNumberIsPartOfThePrefix) {
    EXPECT_EQ("a#1", Decoded("user.DosStreamExt.1.a:$DATA"));
    EXPECT_EQ("b.c#255", Decoded("user.DosStreamExt.255.b.c:$DATA"));
    EXPECT_EQ("2.a#1", Decoded("user.DosStreamExt.1.2.a:$DATA"));
    for (const char* attribute :
         {"user.DosStreamExt.a:$DATA", "user.DosStreamExt..a:$DATA", "user.DosStreamExt.0.a:$DATA",
          "user.DosStreamExt.01.a:$DATA", "user.DosStreamExt.1a:$DATA", "user.DosStreamExt.1",
          "user.DosStreamExt.1.", "user.DosStreamExt.1.:$DATA", "user.DosStreamExt.1.a",
          "user.DosStreamExt.-1.a:$DATA", "user.DosStreamExt.1000.a:$DATA"}) {
        SCOPED_TRACE(attribute);
        EXPECT_EQ("none", Decoded(attribute));
    }
}

TEST(SambaStreamTest, ForbiddenCharactersArePrivateOnesInUtf8) {
    struct Case {
        char plain;
        const char* utf8;
    };
    for (const Case& c : std::vector<Case>{{'"', "\xEF\x80\xA0"},
                                           {'*', "\xEF\x80\xA1"},
                                           {':', "\xEF\x80\xA2"},
                                           {'<', "\xEF\x80\xA3"},
                                           {'>', "\xEF\x80\xA4"},
                                           {'?', "\xEF\x80\xA5"},
                                           {'\\', "\xEF\x80\xA6"},
                                           {'|', "\xEF\x80\xA7"},
                                           {'\x01', "\xEF\x80\x81"},
                                           {'\t', "\xEF\x80\x89"},
                                           {'\x1F', "\xEF\x80\x9F"}}) {
        const std::string plain = {'x', c.plain, 'y'};
        SCOPED_TRACE(plain);
        const std::string attribute = std::string("user.DosStream.x") + c.utf8 + "y:$DATA";
        EXPECT_EQ(attribute, Encoded(plain));
        EXPECT_EQ(plain, Decoded(attribute));
        EXPECT_EQ(plain, Decoded("user.DosStream." + plain + ":$DATA"));  // as it is where "native"
    }
}

TEST(SambaStreamTest, EveryControlCharacterIsMapped) {
    for (char plain = 1; plain < 0x20; ++plain) {
        const std::string mapped = {'\xEF', '\x80', static_cast<char>(0x80 + plain)};
        EXPECT_EQ("user.DosStream." + mapped + ":$DATA", Encoded({&plain, 1}));
        EXPECT_EQ(std::string(1, plain), Decoded("user.DosStream." + mapped + ":$DATA"));
    }
}

TEST(SambaStreamTest, AllOtherBytesAreAsTheyAre) {
    for (const std::string name :
         {" ", ".", "a b", "$DATA", "\x7F", "\xC3\xA4", "\xEF\x80\x80", "\xEF\x80\xA8", "\xEF\x80",
          "\xEF", "\xEF\x81\xA2", "\xEE\x80\xA2", "\xFF\xFE", "\xEF\xEF\x80"}) {
        SCOPED_TRACE(name);
        EXPECT_EQ("user.DosStream." + name + ":$DATA", Encoded(name));
        EXPECT_EQ(name, Decoded("user.DosStream." + name + ":$DATA"));
    }
}

TEST(SambaStreamTest, APlainColonInFrontOfTheTypeIsTheNames) {
    EXPECT_EQ("a:", Decoded("user.DosStream.a::$DATA"));
    EXPECT_EQ(":$DATA", Decoded("user.DosStream.:$DATA:$DATA"));
}

TEST(SambaStreamTest, NamesThatNoClientCanCallHaveNoAttribute) {
    using namespace std::string_view_literals;
    for (const std::string_view name : {""sv, "/"sv, "a/b"sv, "\0"sv, "a\0"sv}) {
        SCOPED_TRACE(name);
        EXPECT_EQ("none", Encoded(name));
    }
}

TEST(SambaStreamTest, TheKernelsLimitIsForTheWholeAttribute) {
    EXPECT_EQ(255U, Encoded(std::string(234, 'n')).size());
    EXPECT_EQ("none", Encoded(std::string(235, 'n')));
    EXPECT_EQ(255U, Encoded(std::string(78, ':')).size());
    EXPECT_EQ("none", Encoded(std::string(78, ':') + "n"));
    EXPECT_EQ("none", Encoded(std::string(79, ':')));
    EXPECT_EQ("none", Encoded(std::string(100000, ':')));
}

TEST(SambaStreamTest, ANameThatIsTooLongForAnyAttributeIsNone) {
    EXPECT_EQ(std::string(255, 'n'), Decoded("user.DosStream." + std::string(255, 'n') + ":$DATA"));
    EXPECT_EQ("none", Decoded("user.DosStream." + std::string(256, 'n') + ":$DATA"));
}

TEST(SambaStreamTest, AnyDamageLeavesANameThatComesBackOrNone) {
    for (const char* attribute :
         {"user.DosStream.a\xEF\x80\xA2:$DATA", "user.DosStreamExt.12.a:$DATA"}) {
        ForEachDamage(Ascii(attribute), [](const Bytes& damaged) {
            const auto stream = DecodeStreamAttribute(Text(damaged));
            if (!stream) return;
            ASSERT_FALSE(stream->name.text().empty());
            const auto again = EncodeStreamAttribute(stream->name.text());
            const bool callable = stream->name.text().find_first_of(std::string_view("/\0", 2)) ==
                                  std::string_view::npos;
            ASSERT_EQ(callable, again.has_value());
            if (again) {
                ASSERT_EQ(stream->name.text(), Decoded(again->text()));
            }
        });
    }
}

// ---- Values -------------------------------------------------------------------------------------

TEST(SambaStreamTest, AValueEndsInOneByteMore) {
    const Bytes bytes = Hex("'value' 00");
    const auto value = DecodeStreamValue(bytes);
    ASSERT_TRUE(value);
    EXPECT_THAT(value->bytes, ElementsAreArray(Ascii("value")));
    EXPECT_EQ(0U, value->extents);
}

TEST(SambaStreamTest, TheLastByteIsNeverTheValues) {
    const Bytes bytes = Ascii("ABC");
    const auto value = DecodeStreamValue(bytes);
    ASSERT_TRUE(value);
    EXPECT_THAT(value->bytes, ElementsAreArray(Ascii("AB")));
    EXPECT_EQ('C', value->extents);
}

TEST(SambaStreamTest, AnEmptyValueIsOneByte) {
    const Bytes nul = {0};
    const auto value = DecodeStreamValue(nul);
    ASSERT_TRUE(value);
    EXPECT_TRUE(value->bytes.empty());
    EXPECT_FALSE(DecodeStreamValue({}));
}

}  // namespace
}  // namespace mavoea::test
