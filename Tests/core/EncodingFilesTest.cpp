#include "libkernel/core/StringEncoding.h"
#include "support/Rows.h"

#include <functional>
#include <gtest/gtest.h>
#include <memory>
#include <set>
#include <unicode/ucnv.h>
#include <unicode/utf16.h>

// The generated mapping files against ICU's converters, both ways over all codes and all code points. They were made
// from other sources, so that a difference is either a fault or a known one of the peer.

using namespace Kernel;

namespace {

constexpr u32 c_none = StringEncoding::c_noCode;

struct Peer
{
    std::function<u32(u32)> decode; // c_none for what it has not.
    std::function<u32(u32)> encode;
};

Peer MakeIcu(char const* name)
{
    UErrorCode status = U_ZERO_ERROR;
    std::shared_ptr<UConverter> const c(ucnv_open(name, &status), ucnv_close);
    if (U_FAILURE(status)) return {};
    ucnv_setToUCallBack(c.get(), UCNV_TO_U_CALLBACK_STOP, nullptr, nullptr, nullptr, &status);
    ucnv_setFromUCallBack(c.get(), UCNV_FROM_U_CALLBACK_STOP, nullptr, nullptr, nullptr, &status);
    return {[c](u32 code) -> u32 {
                UErrorCode e = U_ZERO_ERROR;
                char const bytes[] = {static_cast<char>(code >> 8), static_cast<char>(code)};
                char16_t out[4];
                int const n = code > 0xFF ? ucnv_toUChars(c.get(), out, 4, bytes, 2, &e)
                                          : ucnv_toUChars(c.get(), out, 4, bytes + 1, 1, &e);
                if (U_FAILURE(e) || n < 1) return c_none;
                if (n == 2 && U16_IS_LEAD(out[0]) && U16_IS_TRAIL(out[1])) return U16_GET_SUPPLEMENTARY(out[0], out[1]);
                return n == 1 ? out[0] : c_none;
            },
            [c](u32 codePoint) -> u32 {
                UErrorCode e = U_ZERO_ERROR;
                char16_t units[2];
                int length = 0;
                U16_APPEND_UNSAFE(units, length, codePoint);
                char out[8];
                int const n = ucnv_fromUChars(c.get(), out, 8, units, length, &e);
                if (U_FAILURE(e) || n < 1 || n > 2) return c_none;
                u32 const first = static_cast<u8>(out[0]);
                return n == 1 ? first : first << 8 | static_cast<u8>(out[1]);
            }};
}

struct Known
{
    char const* name;
    u32 first; // Codes.
    u32 last;
};

constexpr Known c_known[] = {
    // The control codes of the PC's own terminals.
    {"CP775", 0x1A, 0x1C},
    {"CP775", 0x7F, 0x7F},
    {"CP932", 0x1A, 0x1C},
    {"CP932", 0x7F, 0x7F},
    // Bytes that Windows maps though the code page has no characters there.
    {"CP932", 0x80, 0x80},
    {"CP932", 0xA0, 0xA0},
    {"CP932", 0xFD, 0xFF},
    {"CP1253", 0xAA, 0xAA},
    // A row for the user's own characters, where the file has the Kana and Cyrillic that fonts have there.
    {"CP950", 0xC6A1, 0xC8FE},
};

struct Comparison
{
    StringEncoding const& ours;
    Peer peer;

    bool IsKnown(u32 code) const
    {
        for (Known const& known : c_known)
            if (ours.GetName() == known.name && code >= known.first && code <= known.last) return true;
        return false;
    }

    // The peer passes on what has no character: bytes as control characters, and all else by the private use area.
    bool IsPassedOn(u32 mine, u32 code, u32 codePoint) const
    {
        bool const isControl = code == codePoint && code >= 0x80 && code <= 0x9F;
        return mine == c_none && (isControl || (codePoint >= 0xE000 && codePoint <= 0xF8FF));
    }

    // Gives the code points that either side has, for the way back.
    std::set<u32> CompareCodes() const
    {
        std::set<u32> codePoints;
        for (u32 code = 0; code < 0x10000; code = code == 0xFF ? 0x8000 : code + 1) {
            u32 const high = code >> 8;
            // A lead byte alone is no character to the peer, and a pair behind another byte is two.
            if (high == 0 && ours.IsVariableLength() && ours.IsLeadByte(static_cast<u8>(code))) continue;
            if (high != 0 && (!ours.IsVariableLength() || peer.decode(high) != c_none)) continue;
            u32 const mine = ours.ToUnicode(code);
            u32 const theirs = peer.decode(code);
            codePoints.insert({mine, theirs});
            if (mine != theirs && !IsKnown(code) && !IsPassedOn(mine, code, theirs))
                ADD_FAILURE() << std::hex << code << " gives " << mine << ", but " << theirs << " there";
        }
        codePoints.erase(c_none);
        return codePoints;
    }

