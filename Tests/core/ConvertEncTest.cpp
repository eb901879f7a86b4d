#include "libkernel/core/ConvertEnc.h"

#include "libkernel/core/CharTraits.h"
#include "support/Rows.h"

#include <gtest/gtest.h>
#include <iconv.h>
#include <memory>
#include <random>
#include <vector>

namespace Kernel {
namespace {

/// What the C library makes of the same text.
template <class To>
StringT<To> Reference(std::vector<u32> const& codePoints)
{
    std::vector<char> room(codePoints.size() * 4 + 4);
    constexpr char const* c_names[] = {"", "UTF-8", "UTF-16LE", "", "UTF-32LE"};
    iconv_t const converter = iconv_open(c_names[sizeof(typename To::Unit)], "UTF-32LE");
    char* from = reinterpret_cast<char*>(const_cast<u32*>(codePoints.data()));
    size_t fromLeft = codePoints.size() * 4;
    char* to = room.data();
    size_t toLeft = room.size();
    EXPECT_EQ(iconv(converter, &from, &fromLeft, &to, &toLeft), 0u);
    iconv_close(converter);
    using Unit = typename To::Unit;
    StringT<To> result;
    size_t const bytes = static_cast<size_t>(to - room.data());
    std::memcpy(result.SetLength(static_cast<int>(bytes / sizeof(Unit))), room.data(), bytes);
    return result;
}

template <class To, class From>
void ExpectConverts(std::vector<u32> const& codePoints)
{
    StringT<From> const from = Reference<From>(codePoints);
    StringT<To> const expected = Reference<To>(codePoints);
    ASSERT_TRUE((ConvertedTo<To>(from) == expected));
    // Behind what is there already, and with the terminator for an end.
    StringT<To> appended(expected);
    ConvertEnc<To, From>(appended, from.GetData(), -1);
    ASSERT_TRUE(appended == expected + expected);
}

void ExpectAllNineConvert(std::vector<u32> const& text)
{
    auto const from = [&]<class From>(From) {
        ExpectConverts<TEncUtf8, From>(text);
        ExpectConverts<TEncUtf16, From>(text);
        ExpectConverts<TEncUtf32, From>(text);
    };
    from(TEncUtf8());
    from(TEncUtf16());
    from(TEncUtf32());
}

TEST(ConvertEncTest, NinePairsAgreeWithTheCLibrary)
{
    std::mt19937 random(3);
    for (int round = 0; round < 1500 && !HasFatalFailure(); ++round) {
        SCOPED_TRACE(round);
        std::vector<u32> text(random() % 100);
        for (u32& c : text) {
            u32 const limits[] = {0x7F, 0x7FF, 0xFFFF, 0x10FFFF};
            u32 const style = round % 5;
            do c = random() % limits[style < 4 ? style : random() % 8 ? 0 : random() % 4] + 1;
            while (c >= 0xD800 && c < 0xE000);
        }
        ExpectAllNineConvert(text);
    }
}

template <class To, class From>
void ConvertExact(std::vector<u8> const& bytes)
{
    using Unit = typename From::Unit;
    size_t const units = bytes.size() / sizeof(Unit);
    std::unique_ptr<Unit[]> const exact(new Unit[units]);
    if (units) std::memcpy(exact.get(), bytes.data(), units * sizeof(Unit));
    StringT<To> text;
    ConvertEnc<To, From>(text, exact.get(), static_cast<int>(units));
    EXPECT_EQ(text.GetData()[text.GetLength()], 0u);
}

TEST(ConvertEncTest, IllFormedTextStaysInsideItsBounds)
{
    std::mt19937 random(5);
    for (int round = 0; round < 3000; ++round) {
        std::vector<u8> bytes(random() % 80);
        for (u8& b : bytes)
            b = static_cast<u8>(round % 2 ? random() : (random() % 4 ? 0xD8 + random() % 40 : random()));
        ConvertExact<TEncUtf16, TEncUtf8>(bytes);
        ConvertExact<TEncUtf32, TEncUtf8>(bytes);
        ConvertExact<TEncUtf8, TEncUtf16>(bytes);
        ConvertExact<TEncUtf32, TEncUtf16>(bytes);
        ConvertExact<TEncUtf8, TEncUtf32>(bytes);
        ConvertExact<TEncUtf16, TEncUtf32>(bytes);
    }
}

// The target grows once, and keeps no room, wherever the text stops to be ASCII.
TEST(ConvertEncTest, LongTextIsExactAndKeepsNoRoom)
{
    for (u32 const codePoint : {0x41u, 0xE9u, 0x20ACu, 0x1F600u})
        for (auto const& [ascii, far] : Rows<size_t, size_t>{{600, 1}, {600, 40}, {600, 9000}, {0, 70001}}) {
            SCOPED_TRACE(far);
            std::vector<u32> text(ascii, 'a');
            text.insert(text.end(), far, codePoint);
            text.push_back('z');
            ExpectAllNineConvert(text);
            String16 const wide = ConvertedTo<TEncUtf16>(Reference<TEncUtf8>(text));
            EXPECT_LE(wide.GetCapacity(), wide.GetLength() + wide.GetLength() / 4 + 8);
        }
    // Room that the caller made stays.
    String16 reserved;
    reserved.Reserve(5000);
    ConvertEnc<TEncUtf16, TEncUtf8>(reserved, "a\xC3\xA9", 3);
    EXPECT_GE(reserved.GetCapacity(), 5000);
}

TEST(ConvertEncTest, VeryLongAsciiGoesBothWaysFromAnyPlace)
{
    String8 text;
    char* const units = text.SetLength((1 << 22) + 100);
    for (int i = 0; i < text.GetLength(); ++i) units[i] = static_cast<char>(i * 7 & 0x7F);
    for (char const* tail : {"", "\u00E9 and more", "\U0001F600"}) {
        String8 const whole = text + tail;
        String16 wide(u"abc");
        ConvertEnc<TEncUtf16, TEncUtf8>(wide, whole.GetData(), whole.GetLength());
        ASSERT_TRUE((ConvertedTo<TEncUtf8>(wide.GetSubstring(3)) == whole));
        ASSERT_TRUE((ConvertedTo<TEncUtf8>(ConvertedTo<TEncUtf32>(wide)) == String8("abc") + whole));
    }
}

TEST(ConvertEncTest, ZeroUnitsPassAndALastCodePointCutShortIsDropped)
{
    EXPECT_EQ(ConvertedTo<TEncUtf16>(String8("ab\xF0")), u"ab");
    EXPECT_EQ(ConvertedTo<TEncUtf8>(String16(u"ab\xD83D")), "ab");
    EXPECT_EQ(ConvertedTo<TEncUtf16>(String8("a\0b", 3)), String16(u"a\0b", 3));
    String8 out("x");
    ConvertEnc<TEncUtf8, TEncUtf16>(out, nullptr, 0);
    EXPECT_EQ(out, "x");
}

} // namespace
} // namespace Kernel
