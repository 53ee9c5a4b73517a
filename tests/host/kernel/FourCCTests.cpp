#include "host/kernel/FourCC.h"

#include <gtest/gtest.h>

#include <string>

using namespace Kernel;
using namespace Kernel::Literals;

static_assert(MakeFourCC("Inte") == 0x496E7465u);
static_assert("Inte"_4cc == 0x496E7465u);
static_assert("Inte"_4cc == MakeFourCC("Inte"));
static_assert(MakeFourCC("\xFF\x00\x01 ") == 0xFF000120u, "bytes are unsigned, the first in the top byte");

TEST(FourCC, MakeAndLiteralAgree) {
    EXPECT_EQ(MakeFourCC("Inte"), 0x496E7465u);
    EXPECT_EQ("Smpl"_4cc, MakeFourCC("Smpl"));
    EXPECT_EQ("    "_4cc, 0x20202020u);
}

TEST(FourCC, ToString) {
    EXPECT_EQ(FourCCToString(0x496E7465u), "Inte");
    EXPECT_EQ(FourCCToString("a b~"_4cc), "a b~");
    // Unprintable bytes (control characters, DEL, anything above 0x7F) read as '?'.
    EXPECT_EQ(FourCCToString(0x00410A42u), "?A?B");
    EXPECT_EQ(FourCCToString(0x7F80FF41u), "???A");
    EXPECT_EQ(FourCCToString(0u), "????");
}

TEST(FourCC, ParseRoundTrip) {
    for (const char* text : {"Inte", "Smpl", "    ", "~~~~", "a-1_", "!@#$"}) {
        const auto code = ParseFourCC(text);
        ASSERT_TRUE(code.has_value()) << text;
        EXPECT_EQ(FourCCToString(*code), text);
    }
    EXPECT_EQ(ParseFourCC("Inte"), std::optional<FourCC>(0x496E7465u));
    // Every printable character in every position.
    for (int c = 0x20; c < 0x7F; ++c) {
        std::string text = "abcd";
        text[std::size_t(c % 4)] = char(c);
        const auto code = ParseFourCC(text);
        ASSERT_TRUE(code.has_value()) << c;
        EXPECT_EQ(FourCCToString(*code), text);
    }
}

TEST(FourCC, ParseRefusals) {
    EXPECT_FALSE(ParseFourCC(""));
    EXPECT_FALSE(ParseFourCC("Int"));
    EXPECT_FALSE(ParseFourCC("Inter"));
    EXPECT_FALSE(ParseFourCC(std::string_view("In\0e", 4)));
    EXPECT_FALSE(ParseFourCC("In\te"));
    EXPECT_FALSE(ParseFourCC("Int\x7F"));
    EXPECT_FALSE(ParseFourCC("\xC3\xA9te")); // non-ASCII
    EXPECT_FALSE(ParseFourCC("Inté"));       // five bytes in UTF-8
}
