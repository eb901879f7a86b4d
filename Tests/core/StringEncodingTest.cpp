#include "libkernel/core/StringEncoding.h"

#include "libkernel/concurrency/Dispatch.h"
#include "libkernel/filesystem/FileSystem.h"
#include "support/TempFolder.h"

#include <gmock/gmock.h>
#include <tuple>

using namespace Kernel;
using Policy = StringEncoding::ErrorPolicy;

namespace {

// Mapping files of our own, under names that are never installed. Each is read at its first use in the process.
class MappingFile : public testing::Test
{
protected:
    MappingFile()
    {
        FileSystem::SetResourcesDirectory(String8(std::string_view(m_folder.GetPath())));
        StringEncoding::SetSubdirectory("");
    }
    ~MappingFile() override
    {
        FileSystem::SetResourcesDirectory("");
        StringEncoding::SetSubdirectory("encodings");
    }
    Counted<StringEncoding> Make(char const* file, std::string const& content, int script, int language)
    {
        TestSupport::WriteWholeFile(m_folder / file, content);
        return StringEncoding::Make(script, language);
    }

    TestSupport::TempFolder m_folder;
};

TEST_F(MappingFile, LinesGiveEntriesAndEverythingElseIsIgnored)
{
    auto const encoding = Make("Inuit.txt",
                               "0x41 0x0041 # LATIN CAPITAL LETTER A\n"
                               "# 0x42 0x0042\n"
                               "0x43\n"
                               "0x44 # 0x0044\n"
                               "45 0x0045\n"
                               "  code 0x46=0x2022+0x20\r\n"
                               "0x47 0xD800\n"
                               "0x48 0x110000\n"
                               "0x12345678 0x41\n"
                               "0x100000041 0x41\n"
                               "0x41 0x5A\n" // Behind its place.
                               "0x4a\t0x1f600\n"
                               "0x4B 0x" +
                                   std::string(300, '0') + "4B\n" + // Past what is read of a line.
                                   std::string(300, ' ') + "0x4C 0x4C\n" + "0xFF 0x0041",
                               28, 0);
    using Row = std::tuple<u32, u32>;
    for (auto const& [code, codePoint] :
         {Row{0, 0}, Row{31, 31}, Row{32, 0xFFFF}, Row{0x41, 0x41}, Row{0x42, 0xFFFF}, Row{0x43, 0xFFFF},
          Row{0x44, 0xFFFF}, Row{0x45, 0xFFFF}, Row{0x46, 0x2022}, Row{0x47, 0xFFFF}, Row{0x48, 0xFFFF},
          Row{0x4A, 0x1F600}, Row{0x4B, 0}, Row{0x4C, 0xFFFF}, Row{0x7F, 0x7F}, Row{0xFF, 0x41}, Row{256, 0xFFFF},
          Row{0x12345678, 0xFFFF}})
        EXPECT_EQ(encoding->ToUnicode(code), codePoint) << code;
    EXPECT_EQ(encoding->GetName(), "Inuit");
    EXPECT_FALSE(encoding->IsVariableLength());
    EXPECT_FALSE(encoding->IsIdentity());
    EXPECT_EQ(encoding->FromUnicode(0x41, 0), 0x41u); // The lowest of its two codes.
    EXPECT_EQ(encoding->FromUnicode(0xFFFF, 7), 7u);
}

TEST_F(MappingFile, CodesAbove255MakeLeadBytes)
{
    auto const encoding = Make("Celtic.txt", "0x41 0x0041\n0x42 0x0042\n0x8141 0x3042\n0x8250 0x4E00\n", 0, 50);
    EXPECT_TRUE(encoding->IsVariableLength());
    for (int byte = 0; byte < 256; ++byte)
        EXPECT_EQ(encoding->IsLeadByte(static_cast<u8>(byte)), byte == 0x81 || byte == 0x82) << byte;
    using Row = std::tuple<std::string, char const*>;
    for (auto const& [in, out] : {Row{"", ""}, Row{"A\x81\101B", "A\u3042B"}, Row{"\x82\x50", "\u4E00"},
                                  Row{"A\x81", "A\uFFFF"}, // A lead byte as the very last one is a code of its own.
                                  Row{"\x81\102A", "\xEF\xBF\277A"}, // No such pair.
                                  Row{"\203A", "\xEF\xBF\277A"}})
        EXPECT_EQ(encoding->ToUnicode(in.data(), static_cast<int>(in.size())), out) << out;
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\x41", 2), 0x3042u);
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\x41", 1), 0xFFFFu);
    EXPECT_EQ(encoding->ToUnicodeSingle("\x81\101A", 3), 0xFFFFu);
    EXPECT_EQ(encoding->ToUnicodeSingle("A\x41", 2), 0x41u);
    EXPECT_EQ(encoding->ToUnicodeSingle(nullptr, 0), 0xFFFFu);
}

TEST_F(MappingFile, NameWithoutExtensionIsTheWholeFileName)
{
    auto const encoding = Make("Gaelic", "0x80 0x1E02\n", 6, 81);
    EXPECT_EQ(encoding->GetName(), "Gaelic");
    EXPECT_EQ(encoding->ToUnicode(0x80), 0x1E02u);
}

TEST(StringEncoding, EachNumberHasItsFile)
{
    // A script, or -1 for a code page.
    using Row = std::tuple<int, int, char const*>;
    for (auto const& [script, number, name] :
         {Row{-1, 2, "WinSymbol"},  Row{-1, 775, "CP775"},     Row{-1, 1252, "CP1252"},     Row{-1, 1256, "Arabic"},
          Row{-1, 10004, "Arabic"}, Row{-1, 10029, "Latin2"},  Row{-1, 10079, "Icelandic"}, Row{-1, 20936, "ChinSimp"},
          Row{-1, 0, "Identity"},   Row{-1, 1257, "Identity"}, Row{-1, 12345, "Identity"},  Row{0, 0, "Roman"},
          Row{0, 20, "Greek"},      Row{6, 20, "Greek"},       Row{6, 0, "Roman"},          Row{0, 47, "Iceland"},
          Row{0, 24, "Turkish"},    Row{0, 68, "Croatian"},    Row{0, 39, "Romanian"},      Row{1, 20, "Japanese"},
          Row{4, 48, "Farsi"},      Row{4, 12, "Arabic"},      Row{8, 0, "MacSymbol"},      Row{29, 5, "CentEuro"},
          Row{12, 0, "Identity"},   Row{32, 0, "Identity"},    Row{-7, -1, "Identity"}})
    {
        SCOPED_TRACE(testing::Message() << script << ", " << number);
        bool const page = script == -1;
        auto const encoding = page ? StringEncoding::Make(number) : StringEncoding::Make(script, number);
        EXPECT_EQ(encoding->GetName(), name);
        bool const supported = page ? StringEncoding::IsSupported(number) : StringEncoding::IsSupported(script, number);
        EXPECT_EQ(supported, encoding->GetName() != "Identity");
        if (page) {
            EXPECT_EQ(StringEncoding::ToCodePage(number), supported ? number : 0);
        }
    }
    EXPECT_EQ(StringEncoding::MakePdfDocEncoding()->GetName(), "PdfDocEncoding");
    EXPECT_EQ(StringEncoding::Make(12345), StringEncoding::MakeIdentity());
}

TEST(StringEncoding, AllThreadsGetOneObject)
{
    std::vector<Counted<StringEncoding>> made(8);
    Dispatch::DispatchParallelFor([&](u64 i) { made[i] = StringEncoding::Make(10000); }, made.size());
    for (auto const& encoding : made) EXPECT_EQ(encoding, made[0]);
    EXPECT_EQ(made[0], StringEncoding::Make(10000));
}

TEST(StringEncoding, IdentityReadsTwoBytesACharacter)
{
    auto const identity = StringEncoding::MakeIdentity();
    EXPECT_TRUE(identity->IsIdentity());
    EXPECT_FALSE(identity->IsVariableLength());
    EXPECT_EQ(identity->ToUnicode("\0A\x30\102B", 5), "A\u3042B");
    EXPECT_EQ(identity->ToUnicode("ab", -1), "\u6162");
    EXPECT_EQ(identity->FromUnicode(0x3042, 0), 0x3042u);
    std::vector<char> out{'<'};
    EXPECT_TRUE(identity->FromUnicode(out, "\u3042", Policy::Stop, 0));
    EXPECT_THAT(out, testing::ElementsAreArray("<\u3042", 4));
    char bytes[2];
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 2, 'A'), 2);
    EXPECT_EQ(std::string(bytes, 2), std::string("\0A", 2));
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 1, 'A'), 0);
    EXPECT_EQ(identity->FromUnicodeSingle(bytes, 2, 0x1F600), 0);
}

