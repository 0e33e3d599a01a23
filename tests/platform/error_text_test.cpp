#include <errno.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <regex>
#include <set>
#include <string>
#include <vector>

#include "platform/include/mavocore.h"

namespace mavoea::core {
namespace {

std::string Text(const char* path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

// The first group of every match, as a number.
std::set<int> Numbers(const std::string& text, const char* pattern) {
    const std::regex expression(pattern);
    std::set<int> numbers;
    for (std::sregex_iterator i(text.begin(), text.end(), expression), end; i != end; ++i)
        numbers.insert(std::stoi((*i)[1], nullptr, 16));
    return numbers;
}

std::set<int> HeaderCodes() {
    return Numbers(Text(MAVOEA_HEADER), "MAVOEA_ERR_[A-Z_]+ = 0x([0-9A-F]+)");
}

TEST(ErrorTextTest, TheTableHasTheCodesOfTheHeaderAndNoOthers) {
    ASSERT_EQ(19u, HeaderCodes().size());
    EXPECT_EQ(HeaderCodes(), Numbers(Text(ERROR_TEXTS), "0x([0-9A-F]+)\\}"));
}

TEST(ErrorTextTest, EveryCodeHasATextOfItsOwnAndAdvice) {
    std::set<std::string> texts = {MAVOErrorText(0), MAVOErrorText(0x1)};
    for (const int code : HeaderCodes()) {
        EXPECT_TRUE(texts.insert(MAVOErrorText(code)).second) << std::hex << code;
        EXPECT_THAT(MAVOErrorAdvice(code), testing::EndsWith(".")) << std::hex << code;
    }
}

TEST(ErrorTextTest, CodesThatNobodyKnowsHaveTextsToo) {
    for (const int code : {-1, 1, 0x101, 0x7FFFFFFF}) {
        EXPECT_STREQ("Unknown error code", MAVOErrorText(code));
        EXPECT_STREQ("Look at errno and at the system log.", MAVOErrorAdvice(code));
    }
    EXPECT_STREQ("No error is recorded", MAVOErrorText(0));
}

TEST(ErrorTextTest, ErrnoStaysAsItIs) {
    errno = EXDEV;
    MAVOErrorText(0xD00);
    MAVOErrorAdvice(1);
    EXPECT_EQ(EXDEV, errno);
}

// "|  0xD00" begins a row of the page's table, and two lines that begin with ":" follow.
TEST(ErrorTextTest, TheManualHasTheSameTable) {
    const std::string page = Text(ERROR_PAGE);
    EXPECT_EQ(HeaderCodes(), Numbers(page, "\n\\|  0x([0-9A-F]+)\n"));
    for (const int code : HeaderCodes()) {
        char number[16];
        snprintf(number, sizeof number, "0x%X", static_cast<unsigned>(code));
        EXPECT_THAT(
            page, testing::HasSubstr(std::string("\n|  ") + number + "\n:  " + MAVOErrorText(code) +
                                     "\n:  " + MAVOErrorAdvice(code) + "\n"));
    }
}

}  // namespace
}  // namespace mavoea::core