    void CompareCodePoints(std::set<u32> const& codePoints) const
    {
        for (u32 const codePoint : codePoints) {
            u32 const mine = ours.FromUnicode(codePoint, c_none);
            u32 const theirs = peer.encode(codePoint);
            if (mine == theirs || IsKnown(mine) || IsKnown(theirs)) continue;
            if (theirs != c_none && peer.decode(theirs) != codePoint) continue; // A stand-in, one way only.
            if (IsPassedOn(mine, theirs, codePoint)) continue;
            // Of several codes for one character each side takes its own choice.
            if (mine != c_none && theirs != c_none && ours.ToUnicode(mine) == codePoint &&
                ours.ToUnicode(theirs) == codePoint)
                continue;
            ADD_FAILURE() << std::hex << codePoint << " is " << mine << ", but " << theirs << " there";
        }
    }
};

TEST(EncodingFiles, AgreeWithOtherConverters)
{
    // A code page, or -1 and then the script and language.
    for (auto const& [codePage, script, language, name] :
         Rows<CodePage, int, int, char const*>{{775, 0, 0, "ibm-775"},
                                               {874, 0, 0, "windows-874"},
                                               {932, 0, 0, "windows-31j"},
                                               {949, 0, 0, "windows-949-2000"},
                                               {950, 0, 0, "windows-950-2000"},
                                               {1250, 0, 0, "windows-1250"},
                                               {1251, 0, 0, "windows-1251"},
                                               {1252, 0, 0, "windows-1252"},
                                               {1253, 0, 0, "windows-1253"},
                                               {1254, 0, 0, "windows-1254"},
                                               {1255, 0, 0, "windows-1255"},
                                               {1258, 0, 0, "windows-1258"},
                                               {10000, 0, 0, "macos-0_2-10.2"},
                                               {10006, 0, 0, "macos-6_2-10.4"},
                                               {10007, 0, 0, "macos-7_3-10.2"},
                                               {10029, 0, 0, "macos-29-10.2"},
                                               {10081, 0, 0, "macos-35-10.2"},
                                               {-1, 0, 20, "macos-6_2-10.4"},
                                               {-1, 29, 0, "macos-29-10.2"}})
    {
        auto const encoding = codePage >= 0 ? StringEncoding::Make(codePage) : StringEncoding::Make(script, language);
        SCOPED_TRACE(std::string(encoding->GetName().GetData()) + " against " + name);
        ASSERT_FALSE(encoding->IsIdentity());
        Peer const peer = MakeIcu(name);
        ASSERT_TRUE(peer.decode);
        Comparison const comparison{*encoding, peer};
        std::set<u32> codePoints = comparison.CompareCodes();
        EXPECT_GT(codePoints.size(), 200u);
        for (u32 c = 0; c < 0x3100; ++c) codePoints.insert(c);
        comparison.CompareCodePoints(codePoints);
    }
}

// What the peer doesn't know: a published value or two of each, on both sides of the line between one byte and two.
TEST(EncodingFiles, HaveThePublishedCharacters)
{
    for (auto const& [script, language, code, codePoint] : Rows<int, int, u32, u32>{{1, 0, 0x82A0, 0x3042},
                                                                                    {1, 0, 0x80, 0x5C},
                                                                                    {2, 0, 0xA440, 0x4E00},
                                                                                    {3, 0, 0xB0A1, 0xAC00},
                                                                                    {4, 0, 0xC7, 0x627},
                                                                                    {4, 48, 0xB0, 0x6F0},
                                                                                    {5, 0, 0xE0, 0x5D0},
                                                                                    {8, 0, 0x61, 0x3B1},
                                                                                    {9, 0, 0xB3, 0x915},
                                                                                    {10, 0, 0xB3, 0xA15},
                                                                                    {11, 0, 0xB3, 0xA95},
                                                                                    {21, 0, 0xA1, 0xE01},
                                                                                    {21, 0, 0xE8, 0xE48},
                                                                                    {25, 0, 0xB0A1, 0x554A},
                                                                                    {0, 21, 0xA0, 0xDD},
                                                                                    {0, 25, 0xA9, 0x160},
                                                                                    {0, 39, 0xAF, 0x218},
                                                                                    {0, 24, 0xDA, 0x11E}})
    {
        SCOPED_TRACE(testing::Message() << "script " << script << ", language " << language);
        auto const encoding = StringEncoding::Make(script, language);
        EXPECT_EQ(encoding->ToUnicode(code), codePoint);
        EXPECT_EQ(encoding->FromUnicode(codePoint, c_none), code);
    }
    auto const pdf = StringEncoding::MakePdfDocEncoding();
    EXPECT_EQ(pdf->ToUnicode("\x18\x80\x92\x9E\xA0\xAD\xE9", 7), "\u02D8\u2022\u2122\u017E\u20AC\uFFFF\u00E9");
    EXPECT_EQ(StringEncoding::Make(2)->ToUnicode("a\xB7", 2), "\uF061\uF0B7");
}

} // namespace