TEST(StringEncoding, PolicyDecidesAboutWhatHasNoCode)
{
    using Row = std::tuple<CodePage, char const*, Policy, u32, std::string, bool>;
    for (auto const& [codePage, text, policy, fallback, expected, whole] :
         {Row{1252, "a\u20ACb", Policy::Stop, '?', "a\200b", true},
          Row{1252, "a\u3042b", Policy::WriteFallback, '?', "a?b", false},
          Row{1252, "a\u3042b", Policy::WriteFallback, 0x4142, "aABb", false},
          Row{1252, "a\u3042b", Policy::Skip, '?', "ab", false}, Row{1252, "a\u3042b", Policy::Stop, '?', "a", false},
          Row{1252, "a\xE3\201b", Policy::WriteFallback, '?', "a??b", false},
          Row{1252, "a\xF0", Policy::Skip, '?', "a", false},
          Row{932, "a\u3042\uFF71", Policy::Stop, '?', "a\x82\xA0\xB1", true}})
    {
        std::vector<char> out;
        EXPECT_EQ(StringEncoding::Make(codePage)->FromUnicode(out, text, policy, fallback), whole) << text;
        EXPECT_EQ(std::string(out.begin(), out.end()), expected) << text;
    }
    char bytes[2];
    auto const japanese = StringEncoding::Make(932);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 2, 0x3042), 2);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 1, 0x3042), 0);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 1, 'a'), 1);
    EXPECT_EQ(japanese->FromUnicodeSingle(bytes, 2, 0x10FFFF), 0);
}

} // namespace
